#include "disk/mount_table.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/disk_world.h"
#include "support/records.h"
#include "support/text.h"

using support::capture_stdout;
using support::contains;
using support::is_all_zero;

namespace {

class MountTable : public support::disk_world {
protected:
    mount_table table{};
};

struct numbers {
    int32_t main;
    int32_t sub;
    bool operator==(const numbers&) const = default;
};

numbers numbers_of(const char* path)
{
    numbers result{-1, -1};
    parse_mount_point_num(path, &result.main, &result.sub);
    return result;
}

}  // namespace

TEST_F(MountTable, a_mount_line_yields_device_path_and_both_numbers)
{
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(parse_mount_line(&table, "/dev/sdb1 on /tmp/mountd/disk2_part3 type vfat (rw)\n"),
                  0);
    });
    ASSERT_EQ(table.num, 1);
    EXPECT_STREQ(table.entries[0].dev, "/dev/sdb1");
    EXPECT_STREQ(table.entries[0].path, "/tmp/mountd/disk2_part3");
    EXPECT_EQ(table.entries[0].main, 2);
    EXPECT_EQ(table.entries[0].sub, 3);
    EXPECT_TRUE(contains(log, "get dev mount[0] /dev/sdb1 ==> /tmp/mountd/disk2_part3\n"));
    EXPECT_TRUE(contains(log, "mount pont[0] main = 2, sub = 3\n"));
    EXPECT_TRUE(contains(log, "get port = 2 3\n"));
}

TEST_F(MountTable, the_card_of_the_first_slot_is_taken_and_other_devices_and_places_are_skipped)
{
    EXPECT_EQ(parse_mount_line(&table, "/dev/mmcblk0p1 on /tmp/mountd/disk1_part1 type ext4 (rw)"),
              0);
    for (const char* line :
         {"/dev/mmcblk1p1 on /tmp/mountd/disk1_part1 type ext4 (rw)",
          "/dev/ubi0_0 on /tmp/mountd/disk1_part1 type ubifs (rw)",
          "/dev/hda1 on /tmp/mountd/disk1_part1 type ext4 (rw)",
          "/dev/loop0 on /tmp/mountd/disk1_part1 type ext4 (rw)",
          "/dev/sda1 on /mnt/sda1 type ext4 (rw)", "/dev/sda1 on /tmp/mount type ext4 (rw)",
          "tmpfs on /tmp/mountd type tmpfs (rw)",
          " /dev/sda1 on /tmp/mountd/disk1_part1 type ext4 (rw)", "", "\n"}) {
        EXPECT_EQ(parse_mount_line(&table, line), 1) << line;
    }
    EXPECT_EQ(table.num, 1);
    EXPECT_STREQ(table.entries[0].dev, "/dev/mmcblk0p1");
}

TEST_F(MountTable, a_line_that_ends_behind_the_path_is_taken_without_its_newline)
{
    EXPECT_EQ(parse_mount_line(&table, "/dev/sda1 on /tmp/mountd/disk1_part12\n"), 0);
    EXPECT_STREQ(table.entries[0].path, "/tmp/mountd/disk1_part12");
    EXPECT_EQ(table.entries[0].sub, 12);
}

TEST_F(MountTable, a_path_without_digits_is_kept_with_numbers_0)
{
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(parse_mount_line(&table, "/dev/sda1 on /tmp/mountd/usbdisk type vfat (rw)"), 0);
    });
    EXPECT_STREQ(table.entries[0].path, "/tmp/mountd/usbdisk");
    EXPECT_EQ(table.entries[0].main, 0);
    EXPECT_EQ(table.entries[0].sub, 0);
    EXPECT_TRUE(contains(log, "err str = isk\n")) << log;
}

