#include "disk/removal.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "disk/discovery.h"
#include "disk/disk_db.h"
#include "disk/disk_sets.h"
#include "support/capture.h"
#include "support/child.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/listing.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/text.h"
#include "util/waits.h"

using support::capture_stdout;
using support::contains;
using support::is_all_zero;
using support::put_part;
using support::put_root;

namespace {

class Removal : public support::disk_world {
protected:
    // A disk whose slots carry mounted partitions of these numbers.
    void put_mounted_disk(int place, const std::string& disk, const std::vector<int>& slots)
    {
        put_root(&sets.entries[place], disk.c_str(), 50000);
        for (const int slot : slots) {
            const std::string dev = disk + std::to_string(slot + 1);
            part_info* part = put_part(&sets.entries[place].disk, slot, dev.c_str(), 4000);
            text_copy(part->uid, ("U-" + dev).c_str());
            path_mount_name(part->disk_name, place + 1, slot + 1);
            path_mount_dir(part->mount_path, part->disk_name);
            part->mount_status = 1;
            add_mount("/dev/" + dev, part->mount_path);
            disk_db_record record{};
            text_copy(record.uid, part->uid);
            text_copy(record.dev_name, part->dev_name);
            text_copy(record.disk_name, part->disk_name);
            text_copy(record.mount_path, part->mount_path);
            record.mountd = 1;
            disk_db_add(&record);
        }
        stubs.forget_calls();
    }

    static int stored_mountd(const char* uid)
    {
        disk_db_record record{};
        return disk_db_get(uid, &record) == 0 ? record.mountd : -1;
    }

    support::skipped_sleeps no_sleep;
    disk_sets sets{};
};

}  // namespace

TEST_F(Removal, a_part_is_unmounted_by_device_and_by_path_and_noted_as_unmounted)
{
    put_mounted_disk(0, "sda", {0});
    support::make_dir("/tmp/mountd/disk1_part1");
    part_info* part = &sets.entries[0].disk.parts[0].part;
    const std::string log = capture_stdout([&] { umount_part(part); });
    EXPECT_EQ(actions(),
              (std::vector<std::string>{"umount /dev/sda1", "umount /tmp/mountd/disk1_part1"}));
    EXPECT_EQ(stored_mountd("U-sda1"), 0);
    EXPECT_EQ(part->mount_status, 1) << "the record is left to the caller";
    EXPECT_TRUE(std::filesystem::exists("/tmp/mountd/disk1_part1"));
    EXPECT_EQ(support::the_clock.slept_ms, 0);
    EXPECT_TRUE(contains(log, "]==> umount dev = sda1\n"));
}

TEST_F(Removal, a_part_without_names_runs_no_umount)
{
    const part_info part{};
    umount_part(&part);
    EXPECT_TRUE(actions().empty());
    umount_part(nullptr);
}

TEST_F(Removal, a_device_that_stays_mounted_is_tried_ten_more_times_a_second_apart)
{
    put_mounted_disk(0, "sda", {0});
    support::write_file(support::UMOUNT_BUSY, std::string(50, 'x'));
    umount_part(&sets.entries[0].disk.parts[0].part);
    EXPECT_EQ(times_called("umount /dev/sda1"), 1);
    EXPECT_EQ(times_called("umount /tmp/mountd/disk1_part1"), 1 + UMOUNT_TRIES);
    EXPECT_EQ(support::the_clock.slept_ms, 10000);
    EXPECT_EQ(stored_mountd("U-sda1"), 0);
}

TEST_F(Removal, further_attempts_end_when_the_device_is_gone_and_use_the_path_of_the_mount_table)
{
    put_mounted_disk(0, "sda", {0});
    text_copy(sets.entries[0].disk.parts[0].part.mount_path, "/tmp/mountd/somewhere_else");
    support::write_file(support::UMOUNT_BUSY, "xxx");
    umount_part(&sets.entries[0].disk.parts[0].part);
    EXPECT_EQ(actions(), (std::vector<std::string>{
                             "umount /dev/sda1", "umount /tmp/mountd/somewhere_else",
                             "umount /tmp/mountd/disk1_part1", "umount /tmp/mountd/disk1_part1"}));
    EXPECT_EQ(support::the_clock.slept_ms, 1000 + WAITS.umount[0]) << "the second attempt succeeds";
}

