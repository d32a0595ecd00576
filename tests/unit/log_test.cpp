#include "log/log.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/child.h"
#include "support/files.h"
#include "support/text.h"

using support::capture_stdout;
using support::in_child;

namespace {

// Through this pointer a test may make up formats of any length.
void (*const print)(int32_t, const char*, int32_t, const char*, ...) = log_printf;

std::string printed(int32_t level, const char* file, int32_t line, const std::string& fmt)
{
    return capture_stdout([&] { print(level, file, line, fmt.c_str()); });
}

// The receiving end of syslog.
class syslog_socket {
public:
    syslog_socket() : fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0))
    {
        support::remove_all("/dev/log");
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        strcpy(address.sun_path, "/dev/log");
        EXPECT_EQ(bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0);
    }

    ~syslog_socket()
    {
        close(fd);
        support::remove_all("/dev/log");
    }

    syslog_socket(const syslog_socket&) = delete;
    syslog_socket& operator=(const syslog_socket&) = delete;

    // The next message, empty when none has come. Senders have finished when this is called.
    [[nodiscard]] std::string next() const
    {
        char text[2048];
        ssize_t length = recv(fd, text, sizeof(text), 0);
        return length < 0 ? "" : std::string(text, static_cast<size_t>(length));
    }

private:
    int fd;
};

bool ends_with(const std::string& text, const std::string& end)
{
    return text.size() >= end.size() &&
           text.compare(text.size() - end.size(), end.size(), end) == 0;
}

std::string dated_log_path(time_t when)
{
    const tm* date = localtime(&when);
    std::ostringstream path;
    path << "/tmp/log/disk_log-" << date->tm_year + 1900 << '-' << date->tm_mon + 1 << '-'
         << date->tm_mday << '-' << date->tm_hour << '-' << date->tm_min << '-' << date->tm_sec
         << ".txt";
    return path.str();
}

std::vector<std::string> log_files()
{
    std::vector<std::string> paths;
    for (const auto& entry : std::filesystem::directory_iterator("/tmp/log")) {
        paths.push_back(entry.path());
    }
    return paths;
}

}  // namespace

TEST(Log, each_level_has_its_header)
{
    errno = ENOENT;
    EXPECT_EQ(printed(LOG_LVL_INFO, "mount.cpp", 12, "hello\n"), "mount.cpp(12)hello\n");
    EXPECT_EQ(printed(LOG_LVL_WARN, "mount.cpp", 12, "hello\n"), "Warning[mount.cpp:12]hello\n");
    EXPECT_EQ(printed(LOG_LVL_ERR, "mount.cpp", 12, "hello\n"), "ERROR[mount.cpp:12]hello\n");
    errno = ENOENT;
    EXPECT_EQ(printed(LOG_LVL_ERRNO, "mount.cpp", 12, "hello\n"),
              "ERROR[mount.cpp:12](No such file or directory)hello\n");
}

TEST(Log, the_levels_are_numbered_from_one_to_four)
{
    EXPECT_EQ(LOG_LVL_INFO, 1);
    EXPECT_EQ(LOG_LVL_WARN, 2);
    EXPECT_EQ(LOG_LVL_ERR, 3);
    EXPECT_EQ(LOG_LVL_ERRNO, 4);
}

TEST(Log, any_other_level_is_printed_like_level_one)
{
    for (int32_t level : {0, 5, 7, -1, 1000}) {
        EXPECT_EQ(printed(level, "a.cpp", 3, "x\n"), "a.cpp(3)x\n") << level;
    }
}

TEST(Log, only_the_base_name_of_the_file_is_printed)
{
    EXPECT_EQ(printed(1, "/a/b/c.cpp", 1, "x"), "c.cpp(1)x");
    EXPECT_EQ(printed(1, "src/disk/mount.cpp", 1, "x"), "mount.cpp(1)x");
    EXPECT_EQ(printed(1, "plain", 1, "x"), "plain(1)x");
    EXPECT_EQ(printed(1, "ends/", 1, "x"), "(1)x");
}

