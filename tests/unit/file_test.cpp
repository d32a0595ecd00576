#include "util/file.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include "support/capture.h"
#include "support/files.h"
#include "support/images.h"
#include "support/stubs.h"
#include "support/text.h"

using support::exists;
using support::log_of;
using support::make_dir;
using support::make_link;
using support::make_socket;
using support::read_file;
using support::write_file;

namespace {

const std::string ROOT = "/run/files";

mode_t mode_of(const std::string& path)
{
    struct stat info {};
    EXPECT_EQ(lstat(path.c_str(), &info), 0) << path;
    return info.st_mode;
}

// The content that file_read_all gives, with its terminating zero checked.
std::string whole_file(const std::string& path)
{
    char* content = file_read_all(path.c_str());
    EXPECT_NE(content, nullptr);
    if (content == nullptr) {
        return "";
    }
    std::string text(content);
    free(content);
    return text;
}

class Files : public testing::Test {
protected:
    Files()
    {
        support::remove_all(ROOT);
        make_dir(ROOT);
    }
    ~Files() override { support::remove_all(ROOT); }

    support::kept_working_dir working_dir;
    const std::string file = ROOT + "/file";
    const std::string missing = ROOT + "/missing";
};

using DirHasEntry = Files;
using FileGetSize = Files;
using FileWrite = Files;
using FileAppend = Files;
using FdReadFull = Files;
using FileReadAt = Files;
using FileReadAll = Files;
using FileReadBuf = Files;
using FileDelete = Files;
using DirMake = Files;
using FifoCreateOpen = Files;

}  // namespace

TEST_F(DirHasEntry, wants_the_whole_name)
{
    make_dir(ROOT + "/sda");
    write_file(ROOT + "/sdb1", "");
    EXPECT_EQ(dir_has_entry(ROOT.c_str(), "sda"), 0);
    EXPECT_EQ(dir_has_entry(ROOT.c_str(), "sdb1"), 0);
    EXPECT_EQ(dir_has_entry(ROOT.c_str(), "."), 0);
    for (const char* name : {"sd", "sda1", "SDA", "sdb", "", "sda/"}) {
        EXPECT_EQ(dir_has_entry(ROOT.c_str(), name), 1) << name;
    }
}