TEST_F(Removal, a_listed_path_that_a_shell_would_read_reaches_no_command)
{
    part_info part{};
    text_copy(part.dev_name, "sda1");
    add_mount("/dev/sda1", "/home/u/tmp/mountd/x;touch$IFS/run/harm");
    support::write_file(support::UMOUNT_BUSY, std::string(50, 'x'));
    const std::string log = capture_stdout([&] { umount_part(&part); });
    for (const std::string& call : actions()) {
        EXPECT_EQ(call, "umount /dev/sda1");
    }
    EXPECT_TRUE(contains(log, "]umount err, target = /tmp/mountd/x;touch")) << log;
    EXPECT_FALSE(std::filesystem::exists("/run/harm"));
}

TEST_F(Removal, removing_a_disk_unmounts_its_slots_in_order_then_the_root_and_zeroes_the_entry)
{
    put_mounted_disk(1, "sdb", {5, 0, 2});
    const std::string log = capture_stdout([&] { EXPECT_EQ(remove_root_part(&sets, "sdb"), 0); });
    std::vector<std::string> devices;
    for (const std::string& call : actions()) {
        if (contains(call, "/dev/")) {
            devices.push_back(call);
        }
    }
    EXPECT_EQ(devices, (std::vector<std::string>{"umount /dev/sdb1", "umount /dev/sdb3",
                                                 "umount /dev/sdb6", "umount /dev/sdb"}));
    EXPECT_TRUE(is_all_zero(sets));
    EXPECT_TRUE(contains(log, "]remove disk, root dev = sdb\n"));
    EXPECT_TRUE(contains(log, "]=== === ===> remove root path:\n"));
}

TEST_F(Removal, removing_an_unknown_disk_answers_1)
{
    put_mounted_disk(0, "sda", {0});
    const std::string log = capture_stdout([&] { EXPECT_EQ(remove_root_part(&sets, "sdq"), 1); });
    EXPECT_TRUE(contains(log, "]remove root part[sdq] err!\n"));
    EXPECT_TRUE(actions().empty());
    EXPECT_EQ(disk_sets_count(&sets), 1);
}

TEST_F(Removal, remove_dev_of_a_partition_forgets_that_partition_alone)
{
    put_mounted_disk(0, "sda", {0, 1});
    const std::string log = capture_stdout([&] { EXPECT_EQ(remove_dev(&sets, "sda1"), 0); });
    EXPECT_TRUE(is_all_zero(sets.entries[0].disk.parts[0]));
    EXPECT_STREQ(sets.entries[0].disk.parts[1].part.dev_name, "sda2");
    EXPECT_EQ(stored_mountd("U-sda1"), 0);
    EXPECT_EQ(stored_mountd("U-sda2"), 1);
    EXPECT_TRUE(contains(log, "]remove sub dev = sda1\n"));
    EXPECT_TRUE(contains(log, "want to remove:\n"));
    EXPECT_TRUE(contains(log, "clear ok, find dev = sda1\n"));
}

TEST_F(Removal, remove_dev_of_the_last_partition_clears_the_empty_disk)
{
    put_mounted_disk(0, "sda", {3});
    remove_dev(&sets, "sda4");
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Removal, remove_dev_clears_from_the_disk_that_the_record_belongs_to)
{
    put_mounted_disk(0, "sda", {0});
    put_mounted_disk(4, "sdb", {0, 1});
    remove_dev(&sets, "sdb1");
    EXPECT_EQ(sets.entries[0].disk.parts[0].in_use, 1);
    EXPECT_EQ(sets.entries[4].disk.parts[0].in_use, 0);
    EXPECT_EQ(sets.entries[4].disk.parts[1].in_use, 1);
}

