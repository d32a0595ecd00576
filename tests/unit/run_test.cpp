#include "main/run.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include "log/log.h"
#include "main/signals.h"
#include "manager/manager.h"
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

class Environment : public support::disk_world {
protected:
    // A running restart leaves this file, with what it saw of the pid file.
    void add_restart_script()
    {
        support::remove_all("/run/restarted");
        stubs.add_at("/etc/init.d/tarn_nas_diskmanager",
                     "if [ -e /tmp/tarn_nas/disk_manager_pid ]; then seen=there; else seen=gone; "
                     "fi\necho $seen >/run/restarted.new && mv /run/restarted.new /run/restarted");
    }

    static std::string wait_for_restart()
    {
        for (int i = 0; i < 500 && !std::filesystem::exists("/run/restarted"); ++i) {
            usleep(10000);
        }
        return read_file("/run/restarted");
    }

    static int log_file_count()
    {
        int count = 0;
        if (std::filesystem::exists("/tmp/log")) {
            for (const auto& entry : std::filesystem::directory_iterator("/tmp/log")) {
                count += contains(entry.path(), "/tmp/log/disk_log-") ? 1 : 0;
            }
        }
        return count;
    }
};

// Both kinds of run.
struct way_to_run {
    const char* name;
    int (*run)();
    int log_files;
};

constexpr way_to_run WAYS[] = {
    {"ordinary", run_daemon, 1},
    {"block input", [] { return run_block_input_mode(0, nullptr); }, 0},
};

class Run : public Environment {
protected:
    Run() : open_before(open_files()) { stubs.add("pgrep"); }

    // One cycle of the loop, which is woken by a message; then running is cleared.
    void run_one_cycle(const way_to_run& way)
    {
        fake_clock clock(1000000);
        the_clock.on_look = [looks = 0](int) mutable {
            // Only the loop looks at the clock while the pipes are there.
            if (!std::filesystem::exists(PIPE_REMOVE)) {
                return;
            }
            send("#heart_beat\n");
            running = ++looks < 3 ? 1 : 0;
        };
        EXPECT_EQ(way.run(), 0) << way.name;
    }

    static void send(const std::string& message)
    {
        const int fd = open(PIPE_ADD_REMOVE, O_WRONLY | O_NONBLOCK | O_CLOEXEC);
        EXPECT_GE(fd, 0);
        EXPECT_EQ(write(fd, message.data(), message.size()), static_cast<ssize_t>(message.size()));
        close(fd);
    }

    // Open descriptors of log files and pipes.
    static int open_files()
    {
        int count = 0;
        for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
            std::error_code gone;
            const std::string target = std::filesystem::read_symlink(entry.path(), gone);
            count += contains(target, "/tmp/log/") || contains(target, "/tmp/tarn_nas/") ? 1 : 0;
        }
        return count;
    }

    [[nodiscard]] int left_open() const { return open_files() - open_before; }

private:
    int open_before;
};

class SingleInstance : public support::disk_world {
protected:
    // What pgrep prints.
    void list_pids(const std::string& text)
    {
        write_file("/run/pgrep_output", text);
        stubs.add("pgrep", "cat /run/pgrep_output");
    }
};

}  // namespace

TEST_F(Environment, the_preparation_makes_pid_file_and_directories_and_takes_the_hook_away)
{
    write_file("/etc/hotplug.d/block/10-mount", "hook");
    write_file("/etc/hotplug.d/block/20-other", "hook");
    support::remove_all("/tmp/tarn_nas");
    support::make_dir("/tmp/log");
    EXPECT_EQ(init_environment(), 0);
    EXPECT_EQ(read_file("/tmp/tarn_nas//disk_manager_pid"), std::to_string(getpid()));
    log_file_close();
    EXPECT_TRUE(std::filesystem::is_directory("/tmp/mountd"));
    EXPECT_TRUE(std::filesystem::is_directory("/etc/config/tarn_nas"));
    EXPECT_FALSE(std::filesystem::exists("/etc/hotplug.d/block/10-mount"));
    EXPECT_TRUE(std::filesystem::exists("/etc/hotplug.d/block/20-other"));
    EXPECT_EQ(log_file_count(), 1);
}

TEST_F(Environment, what_an_earlier_run_left_mounted_is_unmounted_by_force)
{
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdb1", "/mnt");
    init_environment();
    log_file_close();
    EXPECT_EQ(actions(), (std::vector<std::string>{"umount -f /dev/sda1",
                                                   "umount -f /tmp/mountd/disk1_part1"}));
}

