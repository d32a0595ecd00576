#include "manager/services.h"

#include <cstdint>
#include <cstdlib>
#include <ctime>

#include "config/uci2.h"
#include "log/log.h"
#include "util/device.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t OPTION_SIZE = 32;
constexpr time_t FIREWALL_PAUSE_SECONDS = 9;
constexpr char WEBDAV_TARGET[] = "firewall.webdav_wan.target";

// What the firewall rule keeps for the life of the process. Once set the flags stay set: it fires
// at most once.
struct firewall_rule {
    int32_t ser_port_set;
    int32_t webdav_port_set;
    time_t t_firewall;  // of the last look
};

firewall_rule rule;

bool option_is_set(uci_context* ctx, const char* path)
{
    char value[OPTION_SIZE];
    uci2_get(ctx, path, value, sizeof(value));
    return value[0] == '1';
}

int published_disk_count()
{
    char text[OPTION_SIZE + 1];
    file_read_text(DISK_NUM_FILE, text);
    return atoi(text);
}

// Reads the rule's target and turns a "DROP" into "ACCEPT".
void accept_webdav(uci_context* ctx, char (&target)[OPTION_SIZE])
{
    uci2_get(ctx, WEBDAV_TARGET, target, sizeof(target));
    if (!text_has_prefix(target, "DROP")) {
        return;
    }
    // A change that cannot be written is logged, and not tried again.
    uci2_set(ctx, WEBDAV_TARGET, "ACCEPT");
    uci2_commit(ctx, "firewall");
    rule.webdav_port_set = 1;
    firewall_reload();
}

void apply_webdav_rule(uci_context* ctx)
{
    if (option_is_set(ctx, "nas.conf.tarnser_port_set")) {
        rule.ser_port_set = 1;
    }
    if (option_is_set(ctx, "nas.conf.webdav_port_set")) {
        rule.webdav_port_set = 1;
        return;
    }
    if (rule.ser_port_set == 1 || rule.webdav_port_set == 1) {
        return;
    }
    // Nothing fills it; whoever reads the log expects the line.
    const char tarnnas_target[OPTION_SIZE]{};
    char webdav_target[OPTION_SIZE]{};
    if (published_disk_count() > 0) {
        accept_webdav(ctx, webdav_target);
    }
    log_info("tarnnas target = %s\n", tarnnas_target);
    log_info("webdav target = %s\n", webdav_target);
}

}  // namespace

void services_stop()
{
    for (const auto& [stop, start] : FILE_SERVICES) {
        exec_cmd(stop, 1);
    }
}

// In the order of stopping, not the reverse: none of them needs another.
void services_start()
{
    for (const auto& [stop, start] : FILE_SERVICES) {
        exec_cmd(start, 1);
    }
}

int firewall_webdav_check()
{
    const time_t now = time(nullptr);
    if (now - rule.t_firewall <= FIREWALL_PAUSE_SECONDS) {
        return 0;
    }
    rule.t_firewall = now;
    uci_context* ctx = uci2_new();
    if (ctx == nullptr) {
        log_err("err!\n");
        return 1;
    }
    apply_webdav_rule(ctx);
    uci2_free(ctx);
    return 0;
}

void firewall_rule_reset()
{
    rule = {};
}