TEST_F(Removal, remove_dev_of_a_listed_disk_unmounts_and_forgets_all_of_it)
{
    put_mounted_disk(0, "sda", {0, 1});
    put_mounted_disk(1, "sdb", {0});
    plug_disk("sda", "", 1);
    const std::string log = capture_stdout([&] { EXPECT_EQ(remove_dev(&sets, "sda"), 0); });
    EXPECT_TRUE(is_all_zero(sets.entries[0]));
    EXPECT_EQ(disk_sets_count(&sets), 1);
    EXPECT_TRUE(contains(log, "]remove root dev = sda\n"));
}

TEST_F(Removal, remove_dev_of_a_vanished_disk_takes_the_partition_path_and_the_disk_stays)
{
    put_mounted_disk(0, "sda", {0});
    const std::string log = capture_stdout([&] { EXPECT_EQ(remove_dev(&sets, "sda"), 0); });
    EXPECT_TRUE(contains(log, "]remove sub dev = sda\n"));
    EXPECT_TRUE(contains(log, "]clear err, not find dev = sda\n"));
    EXPECT_EQ(actions(), std::vector<std::string>{"umount /dev/sda"})
        << "only the whole device is unmounted";
    EXPECT_STREQ(sets.entries[0].disk.root.dev_name, "sda");
    EXPECT_EQ(sets.entries[0].disk.parts[0].in_use, 1);
    EXPECT_EQ(stored_mountd("U-sda1"), 1);
}

TEST_F(Removal, remove_dev_of_a_vanished_disk_drops_it_when_no_valid_partition_is_left)
{
    put_mounted_disk(0, "sda", {0});
    text_copy(sets.entries[0].disk.parts[0].part.disk_name, "");
    remove_dev(&sets, "sda");
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Removal, remove_dev_of_a_vanished_disk_with_a_filesystem_of_its_own_keeps_it)
{
    put_mounted_disk(0, "sda", {});
    sets.entries[0].disk.root.fs_type = FS_EXT4;
    remove_dev(&sets, "sda");
    EXPECT_EQ(disk_sets_count(&sets), 1);
}

TEST_F(Removal, remove_dev_of_an_unknown_device_changes_nothing)
{
    put_mounted_disk(0, "sda", {0});
    const disk_sets before = sets;
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(remove_dev(&sets, "sdq"), 0);
        EXPECT_EQ(remove_dev(&sets, ""), 0);
        EXPECT_EQ(remove_sub_part(&sets, "sdq1"), 0);
    });
    EXPECT_TRUE(contains(log, "]want remove dev(sdq) not exist!\n"));
    EXPECT_TRUE(contains(log, "]want remove dev(sdq1) not exist!\n"));
    EXPECT_TRUE(support::same_bytes(before, sets));
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Removal, remove_disk_takes_the_directory_name_and_forgets_that_partition)
{
    put_mounted_disk(0, "sda", {0, 1});
    put_mounted_disk(1, "sdb", {0});
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(remove_disk(&sets, "disk1_part2"), 0); });
    EXPECT_TRUE(contains(log, "remove disk name = disk1_part2\n"));
    EXPECT_EQ(actions(),
              (std::vector<std::string>{"umount /dev/sda2", "umount /tmp/mountd/disk1_part2"}));
    EXPECT_EQ(sets.entries[0].disk.parts[1].in_use, 0);
    EXPECT_EQ(sets.entries[0].disk.parts[0].in_use, 1);
    EXPECT_EQ(stored_mountd("U-sda2"), 0);
}

TEST_F(Removal, remove_disk_of_the_last_partition_clears_the_empty_disk)
{
    put_mounted_disk(0, "sda", {0});
    remove_disk(&sets, "disk1_part1");
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Removal, remove_disk_with_an_unknown_name_changes_nothing_and_logs_one_line)
{
    put_mounted_disk(0, "sda", {0});
    text_copy(sets.entries[0].disk.root.disk_name, "disk7_part1");
    const disk_sets before = sets;
    for (const char* name : {"disk9_part9", "disk1", "sda1", "disk7_part1"}) {
        const std::string log = capture_stdout([&] { EXPECT_EQ(remove_disk(&sets, name), 0); });
        EXPECT_EQ(support::lines_of(log).size(), 1U) << log;
        EXPECT_TRUE(contains(log, std::string("remove disk name = ") + name + "\n"));
    }
    EXPECT_TRUE(support::same_bytes(before, sets));
}