TEST(Log, the_arguments_fill_the_callers_format)
{
    std::string text = capture_stdout([] {
        log_printf(LOG_LVL_WARN, "m.cpp", 9, "dev = %s, n = %d, %llu%%\n", "sda1", -5, 1ULL << 40);
    });
    EXPECT_EQ(text, "Warning[m.cpp:9]dev = sda1, n = -5, 1099511627776%\n");
}

TEST(Log, a_percent_sign_in_an_argument_is_printed_as_it_stands)
{
    std::string text = capture_stdout([] { log_printf(1, "m.cpp", 9, "label = %s\n", "50%d%s"); });
    EXPECT_EQ(text, "m.cpp(9)label = 50%d%s\n");
}

TEST(Log, no_newline_is_added)
{
    EXPECT_EQ(printed(1, "m.cpp", 1, "no end"), "m.cpp(1)no end");
}

TEST(Log, header_and_format_together_are_cut_at_255_characters)
{
    const std::string header = "m.cpp(1)";
    for (size_t length : {254U, 255U, 256U, 300U}) {
        std::string fmt(length - header.size(), 'f');
        std::string expected = (header + fmt).substr(0, 255);
        EXPECT_EQ(printed(1, "m.cpp", 1, fmt), expected) << length;
    }
}

TEST(Log, a_conversion_behind_the_headers_cut_is_not_made)
{
    const std::string header = "m.cpp(1)";
    std::string fmt(255 - header.size(), 'f');
    std::string text = capture_stdout([&] { print(1, "m.cpp", 1, (fmt + "%s").c_str(), "late"); });
    EXPECT_EQ(text, header + fmt);
}

TEST(Log, the_message_is_cut_at_511_characters)
{
    const std::string header = "m.cpp(1)";
    for (size_t length : {510U, 511U, 512U, 2000U}) {
        std::string argument(length - header.size(), 'a');
        std::string expected = (header + argument).substr(0, 511);
        std::string text = capture_stdout([&] { print(1, "m.cpp", 1, "%s", argument.c_str()); });
        EXPECT_EQ(text, expected) << length;
    }
}

TEST(Log, the_short_forms_give_their_own_file_and_line)
{
    std::string text = support::log_of([] {
        errno = EACCES;
        log_info("1\n");
        log_warn("2\n");
        log_err("3\n");
        log_errno("4\n");
    });
    EXPECT_EQ(text, "log_test.cpp(N)1\n"
                    "Warning[log_test.cpp:N]2\n"
                    "ERROR[log_test.cpp:N]3\n"
                    "ERROR[log_test.cpp:N](Permission denied)4\n");
}

TEST(Log, errno_is_kept)
{
    for (int32_t level = 1; level <= 4; level++) {
        capture_stdout([&] {
            errno = EXDEV;
            log_printf(level, "m.cpp", 1, "x\n");
            EXPECT_EQ(errno, EXDEV);
        });
    }
}

TEST(Log, errno_is_kept_when_standard_output_is_closed)
{
    EXPECT_EQ(in_child([] {
                  setvbuf(stdout, nullptr, _IONBF, 0);
                  close(STDOUT_FILENO);
                  errno = EXDEV;
                  log_printf(1, "m.cpp", 1, "x\n");
                  return errno == EXDEV ? 0 : 1;
              }),
              0);
}

TEST(Log, switching_the_log_on_leaves_it_on)
{
    log_set_debug();
    EXPECT_EQ(printed(1, "m.cpp", 1, "x\n"), "m.cpp(1)x\n");
}

TEST(Log, printing_without_header_takes_the_format_alone)
{
    EXPECT_EQ(capture_stdout([] { log_print_stdout("%s(%d)line\n", "a/b.cpp", 7); }),
              "a/b.cpp(7)line\n");
}

