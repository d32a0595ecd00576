#include "util/publish.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <string>

#include "support/capture.h"
#include "support/files.h"
#include "support/text.h"

using support::contains;
using support::exists;
using support::log_of;
using support::make_dir;
using support::make_link;
using support::read_file;
using support::write_file;

namespace {

constexpr size_t PAGE = 4096;

struct stat status_of(const std::string& path)
{
    struct stat info {};
    EXPECT_EQ(lstat(path.c_str(), &info), 0) << path;
    return info;
}

class FilePublish : public testing::Test {
protected:
    FilePublish()
    {
        support::remove_all(folder);
        make_dir(folder);
    }
    ~FilePublish() override
    {
        umount2(folder.c_str(), MNT_DETACH);
        support::remove_all(folder);
        umask(old_mask);
    }

    bool publish(const std::string& text)
    {
        return file_publish(file.c_str(), beside.c_str(), text.c_str());
    }

    // The folder becomes a filesystem with room for so many pages.
    void limit_pages(int pages, const std::string& more = "")
    {
        const std::string options = "size=" + std::to_string(pages * 4) + "k" + more;
        ASSERT_EQ(mount("tmpfs", folder.c_str(), "tmpfs", 0, options.c_str()), 0);
    }

    const mode_t old_mask = umask(022);
    const std::string folder = "/tmp/publish";
    const std::string file = folder + "/status";
    const std::string beside = folder + "/status.new";
};

// Reads until it is killed; ends by itself when it meets anything but one of the two texts.
pid_t start_reader(const std::string& path, const std::string& one, const std::string& other)
{
    const pid_t child = fork();
    if (child != 0) {
        return child;
    }
    while (true) {
        const std::string text = read_file(path);
        if (text != one && text != other) {
            _exit(text.empty() ? 1 : 2);
        }
    }
}

}  // namespace

TEST_F(FilePublish, a_new_file_has_the_mode_that_any_new_file_has)
{
    ASSERT_TRUE(publish("one"));
    EXPECT_EQ(read_file(file), "one");
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0644U);
    support::remove_all(file);
    umask(077);
    ASSERT_TRUE(publish("one"));
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0600U);
    EXPECT_FALSE(exists(beside));
}

TEST_F(FilePublish, whoever_has_the_old_file_open_still_reads_it_whole)
{
    ASSERT_TRUE(publish("the old one"));
    const int old = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    ASSERT_GE(old, 0);
    ASSERT_TRUE(publish("new"));
    char text[32]{};
    EXPECT_EQ(read(old, text, sizeof(text)), 11);
    EXPECT_STREQ(text, "the old one");
    EXPECT_EQ(read_file(file), "new");
    close(old);
}

TEST_F(FilePublish, mode_and_owner_stay_as_somebody_has_set_them)
{
    ASSERT_TRUE(publish("one"));
    ASSERT_EQ(chown(file.c_str(), 1234, 4321), 0);
    ASSERT_EQ(chmod(file.c_str(), 0640), 0);
    ASSERT_TRUE(publish("two"));
    EXPECT_EQ(read_file(file), "two");
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0640U);
    EXPECT_EQ(status_of(file).st_uid, 1234U);
    EXPECT_EQ(status_of(file).st_gid, 4321U);
    // Also one that the mask would not give.
    ASSERT_EQ(chmod(file.c_str(), 0666), 0);
    ASSERT_TRUE(publish("three"));
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0666U);
}

TEST_F(FilePublish, a_reader_in_a_tight_loop_finds_one_of_two_whole_documents)
{
    const std::string one(3 * PAGE + 1, '1');
    const std::string other(20, '2');
    ASSERT_TRUE(publish(one));
    const pid_t reader = start_reader(file, one, other);
    ASSERT_GT(reader, 0);
    for (int i = 0; i < 3000; ++i) {
        ASSERT_TRUE(publish(i % 2 == 0 ? other : one));
    }
    kill(reader, SIGKILL);
    int status = 0;
    ASSERT_EQ(waitpid(reader, &status, 0), reader);
    EXPECT_TRUE(WIFSIGNALED(status))
        << "the reader met nothing (1) or a part (2): " << WEXITSTATUS(status);
}

TEST_F(FilePublish, a_missing_directory_is_told)
{
    support::remove_all(folder);
    EXPECT_EQ(log_of([&] { EXPECT_FALSE(publish("one")); }),
              "ERROR[claim.cpp:N](No such file or directory)claim err, path = "
              "/tmp/publish/status.new\n"
              "publish.cpp(N)file not exist, fn = /tmp/publish/status\n");
}

