#include "util/process.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/files.h"
#include "support/stubs.h"
#include "support/text.h"

using support::log_of;

namespace {

class Process : public testing::Test {
protected:
    Process() { support::remove_all("/tmp/pid"); }
    ~Process() override { support::remove_all("/tmp/pid"); }

    support::stub_programs stubs;
};

}  // namespace

TEST_F(Process, the_first_pid_that_pidof_reports_is_taken)
{
    stubs.add("pidof", "echo 4711 12 13");
    std::string log = log_of([] { EXPECT_EQ(proc_pid_of("tarn_nas_sys"), 4711); });
    EXPECT_EQ(stubs.calls(), std::vector<std::string>{"pidof tarn_nas_sys"});
    EXPECT_TRUE(support::contains(log, "exec cmd = pidof tarn_nas_sys > /tmp/pid\n")) << log;
    EXPECT_TRUE(support::contains(log, "process.cpp(N)get app = tarn_nas_sys, pid = 4711 12 13\n"))
        << log;
}

TEST_F(Process, no_pid_is_zero)
{
    stubs.add("pidof", "exit 1");
    std::string log = log_of([] { EXPECT_EQ(proc_pid_of("nobody"), 0); });
    EXPECT_FALSE(support::contains(log, "get app")) << log;
}

TEST_F(Process, a_missing_pidof_is_zero)
{
    support::capture_stderr([] {
        setenv("PATH", "/nowhere", 1);
        log_of([] { EXPECT_EQ(proc_pid_of("nobody"), 0); });
    });
}

TEST_F(Process, an_answer_file_that_is_missing_is_zero)
{
    support::write_file("/tmp/pid", "99\n");
    stubs.add("pidof", "rm -f /tmp/pid");
    log_of([] { EXPECT_EQ(proc_pid_of("nobody"), 0); });
}

TEST_F(Process, the_old_answer_is_deleted_first)
{
    support::write_file("/tmp/pid", "99\n");
    stubs.add("pidof");
    std::string log = log_of([] { proc_pid_of("nobody"); });
    EXPECT_FALSE(support::contains(log, "del err!")) << log;
    support::remove_all("/tmp/pid");
    log = log_of([] { proc_pid_of("nobody"); });
    EXPECT_TRUE(support::contains(log, "Warning[file.cpp:N]del err! not exist file = /tmp/pid\n"))
        << log;
}

TEST_F(Process, a_command_of_more_than_127_characters_is_cut)
{
    stubs.add("pidof", "echo 5");
    // "pidof ", " > " and "/tmp/pid" are 17 characters.
    log_of([] { EXPECT_EQ(proc_pid_of(std::string(109, 'a').c_str()), 5); });
    log_of([] { EXPECT_EQ(proc_pid_of(std::string(110, 'a').c_str()), 5); });
    support::remove_all("/tmp/pi");
    log_of([] { EXPECT_EQ(proc_pid_of(std::string(111, 'a').c_str()), 0); });
    EXPECT_EQ(support::read_file("/tmp/pi"), "5\n");
    support::remove_all("/tmp/pi");
}

TEST_F(Process, exists_when_it_has_a_pid)
{
    stubs.add("pidof", "echo 5");
    std::string log = log_of([] { EXPECT_EQ(proc_exists("tarn_nas_sys"), 1); });
    EXPECT_FALSE(support::contains(log, "proc not exist")) << log;
}

TEST_F(Process, without_a_pid_its_absence_is_a_warning)
{
    stubs.add("pidof", "exit 1");
    std::string log = log_of([] { EXPECT_EQ(proc_exists("tarn_nas_sys"), 0); });
    EXPECT_TRUE(
        support::contains(log, "Warning[process.cpp:N]===> proc not exist, name = tarn_nas_sys\n"))
        << log;
}

TEST_F(Process, the_real_pidof_finds_a_running_program)
{
    pid_t child = fork();
    if (child == 0) {
        execl("/bin/sleep", "sleep_for_this_test", "20", nullptr);
        _exit(1);
    }
    int found = 0;
    for (int i = 0; i < 50 && found == 0; i++) {
        usleep(20000);
        log_of([&] { found = proc_pid_of("sleep_for_this_test"); });
    }
    EXPECT_EQ(found, child);
    kill(child, SIGKILL);
    waitpid(child, nullptr, 0);
}
