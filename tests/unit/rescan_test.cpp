#include "manager/rescan.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>
#include <vector>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "disk/removal.h"
#include "support/capture.h"
#include "support/child.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/block_dev.h"

using support::capture_stdout;
using support::contains;
using support::expect_in_child;

namespace {

class Rescan : public support::disk_world {
protected:
    void plug(const std::string& name) { plug_disk(name, R"(PTTYPE="dos")", 5000); }

    // Another one under the same name.
    void replace(const std::string& name)
    {
        unplug(name);
        support::write_file("/dev/keeps_a_number", "");
        plug(name);
        support::remove_all("/dev/keeps_a_number");
    }

    static std::vector<std::string> listed()
    {
        std::vector<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator("/sys/block")) {
            names.push_back(entry.path().filename());
        }
        return names;
    }

    static std::string letter_name(int i)
    {
        return "sd" + std::string(1, static_cast<char>('a' + i));
    }

    // Rescans and tells whether a change was noticed.
    int32_t rescan()
    {
        int32_t changed = 0;
        EXPECT_TRUE(rescan_block_devices(&sets, &changed));
        return changed;
    }

    bool holds(const std::string& name)
    {
        return disk_sets_find_disk(&sets, name.c_str()) != nullptr;
    }

    disk_sets sets{};
};

}  // namespace

TEST_F(Rescan, a_disk_that_came_is_added_and_one_that_went_is_removed)
{
    plug("sda");
    EXPECT_EQ(rescan(), 1);
    EXPECT_TRUE(holds("sda"));
    EXPECT_EQ(rescan(), 0) << "nothing new";

    plug("sdb");
    unplug("sda");
    EXPECT_EQ(rescan(), 1);
    EXPECT_FALSE(holds("sda"));
    EXPECT_TRUE(holds("sdb"));
    EXPECT_EQ(times_called("umount /dev/sda"), 1);
    EXPECT_EQ(rescan(), 0);
}

TEST_F(Rescan, the_first_rescan_offers_known_disks_again_and_the_inventory_ignores_them)
{
    const std::string log = capture_stdout([&] {
        plug("sda");
        support::put_root(&sets.entries[0], "sda", 5000);
        EXPECT_EQ(rescan(), 1);
        EXPECT_EQ(disk_sets_count(&sets), 1);
    });
    EXPECT_TRUE(contains(log, "=== ===> dev is already add! dev name = sda\n"));
}

TEST_F(Rescan, a_disk_that_came_and_went_between_two_rescans_is_forgotten)
{
    plug("sda");
    disk_sets_add_dev(&sets, "sda");
    unplug("sda");
    const std::string log = capture_stdout([&] { EXPECT_EQ(rescan(), 1); });
    EXPECT_FALSE(holds("sda"));
    EXPECT_TRUE(contains(log, "]disk was pulled, dev = sda\n")) << log;
    EXPECT_EQ(rescan(), 0);
}

TEST_F(Rescan, another_disk_under_a_known_name_is_gone_and_new)
{
    plug("sda");
    EXPECT_EQ(rescan(), 1);
    const uint64_t before = sets.entries[0].disk.node_id;
    replace("sda");
    const std::string log = capture_stdout([&] { EXPECT_EQ(rescan(), 1); });
    EXPECT_TRUE(contains(log, "]disk was replaced, dev = sda\n")) << log;
    EXPECT_TRUE(holds("sda"));
    EXPECT_NE(sets.entries[0].disk.node_id, before);
    EXPECT_EQ(rescan(), 0);
}

TEST_F(Rescan, a_disk_replaced_before_any_rescan_listed_it_is_gone_and_new)
{
    plug("sda");
    disk_sets_add_dev(&sets, "sda");
    replace("sda");
    EXPECT_EQ(rescan(), 1);
    EXPECT_TRUE(holds("sda"));
    EXPECT_EQ(sets.entries[0].disk.node_id, dev_node_id("sda"));
}

TEST_F(Rescan, a_removed_disk_that_stays_plugged_stays_removed_and_returns_when_it_is_replaced)
{
    plug("sda");
    rescan();
    remove_dev(&sets, "sda");
    EXPECT_EQ(rescan(), 0);
    EXPECT_FALSE(holds("sda"));
    // A node that is missing for a moment makes no new disk.
    support::remove_all("/dev/sda");
    EXPECT_EQ(rescan(), 0);
    EXPECT_FALSE(holds("sda"));
    replace("sda");
    EXPECT_EQ(rescan(), 1);
    EXPECT_TRUE(holds("sda"));
}

TEST_F(Rescan, disks_beyond_the_sixteen_of_the_list_were_not_pulled)
{
    for (int i = 0; i < 17; ++i) {
        plug(letter_name(i));
    }
    for (const auto& name : listed()) {
        disk_sets_add_dev(&sets, name.c_str());
        if (disk_sets_count(&sets) == 16) {
            break;
        }
    }
    // The kernel lists them in whatever order: one of the 16 has no slot in some of these cases.
    for (int i = 0; i < 3; ++i) {
        rescan();
        EXPECT_EQ(disk_sets_count(&sets), 16);
    }
}

