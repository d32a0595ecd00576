#include "disk/disk_sets.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <string>

#include "support/capture.h"
#include "support/disk_world.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;
using support::is_all_zero;
using support::put_part;
using support::put_root;

namespace {

class DiskSets : public support::disk_world {
protected:
    void put(int place, const char* name, uint64_t mib)
    {
        put_root(&sets.entries[place], name, mib);
    }

    [[nodiscard]] std::string order() const
    {
        std::string text;
        for (const disk_entry& entry : sets.entries) {
            if (entry.in_use == 1) {
                text += (text.empty() ? "" : " ") + std::string(entry.disk.root.dev_name);
            }
        }
        return text;
    }

    disk_sets sets{};
};

}  // namespace

TEST_F(DiskSets, init_and_free_zero_the_whole_table)
{
    memset(&sets, 'x', sizeof(sets));
    EXPECT_EQ(disk_sets_init(&sets), 0);
    EXPECT_TRUE(is_all_zero(sets));
    put(3, "sda", 100);
    sets.sorted_once = 1;
    EXPECT_EQ(disk_sets_free(&sets), 0);
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(DiskSets, entries_are_claimed_from_the_front)
{
    put(0, "sda", 1);
    put(2, "sdc", 1);
    EXPECT_EQ(disk_sets_get_free_entry(&sets), &sets.entries[1]);
    EXPECT_EQ(sets.entries[1].in_use, 1);
    EXPECT_EQ(disk_sets_get_free_entry(&sets), &sets.entries[3]);
}

TEST_F(DiskSets, a_17th_disk_is_refused_and_leaves_the_table_unchanged)
{
    for (int i = 0; i < MAX_DISKS; ++i) {
        ASSERT_NE(disk_sets_get_free_entry(&sets), nullptr) << i;
    }
    const disk_sets before = sets;
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_sets_get_free_entry(&sets), nullptr); });
    EXPECT_TRUE(contains(log, "]disk sets is full\n"));
    EXPECT_TRUE(contains(log, "Warning["));
    EXPECT_TRUE(support::same_bytes(before, sets));
}

TEST_F(DiskSets, a_disk_is_found_by_its_exact_root_name_and_dumped)
{
    put(0, "sda", 1);
    put(5, "sdaa", 1);
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_sets_find_disk(&sets, "sdaa"), &sets.entries[5]); });
    EXPECT_TRUE(contains(log, "get disk, root name = sdaa\n"));
    EXPECT_TRUE(contains(log, "disk obj:\n"));
    EXPECT_EQ(disk_sets_find_disk(&sets, "sdb"), nullptr);
    EXPECT_EQ(disk_sets_find_disk(&sets, ""), nullptr) << "free entries have no name";
    EXPECT_EQ(disk_sets_find_disk(&sets, nullptr), nullptr);
}

TEST_F(DiskSets, a_part_is_found_on_any_disk_in_table_order)
{
    put(1, "sda", 1);
    put(4, "sdb", 1);
    part_info* part = put_part(&sets.entries[4].disk, 2, "sdb3", 2000);
    EXPECT_EQ(disk_sets_find_part(&sets, "sdb3"), part);
    EXPECT_EQ(disk_sets_find_part(&sets, "sdb"), &sets.entries[4].disk.root);
    EXPECT_EQ(disk_sets_find_part(&sets, "sdb1"), nullptr);
}

TEST_F(DiskSets, disks_are_sorted_largest_first_and_free_entries_sink_to_the_end)
{
    put(0, "sda", 100);
    put(3, "sdb", 300);
    put(15, "sdc", 200);
    EXPECT_EQ(disk_sets_sort_by_size(&sets), 0);
    EXPECT_STREQ(sets.entries[0].disk.root.dev_name, "sdb");
    EXPECT_STREQ(sets.entries[1].disk.root.dev_name, "sdc");
    EXPECT_STREQ(sets.entries[2].disk.root.dev_name, "sda");
}

TEST_F(DiskSets, the_exchange_rule_orders_disks_too)
{
    put(0, "sda", 5000);
    put(1, "sdb", 5000);
    put(2, "sdc", 8000);
    disk_sets_sort_by_size(&sets);
    EXPECT_EQ(order(), "sdc sdb sda");
}

TEST_F(DiskSets, after_the_sort_every_in_use_slot_points_into_its_own_entry_and_free_ones_stay_zero)
{
    put(0, "sda", 100);
    put_part(&sets.entries[0].disk, 0, "sda1", 100);
    put_part(&sets.entries[0].disk, 7, "sda2", 50);
    put(2, "sdb", 900);
    put_part(&sets.entries[2].disk, 4, "sdb1", 900);
    put(9, "sdc", 400);
    put_part(&sets.entries[9].disk, 1, "sdc1", 400);
    disk_sets_sort_by_size(&sets);

    EXPECT_EQ(order(), "sdb sdc sda");
    for (int i = 0; i < MAX_DISKS; ++i) {
        disk_entry* entry = &sets.entries[i];
        if (i >= 3) {
            EXPECT_TRUE(is_all_zero(*entry)) << i;
            continue;
        }
        EXPECT_EQ(entry->in_use, 1);
        EXPECT_EQ(entry->disk.root.ref_root, &entry->disk.root) << i;
        for (const part_slot& slot : entry->disk.parts) {
            if (slot.in_use == 1) {
                EXPECT_EQ(slot.part.ref_root, &entry->disk.root) << slot.part.dev_name;
                EXPECT_EQ(strncmp(slot.part.dev_name, entry->disk.root.dev_name, 3), 0);
            } else {
                EXPECT_TRUE(is_all_zero(slot)) << i;
            }
        }
    }
    EXPECT_STREQ(sets.entries[2].disk.parts[7].part.dev_name, "sda2");
}

