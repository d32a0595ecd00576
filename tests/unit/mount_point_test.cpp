#include "disk/mount_point.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "disk/disk_sets.h"
#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"

using support::capture_stdout;
using support::contains;
using support::put_part;
using support::put_root;

namespace {

class MountPoint : public support::disk_world {
protected:
    // Disks in use in entries 0.. with these numbers; 0 stands for the disk that is being added.
    void put_numbers(const std::vector<int>& numbers)
    {
        sets = {};
        int place = 0;
        for (const int number : numbers) {
            put_root(&sets.entries[place], "sda", 1);
            sets.entries[place++].disk.root.mount_point_num = number;
        }
    }

    disk_sets sets{};
};

void mount_numbers(int first, int last)
{
    std::string listing;
    for (int i = first; i <= last; ++i) {
        listing += "/dev/sdz" + std::to_string(i) + " on /tmp/mountd/disk" + std::to_string(i) +
                   "_part1 type ext4 (rw)\n";
    }
    support::write_file(support::MOUNTS_FILE, listing);
}

}  // namespace

TEST_F(MountPoint, a_new_disk_gets_the_first_number_that_no_disk_has)
{
    const struct {
        std::vector<int> present;
        int expected;
    } cases[] = {
        {{0}, 1},
        {{1, 3, 0}, 2},
        {{1, 0, 3}, 2},
        {{1, 2, 0}, 3},
        {{1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 0}, 16},
    };
    for (const auto& c : cases) {
        put_numbers(c.present);
        const std::string log =
            capture_stdout([&] { EXPECT_EQ(get_mount_point_num(&sets), c.expected); });
        const std::string number = std::to_string(c.expected);
        EXPECT_TRUE(contains(log, "point num = " + number + "\n")) << log;
    }
}

TEST_F(MountPoint, a_number_under_which_something_is_mounted_is_not_given)
{
    const struct {
        std::vector<int> present;
        const char* mounted;
        int expected;
    } cases[] = {
        {{0}, "/tmp/mountd/disk1_part1", 2},
        {{1, 3, 0}, "/tmp/mountd/disk2_part4", 3},
        {{0}, "/tmp/mountd/usbdisk", 1},
    };
    for (const auto& c : cases) {
        put_numbers(c.present);
        support::remove_all(support::MOUNTS_FILE);
        add_mount("/dev/sdq1", c.mounted);
        EXPECT_EQ(get_mount_point_num(&sets), c.expected) << c.mounted;
    }
}

TEST_F(MountPoint, when_all_16_candidates_are_mounted_the_17th_is_taken_untested)
{
    put_numbers({0});
    mount_numbers(1, 15);
    EXPECT_EQ(get_mount_point_num(&sets), 16);
    mount_numbers(1, 16);
    EXPECT_EQ(get_mount_point_num(&sets), 17);
    put_numbers({1, 2, 0});
    mount_numbers(3, 18);
    EXPECT_EQ(get_mount_point_num(&sets), 19);
}

TEST_F(MountPoint, free_entries_between_disks_do_not_end_the_walk)
{
    put_root(&sets.entries[2], "sda", 1);
    sets.entries[2].disk.root.mount_point_num = 1;
    put_root(&sets.entries[9], "sdb", 1);
    EXPECT_EQ(get_mount_point_num(&sets), 2);
}

TEST_F(MountPoint, numbering_all_disks_follows_the_table_and_passes_over_mounted_numbers)
{
    put_root(&sets.entries[0], "sda", 1);
    put_root(&sets.entries[3], "sdb", 1);
    put_root(&sets.entries[4], "sdc", 1);
    put_part(&sets.entries[3].disk, 1, "sdb1", 2000);
    add_mount("/dev/sdx1", "/tmp/mountd/disk2_part1");
    add_mount("/dev/sdy1", "/tmp/mountd/disk3_part1");
    const std::string log = capture_stdout([&] { EXPECT_EQ(set_all_mount_point_num(&sets), 0); });
    EXPECT_EQ(sets.entries[0].disk.root.mount_point_num, 1);
    EXPECT_EQ(sets.entries[3].disk.root.mount_point_num, 4);
    EXPECT_EQ(sets.entries[4].disk.root.mount_point_num, 5);
    EXPECT_EQ(sets.entries[3].disk.parts[1].part.mount_point_num, 2);
    EXPECT_TRUE(contains(log, "=== ===> set[3] mount point num = 4\n"));
    EXPECT_TRUE(support::is_all_zero(sets.entries[1]));
    EXPECT_EQ(times_called("mount"), 1) << "one snapshot for all";
}

