#include "main/signals.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <string>

#include "log/log.h"
#include "manager/manager.h"
#include "manager/signal_inbox.h"
#include "support/support.h"
#include "support_disk/child.h"

using support::contains;
using support_disk::expect_in_child;

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

}  // namespace

TEST(Signals, sigterm_has_no_effect)
{
    const std::string log = expect_in_child([] {
        EXPECT_EQ(setup_signals(), 0);
        EXPECT_EQ(raise(SIGTERM), 0);
        EXPECT_EQ(running, 1);
        EXPECT_EQ(signal(SIGTERM, SIG_DFL), SIG_IGN);
    });
    EXPECT_EQ(log, "");
}

TEST(Signals, one_sigint_only_logs_and_the_second_stops_the_loop)
{
    const std::string log = expect_in_child([] {
        setup_signals();
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 1);
        EXPECT_EQ(running, 1);
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 2);
        EXPECT_EQ(running, 0);
        raise(SIGINT);
        EXPECT_EQ(sigint_count, 3);
        signal_inbox_report();
    });
    for (const char* line :
         {"get sig = SIGINT, c = 0\n", "get sig = SIGINT, c = 1\n", "get sig = SIGINT, c = 2\n"}) {
        EXPECT_TRUE(contains(log, line)) << log;
    }
}

TEST(Signals, sigpipe_is_logged_by_name_and_others_as_warnings_by_number)
{
    const std::string log = expect_in_child([] {
        setup_signals();
        for (const int sig : {SIGPIPE, SIGUSR1, SIGALRM, SIGHUP, SIGCHLD}) {
            raise(sig);
        }
        signal_inbox_report();
        EXPECT_EQ(running, 1);
    });
    EXPECT_TRUE(contains(log, "get sig = SIGPIPE\n"));
    for (const int sig : {SIGUSR1, SIGALRM, SIGHUP, SIGCHLD}) {
        const std::string line = "*** *** get sig = " + std::to_string(sig) + "\n";
        EXPECT_TRUE(contains(log, line)) << log;
    }
    EXPECT_EQ(support::count_of(log, "Warning["), 4);
}

TEST(Signals, sigpipe_of_the_daemons_own_writing_is_not_told)
{
    const std::string log = expect_in_child([] {
        setup_signals();
        int nobody[2];
        EXPECT_EQ(pipe(nobody), 0);
        close(nobody[0]);
        EXPECT_EQ(write(nobody[1], "x", 1), -1);
        EXPECT_EQ(errno, EPIPE);
        signal_inbox_report();
    });
    EXPECT_EQ(log, "");
}

TEST(Signals, nothing_is_printed_by_the_handler_itself)
{
    const std::string log = expect_in_child([] {
        setup_signals();
        for (const int sig : {SIGPIPE, SIGUSR1, SIGUSR2, SIGALRM, SIGHUP, SIGCHLD, SIGINT}) {
            raise(sig);
        }
    });
    EXPECT_EQ(log, "");
}

TEST(Signals, no_signal_is_blocked_afterwards)
{
    expect_in_child([] {
        sigset_t before;
        sigset_t after;
        sigprocmask(SIG_SETMASK, nullptr, &before);
        setup_signals();
        raise(SIGHUP);
        signal_inbox_report();
        sigprocmask(SIG_SETMASK, nullptr, &after);
        for (int sig = 1; sig < NSIG; ++sig) {
            EXPECT_EQ(sigismember(&after, sig), sigismember(&before, sig)) << sig;
        }
    });
}

TEST(SignalInbox, tells_every_counted_signal_once)
{
    const std::string log = expect_in_child([] {
        for (int i = 0; i < 3; ++i) {
            signal_inbox_note(SIGHUP);
        }
        signal_inbox_note(SIGPIPE);
        signal_inbox_report();
        signal_inbox_report();
    });
    EXPECT_EQ(support::count_of(log, "*** *** get sig = 1\n"), 3);
    EXPECT_EQ(support::count_of(log, "get sig = SIGPIPE\n"), 1);
    EXPECT_EQ(support::lines_of(log).size(), 4U) << log;
}

TEST(SignalInbox, goes_on_counting_sigints_from_report_to_report)
{
    const std::string log = expect_in_child([] {
        signal_inbox_note(SIGINT);
        signal_inbox_report();
        signal_inbox_note(SIGINT);
        signal_inbox_report();
    });
    EXPECT_EQ(support::count_of(log, "get sig = SIGINT, c = 0\n"), 1);
    EXPECT_EQ(support::count_of(log, "get sig = SIGINT, c = 1\n"), 1);
}

TEST(SignalInbox, keeps_nothing_of_a_signal_that_is_never_told)
{
    const std::string log = expect_in_child([] {
        signal_inbox_note(SIGUSR2);
        signal_inbox_note(SIGQUIT);
        signal_inbox_report();
    });
    EXPECT_EQ(log, "");
}

TEST(Signals, sigusr2_says_nothing_and_switches_the_copy_to_syslog_on)
{
    const std::string log = expect_in_child([] {
        const int syslog_fd = bind_syslog_socket();
        setup_signals();
        log_info("before\n");
        EXPECT_EQ(next_datagram(syslog_fd), "");
        raise(SIGUSR2);
        EXPECT_EQ(next_datagram(syslog_fd), "");
        log_info("after\n");
        const std::string copy = next_datagram(syslog_fd);
        EXPECT_TRUE(contains(copy, "tarndisk")) << copy;
        EXPECT_TRUE(contains(copy, "after")) << copy;
        support::remove_all("/dev/log");
    });
    EXPECT_EQ(support::lines_of(log).size(), 2U) << log;
}

TEST(Signals, the_handler_leaves_errno_alone)
{
    expect_in_child([] {
        setup_signals();
        errno = EXDEV;
        raise(SIGHUP);
        EXPECT_EQ(errno, EXDEV);
    });
}
