#include "util/device.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/files.h"
#include "support/stubs.h"
#include "support/text.h"

using support::contains;
using support::log_of;
using support::write_file;

namespace {

using lines = std::vector<std::string>;

// The platform library's answers, as its stand-in reads them.
class Device : public testing::Test {
protected:
    Device() { clear(); }
    ~Device() override { clear(); }

    const std::string model_file = "/tmp/sysinfo/model";
    const std::string sdcard_file = "/etc/tarn_utils/sdcard_point";

private:
    void clear() const
    {
        support::remove_all(model_file);
        support::remove_all(sdcard_file);
    }
};

}  // namespace

TEST_F(Device, the_model_is_cut_to_its_buffer_and_the_rest_is_zero)
{
    struct {
        const char* model;
        std::string expected;
    } cases[] = {
        {"AB", "AB"},
        {"TARN-7", "TARN-7"},
        {"TARN-70", "TARN-70"},
        {"TARN-700", "TARN-70"},
        {"TARN-7000 rev B", "TARN-70"},
    };
    for (auto& c : cases) {
        write_file(model_file, std::string(c.model) + "\n");
        char out[9] = "########";
        std::string log = log_of([&] { EXPECT_EQ(device_get_model(out, 8), 0); });
        EXPECT_EQ(log, "device.cpp(N)get model = " + c.expected + "\n");
        c.expected.resize(8, '\0');
        EXPECT_EQ(std::string(out, 8), c.expected);
    }
}

TEST_F(Device, without_a_model_the_query_fails)
{
    char out[8] = "old";
    std::string log = log_of([&] { EXPECT_EQ(device_get_model(out, sizeof(out)), 1); });
    EXPECT_EQ(log, "ERROR[device.cpp:N]err!\n");
}

TEST_F(Device, every_model_passes_the_check)
{
    log_of([] { EXPECT_EQ(device_model_check(), 1); });
    write_file(model_file, "a model text of more than thirty-two characters\n");
    std::string log = log_of([] { EXPECT_EQ(device_model_check(), 1); });
    EXPECT_EQ(log, "device.cpp(N)get model = a model text of more than thirt\n");
}

TEST_F(Device, the_sdcard_point_is_the_librarys_text)
{
    write_file(sdcard_file, "1-1.4\n");
    char out[16];
    memset(out, '#', sizeof(out));
    std::string log = log_of([&] { EXPECT_EQ(device_get_sdcard_point(out, sizeof(out)), 0); });
    EXPECT_EQ(std::string(out, 16), std::string("1-1.4") + std::string(11, '\0'));
    EXPECT_EQ(log, "device.cpp(N)get sdcard point = 1-1.4\n");
}

TEST_F(Device, a_router_without_an_sdcard_slot_gives_an_empty_point)
{
    char out[16];
    memset(out, '#', sizeof(out));
    std::string log = log_of([&] { EXPECT_EQ(device_get_sdcard_point(out, sizeof(out)), 0); });
    EXPECT_EQ(std::string(out, 16), std::string(16, '\0'));
    EXPECT_EQ(log, "device.cpp(N)get sdcard point = \n");
}

TEST_F(Device, a_missing_buffer_for_the_sdcard_point_fails)
{
    std::string log = log_of([] { EXPECT_EQ(device_get_sdcard_point(nullptr, 16), 1); });
    EXPECT_EQ(log, "ERROR[device.cpp:N]err!\n");
}

TEST(Firewall, is_reloaded_by_its_init_script)
{
    support::stub_programs stubs;
    stubs.add_at("/etc/init.d/firewall", "echo noise >&2; exit 1");
    std::string errors = support::capture_stderr([] {
        std::string log = log_of([] { EXPECT_EQ(firewall_reload(), 0); });
        EXPECT_TRUE(contains(log, "exec cmd = /etc/init.d/firewall reload 2>/dev/null\n")) << log;
    });
    EXPECT_EQ(stubs.calls(), lines{"/etc/init.d/firewall reload"});
    EXPECT_EQ(errors, "");
}

TEST(Firewall, a_missing_init_script_is_no_failure)
{
    support::remove_all("/etc/init.d/firewall");
    log_of([] { EXPECT_EQ(firewall_reload(), 0); });
}

TEST(SambaShare, is_pointed_at_the_mount_base_and_samba_restarted)
{
    support::stub_programs stubs;
    stubs.add("uci", "exit 1");
    stubs.add_at("/etc/init.d/samba", "exit 1");
    std::string log = log_of([] { EXPECT_EQ(samba_share_mountd(), 0); });
    EXPECT_EQ(stubs.calls(), (lines{"uci set samba.@sambashare[-1].path=/tmp/mountd", "uci commit",
                                    "/etc/init.d/samba restart"}));
    EXPECT_TRUE(contains(log, "exec cmd = uci set samba.@sambashare[-1].path=\"/tmp/mountd\"\n"))
        << log;
    EXPECT_TRUE(contains(log, "exec cmd = uci commit\n")) << log;
    EXPECT_TRUE(contains(log, "exec cmd = /etc/init.d/samba restart\n")) << log;
}

TEST(InitHook, does_nothing)
{
    EXPECT_EQ(log_of([] { EXPECT_EQ(init_hook(), 0); }), "");
}
