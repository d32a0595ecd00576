#include "disk/mount.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "disk/discovery.h"
#include "disk/disk_db.h"
#include "disk/disk_sets.h"
#include "disk/mount_point.h"
#include "disk/removal.h"
#include "support/capture.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"
#include "util/waits.h"

using support::capture_stdout;
using support::contains;
using support::put_part;
using support::put_root;

namespace {

constexpr char TABLE_DETAILS[] = R"(PTUUID="12345678" PTTYPE="dos")";

class Mount : public support::disk_world {
protected:
    // A numbered disk with one ext4 partition in slot 0, ready to be mounted.
    part_info* put_ready_part(int place, int disk_number, const char* uid)
    {
        const std::string disk = "sd" + std::string(1, static_cast<char>('a' + place));
        put_root(&sets.entries[place], disk.c_str(), 50000);
        sets.entries[place].disk.root.mount_point_num = disk_number;
        part_info* part = put_part(&sets.entries[place].disk, 0, (disk + "1").c_str(), 4000);
        part->mount_point_num = 1;
        part->fs_type = FS_EXT4;
        text_copy(part->uid, uid);
        return part;
    }

    // What the database remembers for the uid, as "dev_name disk_name mount_path mountd".
    static std::string remembered(const char* uid)
    {
        disk_db_record record{};
        if (disk_db_get(uid, &record) != 0) {
            return "nothing";
        }
        return std::string(record.dev_name) + " " + record.disk_name + " " + record.mount_path +
               (record.mountd == 1 ? " yes" : " no");
    }

    static void remember(const char* uid, const char* dev_name, const char* disk_name)
    {
        disk_db_record record{};
        text_copy(record.uid, uid);
        text_copy(record.dev_name, dev_name);
        text_copy(record.disk_name, disk_name);
        path_mount_dir(record.mount_path, disk_name);
        disk_db_add(&record);
    }

    void plug_with_part(const std::string& disk, const std::string& uuid, uint64_t mib)
    {
        plug_disk(disk, TABLE_DETAILS, mib + 1);
        plug_part(disk, disk + "1", "UUID=\"" + uuid + R"(" TYPE="ext4")", mib);
    }

    support::skipped_sleeps no_sleep;
    disk_sets sets{};
};

}  // namespace

TEST_F(Mount, a_partition_is_mounted_in_its_directory_with_its_filesystems_command)
{
    part_info* part = put_ready_part(0, 3, "U-1");
    part->mount_point_num = 2;
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_EQ(part->mount_status, 1);
    EXPECT_STREQ(part->disk_name, "disk3_part2");
    EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk3_part2");
    EXPECT_EQ(actions(), std::vector<std::string>{
                             "mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk3_part2"});
    struct stat info {};
    ASSERT_EQ(stat("/tmp/mountd/disk3_part2", &info), 0);
    EXPECT_EQ(info.st_mode & 0666U, 0666U);
    EXPECT_EQ(remembered("U-1"), "sda1 disk3_part2 /tmp/mountd/disk3_part2 yes");
    EXPECT_EQ(support::the_clock.slept_ms, WAITS.mount[0]) << "one pause before the first look";
    EXPECT_TRUE(contains(log, "*** *** *** mount part, status = 0\n"));
    EXPECT_EQ(support::count_of(log, "mout path = /tmp/mountd/disk3_part2\n"), 2);
    EXPECT_TRUE(contains(log, "mount OK, /dev/sda1 ==> /tmp/mountd/disk3_part2\n"));
    EXPECT_LT(log.find("exec cmd = mkdir -p"), log.find("exec cmd = chmod a+wr "));
    EXPECT_LT(log.find("exec cmd = chmod a+wr "), log.find("exec cmd = mount -t"));
}

TEST_F(Mount, the_whole_disk_takes_part_1_whatever_its_number)
{
    put_root(&sets.entries[0], "sda", 4000);
    part_info* root = &sets.entries[0].disk.root;
    root->fs_type = FS_FAT;
    root->mount_point_num = 7;
    mount_part(root);
    EXPECT_STREQ(root->mount_path, "/tmp/mountd/disk7_part1");
    EXPECT_EQ(actions(),
              std::vector<std::string>{"mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 "
                                       "/dev/sda /tmp/mountd/disk7_part1"});
}