TEST_F(Environment, the_preparation_of_block_input_mode_does_no_more_than_its_own_part)
{
    write_file("/etc/hotplug.d/block/10-mount", "hook");
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    init_block_input_environment();
    EXPECT_EQ(read_file(PID_FILE), std::to_string(getpid()));
    EXPECT_TRUE(std::filesystem::is_directory("/tmp/mountd"));
    EXPECT_FALSE(std::filesystem::exists("/etc/config/tarn_nas"));
    EXPECT_TRUE(std::filesystem::exists("/etc/hotplug.d/block/10-mount"));
    EXPECT_EQ(log_file_count(), 0);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Environment, a_restart_runs_the_init_script_and_does_not_wait_for_it)
{
    stubs.add_at("/etc/init.d/tarn_nas_diskmanager", "sleep 2; echo done >/run/restarted");
    support::remove_all("/run/restarted");
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(restart_self(), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(2));
    EXPECT_EQ(wait_for_restart(), "done\n");
    EXPECT_EQ(stubs.calls(), std::vector<std::string>{"/etc/init.d/tarn_nas_diskmanager restart"});
}

TEST_F(Run, both_kinds_loop_leave_no_pid_file_and_close_all_that_they_opened)
{
    support::make_dir("/tmp/log");
    add_restart_script();
    for (const way_to_run& way : WAYS) {
        manager_life_reset();
        support::remove_all("/tmp/log");
        support::make_dir("/tmp/log");
        const std::string log = capture_stdout([&] { run_one_cycle(way); });
        EXPECT_TRUE(contains(log, "EVENT_DISK_HEART_BEAT")) << way.name << log;
        EXPECT_FALSE(std::filesystem::exists(PID_FILE)) << way.name;
        EXPECT_TRUE(std::filesystem::exists(PIPE_ADD_REMOVE)) << way.name;
        EXPECT_EQ(log_file_count(), way.log_files) << way.name;
        EXPECT_EQ(left_open(), 0) << way.name;
        EXPECT_FALSE(std::filesystem::exists("/run/restarted")) << way.name;
    }
}

TEST_F(Run, both_kinds_log_the_signals_of_their_last_work)
{
    for (const way_to_run& way : WAYS) {
        manager_life_reset();
        signals_reset();
        const std::string log = capture_stdout([&] {
            fake_clock clock(1000000);
            the_clock.on_look = [](int) {
                raise(SIGINT);
                running = 0;
            };
            EXPECT_EQ(way.run(), 0) << way.name;
        });
        EXPECT_TRUE(contains(log, "get sig = SIGINT, c = 0\n")) << way.name << log;
    }
}

TEST_F(Run, only_the_ordinary_kind_unmounts_what_is_left_and_closes_a_log_file)
{
    support::make_dir("/tmp/log");
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    running = 0;
    ASSERT_EQ(log_file_open(), 0);
    EXPECT_EQ(run_block_input_mode(0, nullptr), 0);
    EXPECT_EQ(times_called("umount -f /dev/sda1"), 0);
    EXPECT_EQ(left_open(), 1);
    log_file_close();

    running = 0;
    EXPECT_EQ(run_daemon(), 0);
    EXPECT_EQ(times_called("umount -f /dev/sda1"), 1);
    EXPECT_EQ(left_open(), 0);
}

TEST_F(Run, pipes_that_cannot_be_made_end_both_kinds_with_0_and_without_a_scan)
{
    for (const way_to_run& way : WAYS) {
        support::remove_all("/tmp/tarn_nas");
        write_file("/tmp/tarn_nas", "in the way");
        const std::string log = capture_stdout([&] { EXPECT_EQ(way.run(), 0) << way.name; });
        EXPECT_FALSE(contains(log, "scan path")) << way.name << log;
    }
    support::remove_all("/tmp/tarn_nas");
}

TEST_F(Run, a_requested_restart_of_either_kind_runs_after_the_pid_file_is_gone)
{
    for (const way_to_run& way : WAYS) {
        add_restart_script();
        running = 0;
        restart_requested = 1;
        EXPECT_EQ(way.run(), 0) << way.name;
        EXPECT_EQ(wait_for_restart(), "gone\n") << way.name;
    }
}

TEST_F(Run, either_kind_ends_with_1_beside_another_instance_and_creates_nothing)
{
    for (const way_to_run& way : WAYS) {
        write_file(PID_FILE, "4123");
        stubs.add("pgrep", "echo 4123");
        EXPECT_EQ(way.run(), 1) << way.name;
        EXPECT_EQ(read_file(PID_FILE), "4123");
        EXPECT_FALSE(std::filesystem::exists(PIPE_ADD_REMOVE)) << way.name;
        EXPECT_FALSE(std::filesystem::exists("/tmp/mountd")) << way.name;
        EXPECT_FALSE(std::filesystem::exists("/etc/config/tarn_nas")) << way.name;
    }
}

