#include "manager/services.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "support/capture.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/text.h"
#include "util/paths.h"

using support::capture_stdout;
using support::contains;
using support::fake_clock;
using support::read_file;
using support::the_clock;
using support::write_file;

namespace {

constexpr char RELOAD[] = "/etc/init.d/firewall reload";

class FirewallRule : public support::disk_world {
protected:
    FirewallRule()
    {
        support::remove_all("/tmp/.uci");
        stubs.add_at("/etc/init.d/firewall");
        set_ports("0", "0");
        set_target("DROP");
        write_file(DISK_NUM_FILE, "1");
    }

    static void set_ports(const std::string& tarnser, const std::string& webdav)
    {
        write_file("/etc/config/nas", "config nas 'conf'\n\toption tarnser_port_set '" + tarnser +
                                          "'\n\toption webdav_port_set '" + webdav + "'\n");
    }

    static void set_target(const std::string& target)
    {
        write_file("/etc/config/firewall",
                   "config rule 'webdav_wan'\n\toption target '" + target + "'\n");
    }

    static bool is_accepted()
    {
        return contains(read_file("/etc/config/firewall"), "option target 'ACCEPT'");
    }

    // One call, well after the one before.
    static void check_later()
    {
        the_clock.now += 100;
        EXPECT_EQ(firewall_webdav_check(), 0);
    }

    fake_clock clock{1000000};
};

class Services : public support::disk_world {};

}  // namespace

TEST_F(Services, stopping_and_starting_run_the_four_scripts_in_the_same_order)
{
    services_stop();
    services_start();
    EXPECT_EQ(stubs.calls(),
              (std::vector<std::string>{
                  "/etc/init.d/samba4 stop", "/etc/init.d/nas_samba3 stop",
                  "/etc/init.d/tarn_nas_sys_dl stop", "/etc/init.d/tarn_nas_sys_up stop",
                  "/etc/init.d/samba4 start", "/etc/init.d/nas_samba3 start",
                  "/etc/init.d/tarn_nas_sys_dl start", "/etc/init.d/tarn_nas_sys_up start"}));
}

TEST_F(Services, each_command_is_waited_for)
{
    stubs.add_at("/etc/init.d/samba4", "sleep 0.3; echo done >/run/samba_done");
    stubs.add_at("/etc/init.d/nas_samba3", "cat /run/samba_done >/run/seen");
    services_stop();
    EXPECT_EQ(read_file("/run/seen"), "done\n");
    support::remove_all("/run/samba_done");
    support::remove_all("/run/seen");
}

TEST_F(Services, missing_and_failing_scripts_do_not_end_the_row)
{
    stubs.add_at("/etc/init.d/samba4", "exit 7");
    support::remove_all("/etc/init.d/nas_samba3");
    services_start();
    EXPECT_EQ(stubs.calls().size(), 3U);
}

TEST_F(FirewallRule, a_disk_present_turns_drop_into_accept_and_reloads_once_in_the_process)
{
    const std::string log = capture_stdout([&] {
        check_later();
        EXPECT_TRUE(is_accepted()) << read_file("/etc/config/firewall");
        EXPECT_EQ(times_called(RELOAD), 1);
        set_target("DROP");
        check_later();
        EXPECT_FALSE(is_accepted()) << "the rule fires at most once";
        EXPECT_EQ(times_called(RELOAD), 1);
    });
    EXPECT_TRUE(contains(log, "tarnnas target = \n"));
    EXPECT_TRUE(contains(log, "webdav target = DROP\n"));
}

TEST_F(FirewallRule, without_a_disk_it_is_not_touched)
{
    for (const char* count : {"0", "", "none", "-1"}) {
        write_file(DISK_NUM_FILE, count);
        check_later();
    }
    support::remove_all(DISK_NUM_FILE);
    check_later();
    EXPECT_FALSE(is_accepted());
    EXPECT_EQ(times_called(RELOAD), 0);
    write_file(DISK_NUM_FILE, "2");
    check_later();
    EXPECT_TRUE(is_accepted()) << "and is opened once a disk came";
}

TEST_F(FirewallRule, a_target_that_merely_begins_with_drop_counts_as_drop)
{
    set_target("DROPPED");
    check_later();
    EXPECT_TRUE(is_accepted());
}

TEST_F(FirewallRule, other_targets_are_left_alone_and_looked_at_again)
{
    for (const char* target : {"REJECT", "drop", "DRO", " DROP"}) {
        set_target(target);
        check_later();
        EXPECT_FALSE(is_accepted()) << target;
    }
    set_target("DROP");
    check_later();
    EXPECT_TRUE(is_accepted());
}

TEST_F(FirewallRule, a_second_call_within_nine_seconds_does_nothing)
{
    set_target("REJECT");
    check_later();
    set_target("DROP");
    the_clock.now += 9;
    EXPECT_EQ(firewall_webdav_check(), 0);
    EXPECT_FALSE(is_accepted());
    the_clock.now += 1;
    EXPECT_EQ(firewall_webdav_check(), 0);
    EXPECT_TRUE(is_accepted());
}

TEST_F(FirewallRule, either_port_option_of_the_user_keeps_the_rule_away)
{
    set_ports("1", "0");
    check_later();
    EXPECT_FALSE(is_accepted());
    set_ports("0", "0");
    check_later();
    EXPECT_FALSE(is_accepted()) << "what was set once stays set in the process";
    firewall_rule_reset();
    const std::string log = capture_stdout([&] {
        set_ports("0", "1x");
        check_later();
        EXPECT_FALSE(is_accepted()) << "only the first character counts";
    });
    EXPECT_FALSE(contains(log, "tarnnas target")) << "it ends before the two lines";
}

TEST_F(FirewallRule, missing_configuration_counts_as_not_set)
{
    support::remove_all("/etc/config/nas");
    check_later();
    EXPECT_TRUE(is_accepted());
    firewall_rule_reset();
    support::remove_all("/etc/config/firewall");
    check_later();
    EXPECT_EQ(times_called(RELOAD), 1) << "only the call before";
}