TEST_F(DiskSets, a_full_table_is_sorted_to_its_last_entry)
{
    uint64_t size = 0;
    for (int i = 0; i < MAX_DISKS; ++i) {
        const std::string name = "sd" + std::string(1, static_cast<char>('a' + i));
        put(i, name.c_str(), ++size);
    }
    disk_sets_sort_by_size(&sets);
    EXPECT_EQ(order(), "sdp sdo sdn sdm sdl sdk sdj sdi sdh sdg sdf sde sdd sdc sdb sda");
    for (disk_entry& entry : sets.entries) {
        EXPECT_EQ(entry.disk.root.ref_root, &entry.disk.root);
    }
}

TEST_F(DiskSets, a_disk_whose_partitions_were_all_dropped_is_removed_by_clear_empty)
{
    put(0, "sda", 5000);
    put_part(&sets.entries[0].disk, 0, "sda1", 500);
    put_part(&sets.entries[0].disk, 1, "sda2", 999);
    put(1, "sdb", 5000);
    text_copy(put_part(&sets.entries[1].disk, 0, "sdb1", 4000)->disk_name, "disk2_part1");
    disk_sets_drop_small_parts(&sets);
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_sets_clear_empty(&sets), 0); });
    EXPECT_EQ(order(), "sdb");
    EXPECT_TRUE(is_all_zero(sets.entries[0]));
    EXPECT_TRUE(contains(log, "]clear empty disk\n"));
    EXPECT_TRUE(contains(log, "clear dev = sda\n"));
    EXPECT_EQ(sets.entries[1].in_use, 1) << "no entry moves";
}

TEST_F(DiskSets, a_disk_with_a_filesystem_of_its_own_is_not_empty)
{
    put(0, "sda", 5000);
    sets.entries[0].disk.root.fs_type = FS_FAT;
    disk_sets_clear_empty(&sets);
    EXPECT_EQ(order(), "sda");
}

TEST_F(DiskSets, the_count_is_that_of_the_entries_in_use)
{
    EXPECT_EQ(disk_sets_count(&sets), 0);
    put(0, "sda", 1);
    put(2, "sdb", 1);
    put(5, "sdc", 1);
    EXPECT_EQ(disk_sets_count(&sets), 3);
}

TEST_F(DiskSets, refreshing_reads_a_missing_root_size_and_the_free_space_of_mounted_parts)
{
    plug_disk("sda", "", 5000);
    put(0, "sda", 0);
    part_info* mounted = put_part(&sets.entries[0].disk, 0, "sda1", 4000);
    text_copy(mounted->mount_path, "/run");
    part_info* planned = put_part(&sets.entries[0].disk, 1, "sda2", 4000);
    planned->free_size = 55;
    disk_sets_refresh_sizes(&sets);
    EXPECT_EQ(sets.entries[0].disk.root.total_len, 5000U);
    EXPECT_GT(mounted->free_size, 0U);
    EXPECT_EQ(planned->free_size, 0U);
    EXPECT_EQ(mounted->total_len, 4000U) << "sizes of slots are not read again";
}

TEST_F(DiskSets, refreshing_asks_for_the_roots_free_space_only_when_it_has_a_filesystem)
{
    put(0, "sda", 5000);
    text_copy(sets.entries[0].disk.root.mount_path, "/run");
    sets.entries[0].disk.root.free_size = 77;
    disk_sets_refresh_sizes(&sets);
    EXPECT_EQ(sets.entries[0].disk.root.free_size, 77U);
    sets.entries[0].disk.root.fs_type = FS_EXT4;
    text_copy(sets.entries[0].disk.root.mount_path, "/nowhere");
    disk_sets_refresh_sizes(&sets);
    EXPECT_EQ(sets.entries[0].disk.root.free_size, 0U);
}

TEST_F(DiskSets, the_dump_shows_every_disk_in_use)
{
    put(0, "sda", 1);
    put(7, "sdb", 1);
    put_part(&sets.entries[7].disk, 3, "sdb1", 1);
    const std::string log = capture_stdout([&] { disk_sets_dump(&sets); });
    EXPECT_EQ(support::count_of(log, "disk obj:\n"), 2);
    EXPECT_EQ(support::count_of(log, "uid = "), 3);
}

TEST_F(DiskSets, a_null_table_is_answered_with_1_or_nothing)
{
    disk_sets_dump(nullptr);
    EXPECT_EQ(disk_sets_init(nullptr), 1);
    EXPECT_EQ(disk_sets_free(nullptr), 1);
    EXPECT_EQ(disk_sets_get_free_entry(nullptr), nullptr);
    EXPECT_EQ(disk_sets_find_disk(nullptr, "sda"), nullptr);
    EXPECT_EQ(disk_sets_find_part(nullptr, "sda"), nullptr);
    EXPECT_EQ(disk_sets_refresh_sizes(nullptr), 1);
    EXPECT_EQ(disk_sets_drop_small_parts(nullptr), 1);
    EXPECT_EQ(disk_sets_sort_by_size(nullptr), 1);
    EXPECT_EQ(disk_sets_clear_empty(nullptr), 1);
}
