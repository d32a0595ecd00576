#include "util/exec.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <string>

#include "support/capture.h"
#include "support/child.h"
#include "support/files.h"
#include "support/text.h"
#include "util/pause.h"

using support::capture_stderr;
using support::capture_stdout;
using support::count_of;
using support::in_child;

namespace {

constexpr const char* KILLS_ITSELF = "kill -KILL $$";
constexpr uid_t NOBODY = 65534;

// How often a command is tried that fails every time.
int tries_for(int attempts)
{
    int tries = 0;
    capture_stderr([&] {
        std::string text = capture_stdout(
            [&] { EXPECT_EQ(exec_cmd(KILLS_ITSELF, attempts, "caller.cpp", 1), 1); });
        tries = count_of(text, "ret = ");
        EXPECT_EQ(support::lines_of(text).size(), 2U * static_cast<size_t>(tries));
    });
    return tries;
}

volatile sig_atomic_t children_ended = 0;

void count_child(int)
{
    children_ended = children_ended + 1;
}

}  // namespace

TEST(ExecCmd, attempts_outside_one_to_nine_mean_five)
{
    for (int attempts : {0, 10, -3, 11, 1000}) {
        EXPECT_EQ(tries_for(attempts), 5) << attempts;
    }
}

TEST(ExecCmd, attempts_from_one_to_nine_are_taken)
{
    for (int attempts : {1, 2, 5, 8, 9}) {
        EXPECT_EQ(tries_for(attempts), attempts);
    }
}

TEST(ExecCmd, prints_the_command_with_the_callers_file_and_line)
{
    std::string text =
        capture_stdout([] { EXPECT_EQ(exec_cmd("echo done", 1, "src/disk/mount.cpp", 77), 0); });
    EXPECT_EQ(text, "src/disk/mount.cpp(77)exec cmd = echo done\ndone\n");
}

TEST(ExecCmd, takes_file_and_line_of_its_caller_by_itself)
{
    const std::string text = support::log_of([] { exec_cmd("true", 1); });
    EXPECT_TRUE(text.ends_with("exec_test.cpp(N)exec cmd = true\n")) << text;
}

TEST(ExecCmd, a_percent_sign_in_a_command_is_printed_as_it_stands)
{
    EXPECT_EQ(capture_stdout([] { exec_cmd("true %s%d", 1, "c.cpp", 1); }),
              "c.cpp(1)exec cmd = true %s%d\n");
}

TEST(ExecCmd, an_exit_code_is_no_failure)
{
    for (const char* command :
         {"false", "exit 1", "exit 127", "exit 255", "no_such_program_here"}) {
        capture_stderr([&] {
            std::string text =
                capture_stdout([&] { EXPECT_EQ(exec_cmd(command, 1, "c.cpp", 1), 0) << command; });
            EXPECT_EQ(count_of(text, "exec cmd"), 1) << command;
        });
    }
}

TEST(ExecCmd, a_command_killed_by_a_signal_fails_with_two_lines_per_attempt)
{
    std::string errors;
    std::string text = capture_stdout([&] {
        errors = capture_stderr([] { EXPECT_EQ(exec_cmd(KILLS_ITSELF, 2, "c.cpp", 4), 1); });
    });
    const std::string pair = "c.cpp(4)exec cmd = kill -KILL $$\n"
                             "c.cpp(4)exec cmd = kill -KILL $$, ret = 9\n";
    EXPECT_EQ(text, pair + pair);
    EXPECT_EQ(count_of(errors, "err:: "), 2) << errors;
}

TEST(ExecCmd, stops_at_the_first_success)
{
    support::remove_all("/run/tried");
    const char* fails_once = "test -e /run/tried || { touch /run/tried; kill -KILL $$; }";
    capture_stderr([&] {
        std::string text = capture_stdout([&] { EXPECT_EQ(exec_cmd(fails_once, 9, "c", 1), 0); });
        EXPECT_EQ(count_of(text, "exec cmd"), 3);
        EXPECT_EQ(count_of(text, ", ret = 9\n"), 1);
    });
    support::remove_all("/run/tried");
}