TEST(Log, a_reader_that_went_away_does_not_silence_the_log_for_the_next_one)
{
    const int result = in_child([] {
        signal(SIGPIPE, SIG_IGN);
        setvbuf(stdout, nullptr, _IOLBF, 0);
        int nobody[2];
        int somebody[2];
        if (pipe(nobody) != 0 || pipe(somebody) != 0 || dup2(nobody[1], STDOUT_FILENO) < 0) {
            return 2;
        }
        close(nobody[0]);
        log_info("nobody reads this\n");
        dup2(somebody[1], STDOUT_FILENO);
        log_info("somebody reads this\n");
        char text[128]{};
        const ssize_t length = read(somebody[0], text, sizeof(text) - 1);
        return length > 0 && strstr(text, "somebody reads this\n") != nullptr ? 0 : 1;
    });
    EXPECT_EQ(result, 0);
}

TEST(Log, nothing_reaches_syslog_before_it_is_switched_on)
{
    syslog_socket sink;
    printed(LOG_LVL_ERR, "m.cpp", 1, "quiet\n");
    EXPECT_EQ(sink.next(), "");
}

class LogToSyslog : public testing::Test {
protected:
    ~LogToSyslog() override { log_reset(); }
};

TEST_F(LogToSyslog, after_the_switch_every_message_goes_to_syslog_as_tarndisk)
{
    syslog_socket sink;
    std::string text = capture_stdout([] {
        log_printf(1, "a/m.cpp", 1, "before\n");
        log_enable_syslog();
        log_printf(1, "a/m.cpp", 2, "one %d\n", 1);
        log_printf(2, "a/m.cpp", 3, "two\n");
        log_set_debug();
        log_printf(3, "a/m.cpp", 4, "three %s\n", "%d");
        errno = ENOENT;
        log_printf(4, "a/m.cpp", 5, "four\n");
        EXPECT_EQ(errno, ENOENT);
    });
    const std::vector<std::string> expected = {"m.cpp(2)one 1", "Warning[m.cpp:3]two",
                                               "ERROR[m.cpp:4]three %d",
                                               "ERROR[m.cpp:5](No such file or directory)four"};
    for (const std::string& message : expected) {
        std::string got = sink.next();
        // Facility daemon (3) and priority info (6), whatever the level.
        EXPECT_EQ(got.substr(0, 4), "<30>") << got;
        while (!got.empty() && (got.back() == '\n' || got.back() == '\0')) {
            got.pop_back();
        }
        EXPECT_TRUE(ends_with(got, " tarndisk: " + message)) << got;
    }
    EXPECT_EQ(sink.next(), "");
    // Standard output goes on as before.
    EXPECT_EQ(support::lines_of(text).size(), 5U);
}

TEST_F(LogToSyslog, a_missing_syslog_disturbs_nothing)
{
    support::remove_all("/dev/log");
    std::string text = capture_stdout([] {
        log_enable_syslog();
        errno = EXDEV;
        log_printf(1, "m.cpp", 2, "still here\n");
        EXPECT_EQ(errno, EXDEV);
    });
    EXPECT_EQ(text, "m.cpp(2)still here\n");
}

// A test that closes the log file itself resets the log behind that.
class LogFile : public testing::Test {
protected:
    LogFile() { support::remove_all("/tmp/log"); }
    ~LogFile() override
    {
        log_file_close();
        log_reset();
        support::remove_all("/tmp/log");
    }
};

TEST_F(LogFile, is_named_after_the_time_without_leading_zeros)
{
    support::make_dir("/tmp/log");
    time_t before = time(nullptr);
    ASSERT_EQ(log_file_open(), 0);
    time_t after = time(nullptr);
    std::vector<std::string> files = log_files();
    ASSERT_EQ(files.size(), 1U);
    EXPECT_TRUE(files[0] == dated_log_path(before) || files[0] == dated_log_path(after))
        << files[0];
}

TEST_F(LogFile, is_for_all_to_read_and_for_its_owner_to_write_less_the_umask)
{
    support::make_dir("/tmp/log");
    const mode_t old_mask = umask(0);
    for (const mode_t mask : {0U, 077U}) {
        umask(mask);
        ASSERT_EQ(log_file_open(), 0);
        log_file_close();
        log_reset();
        ASSERT_EQ(log_files().size(), 1U);
        struct stat info {};
        ASSERT_EQ(stat(log_files()[0].c_str(), &info), 0);
        EXPECT_EQ(info.st_mode, S_IFREG | (0644U & ~mask));
        support::remove_all(log_files()[0]);
    }
    umask(old_mask);
}