TEST_F(MountPoint, numbering_all_disks_takes_the_17th_when_16_candidates_are_mounted)
{
    put_root(&sets.entries[0], "sda", 1);
    put_root(&sets.entries[1], "sdb", 1);
    mount_numbers(1, 16);
    set_all_mount_point_num(&sets);
    EXPECT_EQ(sets.entries[0].disk.root.mount_point_num, 17);
    EXPECT_EQ(sets.entries[1].disk.root.mount_point_num, 18);
}

TEST_F(MountPoint, part_numbers_follow_the_slots_and_start_at_2_behind_a_whole_disk_filesystem)
{
    disk_obj& disk = sets.entries[0].disk;
    put_root(&sets.entries[0], "sda", 1);
    for (const int slot : {0, 1, 4}) {
        put_part(&disk, slot, "sda1", 2000);
    }
    disk.parts[2].part.mount_point_num = 77;
    number_sub_parts(&disk);
    EXPECT_EQ(disk.parts[0].part.mount_point_num, 1);
    EXPECT_EQ(disk.parts[1].part.mount_point_num, 2);
    EXPECT_EQ(disk.parts[4].part.mount_point_num, 5);
    EXPECT_EQ(disk.parts[2].part.mount_point_num, 77) << "slots not in use keep their number";

    disk.root.fs_type = FS_EXT4;
    number_sub_parts(&disk);
    EXPECT_EQ(disk.parts[0].part.mount_point_num, 2);
    EXPECT_EQ(disk.parts[1].part.mount_point_num, 3);
    EXPECT_EQ(disk.parts[4].part.mount_point_num, 6);
}

TEST_F(MountPoint, a_part_that_is_mounted_already_takes_over_its_path_and_name)
{
    part_info part = support::make_part("sda1", 2000);
    EXPECT_EQ(check_part_mounted(&part), 0);
    EXPECT_STREQ(part.mount_path, "");
    add_mount("/dev/sda1", "/tmp/mountd/disk3_part2");
    const std::string log = capture_stdout([&] { EXPECT_EQ(check_part_mounted(&part), 1); });
    EXPECT_STREQ(part.mount_path, "/tmp/mountd/disk3_part2");
    EXPECT_STREQ(part.disk_name, "disk3_part2");
    EXPECT_EQ(part.mount_status, 0) << "the caller marks it";
    EXPECT_TRUE(contains(log, "]already mounted, dev = /dev/sda1\n"));
    EXPECT_TRUE(contains(log, "get disk name = disk3_part2\n"));
}

TEST_F(MountPoint, checking_all_disks_marks_what_is_mounted_and_nothing_else)
{
    put_root(&sets.entries[0], "sda", 1);
    put_part(&sets.entries[0].disk, 0, "sda1", 2000);
    put_part(&sets.entries[0].disk, 5, "sda2", 2000);
    put_root(&sets.entries[1], "sdb", 1);
    add_mount("/dev/sda2", "/tmp/mountd/disk1_part6");
    add_mount("/dev/sdb", "/tmp/mountd/disk2_part1");
    const std::string log = capture_stdout([&] { EXPECT_EQ(check_disks_mounted(&sets), 0); });
    EXPECT_EQ(sets.entries[0].disk.root.mount_status, 0);
    EXPECT_EQ(sets.entries[0].disk.parts[0].part.mount_status, 0);
    EXPECT_EQ(sets.entries[0].disk.parts[5].part.mount_status, 1);
    EXPECT_EQ(sets.entries[1].disk.root.mount_status, 1);
    EXPECT_STREQ(sets.entries[1].disk.root.disk_name, "disk2_part1");
    for (const char* line :
         {"=== === ===> check disk is alread mountd\n", "]root part Not mounted, dev = sda\n",
          "]root part already mounted, dev = sdb\n", "check mount sub part, i = 5, name = sda2\n",
          "===> is already mountd\n", "===> Not mountd\n"}) {
        EXPECT_TRUE(contains(log, line)) << line;
    }
    EXPECT_EQ(times_called("mount"), 4) << "one look for each part";
}