TEST_F(Environment, block_input_mode_takes_over_what_is_mounted_and_leaves_no_pid_file)
{
    plug_disk("sda", R"(PTTYPE="dos")", 9000);
    plug_part("sda", "sda1", R"(UUID="U-1" TYPE="ext4")", 8000);
    add_mount("/dev/sda1", "/tmp/mountd/disk4_part2");
    stubs.add("pgrep");
    add_restart_script();
    const std::string log = capture_stdout([] {
        running = 0;
        EXPECT_EQ(run_block_input_mode(0, nullptr), 0);
    });
    EXPECT_TRUE(contains(log, "disk manage run block input\n"));
    EXPECT_TRUE(contains(log, "===> is already mountd\n"));
    EXPECT_TRUE(actions().empty()) << "nothing is mounted again or unmounted";
    EXPECT_TRUE(contains(read_file("/tmp/tarn_nas/disk.json"), "disk4_part2"));
    EXPECT_FALSE(std::filesystem::exists(PID_FILE));
    EXPECT_FALSE(contains(log, "manager work again!"));
    EXPECT_FALSE(std::filesystem::exists("/run/restarted"));
}

TEST_F(SingleInstance, without_a_pid_file_nobody_is_asked)
{
    list_pids("1\n");
    const std::string log = capture_stdout([] { EXPECT_EQ(check_single_instance(), 0); });
    EXPECT_TRUE(contains(log, "===> pid Not exist, file = /tmp/tarn_nas//disk_manager_pid\n"));
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(SingleInstance, a_listed_pid_is_another_instance_and_its_file_stays)
{
    write_file(PID_FILE, "4123");
    list_pids("4000\n4123\n");
    const std::string log = capture_stdout([] { EXPECT_EQ(check_single_instance(), 1); });
    EXPECT_TRUE(contains(log, "pid sets = 4000\n4123\n\n")) << log;
    EXPECT_TRUE(contains(log, "cur pid = 4123\n"));
    EXPECT_TRUE(contains(log, "===> pid exist, file = /tmp/tarn_nas//disk_manager_pid\n"));
    EXPECT_EQ(read_file(PID_FILE), "4123");
    EXPECT_EQ(stubs.calls(), std::vector<std::string>{"pgrep -f tarn_nas_diskmanager"});
}

TEST_F(SingleInstance, a_pid_file_in_somebody_elses_directory_counts_for_nothing)
{
    write_file(PID_FILE, "1");
    ASSERT_EQ(chown("/tmp/tarn_nas", 4711, 4711), 0);
    list_pids("1\n");
    EXPECT_EQ(check_single_instance(), 0);
    EXPECT_FALSE(std::filesystem::exists("/tmp/tarn_nas"));
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(SingleInstance, a_stale_pid_file_is_deleted_and_start_up_continues)
{
    write_file(PID_FILE, "999");
    list_pids("4000\n4123\n");
    const std::string log = capture_stdout([] { EXPECT_EQ(check_single_instance(), 0); });
    EXPECT_TRUE(contains(log, "===> pid Not exist, file = "));
    EXPECT_FALSE(std::filesystem::exists(PID_FILE));
}

TEST_F(SingleInstance, a_pid_file_holding_1_is_live_whenever_a_listed_pid_contains_that_digit)
{
    write_file(PID_FILE, "1");
    list_pids("4123\n");
    EXPECT_EQ(check_single_instance(), 1);
    list_pids("423\n");
    EXPECT_EQ(check_single_instance(), 0);
}

TEST_F(SingleInstance, the_text_of_the_file_is_found_inside_a_longer_pid)
{
    write_file(PID_FILE, "12");
    list_pids("4123\n");
    EXPECT_EQ(check_single_instance(), 1);
}

TEST_F(SingleInstance, the_scratch_file_is_deleted_before_and_after)
{
    write_file(PID_FILE, "77");
    write_file(SCRATCH_PGREP, "77\n");
    stubs.add("pgrep", "exit 1");
    EXPECT_EQ(check_single_instance(), 0);
    EXPECT_FALSE(std::filesystem::exists(SCRATCH_PGREP));
}

TEST_F(SingleInstance, only_the_first_128_bytes_of_the_list_and_32_of_the_file_are_looked_at)
{
    write_file(PID_FILE, "77777");
    list_pids(std::string(128, '1') + "77777\n");
    EXPECT_EQ(check_single_instance(), 0);

    write_file(PID_FILE, std::string(32, '2') + "999");
    list_pids(std::string(32, '2') + "\n");
    EXPECT_EQ(check_single_instance(), 1);
}

TEST_F(SingleInstance, the_pid_file_holds_the_decimal_pid_and_nothing_else)
{
    support::remove_all("/tmp/tarn_nas");
    write_pid_file();
    EXPECT_EQ(read_file("/tmp/tarn_nas//disk_manager_pid"), std::to_string(getpid()));
    write_file(PID_FILE, "a longer text that was here before");
    write_pid_file();
    EXPECT_EQ(read_file(PID_FILE), std::to_string(getpid()));
}