TEST_F(DirHasEntry, a_missing_directory_has_none_and_is_logged)
{
    std::string log = log_of([&] { EXPECT_EQ(dir_has_entry(missing.c_str(), "sda"), 1); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]open dir err, dir = /run/files/missing\n");
}

TEST_F(DirHasEntry, a_null_argument_gives_one_silently)
{
    std::string log = log_of([&] {
        EXPECT_EQ(dir_has_entry(nullptr, "sda"), 1);
        EXPECT_EQ(dir_has_entry(ROOT.c_str(), nullptr), 1);
    });
    EXPECT_EQ(log, "");
}

TEST_F(DirHasEntry, closes_the_directory_on_both_outcomes)
{
    int before = dup(STDIN_FILENO);
    close(before);
    make_dir(ROOT + "/sda");
    for (int i = 0; i < 10; i++) {
        dir_has_entry(ROOT.c_str(), "sda");
        dir_has_entry(ROOT.c_str(), "sdb");
    }
    int after = dup(STDIN_FILENO);
    close(after);
    EXPECT_EQ(after, before);
}

TEST_F(FileGetSize, gives_the_size_and_that_the_file_exists)
{
    write_file(file, "12345");
    uint8_t flag = 7;
    EXPECT_EQ(file_get_size(file.c_str(), &flag), 5);
    EXPECT_EQ(flag, 1);
    EXPECT_EQ(file_get_size(file.c_str(), nullptr), 5);
}

TEST_F(FileGetSize, counts_past_four_gigabytes)
{
    support::image big(5LL << 30, file);
    EXPECT_EQ(file_get_size(file.c_str(), nullptr), 5LL << 30);
}

TEST_F(FileGetSize, of_a_missing_file_is_zero_with_the_systems_error)
{
    uint8_t flag = 7;
    std::string log = log_of([&] { EXPECT_EQ(file_get_size(missing.c_str(), &flag), 0); });
    EXPECT_EQ(flag, 0);
    EXPECT_EQ(log,
              "ERROR[file.cpp:N](No such file or directory)stat err, fn = /run/files/missing\n");
    log_of([&] { EXPECT_EQ(file_get_size(missing.c_str(), nullptr), 0); });
}

TEST_F(FileWrite, creates_and_truncates)
{
    EXPECT_EQ(file_write(file.c_str(), "long text", 9), 0);
    EXPECT_EQ(read_file(file), "long text");
    EXPECT_EQ(file_write(file.c_str(), "short", 5), 0);
    EXPECT_EQ(read_file(file), "short");
    EXPECT_EQ(file_write(file.c_str(), "", 0), 0);
    EXPECT_EQ(read_file(file), "");
}

TEST_F(FileWrite, takes_any_bytes_and_any_length)
{
    std::string bytes(300000, '\0');
    bytes[1] = '\xff';
    EXPECT_EQ(file_write(file.c_str(), bytes.data(), static_cast<int32_t>(bytes.size())), 0);
    EXPECT_EQ(read_file(file), bytes);
}

TEST_F(FileWrite, any_open_failure_is_logged_in_the_same_words)
{
    std::string path = missing + "/file";
    std::string log = log_of([&] {
        EXPECT_EQ(file_write(path.c_str(), "x", 1), 1);
        EXPECT_EQ(file_write(ROOT.c_str(), "x", 1), 1);
    });
    EXPECT_EQ(log, "file.cpp(N)file not exist, fn = /run/files/missing/file\n"
                   "file.cpp(N)file not exist, fn = /run/files\n");
}

TEST_F(FileWrite, a_stream_that_takes_no_more_bytes_is_no_failure)
{
    FILE* full = fopen("/dev/full", "w");
    ASSERT_NE(full, nullptr);
    setvbuf(full, nullptr, _IONBF, 0);
    EXPECT_EQ(stream_write_all(full, "x", 1), 0);
    fclose(full);
    std::string bytes(100000, 'x');
    EXPECT_EQ(file_write("/dev/full", bytes.data(), 100000), 0);
}

TEST_F(FileWrite, a_stream_gets_all_bytes)
{
    FILE* stream = fopen(file.c_str(), "w");
    ASSERT_NE(stream, nullptr);
    EXPECT_EQ(stream_write_all(stream, "ab", 2), 0);
    EXPECT_EQ(stream_write_all(stream, "ignored", 0), 0);
    EXPECT_EQ(stream_write_all(stream, "cd", 2), 0);
    fclose(stream);
    EXPECT_EQ(read_file(file), "abcd");
}

TEST_F(FileAppend, creates_and_appends)
{
    EXPECT_EQ(file_append(file.c_str(), "one", 3), 0);
    EXPECT_EQ(file_append(file.c_str(), "two", 3), 0);
    EXPECT_EQ(read_file(file), "onetwo");
}

TEST_F(FileAppend, an_open_failure_is_logged)
{
    std::string log = log_of([&] { EXPECT_EQ(file_append(ROOT.c_str(), "x", 1), 1); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]open err, file = /run/files\n");
}

TEST_F(FdReadFull, wants_exactly_that_many_bytes)
{
    write_file(file, "12345");
    for (int32_t length : {0, 1, 4, 5, 6}) {
        char buffer[8] = "#######";
        int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC);
        EXPECT_EQ(fd_read_full(fd, buffer, length), length <= 5 ? 0 : 1) << length;
        EXPECT_EQ(std::string(buffer), std::string("12345").substr(0, length) +
                                           std::string("#######").substr(length <= 5 ? length : 5));
        close(fd);
    }
}

TEST_F(FdReadFull, goes_on_after_a_short_read)
{
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    // The second half comes later, from another process.
    pid_t writer = fork();
    if (writer == 0) {
        ssize_t first = write(ends[1], "ab", 2);
        usleep(50000);
        ssize_t second = write(ends[1], "cd", 2);
        _exit(first + second == 4 ? 0 : 1);
    }
    close(ends[1]);
    char buffer[5] = "";
    EXPECT_EQ(fd_read_full(ends[0], buffer, 4), 0);
    EXPECT_STREQ(buffer, "abcd");
    EXPECT_EQ(fd_read_full(ends[0], buffer, 1), 1);
    close(ends[0]);
    waitpid(writer, nullptr, 0);
}

TEST_F(FdReadFull, a_bad_descriptor_gives_one)
{
    char buffer[4];
    EXPECT_EQ(fd_read_full(-1, buffer, 4), 1);
}

TEST_F(FileReadAt, reads_at_the_offset)
{
    write_file(file, "0123456789");
    char buffer[4] = "";
    EXPECT_EQ(file_read_at(file.c_str(), 0, buffer, 3), 0);
    EXPECT_STREQ(buffer, "012");
    EXPECT_EQ(file_read_at(file.c_str(), 7, buffer, 3), 0);
    EXPECT_STREQ(buffer, "789");
    EXPECT_EQ(file_read_at(file.c_str(), -5, buffer, 3), 0);
    EXPECT_STREQ(buffer, "012");
    EXPECT_EQ(read_file(file), "0123456789");
}

TEST_F(FileReadAt, a_missing_path_is_created_empty_with_mode_0600_and_fails_the_read)
{
    char buffer[4];
    std::string log = log_of([&] { EXPECT_EQ(file_read_at(missing.c_str(), 0, buffer, 4), 1); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]read err, ret=1, len=4\n");
    EXPECT_EQ(mode_of(missing), static_cast<mode_t>(S_IFREG | 0600));
    EXPECT_EQ(read_file(missing), "");
}

TEST_F(FileReadAt, data_that_ends_early_fails)
{
    write_file(file, "0123456789");
    char buffer[8];
    std::string log = log_of([&] { EXPECT_EQ(file_read_at(file.c_str(), 8, buffer, 3), 1); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]read err, ret=1, len=3\n");
}

TEST_F(FileReadAt, a_null_argument_or_a_failed_open_is_logged)
{
    char buffer[4];
    std::string log = log_of([&] {
        EXPECT_EQ(file_read_at(nullptr, 0, buffer, 4), 1);
        EXPECT_EQ(file_read_at(missing.c_str(), 0, nullptr, 4), 1);
        EXPECT_EQ(file_read_at(ROOT.c_str(), 0, buffer, 4), 1);
    });
    const std::string line = "ERROR[file.cpp:N]err!\n";
    EXPECT_EQ(log, line + line + line);
    EXPECT_FALSE(exists(missing));
}

TEST_F(FileReadAt, a_seek_that_fails_is_logged)
{
    ASSERT_EQ(mkfifo(file.c_str(), 0600), 0);
    char buffer[4];
    std::string log = log_of([&] { EXPECT_EQ(file_read_at(file.c_str(), 1, buffer, 4), 1); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]seek err!\n");
}

TEST_F(FileReadAll, gives_the_content_with_a_terminating_zero)
{
    write_file(file, "line one\nline two\n");
    EXPECT_EQ(whole_file(file), "line one\nline two\n");
}

TEST_F(FileReadAll, an_empty_file_gives_the_terminating_zero_alone)
{
    write_file(file, "");
    char* content = file_read_all(file.c_str());
    ASSERT_NE(content, nullptr);
    EXPECT_EQ(content[0], '\0');
    free(content);
}

TEST_F(FileReadAll, takes_exactly_8388607_bytes)
{
    for (off_t size : {8388606, 8388607}) {
        support::image big(size, file);
        big.write_at(size - 1, "z");
        char* content = file_read_all(file.c_str());
        ASSERT_NE(content, nullptr) << size;
        EXPECT_EQ(content[size - 1], 'z');
        EXPECT_EQ(content[size], '\0');
        free(content);
    }
}

TEST_F(FileReadAll, refuses_more_than_8388607_bytes)
{
    for (off_t size : {8388608LL, 5LL << 30}) {
        support::image big(size, file);
        std::string log = log_of([&] { EXPECT_EQ(file_read_all(file.c_str()), nullptr); });
        EXPECT_EQ(log, "file.cpp(N)===== file too large =====\n") << size;
    }
}

TEST_F(FileReadAll, a_missing_file_gives_nothing)
{
    std::string log = log_of([&] { EXPECT_EQ(file_read_all(missing.c_str()), nullptr); });
    EXPECT_EQ(log, "file.cpp(N)file not exist, file = /run/files/missing\n");
}

TEST_F(FileReadAll, a_file_that_cannot_be_opened_gives_nothing)
{
    make_socket(file);
    std::string log = log_of([&] { EXPECT_EQ(file_read_all(file.c_str()), nullptr); });
    EXPECT_EQ(log, "file.cpp(N)open file err, file = /run/files/file\n");
}

TEST_F(FileReadAll, a_short_read_gives_nothing)
{
    // A directory has a size and no bytes to read.
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    struct stat info {};
    ASSERT_EQ(stat(path.c_str(), &info), 0);
    ASSERT_GT(info.st_size, 0);
    std::string log = log_of([&] { EXPECT_EQ(file_read_all(path.c_str()), nullptr); });
    EXPECT_EQ(log, "ERROR[file.cpp:N]err, fn = /run/files/dir, ret = 1, file_size = " +
                       std::to_string(info.st_size) + "\n");
}

TEST_F(FileReadAll, closes_the_file)
{
    write_file(file, "x");
    int before = dup(STDIN_FILENO);
    close(before);
    for (int i = 0; i < 10; i++) {
        whole_file(file);
    }
    int after = dup(STDIN_FILENO);
    close(after);
    EXPECT_EQ(after, before);
}

TEST_F(FileReadBuf, zero_fills_the_buffer_and_leaves_no_zero_from_its_size_on)
{
    for (size_t length : {0, 2, 7, 8, 9}) {
        const std::string content = std::string("123456789").substr(0, length);
        write_file(file, content);
        char buffer[10];
        memset(buffer, '#', sizeof(buffer));
        EXPECT_EQ(file_read_buf(file.c_str(), buffer, 8), 0);
        std::string expected = content;
        expected.resize(8, '\0');
        EXPECT_EQ(std::string(buffer, 8), expected);
        EXPECT_EQ(buffer[8], '#') << length;
    }
}

TEST_F(FileReadBuf, a_missing_file_leaves_the_buffer_alone)
{
    char buffer[4] = "old";
    std::string log = log_of([&] { EXPECT_EQ(file_read_buf(missing.c_str(), buffer, 4), 1); });
    EXPECT_EQ(log, "file.cpp(N)file not exist, file = /run/files/missing\n");
    EXPECT_STREQ(buffer, "old");
}

TEST_F(FileReadBuf, as_a_text_keeps_room_for_its_zero)
{
    for (int length : {6, 7, 8}) {
        const std::string content = std::string("12345678").substr(0, length);
        write_file(file, content);
        char text[10];
        memset(text, '#', sizeof(text));
        EXPECT_EQ(file_read_text(file.c_str(), {text, 8}), 0);
        EXPECT_EQ(text, content.substr(0, 7));
        EXPECT_EQ(text[7], '\0');
        EXPECT_EQ(text[8], '#') << length;
    }
    char text[4] = "old";
    log_of([&] { EXPECT_EQ(file_read_text(missing.c_str(), text), 1); });
    EXPECT_STREQ(text, "");
}

TEST_F(FileReadBuf, a_file_that_cannot_be_opened_is_logged)
{
    make_socket(file);
    char buffer[4] = "old";
    std::string log = log_of([&] { EXPECT_EQ(file_read_buf(file.c_str(), buffer, 4), 1); });
    EXPECT_EQ(log, "file.cpp(N)open file err, file = /run/files/file\n");
    EXPECT_STREQ(buffer, "");
}

TEST_F(FileDelete, takes_the_file_away)
{
    write_file(file, "x");
    std::string log = log_of([&] { EXPECT_EQ(file_delete(file.c_str()), 0); });
    EXPECT_EQ(log, "");
    EXPECT_FALSE(exists(file));
}

TEST_F(FileDelete, a_missing_file_gives_one_and_the_warning)
{
    std::string log = log_of([&] { EXPECT_EQ(file_delete(missing.c_str()), 1); });
    EXPECT_EQ(log, "Warning[file.cpp:N]del err! not exist file = /run/files/missing\n");
}

TEST_F(FileDelete, a_failed_removal_gives_the_systems_error)
{
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    std::string log = log_of([&] { EXPECT_EQ(file_delete(path.c_str()), 1); });
    EXPECT_EQ(log,
              "ERROR[file.cpp:N](Directory not empty)remove file err, file = /run/files/dir\n");
    EXPECT_TRUE(exists(path));
}

TEST_F(FileDelete, a_null_path_gives_one_silently)
{
    std::string log = log_of([] { EXPECT_EQ(file_delete(nullptr), 1); });
    EXPECT_EQ(log, "");
}

TEST_F(DirMake, makes_the_directories_above)
{
    std::string path = ROOT + "/a b/c";
    std::string log = log_of([&] { EXPECT_EQ(dir_make(path.c_str()), 0); });
    EXPECT_EQ(support::count_of(log, "exec cmd = mkdir -p '/run/files/a b/c'\n"), 1) << log;
    EXPECT_TRUE(std::filesystem::is_directory(path));
}

TEST_F(DirMake, an_existing_directory_runs_nothing)
{
    std::string log = log_of([] { EXPECT_EQ(dir_make(ROOT.c_str()), 0); });
    EXPECT_EQ(log, "");
}

TEST_F(DirMake, on_an_existing_regular_file_is_a_success_and_makes_nothing)
{
    write_file(file, "content");
    std::string log = log_of([&] { EXPECT_EQ(dir_make(file.c_str()), 0); });
    EXPECT_EQ(log, "");
    EXPECT_EQ(read_file(file), "content");
}

TEST_F(DirMake, takes_a_path_of_any_length)
{
    std::string path = ROOT + "/" + std::string(250, 'a') + "/" + std::string(250, 'b');
    log_of([&] { EXPECT_EQ(dir_make(path.c_str()), 0); });
    EXPECT_TRUE(std::filesystem::is_directory(path));
}

TEST_F(DirMake, fails_when_its_command_cannot_run_to_its_end)
{
    // The shell is killed, also one that gives its process to its only command.
    support::stub_programs stubs;
    stubs.add("mkdir",
              R"x([ "$(cat /proc/$PPID/comm)" = sh ] && kill -KILL $PPID || kill -KILL $$)x");
    std::string path = ROOT + "/x";
    support::capture_stderr([&] { log_of([&] { EXPECT_EQ(dir_make(path.c_str()), 1); }); });
    EXPECT_EQ(stubs.calls().size(), 1U);
}

TEST_F(DirMake, a_path_that_ends_the_quotes_runs_nothing)
{
    std::string path = ROOT + "/x' ; touch /run/harm ; '";
    EXPECT_EQ(log_of([&] { EXPECT_EQ(dir_make(path.c_str()), 1); }), "ERROR[file.cpp:N]err!\n");
}

TEST_F(FifoCreateOpen, makes_the_pipe_for_its_owner_alone)
{
    std::string path = ROOT + "/fifo";
    int fd = fifo_create_open(path.c_str());
    ASSERT_GE(fd, 0);
    EXPECT_EQ(mode_of(path), static_cast<mode_t>(S_IFIFO | 0600));
    close(fd);
}

TEST_F(FifoCreateOpen, opens_for_reading_and_writing_without_blocking)
{
    std::string path = ROOT + "/fifo";
    int fd = fifo_create_open(path.c_str());
    ASSERT_GE(fd, 0);
    int flags = fcntl(fd, F_GETFL);
    EXPECT_EQ(flags & O_ACCMODE, O_RDWR);
    EXPECT_NE(flags & O_NONBLOCK, 0);

    char buffer[4];
    EXPECT_EQ(read(fd, buffer, sizeof(buffer)), -1);
    EXPECT_EQ(errno, EAGAIN);

    int writer = open(path.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC);
    EXPECT_EQ(write(writer, "abc", 3), 3);
    close(writer);
    EXPECT_EQ(read(fd, buffer, sizeof(buffer)), 3);
    // With the last writer gone there is still no end-of-file.
    EXPECT_EQ(read(fd, buffer, sizeof(buffer)), -1);
    EXPECT_EQ(errno, EAGAIN);
    close(fd);
}

TEST_F(FifoCreateOpen, takes_whatever_exists_at_the_path)
{
    write_file(file, "plain");
    int fd = fifo_create_open(file.c_str());
    EXPECT_GE(fd, 0);
    EXPECT_TRUE(S_ISREG(mode_of(file)));
    EXPECT_EQ(read_file(file), "plain");
    close(fd);
}

TEST_F(FifoCreateOpen, failures_give_minus_one_and_the_systems_error)
{
    std::string path = missing + "/fifo";
    std::string log = log_of([&] {
        EXPECT_EQ(fifo_create_open(path.c_str()), -1);
        EXPECT_EQ(fifo_create_open(ROOT.c_str()), -1);
    });
    EXPECT_EQ(log, "ERROR[file.cpp:N](No such file or directory)mknod err:"
                   "ERROR[file.cpp:N](Is a directory)fopen err:");
}

TEST_F(Files, path_exists_tells_what_is_there)
{
    write_file(file, "");
    make_link(missing, ROOT + "/dead_link");
    EXPECT_TRUE(path_exists(file.c_str()));
    EXPECT_TRUE(path_exists(ROOT.c_str()));
    EXPECT_FALSE(path_exists(missing.c_str()));
    EXPECT_FALSE(path_exists((ROOT + "/dead_link").c_str()));
}