TEST_F(MountTable, numbers_are_taken_behind_16_characters_that_are_not_compared)
{
    EXPECT_EQ(numbers_of("/tmp/mountd/disk2_part3"), (numbers{2, 3}));
    EXPECT_EQ(numbers_of("/tmp/mountd/disk12_part34"), (numbers{12, 34}));
    EXPECT_EQ(numbers_of("0123456789ABCDEF7_8"), (numbers{7, 8}));
    EXPECT_EQ(numbers_of("/tmp/mountd/disks9_x4"), (numbers{9, 4}));
}

TEST_F(MountTable, paths_without_numbers_leave_the_outputs_untouched)
{
    for (const char* path : {"/tmp/mountd/disk", "/tmp/mountd", "", "/tmp/mountd/disk5",
                             "/tmp/mountd/disk5_part", "/tmp/mountd/disk_part"}) {
        numbers result{};
        const std::string log = capture_stdout([&] { result = numbers_of(path); });
        EXPECT_EQ(result, (numbers{-1, -1})) << path;
        EXPECT_TRUE(contains(log, "err str = ")) << path;
    }
    const std::string log = capture_stdout([] {
        EXPECT_EQ(numbers_of(nullptr), (numbers{-1, -1}));
    });
    EXPECT_TRUE(contains(log, "err!\n"));
}

TEST_F(MountTable, each_number_may_be_left_out)
{
    int32_t number = 0;
    parse_mount_point_num("/tmp/mountd/disk2_part3", &number, nullptr);
    EXPECT_EQ(number, 2);
    parse_mount_point_num("/tmp/mountd/disk2_part3", nullptr, &number);
    EXPECT_EQ(number, 3);
}

TEST_F(MountTable, a_17th_line_is_left_out_and_the_16_before_stay)
{
    for (int i = 1; i <= 18; ++i) {
        char line[80];
        snprintf(line, sizeof(line), "/dev/sda%d on /tmp/mountd/disk%d_part1 type ext4 (rw)", i, i);
        EXPECT_EQ(parse_mount_line(&table, line), i <= MOUNT_TABLE_SIZE ? 0 : 1) << i;
    }
    EXPECT_EQ(table.num, 16);
    EXPECT_STREQ(table.entries[0].dev, "/dev/sda1");
    EXPECT_STREQ(table.entries[15].dev, "/dev/sda16");
    EXPECT_EQ(table.entries[15].main, 16);
}

TEST_F(MountTable, over_long_device_and_path_are_cut_and_stay_terminated)
{
    const std::string dev = "/dev/sd" + std::string(60, 'a');
    const std::string path = "/tmp/mountd/" + std::string(200, 'p');
    EXPECT_EQ(parse_mount_line(&table, (dev + " on " + path + " type ext4 (rw)").c_str()), 0);
    EXPECT_EQ(std::string(table.entries[0].dev), dev.substr(0, 31));
    EXPECT_EQ(std::string(table.entries[0].path), path.substr(0, 127));
    EXPECT_EQ(table.num, 1);
    EXPECT_TRUE(is_all_zero(table.entries[1]));
}

TEST_F(MountTable, the_last_entry_with_over_long_fields_leaves_the_count_alone)
{
    table.num = 15;
    const std::string line = "/dev/sd" + std::string(300, 'a') + " on /tmp/mountd/disk1_part1" +
                             std::string(300, '1') + " type";
    EXPECT_EQ(parse_mount_line(&table, line.c_str()), 0);
    EXPECT_EQ(table.num, 16);
}

TEST_F(MountTable, reading_starts_from_zero_runs_mount_and_deletes_the_scratch_file)
{
    memset(&table, 'x', sizeof(table));
    add_mount("/dev/sdb1", "/tmp/mountd/disk2_part1");
    add_mount("proc", "/proc");
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    EXPECT_EQ(read_mount_table(&table), 0);
    ASSERT_EQ(table.num, 2);
    EXPECT_STREQ(table.entries[0].dev, "/dev/sdb1") << "in the order of the listing";
    EXPECT_STREQ(table.entries[1].dev, "/dev/sda1");
    EXPECT_TRUE(is_all_zero(table.entries[2]));
    EXPECT_EQ(stubs.calls(), std::vector<std::string>{"mount"});
    EXPECT_FALSE(std::filesystem::exists("/tmp/mount.txt"));
}

