#include "disk/waiting.h"

#include <gtest/gtest.h>

#include <string>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "support/disk_world.h"
#include "support/records.h"

namespace {

class Waiting : public support::disk_world {
protected:
    Waiting()
    {
        sets.sorted_once = 1;
        for (const char* disk : {"sda", "sdb"}) {
            const std::string part = std::string(disk) + "1";
            plug_disk(disk, R"(PTTYPE="dos")", 5000);
            plug_part(disk, part, "UUID=\"U-" + part + R"(" TYPE="ext4")", 4000);
            disk_sets_add_dev(&sets, disk);
        }
    }

    disk_sets sets{};
};

}  // namespace

TEST_F(Waiting, a_disk_that_nothing_was_planned_for_comes_back_after_another_ones_removal)
{
    const waiting_disks waiting = find_waiting_disks(&sets, "sda1");
    ASSERT_EQ(waiting.count, 1);
    EXPECT_STREQ(waiting.root_devs[0], "sdb");
    disk_sets_clear_empty(&sets);
    ASSERT_EQ(disk_sets_count(&sets), 0);
    bring_back_waiting_disks(&sets, waiting);
    ASSERT_EQ(disk_sets_count(&sets), 1);
    EXPECT_STREQ(sets.entries[0].disk.parts[0].part.uid, "U-sdb1");
}

TEST_F(Waiting, a_disk_that_is_still_there_is_not_added_twice)
{
    const waiting_disks waiting = find_waiting_disks(&sets, "disk1_part1");
    EXPECT_EQ(waiting.count, 2);
    stubs.forget_calls();
    bring_back_waiting_disks(&sets, waiting);
    EXPECT_EQ(disk_sets_count(&sets), 2);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Waiting, a_disk_with_a_planned_partition_or_none_or_its_own_filesystem_does_not_wait)
{
    support::put_part(&sets.entries[0].disk, 1, "sda2", 4000)->mount_path[0] = '/';
    sets.entries[1].disk.parts[0].in_use = 0;
    EXPECT_EQ(find_waiting_disks(&sets, "").count, 0);
    sets.entries[1].disk.parts[0].in_use = 1;
    EXPECT_EQ(find_waiting_disks(&sets, "").count, 1);
    sets.entries[1].disk.root.fs_type = FS_EXT4;
    EXPECT_EQ(find_waiting_disks(&sets, "").count, 0);
}

TEST_F(Waiting, null_arguments_are_answered)
{
    EXPECT_EQ(find_waiting_disks(nullptr, "sda").count, 0);
    EXPECT_EQ(find_waiting_disks(&sets, nullptr).count, 0);
    bring_back_waiting_disks(nullptr, find_waiting_disks(&sets, ""));
}
