#include "util/mount_cmd.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/files.h"
#include "support/stubs.h"
#include "support/text.h"

using support::contains;
using support::log_of;

namespace {

using lines = std::vector<std::string>;

std::string filled_in(const char* format, const char* device, const char* directory)
{
    char command[128];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    snprintf(command, sizeof(command), format, device, directory);
#pragma GCC diagnostic pop
    return command;
}

}  // namespace

TEST(MountCommand, is_that_of_the_filesystems_row)
{
    for (const filesystem& row : FILESYSTEMS) {
        EXPECT_STREQ(fs_mount_cmd_format(row.code), row.mount) << row.name;
    }
}

TEST(MountCommand, numbers_that_are_no_code_have_none)
{
    for (int32_t number : {FS_CODE_COUNT, -1, 1000, INT32_MAX, INT32_MIN}) {
        EXPECT_EQ(fs_mount_cmd_format(static_cast<fs_code>(number)), nullptr) << number;
    }
}

TEST(MountCommand, a_space_in_an_argument_makes_two_shell_words)
{
    support::stub_programs stubs;
    stubs.add("mount", "echo $# >/run/words");
    std::string plain = filled_in(fs_mount_cmd_format(FS_EXFAT), "/dev/sda1", "/tmp/mountd/a");
    std::string spaced = filled_in(fs_mount_cmd_format(FS_EXFAT), "/dev/sda1", "/tmp/mountd/a b");
    ASSERT_EQ(system(plain.c_str()), 0);
    EXPECT_EQ(support::read_file("/run/words"), "4\n");
    ASSERT_EQ(system(spaced.c_str()), 0);
    EXPECT_EQ(support::read_file("/run/words"), "5\n");
    support::remove_all("/run/words");
}

TEST(RepairCommand, each_family_runs_its_checker)
{
    struct {
        int (*repair)(const char*);
        const char* command;
    } cases[] = {
        {fs_repair_ntfs, "ntfsfix /dev/sda1"},      {fs_repair_exfat, "fsck.exfat /dev/sda1"},
        {fs_repair_ext2, "fsck.ext2 -a /dev/sda1"}, {fs_repair_ext3, "fsck.ext3 -a /dev/sda1"},
        {fs_repair_ext4, "fsck.ext4 -a /dev/sda1"}, {fs_repair_fat, "fsck.fat -a /dev/sda1"},
    };
    for (const auto& c : cases) {
        support::stub_programs stubs;
        for (const char* name :
             {"ntfsfix", "fsck.exfat", "fsck.ext2", "fsck.ext3", "fsck.ext4", "fsck.fat"}) {
            stubs.add(name, "exit 8");
        }
        std::string log = log_of([&] { EXPECT_EQ(c.repair("/dev/sda1"), 0); });
        EXPECT_EQ(stubs.calls(), lines{c.command});
        EXPECT_TRUE(contains(log, std::string("exec cmd = ") + c.command + "\n")) << log;
    }
}

TEST(RepairCommand, of_a_type_without_one_runs_nothing)
{
    const std::string log = log_of([] {
        EXPECT_EQ(fs_repair(FS_HFSPLUS, "/dev/sda1"), 1);
        EXPECT_EQ(fs_repair(FS_NONE, "/dev/sda1"), 1);
        EXPECT_EQ(fs_repair(static_cast<fs_code>(1000), "/dev/sda1"), 1);
    });
    EXPECT_EQ(log, "");
}

TEST(RepairCommand, a_command_that_is_killed_is_tried_once_and_gives_zero)
{
    support::stub_programs stubs;
    stubs.add("ntfsfix", "kill -KILL $$");
    support::capture_stderr([&] { log_of([&] { EXPECT_EQ(fs_repair_ntfs("x"), 0); }); });
    EXPECT_EQ(stubs.calls(), lines{"ntfsfix x"});
}

TEST(RepairCommand, is_cut_at_127_characters)
{
    for (size_t length : {118U, 119U, 120U}) {
        support::stub_programs stubs;
        stubs.add("ntfsfix");
        std::string path(length, 'a');
        log_of([&] { fs_repair_ntfs(path.c_str()); });
        EXPECT_EQ(stubs.calls(), lines{("ntfsfix " + path).substr(0, 127)});
    }
}

TEST(RepairCommand, of_a_name_that_a_shell_would_read_runs_nothing)
{
    const std::string log =
        log_of([] { EXPECT_EQ(fs_repair_fat("/dev/sda1;touch /run/harm"), 0); });
    EXPECT_FALSE(contains(log, "exec cmd")) << log;
    EXPECT_TRUE(contains(log, "repair err, dev = /dev/sda1;touch /run/harm\n")) << log;
}

class UmountDirEntries : public testing::Test {
protected:
    UmountDirEntries()
    {
        support::remove_all(dir);
        stubs.add("umount", "exit 32");
    }
    ~UmountDirEntries() override { support::remove_all(dir); }

    support::stub_programs stubs;
    const std::string dir = "/tmp/mountd";
};

TEST_F(UmountDirEntries, unmounts_every_entry_that_is_not_hidden)
{
    support::make_dir(dir + "/disk1_part1");
    support::make_dir(dir + "/disk2_part1");
    support::make_dir(dir + "/.hidden");
    support::make_dir(dir + "/..more");
    std::string log = log_of([&] { EXPECT_EQ(umount_dir_entries(dir.c_str()), 0); });
    lines calls = stubs.calls();
    std::sort(calls.begin(), calls.end());
    EXPECT_EQ(calls, (lines{"umount /tmp/mountd/disk1_part1", "umount /tmp/mountd/disk2_part1"}));
    EXPECT_TRUE(contains(log, "exec cmd = umount /tmp/mountd/disk1_part1\n")) << log;
}

TEST_F(UmountDirEntries, names_that_a_shell_would_read_reach_no_command)
{
    support::make_dir(dir + "/$(touch harm)");
    support::make_dir(dir + "/disk1_part1");
    std::string log = log_of([&] { EXPECT_EQ(umount_dir_entries(dir.c_str()), 0); });
    EXPECT_EQ(stubs.calls(), lines{"umount /tmp/mountd/disk1_part1"});
    EXPECT_TRUE(contains(log, "umount err, target = /tmp/mountd/$(touch harm)\n")) << log;
}

TEST_F(UmountDirEntries, of_an_empty_directory_runs_nothing)
{
    support::make_dir(dir);
    std::string log = log_of([&] { EXPECT_EQ(umount_dir_entries(dir.c_str()), 0); });
    EXPECT_EQ(log, "");
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(UmountDirEntries, of_a_missing_directory_fails)
{
    std::string log = log_of([&] { EXPECT_EQ(umount_dir_entries(dir.c_str()), 1); });
    EXPECT_EQ(log, "ERROR[mount_cmd.cpp:N]open dir err, dir = /tmp/mountd\n");
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(UmountDirEntries, cuts_its_command_at_255_characters)
{
    // "umount /tmp/mountd/" is 19 characters.
    std::string name(250, 'a');
    support::make_dir(dir + "/" + name);
    log_of([&] { umount_dir_entries(dir.c_str()); });
    EXPECT_EQ(stubs.calls(), lines{"umount /tmp/mountd/" + name.substr(0, 236)});
}