TEST_F(MountTable, a_listing_that_cannot_be_opened_gives_1_and_an_empty_snapshot)
{
    table.num = 3;
    stubs.add("mount", "rm -f /tmp/mount.txt");
    const std::string log = capture_stdout([&] { EXPECT_EQ(read_mount_table(&table), 1); });
    EXPECT_TRUE(contains(log, "err, fn = /tmp/mount.txt\n")) << log;
    EXPECT_TRUE(is_all_zero(table));
    EXPECT_EQ(is_dev_mounted("/dev/sda1"), 0);
    EXPECT_EQ(is_path_mounted("/tmp/mountd/disk1_part1"), 0);
    EXPECT_EQ(get_dev_mount_path("/dev/sda1", nullptr), 0);
}

TEST_F(MountTable, a_failing_mount_command_gives_an_empty_snapshot)
{
    stubs.add("mount", "exit 1");
    EXPECT_EQ(read_mount_table(&table), 0);
    EXPECT_EQ(table.num, 0);
}

TEST_F(MountTable, entries_are_found_by_exact_device_and_path)
{
    parse_mount_line(&table, "/dev/sda1 on /tmp/mountd/disk1_part1 type ext4 (rw)");
    parse_mount_line(&table, "/dev/sda11 on /tmp/mountd/disk1_part11 type ext4 (rw)");
    EXPECT_EQ(find_mount_by_dev(&table, "/dev/sda1"), 0);
    EXPECT_EQ(find_mount_by_dev(&table, "/dev/sda11"), 1);
    EXPECT_EQ(find_mount_by_dev(&table, "/dev/sda"), -1);
    EXPECT_EQ(find_mount_by_path(&table, "/tmp/mountd/disk1_part11"), 1);
    EXPECT_EQ(find_mount_by_path(&table, "/tmp/mountd/disk1_part"), -1);
    EXPECT_EQ(find_mount_by_path(&table, nullptr), -1);
}

TEST_F(MountTable, what_is_mounted_is_read_afresh_each_time)
{
    EXPECT_EQ(is_dev_mounted("/dev/sda1"), 0);
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    EXPECT_EQ(is_dev_mounted("/dev/sda1"), 1);
    EXPECT_EQ(is_dev_mounted("/dev/sda"), 0);
    EXPECT_EQ(is_path_mounted("/tmp/mountd/disk1_part1"), 1);
    EXPECT_EQ(is_path_mounted("/tmp/mountd/disk1_part2"), 0);
    EXPECT_EQ(stubs.calls().size(), 5U);
}

TEST_F(MountTable, a_device_mounted_twice_gives_its_last_path)
{
    add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
    add_mount("/dev/sdb1", "/tmp/mountd/disk2_part1");
    add_mount("/dev/sda1", "/tmp/mountd/disk5_part1");
    char path[MOUNT_PATH_SIZE];
    memset(path, 'x', sizeof(path));
    EXPECT_EQ(get_dev_mount_path("/dev/sda1", path), 1);
    EXPECT_STREQ(path, "/tmp/mountd/disk5_part1");
    EXPECT_EQ(get_dev_mount_path("/dev/sdc1", path), 0);
    EXPECT_STREQ(path, "/tmp/mountd/disk5_part1");
}

TEST_F(MountTable, a_missing_argument_counts_as_mounted)
{
    const std::string log = capture_stdout([] {
        EXPECT_EQ(is_dev_mounted(nullptr), 1);
        EXPECT_EQ(is_path_mounted(nullptr), 1);
        EXPECT_EQ(get_dev_mount_path(nullptr, nullptr), 1);
    });
    EXPECT_EQ(support::count_of(log, "err!\n"), 3);
    EXPECT_TRUE(stubs.calls().empty());
}