TEST_F(Removal, the_safe_removal_forgets_every_disk_that_the_kernel_lists)
{
    put_mounted_disk(0, "sda", {0, 1});
    put_mounted_disk(1, "mmcblk0", {});
    put_mounted_disk(2, "sdz", {0});
    for (const char* name : {"sda", "mmcblk0", "loop0", "sr0"}) {
        plug_disk(name, "", 1);
    }
    EXPECT_EQ(safe_remove_all(&sets), 0);
    EXPECT_EQ(disk_sets_count(&sets), 1);
    EXPECT_STREQ(sets.entries[2].disk.root.dev_name, "sdz") << "not listed";
    EXPECT_EQ(stored_mountd("U-sda1"), 0);
    EXPECT_EQ(stored_mountd("U-sda2"), 0);
}

TEST_F(Removal, the_safe_removal_fails_when_the_kernels_list_cannot_be_read)
{
    put_mounted_disk(0, "sda", {0});
    const std::string log = support::expect_in_child([&] {
        support::allow_no_open_files();
        EXPECT_EQ(safe_remove_all(&sets), 1);
        EXPECT_EQ(disk_sets_count(&sets), 1);
    });
    EXPECT_TRUE(contains(log, "]open dir err, dir = /sys/block\n")) << log;
}

TEST_F(Removal, the_safe_removal_begins_anew_when_the_kernels_list_breaks_off_twice)
{
    put_mounted_disk(0, "sda", {0});
    put_mounted_disk(1, "sdb", {0});
    plug_disk("sda", "", 1);
    plug_disk("sdb", "", 1);
    const support::broken_listing broken("/sys/block", support::last_listed("/sys/block"), 2);
    const std::string log = capture_stdout([&] { EXPECT_EQ(safe_remove_all(&sets), 0); });
    EXPECT_EQ(support::count_of(log, "read dir err\n"), 2) << log;
    EXPECT_TRUE(is_all_zero(sets));
    EXPECT_EQ(times_called("umount /dev/sda"), 1) << "one that is gone already is left alone";
    EXPECT_EQ(times_called("umount /dev/sdb"), 1);
}

TEST_F(Removal, the_safe_removal_fails_when_the_kernels_list_breaks_off_a_third_time)
{
    put_mounted_disk(0, "sda", {0});
    put_mounted_disk(1, "sdb", {0});
    plug_disk("sda", "", 1);
    plug_disk("sdb", "", 1);
    const std::string last = support::last_listed("/sys/block");
    const support::broken_listing broken("/sys/block", last, 3);
    const std::string log = capture_stdout([&] { EXPECT_EQ(safe_remove_all(&sets), 1); });
    EXPECT_EQ(support::count_of(log, "read dir err\n"), 3) << log;
    EXPECT_EQ(disk_sets_count(&sets), 1) << "what was listed is removed";
    EXPECT_NE(disk_sets_find_disk(&sets, last.c_str()), nullptr) << "what was not reached stays";
    EXPECT_EQ(stored_mountd(("U-" + last + "1").c_str()), 1);
}

TEST_F(Removal, a_null_table_is_answered_with_1)
{
    EXPECT_EQ(umount_disk_parts(nullptr), 1);
    EXPECT_EQ(remove_root_part(nullptr, "sda"), 1);
    EXPECT_EQ(remove_sub_part(nullptr, "sda1"), 1);
    EXPECT_EQ(remove_dev(nullptr, "sda"), 1);
    EXPECT_EQ(remove_disk(nullptr, "disk1_part1"), 1);
    EXPECT_EQ(safe_remove_all(nullptr), 1);
}
