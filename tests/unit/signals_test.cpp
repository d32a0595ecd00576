#include "main/signals.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <string>

#include "log/log.h"
#include "manager/manager.h"
#include "support/capture.h"
#include "support/files.h"
#include "support/text.h"

using support::capture_stdout;
using support::contains;

namespace {

int bind_syslog_socket()
{
    support::remove_all("/dev/log");
    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    snprintf(address.sun_path, sizeof(address.sun_path), "/dev/log");
    EXPECT_EQ(bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
    return fd;
}

std::string next_datagram(int fd)
{
    char text[1024];
    const ssize_t length = recv(fd, text, sizeof(text), 0);
    return length > 0 ? std::string(text, static_cast<size_t>(length)) : "";
}

class Signals : public testing::Test {
protected:
    Signals() { EXPECT_EQ(setup_signals(), 0); }
};

}  // namespace

TEST_F(Signals, sigterm_has_no_effect)
{
    const std::string log = capture_stdout([] {
        EXPECT_EQ(raise(SIGTERM), 0);
        EXPECT_EQ(running, 1);
        EXPECT_EQ(signal(SIGTERM, SIG_DFL), SIG_IGN);
    });
    EXPECT_EQ(log, "");
}

TEST_F(Signals, one_sigint_only_logs_and_the_second_stops_the_loop)
{
    const std::string log = capture_stdout([] {
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 1);
        EXPECT_EQ(running, 1);
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 2);
        EXPECT_EQ(running, 0);
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 3);
        signals_report();
    });
    for (const char* line :
         {"get sig = SIGINT, c = 0\n", "get sig = SIGINT, c = 1\n", "get sig = SIGINT, c = 2\n"}) {
        EXPECT_TRUE(contains(log, line)) << log;
    }
}

TEST_F(Signals, sigpipe_is_logged_by_name_and_others_as_warnings_by_number)
{
    const std::string log = capture_stdout([] {
        for (const int sig : {SIGPIPE, SIGUSR1, SIGALRM, SIGHUP, SIGCHLD}) {
            raise(sig);
        }
        signals_report();
        EXPECT_EQ(running, 1);
    });
    EXPECT_TRUE(contains(log, "get sig = SIGPIPE\n"));
    for (const int sig : {SIGUSR1, SIGALRM, SIGHUP, SIGCHLD}) {
        const std::string line = "*** *** get sig = " + std::to_string(sig) + "\n";
        EXPECT_TRUE(contains(log, line)) << log;
    }
    EXPECT_EQ(support::count_of(log, "Warning["), 4);
}

TEST_F(Signals, sigpipe_of_the_daemons_own_writing_is_not_logged)
{
    const std::string log = capture_stdout([] {
        int nobody[2];
        EXPECT_EQ(pipe(nobody), 0);
        close(nobody[0]);
        EXPECT_EQ(write(nobody[1], "x", 1), -1);
        EXPECT_EQ(errno, EPIPE);
        close(nobody[1]);
        signals_report();
    });
    EXPECT_EQ(log, "");
}

TEST_F(Signals, nothing_is_printed_by_the_handler_itself)
{
    const std::string log = capture_stdout([] {
        for (const int sig : {SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT}) {
            raise(sig);
        }
    });
    EXPECT_EQ(log, "");
}

TEST_F(Signals, no_signal_is_blocked_afterwards)
{
    sigset_t before;
    sigset_t after;
    sigprocmask(SIG_SETMASK, nullptr, &before);
    setup_signals();
    raise(SIGHUP);
    signals_report();
    sigprocmask(SIG_SETMASK, nullptr, &after);
    for (int sig = 1; sig < NSIG; ++sig) {
        EXPECT_EQ(sigismember(&after, sig), sigismember(&before, sig)) << sig;
    }
}

TEST_F(Signals, every_signal_that_arrived_is_logged_once)
{
    const std::string log = capture_stdout([] {
        for (int i = 0; i < 3; ++i) {
            raise(SIGHUP);
        }
        raise(SIGPIPE);
        signals_report();
        signals_report();
    });
    EXPECT_EQ(support::count_of(log, "*** *** get sig = 1\n"), 3);
    EXPECT_EQ(support::count_of(log, "get sig = SIGPIPE\n"), 1);
    EXPECT_EQ(support::lines_of(log).size(), 4U) << log;
}

TEST_F(Signals, sigints_are_numbered_on_from_report_to_report)
{
    const std::string log = capture_stdout([] {
        raise(SIGINT);
        signals_report();
        raise(SIGINT);
        signals_report();
    });
    EXPECT_EQ(support::count_of(log, "get sig = SIGINT, c = 0\n"), 1);
    EXPECT_EQ(support::count_of(log, "get sig = SIGINT, c = 1\n"), 1);
}

TEST_F(Signals, sigusr2_says_nothing_and_switches_the_copy_to_syslog_on)
{
    const std::string log = capture_stdout([] {
        const int syslog_fd = bind_syslog_socket();
        log_info("before\n");
        EXPECT_EQ(next_datagram(syslog_fd), "");
        raise(SIGUSR2);
        EXPECT_EQ(next_datagram(syslog_fd), "");
        log_info("after\n");
        const std::string copy = next_datagram(syslog_fd);
        EXPECT_TRUE(contains(copy, "tarndisk")) << copy;
        EXPECT_TRUE(contains(copy, "after")) << copy;
        signals_report();
        support::remove_all("/dev/log");
        close(syslog_fd);
    });
    EXPECT_EQ(support::lines_of(log).size(), 2U) << log;
}

TEST_F(Signals, every_handled_signal_has_the_handler_and_restarts_what_it_interrupts)
{
    for (const int sig : {SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT}) {
        struct sigaction action {};
        ASSERT_EQ(sigaction(sig, nullptr, &action), 0);
        EXPECT_EQ(action.sa_flags & (SA_SIGINFO | SA_RESTART), SA_SIGINFO | SA_RESTART) << sig;
    }
}

TEST_F(Signals, the_reset_forgets_what_arrived_and_numbers_sigints_from_0)
{
    const std::string log = capture_stdout([] {
        raise(SIGINT);
        signals_report();
        raise(SIGHUP);
        raise(SIGINT);
        signals_reset();
        EXPECT_EQ(sigint_count, 0);
        raise(SIGINT);
        signals_report();
    });
    EXPECT_EQ(support::count_of(log, "get sig = SIGINT, c = 0\n"), 2) << log;
    EXPECT_EQ(support::lines_of(log).size(), 2U) << log;
}

TEST_F(Signals, the_handler_leaves_errno_alone)
{
    errno = EXDEV;
    raise(SIGHUP);
    EXPECT_EQ(errno, EXDEV);
}