TEST_F(Mount, a_whole_disk_filesystem_is_mounted_as_part_1_and_its_partitions_from_part_2)
{
    put_root(&sets.entries[0], "sda", 9000);
    support::make_dir("/sys/block/sda");
    sets.entries[0].disk.root.fs_type = FS_EXT4;
    put_part(&sets.entries[0].disk, 0, "sda1", 4000)->fs_type = FS_NTFS;
    mount_all(&sets);
    EXPECT_STREQ(sets.entries[0].disk.root.mount_path, "/tmp/mountd/disk1_part1");
    EXPECT_STREQ(sets.entries[0].disk.parts[0].part.mount_path, "/tmp/mountd/disk1_part2");
    EXPECT_EQ(actions()[1], "mount.ntfs-3g -o noatime,big_writes,async,force /dev/sda1 "
                            "/tmp/mountd/disk1_part2");
}

TEST_F(Mount, a_partitioned_disk_mounts_its_first_partition_as_part_1_and_never_the_whole_device)
{
    put_ready_part(0, 0, "U-1");
    const std::string log = capture_stdout([&] { mount_all(&sets); });
    EXPECT_EQ(actions(), std::vector<std::string>{
                             "mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk1_part1"});
    EXPECT_TRUE(contains(log, "]root path fs type err\n"));
}

TEST_F(Mount, a_mounted_part_is_left_alone)
{
    part_info* part = put_ready_part(0, 1, "U-1");
    part->mount_status = 1;
    text_copy(part->disk_name, "disk1_part1");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_TRUE(contains(log, "]already mount sda1 ==> "));
    EXPECT_STREQ(part->disk_name, "disk1_part1");
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Mount, a_device_that_the_system_has_mounted_already_loses_its_name_and_keeps_its_status)
{
    part_info* part = put_ready_part(0, 1, "U-1");
    text_copy(part->disk_name, "disk1_part1");
    add_mount("/dev/sda1", "/tmp/mountd/disk5_part5");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_STREQ(part->disk_name, "");
    EXPECT_EQ(part->mount_status, 0);
    EXPECT_TRUE(contains(log, "]already mounted, dev = /dev/sda1\n"));
    EXPECT_TRUE(actions().empty());
    EXPECT_EQ(remembered("U-1"), "nothing");
}

TEST_F(Mount, an_unknown_filesystem_stays_unmounted_and_gets_no_directory)
{
    for (const fs_code type : {FS_NONE, FS_ERR, FS_MBR, FS_EFI, FS_EXTENDED}) {
        part_info* part = put_ready_part(0, 1, "U-1");
        part->fs_type = type;
        const std::string log = capture_stdout([&] { mount_part(part); });
        EXPECT_TRUE(contains(log, "]err fs type = ")) << type;
        EXPECT_EQ(part->mount_status, 0);
    }
    EXPECT_TRUE(actions().empty());
    EXPECT_FALSE(std::filesystem::exists("/tmp/mountd/disk1_part1"));
}

TEST_F(Mount, a_device_that_no_command_may_name_is_given_up_at_once)
{
    part_info* part = put_ready_part(0, 1, "U-1");
    text_copy(part->dev_name, "sda1;x");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_EQ(part->mount_status, 0);
    EXPECT_EQ(support::the_clock.slept_ms, 0);
    EXPECT_TRUE(contains(log, "]=== === === mount ERROR, /dev/sda1;x ==> "));
    EXPECT_FALSE(contains(log, "exec cmd = mount -t"));
}