TEST_F(Rescan, other_block_devices_are_not_offered)
{
    for (const char* name : {"loop0", "mtdblock3", "sr0", "ram1", "ubiblock0_0", "sd"}) {
        plug(name);
    }
    EXPECT_EQ(rescan(), 0);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Rescan, with_no_disk_at_all_nothing_is_offered)
{
    EXPECT_EQ(rescan(), 0);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Rescan, a_full_list_that_shrinks_offers_its_empty_slot_as_a_name)
{
    const std::string log = capture_stdout([&] {
        for (int i = 0; i < 16; ++i) {
            plug(letter_name(i));
        }
        rescan();
        EXPECT_EQ(disk_sets_count(&sets), 16);
        unplug("sdc");
        printf("=== shrunk\n");
        EXPECT_EQ(rescan(), 1);
        EXPECT_EQ(disk_sets_count(&sets), 15);
        EXPECT_FALSE(holds("sdc"));
        printf("=== calm\n");
        EXPECT_EQ(rescan(), 0);
    });
    const std::string shrunk =
        log.substr(log.find("=== shrunk"), log.find("=== calm") - log.find("=== shrunk"));
    EXPECT_EQ(support::count_of(shrunk, ")add dev name = \n"), 1) << shrunk;
    EXPECT_TRUE(contains(shrunk, "=== ===> dev err, dev = /dev/\n"));
}

TEST_F(Rescan, more_than_16_names_are_cut_at_16)
{
    for (int i = 0; i < 20; ++i) {
        plug(letter_name(i));
    }
    rescan();
    EXPECT_EQ(disk_sets_count(&sets), 16);
    EXPECT_EQ(rescan(), 0) << "the four without a slot do not change the list";
}

TEST_F(Rescan, names_of_15_characters_are_held_whole_and_longer_ones_are_cut)
{
    const std::string log = capture_stdout([&] {
        plug("sd0123456789abc");
        EXPECT_EQ(rescan(), 1);
        EXPECT_TRUE(holds("sd0123456789abc"));
        EXPECT_EQ(rescan(), 0);
        plug("sdX123456789abcdefghij");
        EXPECT_EQ(rescan(), 1);
        EXPECT_EQ(rescan(), 0) << "the cut name is compared as it was kept";
        EXPECT_EQ(disk_sets_count(&sets), 1);
    });
    EXPECT_TRUE(contains(log, ")add dev name = sdX123456789abc\n"));
}

TEST_F(Rescan, a_list_that_cannot_be_read_changes_nothing)
{
    const std::string log = expect_in_child([&] {
        plug("sda");
        rescan();
        support::allow_no_open_files();
        int32_t changed = 0;
        EXPECT_FALSE(rescan_block_devices(&sets, &changed));
        EXPECT_EQ(changed, 0);
        EXPECT_TRUE(holds("sda"));
    });
    EXPECT_TRUE(contains(log, "]open dir err, dir = /sys/block\n"));
}

TEST_F(Rescan, a_disk_that_vanished_unannounced_is_removed_with_all_its_partitions)
{
    plug("sda");
    plug_part("sda", "sda1", R"(UUID="U-1" TYPE="ext4")", 4000);
    rescan();
    ASSERT_NE(disk_sets_find_part(&sets, "sda1"), nullptr);
    unplug("sda");
    EXPECT_EQ(rescan(), 1);
    EXPECT_TRUE(support::is_all_zero(sets));
    EXPECT_EQ(times_called("umount /dev/sda1"), 1);
}

TEST_F(Rescan, a_meant_removal_drops_the_offers_of_its_own_disk_alone)
{
    struct meant_case {
        const char* offered;
        const char* meant;
        bool dropped;
    };
    for (const meant_case& one : {meant_case{"sda1", "sda1", true},
                                  {"sda1", "sda2", true},
                                  {"sda1", "sda", true},
                                  {"sda", "sda10", true},
                                  {"mmcblk0p1", "mmcblk0", true},
                                  {"mmcblk0p1", "mmcblk0p2", true},
                                  {"sda1", "sdaa1", false},
                                  {"sda1", "sd", false},
                                  {"sda1", "", false},
                                  {"mmcblk1p1", "mmcblk10p1", false},
                                  {"sda1", nullptr, true}}) {
        rescan_reset();
        rescan_offer_again(one.offered);
        rescan_drop_offers(one.meant);
        // An offer that is left makes a change of its own, whatever becomes of it.
        EXPECT_EQ(rescan(), one.dropped ? 0 : 1)
            << one.offered << ", " << (one.meant != nullptr ? one.meant : "null");
    }
}
