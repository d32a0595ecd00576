#include "main/single_instance.h"

#include <unistd.h>

#include <string>

#include "support_disk/disk_world.h"
#include "util/paths.h"

using support::capture_stdout;
using support::contains;
using support::read_file;
using support::write_file;

namespace {

class SingleInstance : public support_disk::disk_world {
protected:
    // What pgrep prints.
    void list_pids(const std::string& text)
    {
        write_file("/run/pgrep_output", text);
        stubs.add("pgrep", "cat /run/pgrep_output");
    }
};

}  // namespace

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