TEST_F(MountPoint, two_devices_on_one_path_are_reported_with_both_pairs)
{
    EXPECT_EQ(check_mount_path_dup(), 0);
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdb1", "/tmp/mountd/disk1_part11");
    EXPECT_EQ(check_mount_path_dup(), 0);
    add_mount("/dev/sdc1", "/tmp/mountd/disk1_part1");
    const std::string log = capture_stdout([] { EXPECT_EQ(check_mount_path_dup(), 1); });
    EXPECT_TRUE(contains(log, "=== check mount path err\n"));
    EXPECT_TRUE(contains(log, "mount dev num = 3\n"));
    EXPECT_TRUE(contains(log, "mount path err:\n"));
    EXPECT_TRUE(contains(log, "/dev/sda1 ===> /tmp/mountd/disk1_part1\n"));
    EXPECT_TRUE(contains(log, "/dev/sdc1 ===> /tmp/mountd/disk1_part1\n"));
}

TEST_F(MountPoint, a_mounted_device_whose_node_is_gone_is_reported)
{
    EXPECT_EQ(check_mount_dev_exist(), 0);
    plug_disk("sda", "", 1);
    add_mount("/dev/sda", "/tmp/mountd/disk1_part1");
    EXPECT_EQ(check_mount_dev_exist(), 0);
    add_mount("/dev/sdb", "/tmp/mountd/disk2_part1");
    const std::string log = capture_stdout([] { EXPECT_EQ(check_mount_dev_exist(), 1); });
    EXPECT_TRUE(contains(log, "=== check mount path err\n"));
    EXPECT_TRUE(contains(log, "check mount dev err, dev[1] = /dev/sdb\n"));
    EXPECT_TRUE(contains(log, "]dev not find, dev = /dev/sdb\n"));
}

TEST_F(MountPoint, a_device_that_cannot_be_looked_at_is_not_taken_for_gone)
{
    // A look that ends with ELOOP stands for one that the kernel has no memory for.
    ASSERT_EQ(symlink("/dev/sdb", "/dev/sdb"), 0);
    add_mount("/dev/sdb", "/tmp/mountd/disk2_part1");
    EXPECT_EQ(check_mount_dev_exist(), 0);
    support::remove_all("/dev/sdb");
}

TEST_F(MountPoint, a_mount_listing_that_cannot_be_read_is_nothing_to_complain_of)
{
    // Both faults are there; but a "yes" from either would cost the database.
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdb1", "/tmp/mountd/disk1_part1");
    capture_stdout([] {
        ASSERT_EQ(check_mount_path_dup(), 1);
        ASSERT_EQ(check_mount_dev_exist(), 1);
    });
    stubs.add("mount", "rm -f /tmp/mount.txt");
    for (int (*const check)() : {check_mount_path_dup, check_mount_dev_exist}) {
        const std::string log = capture_stdout([&] { EXPECT_EQ(check(), 0); });
        EXPECT_TRUE(contains(log, "]err, fn = /tmp/mount.txt\n")) << log;
        EXPECT_FALSE(contains(log, "=== check mount path err\n"))
            << "nothing is looked at: " << log;
    }
}

TEST_F(MountPoint, the_forced_unmount_names_each_device_and_then_its_path)
{
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdz1", "/mnt/elsewhere");
    add_mount("/dev/mmcblk0p1", "/tmp/mountd/disk2_part1");
    umount_all_force();
    EXPECT_EQ(actions(), (std::vector<std::string>{
                             "umount -f /dev/sda1", "umount -f /tmp/mountd/disk1_part1",
                             "umount -f /dev/mmcblk0p1", "umount -f /tmp/mountd/disk2_part1"}));
}

TEST_F(MountPoint, names_in_the_mount_table_that_a_shell_would_read_reach_no_command)
{
    add_mount("/dev/sd;touch$IFS/run/harm;", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdb1", "/home/u/tmp/mountd/$(touch$IFS/run/harm)");
    add_mount("/dev/sdc1", "/tmp/mountd/../../overlay");
    const std::string log = capture_stdout([] { umount_all_force(); });
    EXPECT_EQ(actions(), (std::vector<std::string>{"umount -f /tmp/mountd/disk1_part1",
                                                   "umount -f /dev/sdb1", "umount -f /dev/sdc1"}));
    EXPECT_TRUE(contains(log, "]umount err, target = /dev/sd;touch$IFS/run/harm;\n")) << log;
    EXPECT_FALSE(std::filesystem::exists("/run/harm"));
}

TEST_F(MountPoint, null_arguments_are_answered_with_1)
{
    EXPECT_EQ(set_all_mount_point_num(nullptr), 1);
    EXPECT_EQ(check_disks_mounted(nullptr), 1);
}
