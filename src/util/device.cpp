#include "util/device.h"

#include <tarn_utils.h>

#include <cstring>

#include "log/log.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t MODEL_SIZE = 32;

}  // namespace

int device_get_model(char* out, int size)
{
    const char* model = tarn_get_model();
    if (out == nullptr || model == nullptr) {
        log_err("err!\n");
        return 1;
    }
    text_format({out, static_cast<size_t>(size)}, "%s", model);
    log_info("get model = %s\n", out);
    return 0;
}

int device_model_check()
{
    char model[MODEL_SIZE];
    device_get_model(model, sizeof(model));
    return 1;
}

int device_get_sdcard_point(char* out, int size)
{
    if (out == nullptr) {
        log_err("err!\n");
        return 1;
    }
    memset(out, 0, static_cast<size_t>(size));
    get_device_microsd(out);
    log_info("get sdcard point = %s\n", out);
    return 0;
}

int firewall_reload()
{
    exec_cmd(RELOAD_FIREWALL, 1);
    return 0;
}

int samba_share_mountd()
{
    char command[LONG_COMMAND_SIZE];
    if (command_format(command, "uci set samba.@sambashare[-1].path=\"%s\"", {MOUNT_BASE})) {
        exec_cmd(command, 1);
    }
    exec_cmd("uci commit", 1);
    exec_cmd(RESTART_SAMBA, 1);
    return 0;
}

int init_hook()
{
    return 0;
}
