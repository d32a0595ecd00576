#include "main/signals.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <string>

#include "log/log.h"
#include "manager/manager.h"
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
        EXPECT_EQ(running, 1);
    });
    EXPECT_TRUE(contains(log, "get sig = SIGPIPE\n"));
    for (const int sig : {SIGUSR1, SIGALRM, SIGHUP, SIGCHLD}) {
        const std::string line = "*** *** get sig = " + std::to_string(sig) + "\n";
        EXPECT_TRUE(contains(log, line)) << log;
    }
    EXPECT_EQ(support::count_of(log, "Warning["), 4);
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