TEST_F(LogFile, a_link_under_its_name_is_not_followed)
{
    support::make_dir("/tmp/log");
    const time_t now = time(nullptr);
    for (time_t when = now; when < now + 3; ++when) {
        std::filesystem::create_symlink("/tmp/log/victim", dated_log_path(when));
    }
    capture_stdout([] { EXPECT_EQ(log_file_open(), 1); });
    EXPECT_FALSE(std::filesystem::exists("/tmp/log/victim"));
}

TEST_F(LogFile, opening_without_its_directory_fails_and_says_so)
{
    std::string text = capture_stdout([] { EXPECT_EQ(log_file_open(), 1); });
    EXPECT_TRUE(support::matches(text, "err, file = /tmp/log/disk_log-[0-9]+(-[0-9]+){5}\\.txt\n"))
        << text;
    EXPECT_FALSE(std::filesystem::exists("/tmp/log"));
}

TEST_F(LogFile, closing_succeeds_whether_or_not_it_is_open)
{
    EXPECT_EQ(log_file_close(), 0);
    support::make_dir("/tmp/log");
    EXPECT_EQ(log_file_open(), 0);
    EXPECT_EQ(log_file_close(), 0);
    log_reset();
}

TEST_F(LogFile, messages_do_not_reach_the_file)
{
    support::make_dir("/tmp/log");
    capture_stdout([] {
        log_file_open();
        log_err("for standard output\n");
        log_file_close();
        log_reset();
    });
    ASSERT_EQ(log_files().size(), 1U);
    EXPECT_EQ(support::read_file(log_files()[0]), "");
}

TEST_F(LogFile, writing_opens_the_file_and_stands_in_it_at_once)
{
    support::make_dir("/tmp/log");
    EXPECT_EQ(log_file_write("one\n"), 0);
    EXPECT_EQ(log_file_write("two"), 0);
    EXPECT_EQ(support::read_file(log_files().at(0)), "one\ntwo");
}

TEST_F(LogFile, writing_without_its_directory_is_refused)
{
    capture_stdout([] { EXPECT_EQ(log_file_write("x\n"), 1); });
}

TEST_F(LogFile, an_existing_file_is_appended_to)
{
    support::make_dir("/tmp/log");
    time_t now = time(nullptr);
    for (time_t t = now; t < now + 30; t++) {
        support::write_file(dated_log_path(t), "old\n");
    }
    EXPECT_EQ(log_file_write("new\n"), 0);
    int appended = 0;
    for (const std::string& path : log_files()) {
        appended += support::read_file(path) == "old\nnew\n" ? 1 : 0;
    }
    EXPECT_EQ(appended, 1);
}

TEST_F(LogFile, the_1502nd_write_is_refused_and_writes_nothing)
{
    support::make_dir("/tmp/log");
    for (int i = 1; i <= 1501; i++) {
        ASSERT_EQ(log_file_write("x\n"), 0) << i;
    }
    EXPECT_EQ(log_file_write("y\n"), 1);
    EXPECT_EQ(log_file_write("y\n"), 1);
    ASSERT_EQ(log_files().size(), 1U);
    std::string text = support::read_file(log_files()[0]);
    EXPECT_EQ(support::count_of(text, "x\n"), 1501);
    EXPECT_EQ(support::count_of(text, "y"), 0);
}

TEST_F(LogFile, the_reset_switches_syslog_off_and_counts_lines_anew)
{
    support::make_dir("/tmp/log");
    syslog_socket sink;
    log_enable_syslog();
    for (int i = 1; i <= 1502; i++) {
        log_file_write("x\n");
    }
    EXPECT_EQ(log_file_write("y\n"), 1);
    log_file_close();

    log_reset();
    printed(1, "m.cpp", 1, "quiet\n");
    EXPECT_EQ(sink.next(), "");
    EXPECT_EQ(log_file_write("y\n"), 0);
}