TEST(ExecCmd, a_command_that_cannot_be_started_fails)
{
    constexpr int NOT_TOLD = 3;
    int result = 0;
    std::string text = capture_stdout([&] {
        capture_stderr([&] {
            result = in_child([] {
                // The limit does not hold for root.
                const rlimit none{0, 0};
                if (setrlimit(RLIMIT_NPROC, &none) != 0 || setuid(NOBODY) != 0) {
                    return 2;
                }
                return system("true") == -1 ? exec_cmd("true", 3, "c.cpp", 1) : NOT_TOLD;
            });
        });
    });
    if (result == NOT_TOLD) {
        GTEST_SKIP() << "this C library reports a shell that cannot be started as an exit code";
    }
    EXPECT_EQ(result, 1);
    EXPECT_EQ(count_of(text, "c.cpp(1)exec cmd = true, ret = -1\n"), 3) << text;
}

TEST(ExecCmd, its_output_stands_before_that_of_the_command)
{
    std::string text = capture_stdout([] {
        printf("earlier\n");
        exec_cmd("echo now", 1, "c.cpp", 1);
    });
    EXPECT_EQ(text, "earlier\nc.cpp(1)exec cmd = echo now\nnow\n");
}

TEST(RunSystem, gives_the_raw_status)
{
    EXPECT_EQ(run_system("true"), 0);
    EXPECT_EQ(run_system("exit 3"), 3 << 8);
    EXPECT_EQ(run_system("kill -TERM $$"), SIGTERM);
}

TEST(RunSystem, works_also_while_children_are_ignored)
{
    EXPECT_EQ(in_child([] {
                  signal(SIGCHLD, SIG_IGN);
                  if (run_system("exit 3") != 3 << 8) {
                      return 1;
                  }
                  return signal(SIGCHLD, SIG_DFL) == SIG_IGN ? 0 : 2;
              }),
              0);
}

TEST(RunSystem, holds_the_handler_back_and_puts_it_in_again)
{
    EXPECT_EQ(in_child([] {
                  signal(SIGCHLD, count_child);
                  run_system("true");
                  run_system("kill -KILL $$");
                  if (children_ended != 0) {
                      return 1;
                  }
                  return signal(SIGCHLD, SIG_DFL) == count_child ? 0 : 2;
              }),
              0);
}

TEST(RunSystem, puts_the_handler_back_with_its_flags_and_mask)
{
    EXPECT_EQ(in_child([] {
                  struct sigaction ours {};
                  ours.sa_sigaction = [](int, siginfo_t*, void*) {};
                  ours.sa_flags = SA_SIGINFO | SA_RESTART;
                  sigaddset(&ours.sa_mask, SIGHUP);
                  sigaction(SIGCHLD, &ours, nullptr);
                  run_system("true");
                  struct sigaction now {};
                  sigaction(SIGCHLD, nullptr, &now);
                  const int wanted = SA_SIGINFO | SA_RESTART;
                  if (now.sa_sigaction != ours.sa_sigaction || (now.sa_flags & wanted) != wanted) {
                      return 1;
                  }
                  return sigismember(&now.sa_mask, SIGHUP) == 1 ? 0 : 2;
              }),
              0);
}

TEST(Pause, lasts_its_seconds_also_when_signals_arrive)
{
    EXPECT_EQ(in_child([] {
                  struct sigaction action {};
                  action.sa_handler = count_child;
                  sigaction(SIGALRM, &action, nullptr);
                  const timespec before = [] {
                      timespec now{};
                      clock_gettime(CLOCK_MONOTONIC, &now);
                      return now;
                  }();
                  ualarm(100000, 100000);
                  pause_seconds(1);
                  ualarm(0, 0);
                  timespec after{};
                  clock_gettime(CLOCK_MONOTONIC, &after);
                  const double passed = static_cast<double>(after.tv_sec - before.tv_sec) +
                                        static_cast<double>(after.tv_nsec - before.tv_nsec) / 1e9;
                  if (children_ended < 5) {
                      return 1;
                  }
                  return passed >= 1.0 && passed < 30 ? 0 : 2;
              }),
              0);
}
