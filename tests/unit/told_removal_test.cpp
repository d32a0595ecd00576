#include "manager/told_removal.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "disk/mount.h"
#include "disk/pulled.h"
#include "manager/rescan.h"
#include "support/capture.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/text.h"

using support::capture_stdout;
using support::contains;

namespace {

constexpr time_t NOW = 1'000'000;
// Larger than what is free in the directories of this world, which are not really mounted.
constexpr int DISK_MIB = 900'000;
constexpr int PART_MIB = 400'000;

class ToldRemoval : public support::disk_world {
protected:
    // A disk of two partitions whose predecessor under the name has just left.
    ToldRemoval()
    {
        plug();
        take_in();
        unplug("sda1");
        unplug("sda2");
        unplug("sda");
        support::write_file("/dev/keeps_a_number", "");
        plug();
        support::remove_all("/dev/keeps_a_number");
        rescan();
        mount_all(&sets);
        stubs.forget_calls();
    }

    void plug()
    {
        plug_disk("sda", R"(PTTYPE="dos")", DISK_MIB);
        for (const char* part : {"sda1", "sda2"}) {
            plug_part("sda", part, std::string("UUID=\"U-") + part + R"(" TYPE="ext4")", PART_MIB);
        }
    }

    void take_in()
    {
        rescan();
        mount_all(&sets);
    }

    void rescan()
    {
        int32_t changed = 0;
        EXPECT_TRUE(rescan_block_devices(&sets, &changed));
    }

    bool has(const char* dev_name) { return disk_sets_find_part(&sets, dev_name) != nullptr; }

    support::fake_clock clock{NOW};
    disk_sets sets{};
};

}  // namespace

TEST_F(ToldRemoval, what_a_late_message_takes_away_the_next_rescan_takes_in_again)
{
    for (const char* name : {"sda1", "sda"}) {
        const std::string log = capture_stdout([&] { remove_told_dev(&sets, name, true); });
        EXPECT_TRUE(contains(log, std::string("]removal of a former disk, dev = ") + name + "\n"));
        EXPECT_FALSE(has(name));
        EXPECT_EQ(times_called("umount /dev/sda1"), 1) << name;
        rescan();
        EXPECT_TRUE(has("sda1")) << name;
        EXPECT_TRUE(has("sda2")) << name;
        mount_all(&sets);
        stubs.forget_calls();
    }
}

TEST_F(ToldRemoval, it_is_taken_in_again_once)
{
    remove_told_dev(&sets, "sda", true);
    rescan();
    support::the_clock.now += FORMER_DISK_SECONDS;
    remove_told_dev(&sets, "sda", true);
    rescan();
    EXPECT_FALSE(has("sda"));
}

TEST_F(ToldRemoval, whoever_asks_for_a_removal_gets_it_even_then)
{
    remove_told_dev(&sets, "sda1", false);
    ASSERT_TRUE(has("sda2"));
    remove_told_dir(&sets, disk_sets_find_part(&sets, "sda2")->disk_name);
    rescan();
    EXPECT_FALSE(has("sda1"));
    EXPECT_FALSE(has("sda2"));
}

TEST_F(ToldRemoval, a_removal_that_is_meant_lasts_although_a_late_message_came_before)
{
    for (const char* meant : {"sda", "sda1"}) {
        remove_told_dev(&sets, "sda1", true);
        remove_told_dev(&sets, meant, false);
        rescan();
        EXPECT_FALSE(has("sda1")) << meant;
        disk_sets_add_dev(&sets, "sda");
        disk_sets_add_dev(&sets, "sda1");
        disk_sets_add_dev(&sets, "sda2");
        mount_all(&sets);
    }
    remove_told_dev(&sets, "sda1", true);
    remove_told_all(&sets);
    rescan();
    EXPECT_EQ(disk_sets_count(&sets), 0);
}

TEST_F(ToldRemoval, a_removal_of_another_disk_drops_no_offer)
{
    remove_told_dev(&sets, "sda1", true);
    remove_told_dev(&sets, "sdb", false);
    rescan();
    EXPECT_TRUE(has("sda1"));
}

TEST_F(ToldRemoval, a_removal_by_another_devices_directory_drops_no_offer)
{
    plug_disk("sdb", R"(PTTYPE="dos")", DISK_MIB);
    plug_part("sdb", "sdb1", R"(UUID="U-3" TYPE="ext4")", PART_MIB);
    disk_sets_add_dev(&sets, "sdb");
    mount_all(&sets);
    remove_told_dev(&sets, "sda1", true);
    ASSERT_TRUE(has("sdb1"));
    remove_told_dir(&sets, disk_sets_find_part(&sets, "sdb1")->disk_name);
    EXPECT_FALSE(has("sdb1"));
    rescan();
    EXPECT_TRUE(has("sda1"));
}

TEST_F(ToldRemoval, a_removal_by_directory_lasts_although_the_disks_other_partition_is_offered)
{
    remove_told_dev(&sets, "sda1", true);
    ASSERT_TRUE(has("sda2"));
    remove_told_dir(&sets, disk_sets_find_part(&sets, "sda2")->disk_name);
    rescan();
    EXPECT_FALSE(has("sda2"));
}

TEST_F(ToldRemoval, a_directory_that_nobody_knows_may_be_that_of_an_offered_device)
{
    const std::string directory = disk_sets_find_part(&sets, "sda1")->disk_name;
    remove_told_dev(&sets, "sda1", true);
    remove_told_dir(&sets, directory.c_str());
    rescan();
    EXPECT_FALSE(has("sda1"));
}

TEST_F(ToldRemoval, a_directory_is_asked_for_without_a_table_too)
{
    remove_told_dir(nullptr, "disk1_part1");
    EXPECT_TRUE(has("sda1"));
}

TEST_F(ToldRemoval, a_device_that_is_gone_by_then_does_not_come_back)
{
    remove_told_dev(&sets, "sda1", true);
    unplug("sda1");
    rescan();
    EXPECT_FALSE(has("sda1"));
}

TEST_F(ToldRemoval, the_services_stop_before_and_start_after_each)
{
    remove_told_dev(&sets, "sdq", true);
    remove_told_dir(&sets, "disk9_part9");
    remove_told_all(&sets);
    const std::vector<std::string> calls = actions();
    ASSERT_GE(calls.size(), 24U);
    EXPECT_EQ(calls.front(), "/etc/init.d/samba4 stop");
    EXPECT_EQ(calls[7], "/etc/init.d/tarn_nas_sys_up start");
    EXPECT_EQ(calls.back(), "/etc/init.d/tarn_nas_sys_up start");
    EXPECT_EQ(disk_sets_count(&sets), 0);
}

TEST_F(ToldRemoval, a_disk_that_waits_for_its_first_mount_pass_outlives_the_removal_of_another)
{
    for (const bool by_directory : {false, true}) {
        plug_disk("sdb", R"(PTTYPE="dos")", 5000);
        plug_part("sdb", "sdb1", R"(UUID="U-B" TYPE="ext4")", PART_MIB);
        disk_sets_add_dev(&sets, "sdb");
        if (by_directory) {
            remove_told_dir(&sets, sets.entries[0].disk.parts[1].part.disk_name);
        } else {
            remove_told_dev(&sets, "sda1", false);
        }
        EXPECT_TRUE(has("sdb1")) << by_directory;
        remove_told_dev(&sets, "sdb", false);
        EXPECT_FALSE(has("sdb")) << "its own removal is meant";
    }
}