TEST_F(FilePublish, in_a_full_filesystem_the_old_file_stays_and_the_log_says_why)
{
    limit_pages(2);
    ASSERT_TRUE(publish("old"));
    write_file(folder + "/filler", std::string(PAGE, 'f'));
    EXPECT_EQ(log_of([&] { EXPECT_FALSE(publish("new")); }),
              "publish.cpp(N)file write err, len = 3, ret = -1\n"
              "ERROR[publish.cpp:N](No space left on device)publish err, fn = "
              "/tmp/publish/status\n");
    EXPECT_EQ(read_file(file), "old");
    EXPECT_FALSE(exists(beside));
    support::remove_all(folder + "/filler");
    ASSERT_TRUE(publish("new"));
    EXPECT_EQ(read_file(file), "new");
}

TEST_F(FilePublish, with_room_for_half_of_it_the_old_file_stays)
{
    limit_pages(2);
    ASSERT_TRUE(publish("old"));
    const std::string log = log_of([&] { EXPECT_FALSE(publish(std::string(2 * PAGE, 'n'))); });
    EXPECT_TRUE(contains(log, "(No space left on device)publish err")) << log;
    EXPECT_EQ(read_file(file), "old");
    EXPECT_FALSE(exists(beside));
}

TEST_F(FilePublish, without_a_free_inode_the_old_file_stays)
{
    limit_pages(8, ",nr_inodes=2");
    write_file(file, "old");
    const std::string log = log_of([&] { EXPECT_FALSE(publish("new")); });
    EXPECT_TRUE(contains(log, "(No space left on device)claim err")) << log;
    EXPECT_EQ(read_file(file), "old");
}

TEST_F(FilePublish, a_directory_in_place_of_the_file_stays)
{
    make_dir(file + "/inside");
    const std::string log = log_of([&] { EXPECT_FALSE(publish("new")); });
    EXPECT_TRUE(contains(log, "publish err, fn = /tmp/publish/status\n")) << log;
    EXPECT_TRUE(exists(file + "/inside"));
    EXPECT_FALSE(exists(beside));
}

TEST_F(FilePublish, what_a_killed_run_left_beside_it_is_gone_with_the_next)
{
    write_file(beside, std::string(3 * PAGE, 'h'));
    ASSERT_EQ(chmod(beside.c_str(), 0666), 0);
    ASSERT_TRUE(publish("whole"));
    EXPECT_EQ(read_file(file), "whole");
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0644U);
    EXPECT_FALSE(exists(beside));
}

TEST_F(FilePublish, what_others_planted_beside_it_is_not_followed)
{
    write_file("/tmp/victim", "kept");
    make_link("/tmp/victim", beside);
    ASSERT_TRUE(publish("one"));
    ASSERT_EQ(link("/tmp/victim", beside.c_str()), 0);
    ASSERT_TRUE(publish("two"));
    ASSERT_EQ(mkfifo(beside.c_str(), 0666), 0);
    ASSERT_TRUE(publish("three"));
    make_dir(beside + "/inside");
    ASSERT_TRUE(publish("four"));
    EXPECT_EQ(read_file(file), "four");
    EXPECT_TRUE(S_ISREG(status_of(file).st_mode));
    EXPECT_EQ(read_file("/tmp/victim"), "kept");
    EXPECT_EQ(status_of("/tmp/victim").st_mode, S_IFREG | 0644U);
}

TEST_F(FilePublish, a_link_in_place_of_the_file_is_replaced_and_its_target_kept)
{
    write_file("/tmp/victim", "kept");
    ASSERT_EQ(chmod("/tmp/victim", 0600), 0);
    make_link("/tmp/victim", file);
    ASSERT_TRUE(publish("one"));
    EXPECT_EQ(read_file(file), "one");
    EXPECT_EQ(status_of(file).st_mode, S_IFREG | 0644U);
    EXPECT_EQ(read_file("/tmp/victim"), "kept");
}

TEST_F(FilePublish, nothing_is_published_without_a_path_or_text)
{
    EXPECT_FALSE(file_publish(nullptr, beside.c_str(), "x"));
    EXPECT_FALSE(file_publish(file.c_str(), nullptr, "x"));
    EXPECT_FALSE(file_publish(file.c_str(), beside.c_str(), nullptr));
    EXPECT_FALSE(exists(file));
}

TEST_F(FilePublish, no_descriptor_stays_open)
{
    const int before = dup(STDIN_FILENO);
    close(before);
    for (int i = 0; i < 5; ++i) {
        EXPECT_TRUE(publish("x"));
        EXPECT_FALSE(file_publish("/tmp/publish/missing/status", beside.c_str(), "x"));
    }
    const int after = dup(STDIN_FILENO);
    close(after);
    EXPECT_EQ(after, before);
}