TEST_F(Mount, a_mount_that_never_appears_is_given_up_after_18_seconds)
{
    support::write_file(support::MOUNT_REFUSES, "");
    part_info* part = put_ready_part(0, 1, "U-1");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_EQ(part->mount_status, 0);
    EXPECT_EQ(support::the_clock.slept_ms, 18000);
    EXPECT_TRUE(contains(log, "]=== === === mount ERROR, /dev/sda1 ==> /tmp/mountd/disk1_part1\n"));
    EXPECT_TRUE(std::filesystem::exists("/tmp/mountd/disk1_part1"));
    EXPECT_EQ(remembered("U-1"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes");

    support::remove_all(support::MOUNT_REFUSES);
    mount_part(part);
    EXPECT_EQ(part->mount_status, 1) << "the next pass tries again";
}

TEST_F(Mount, a_mount_that_appears_late_is_waited_for)
{
    support::write_file(support::MOUNT_REFUSES, "");
    part_info* part = put_ready_part(0, 1, "U-1");
    size_t sleeps = 0;
    support::the_clock.on_sleep = [&] {
        if (++sleeps == WAITS.mount.size()) {
            add_mount("/dev/sda1", "/tmp/mountd/disk1_part1");
        }
    };
    mount_part(part);
    EXPECT_EQ(part->mount_status, 1);
    EXPECT_EQ(support::the_clock.slept_ms, 18000);
}

TEST_F(Mount, without_a_row_the_new_name_is_kept_and_stored)
{
    part_info* part = put_ready_part(0, 1, "U-1");
    text_copy(part->disk_name, "disk1_part1");
    text_copy(part->mount_path, "/tmp/mountd/disk1_part1");
    const std::string log = capture_stdout([&] { sync_part_with_db(part); });
    EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk1_part1");
    EXPECT_EQ(remembered("U-1"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes");
    EXPECT_TRUE(contains(log, "=== === ===> db ret = 1\n"));
}

TEST_F(Mount, a_part_without_a_uid_is_mounted_and_never_stored)
{
    part_info* part = put_ready_part(0, 1, "");
    mount_part(part);
    EXPECT_EQ(part->mount_status, 1);
    EXPECT_EQ(remembered(""), "nothing");
}

TEST_F(Mount, a_remembered_free_directory_wins_over_the_new_one)
{
    remember("U-1", "sdq7", "disk4_part2");
    part_info* part = put_ready_part(0, 1, "U-1");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk4_part2");
    EXPECT_STREQ(part->disk_name, "disk4_part2");
    EXPECT_EQ(remembered("U-1"), "sdq7 disk4_part2 /tmp/mountd/disk4_part2 yes")
        << "the row's device name is not refreshed";
    EXPECT_TRUE(contains(
        log, "===> update mount path /tmp/mountd/disk1_part1 --> /tmp/mountd/disk4_part2\n"));
    EXPECT_TRUE(contains(log, "===> update disk name disk1_part1 --> disk4_part2\n"));
    EXPECT_EQ(actions(), std::vector<std::string>{
                             "mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk4_part2"});
}

TEST_F(Mount, a_remembered_directory_equal_to_the_new_one_is_only_marked)
{
    remember("U-1", "sda1", "disk1_part1");
    part_info* part = put_ready_part(0, 1, "U-1");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_FALSE(contains(log, "===> update "));
    EXPECT_EQ(remembered("U-1"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes");
}

TEST_F(Mount, an_occupied_remembered_directory_is_replaced_by_the_new_one_in_the_database)
{
    remember("U-1", "sdq7", "disk4_part2");
    add_mount("/dev/sdx1", "/tmp/mountd/disk4_part2");
    part_info* part = put_ready_part(0, 1, "U-1");
    const std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk1_part1");
    EXPECT_EQ(remembered("U-1"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes");
    EXPECT_TRUE(contains(log, "=== ===> update uid = U-1, mount = /tmp/mountd/disk1_part1\n"));
}

TEST_F(Mount, a_remembered_path_that_is_not_ours_is_overwritten_and_reaches_no_command)
{
    for (const char* path : {"/etc", "/tmp/mountd", "/tmp/mountd/../etc", "/tmp/mountdisk/x",
                             "/tmp/mountd/x;touch /run/harm", "/tmp/mountd/a/b", ""}) {
        support::remove_all(DISK_DB_FILE);
        support::remove_all(support::MOUNTS_FILE);
        remember("U-1", "sda1", "disk4_part2");
        sqlite3* db = nullptr;
        ASSERT_EQ(sqlite3_open(DISK_DB_FILE, &db), SQLITE_OK);
        const std::string sql = std::string("update disk set mount_path='") + path + "'";
        EXPECT_EQ(sqlite3_exec(db, sql.c_str(), nullptr, nullptr, nullptr), SQLITE_OK);
        sqlite3_close(db);

        part_info* part = put_ready_part(0, 1, "U-1");
        const std::string log = capture_stdout([&] { mount_part(part); });
        EXPECT_TRUE(contains(log, "]remembered path err, uid = U-1, mount = ")) << log;
        EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk1_part1") << path;
        EXPECT_EQ(remembered("U-1"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes") << path;
    }
    EXPECT_FALSE(std::filesystem::exists("/run/harm"));
}

TEST_F(Mount, a_damaged_database_does_not_keep_a_partition_from_its_mount)
{
    support::write_file(DISK_DB_FILE, std::string(8192, 'x'));
    part_info* part = put_ready_part(0, 1, "U-1");
    mount_part(part);
    EXPECT_EQ(part->mount_status, 1);
    EXPECT_STREQ(part->mount_path, "/tmp/mountd/disk1_part1");
}

TEST_F(Mount, the_longest_remembered_name_stands_whole_in_the_command_and_a_longer_one_is_refused)
{
    put_root(&sets.entries[0], "sda", 4000);
    part_info* part = put_part(&sets.entries[0].disk, 0, "sda1", 4000);
    part->fs_type = FS_FAT;
    text_copy(part->uid, "U-1");
    disk_db_record record{};
    text_copy(record.uid, "U-1");
    text_copy(record.dev_name, "sda1");
    text_copy(record.disk_name, "disk1_part1");
    const std::string longest = "/tmp/mountd/" + std::string(MOUNT_NAME_SIZE - 1, 'x');
    text_copy(record.mount_path, longest.c_str());
    disk_db_add(&record);
    support::write_file(support::MOUNT_REFUSES, "");
    const std::string command =
        "exec cmd = mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 /dev/sda1 ";
    std::string log = capture_stdout([&] { mount_part(part); });
    EXPECT_TRUE(contains(log, command + longest + "\n")) << log;

    text_copy(record.mount_path, (longest + "x").c_str());
    disk_db_update_all(&record);
    log = capture_stdout([&] { mount_part(part); });
    EXPECT_TRUE(contains(log, "remembered path err, uid = U-1")) << log;
    EXPECT_TRUE(contains(log, command + "/tmp/mountd/disk0_part0\n")) << log;
}

TEST_F(Mount, the_first_pass_sorts_and_numbers_all_disks_and_later_passes_do_not)
{
    put_ready_part(0, 0, "U-1");
    sets.entries[0].disk.root.total_len = 1000;
    put_ready_part(1, 0, "U-2");
    sets.entries[1].disk.root.total_len = 9000;
    EXPECT_EQ(mount_all(&sets), 0);
    EXPECT_EQ(sets.sorted_once, 1);
    EXPECT_STREQ(sets.entries[0].disk.root.dev_name, "sdb");
    EXPECT_STREQ(sets.entries[0].disk.parts[0].part.mount_path, "/tmp/mountd/disk1_part1");
    EXPECT_STREQ(sets.entries[1].disk.parts[0].part.mount_path, "/tmp/mountd/disk2_part1");

    sets.entries[1].disk.root.total_len = 99000;
    mount_all(&sets);
    EXPECT_STREQ(sets.entries[0].disk.root.dev_name, "sdb");
    EXPECT_EQ(sets.entries[1].disk.root.mount_point_num, 2);
}

TEST_F(Mount, a_pass_drops_small_partitions_and_refreshes_the_free_space_afterwards)
{
    put_ready_part(0, 0, "U-1");
    put_part(&sets.entries[0].disk, 1, "sda2", 999)->fs_type = FS_EXT4;
    mount_all(&sets);
    EXPECT_EQ(sets.entries[0].disk.parts[1].in_use, 0);
    EXPECT_EQ(actions().size(), 1U);
    EXPECT_GT(sets.entries[0].disk.parts[0].part.free_size, 0U);
}

TEST_F(Mount,
       a_disk_that_returned_under_another_name_gets_its_directory_although_the_old_is_mounted)
{
    plug_with_part("sda", "U-A", 9000);
    plug_with_part("sdb", "U-B", 5000);
    disk_sets_add_dev(&sets, "sda");
    disk_sets_add_dev(&sets, "sdb");
    mount_all(&sets);
    unplug("sdb");
    plug_with_part("sdc", "U-B", 5000);
    disk_sets_add_dev(&sets, "sdc");
    const std::string log = capture_stdout([&] { mount_all_present(&sets); });
    EXPECT_TRUE(contains(log, "]disk was pulled, dev = sdb\n")) << log;
    EXPECT_FALSE(contains(log, "=== ===> update uid"));
    EXPECT_EQ(remembered("U-B"), "sdb1 disk2_part1 /tmp/mountd/disk2_part1 yes");
    EXPECT_EQ(support::read_file(support::MOUNTS_FILE),
              "/dev/sda1 on /tmp/mountd/disk1_part1 type x (rw)\n"
              "/dev/sdc1 on /tmp/mountd/disk2_part1 type x (rw)\n");
}

TEST_F(Mount, a_disk_pulled_while_another_is_waited_for_is_neither_mounted_nor_kept)
{
    plug_with_part("sda", "U-A", 9000);
    plug_with_part("sdb", "U-B", 5000);
    disk_sets_add_dev(&sets, "sda");
    disk_sets_add_dev(&sets, "sdb");
    support::the_clock.on_sleep = [&] { unplug("sdb"); };
    mount_all_present(&sets);
    EXPECT_EQ(disk_sets_count(&sets), 1);
    EXPECT_EQ(remembered("U-B"), "nothing");
    EXPECT_EQ(times_called("mount -t ext4 -o rw,defaults /dev/sdb1 /tmp/mountd/disk2_part1"), 0);
}

TEST_F(Mount, mount_all_believes_its_table)
{
    put_ready_part(0, 0, "U-1");
    mount_all(&sets);
    EXPECT_EQ(disk_sets_count(&sets), 1);
    EXPECT_EQ(mount_all_present(nullptr), 1);
}

TEST_F(Mount, a_pass_with_nothing_to_mount_does_not_ask_who_left)
{
    plug_with_part("sda", "U-A", 9000);
    disk_sets_add_dev(&sets, "sda");
    mount_all_present(&sets);
    unplug("sda");
    mount_all_present(&sets);
    EXPECT_EQ(disk_sets_count(&sets), 1);
}

TEST_F(Mount, a_mount_that_the_inventory_does_not_know_pushes_a_disk_out_of_its_directory)
{
    remember("U-A", "sda1", "disk4_part1");
    plug_with_part("sda", "U-A", 9000);
    disk_sets_add_dev(&sets, "sda");
    add_mount("/dev/sdq1", "/tmp/mountd/disk4_part1");
    mount_all(&sets);
    EXPECT_EQ(remembered("U-A"), "sda1 disk1_part1 /tmp/mountd/disk1_part1 yes");
}

TEST_F(Mount, every_pass_gives_slots_their_part_numbers_again)
{
    sets.sorted_once = 1;
    put_ready_part(0, 4, "U-1");
    part_info* later = put_part(&sets.entries[0].disk, 5, "sda6", 4000);
    later->fs_type = FS_EXT4;
    mount_all(&sets);
    EXPECT_STREQ(later->mount_path, "/tmp/mountd/disk4_part6");
}

TEST_F(Mount, a_stick_whose_number_was_taken_meanwhile_returns_to_its_remembered_directory)
{
    plug_with_part("sda", "U-A", 9000);
    plug_with_part("sdb", "U-B", 5000);
    disk_sets_add_dev(&sets, "sda");
    disk_sets_add_dev(&sets, "sdb");
    mount_all(&sets);
    ASSERT_EQ(remembered("U-B"), "sdb1 disk2_part1 /tmp/mountd/disk2_part1 yes");

    unplug("sdb");
    remove_root_part(&sets, "sdb");
    ASSERT_EQ(remembered("U-B"), "sdb1 disk2_part1 /tmp/mountd/disk2_part1 no");
    // Another disk takes number 2 and another directory, as it remembers one of its own.
    remember("U-C", "sdq1", "disk9_part1");
    plug_with_part("sdc", "U-C", 4000);
    disk_sets_add_dev(&sets, "sdc");
    mount_all(&sets);
    ASSERT_EQ(disk_sets_find_part(&sets, "sdc")->mount_point_num, 2);

    plug_with_part("sdd", "U-B", 5000);
    disk_sets_add_dev(&sets, "sdd");
    EXPECT_EQ(disk_sets_find_part(&sets, "sdd")->mount_point_num, 3);
    mount_all(&sets);
    EXPECT_STREQ(disk_sets_find_part(&sets, "sdd1")->mount_path, "/tmp/mountd/disk2_part1");
    EXPECT_STREQ(disk_sets_find_part(&sets, "sdd1")->disk_name, "disk2_part1");
}

TEST_F(Mount, a_directory_remembered_by_one_and_proposed_to_another_is_reported_as_shared)
{
    remember("U-A", "sda1", "disk2_part1");
    put_ready_part(0, 1, "U-A");
    put_ready_part(1, 2, "U-B");
    sets.sorted_once = 1;
    mount_all(&sets);
    EXPECT_STREQ(sets.entries[0].disk.parts[0].part.mount_path, "/tmp/mountd/disk2_part1");
    EXPECT_STREQ(sets.entries[1].disk.parts[0].part.mount_path, "/tmp/mountd/disk2_part1");
    EXPECT_EQ(check_mount_path_dup(), 1);
}

TEST_F(Mount, null_arguments_are_answered)
{
    const std::string log = capture_stdout([] { EXPECT_EQ(mount_all(nullptr), 1); });
    EXPECT_TRUE(contains(log, "]err!\n"));
    EXPECT_EQ(mount_disk_sets(nullptr), 1);
    EXPECT_EQ(mount_root_part(nullptr), 1);
    EXPECT_EQ(mount_sub_parts(nullptr), 1);
    mount_part(nullptr);
    sync_part_with_db(nullptr);
    EXPECT_TRUE(stubs.calls().empty());
}
