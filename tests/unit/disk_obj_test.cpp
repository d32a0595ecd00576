#include "disk/disk_obj.h"

#include <gtest/gtest.h>

#include <string>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;
using support::is_all_zero;
using support::put_part;

namespace {

class DiskObj : public support::disk_world {
protected:
    DiskObj()
    {
        disk = &entry.disk;
        support::put_root(&entry, "sda", 50000);
    }

    // The device names in slot order, "-" for a free slot.
    [[nodiscard]] std::string slots() const
    {
        std::string text;
        for (const part_slot& slot : disk->parts) {
            text += text.empty() ? "" : " ";
            text += slot.in_use == 1 ? slot.part.dev_name : "-";
        }
        return text;
    }

    disk_entry entry{};
    disk_obj* disk;
};

}  // namespace

TEST_F(DiskObj, a_partition_of_999_mib_is_dropped_and_one_of_1000_mib_is_kept)
{
    put_part(disk, 0, "sda1", 999);
    put_part(disk, 3, "sda2", 1000);
    put_part(disk, 7, "sda3", 0);
    const std::string log = capture_stdout([&] { disk_obj_drop_small_parts(disk); });
    EXPECT_EQ(slots(), "- - - sda2 - - - -");
    EXPECT_TRUE(is_all_zero(disk->parts[0]));
    EXPECT_TRUE(is_all_zero(disk->parts[7]));
    EXPECT_TRUE(contains(log, "=== Delete part[0], dev name = sda1\n"));
    EXPECT_TRUE(contains(log, "total len = 999\n"));
    EXPECT_TRUE(contains(log, "=== Delete part[7], dev name = sda3\n"));
    EXPECT_FALSE(contains(log, "sda2"));
}

TEST_F(DiskObj, an_extended_partition_of_1000_mib_keeps_its_slot_when_small_ones_are_dropped)
{
    plug_disk("sda", "", 50000);
    const std::string details = R"(PTTYPE="dos")";
    plug_part("sda", "sda1", details, 999);
    plug_part("sda", "sda2", details, 1000);
    std::string sector(512, '\0');
    sector[510] = '\x55';
    sector[511] = '\xAA';
    for (const char* name : {"sda1", "sda2"}) {
        support::write_file(std::string("/dev/") + name, sector + std::string(200000, '\0'));
        ASSERT_EQ(disk_obj_add_sub_part(disk, name), 0);
    }
    ASSERT_EQ(disk->parts[1].part.fs_type, FS_EXTENDED);
    disk_obj_read_sizes(disk);
    disk_obj_drop_small_parts(disk);
    EXPECT_EQ(slots(), "- sda2 - - - - - -") << "the small one goes like any other";
    EXPECT_EQ(disk->parts[1].part.fs_type, FS_EXTENDED);
}

TEST_F(DiskObj, the_whole_disk_is_never_dropped_as_small)
{
    disk->root.total_len = 10;
    disk_obj_drop_small_parts(disk);
    EXPECT_STREQ(disk->root.dev_name, "sda");
}

TEST_F(DiskObj, sizes_5000_5000_8000_end_as_8000_then_the_former_slot_1_then_the_former_slot_0)
{
    put_part(disk, 0, "sda1", 5000);
    put_part(disk, 1, "sda2", 5000);
    put_part(disk, 2, "sda3", 8000);
    const std::string log = capture_stdout([&] { disk_obj_sort_parts_by_size(disk); });
    EXPECT_EQ(slots(), "sda3 sda2 sda1 - - - - -");
    EXPECT_TRUE(contains(log, "sort by size, dev = sda\n"));
}

TEST_F(DiskObj, equal_sizes_are_never_swapped_with_each_other)
{
    put_part(disk, 0, "sda1", 5000);
    put_part(disk, 1, "sda2", 5000);
    put_part(disk, 2, "sda3", 5000);
    disk_obj_sort_parts_by_size(disk);
    EXPECT_EQ(slots(), "sda1 sda2 sda3 - - - - -");
}

TEST_F(DiskObj, sorting_carries_free_slots_to_the_end_with_their_flag_and_all_their_bytes_zero)
{
    put_part(disk, 1, "sda1", 1000);
    put_part(disk, 4, "sda2", 3000);
    put_part(disk, 7, "sda3", 2000);
    disk_obj_sort_parts_by_size(disk);
    EXPECT_EQ(slots(), "sda2 sda3 sda1 - - - - -");
    for (int i = 3; i < MAX_SUB_PARTS; ++i) {
        EXPECT_TRUE(is_all_zero(disk->parts[i])) << i;
    }
    EXPECT_EQ(disk->parts[0].part.ref_root, &disk->root);
}

TEST_F(DiskObj, a_ninth_partition_is_refused_and_changes_nothing)
{
    for (int i = 1; i <= MAX_SUB_PARTS; ++i) {
        EXPECT_EQ(disk_obj_add_sub_part(disk, ("sda" + std::to_string(i)).c_str()), 0);
    }
    const disk_obj before = *disk;
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_obj_add_sub_part(disk, "sda9"), 1); });
    EXPECT_TRUE(contains(log, "sub part full, root dev name = sda, sub dev = sda9\n"));
    EXPECT_TRUE(contains(log, "Warning["));
    EXPECT_TRUE(support::same_bytes(before, *disk));
    EXPECT_EQ(slots(), "sda1 sda2 sda3 sda4 sda5 sda6 sda7 sda8");
}

TEST_F(DiskObj, a_new_partition_takes_the_first_free_slot_and_points_to_its_root)
{
    put_part(disk, 0, "sda1", 2000);
    put_part(disk, 2, "sda3", 2000);
    plug_part("sda", "sda2", R"(LABEL="Music" UUID="U-2" TYPE="ext4")", 2000);
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_obj_add_sub_part(disk, "sda2"), 0); });
    EXPECT_EQ(slots(), "sda1 sda2 sda3 - - - - -");
    EXPECT_EQ(disk->parts[1].part.ref_root, &disk->root);
    EXPECT_EQ(disk->parts[1].part.is_root_part, 0);
    EXPECT_STREQ(disk->parts[1].part.uid, "U-2");
    EXPECT_TRUE(contains(log, "=== ===> add sub part ==> /dev/sda2\n"));
    EXPECT_TRUE(contains(log, "=== ===> part dev name = sda2, ref root dev = sda\n"));
}

TEST_F(DiskObj, behind_several_slots_that_fell_free_a_new_partition_takes_the_first_after_sorting)
{
    const uint64_t sizes[MAX_SUB_PARTS] = {2000, 500, 4000, 3000, 999, 1000, 0, 5000};
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        put_part(disk, i, ("sda" + std::to_string(i + 1)).c_str(), sizes[i]);
    }
    disk_obj_drop_small_parts(disk);
    disk_obj_clear_part(disk, &disk->parts[3].part);
    ASSERT_EQ(slots(), "sda1 - sda3 - - sda6 - sda8");
    disk_obj_sort_parts_by_size(disk);
    EXPECT_EQ(slots(), "sda8 sda3 sda1 sda6 - - - -");
    plug_part("sda", "sda9", R"(UUID="U-9" TYPE="ext4")", 2000);
    EXPECT_EQ(disk_obj_add_sub_part(disk, "sda9"), 0);
    EXPECT_EQ(slots(), "sda8 sda3 sda1 sda6 sda9 - - -");
    EXPECT_STREQ(disk->parts[4].part.uid, "U-9");
    for (int i = 5; i < MAX_SUB_PARTS; ++i) {
        EXPECT_TRUE(is_all_zero(disk->parts[i])) << i;
    }
}

TEST_F(DiskObj, setting_the_root_makes_it_point_to_itself)
{
    disk_obj fresh{};
    plug_disk("sdb", R"(UUID="U-B" TYPE="ext4")", 2000);
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_obj_set_root(&fresh, "sdb"), 0); });
    EXPECT_EQ(fresh.root.is_root_part, 1);
    EXPECT_EQ(fresh.root.ref_root, &fresh.root);
    EXPECT_STREQ(fresh.root.dev_name, "sdb");
    EXPECT_EQ(fresh.root.fs_type, FS_EXT4);
    EXPECT_TRUE(contains(log, "=== ===> set root part(sdb), ref disk dev name = sdb\n"));
}

TEST_F(DiskObj, a_device_name_longer_than_15_characters_is_cut)
{
    disk_obj fresh{};
    disk_obj_set_root(&fresh, "sdabcdefghijklmnop");
    EXPECT_STREQ(fresh.root.dev_name, "sdabcdefghijklm");
}

TEST_F(DiskObj, parts_are_found_by_their_exact_name_root_first)
{
    put_part(disk, 5, "sda1", 2000);
    EXPECT_EQ(disk_obj_get_part(disk, "sda"), &disk->root);
    EXPECT_EQ(disk_obj_get_part(disk, "sda1"), &disk->parts[5].part);
    EXPECT_EQ(disk_obj_get_part(disk, "sda11"), nullptr);
    EXPECT_EQ(disk_obj_get_part(disk, "sd"), nullptr);
    EXPECT_EQ(disk_obj_get_part(disk, ""), nullptr) << "free slots have no name";
    EXPECT_EQ(disk_obj_get_part(disk, nullptr), nullptr);
    const std::string log = capture_stdout([&] { disk_obj_get_part(disk, "sda1"); });
    EXPECT_TRUE(contains(log, "get part, dev name = sda1\n"));
}

TEST_F(DiskObj, the_search_by_directory_name_leaves_the_root_out)
{
    text_copy(disk->root.disk_name, "disk1_part1");
    part_info* part = put_part(disk, 2, "sda1", 2000);
    text_copy(part->disk_name, "disk1_part2");
    EXPECT_EQ(disk_obj_find_part_by_disk_name(disk, "disk1_part1"), nullptr);
    EXPECT_EQ(disk_obj_find_part_by_disk_name(disk, "disk1_part2"), part);
    EXPECT_EQ(disk_obj_find_part_by_disk_name(disk, "disk1_part22"), nullptr);
}

TEST_F(DiskObj, having_a_device_answers_0_for_root_and_slot_and_1_for_others)
{
    put_part(disk, 1, "sda1", 2000);
    std::string log = capture_stdout([&] { EXPECT_EQ(disk_obj_has_dev(disk, "sda"), 0); });
    EXPECT_TRUE(contains(log, "root dev already exist, name = sda\n"));
    log = capture_stdout([&] { EXPECT_EQ(disk_obj_has_dev(disk, "sda1"), 0); });
    EXPECT_TRUE(contains(log, "check dev, name = sda1\n"));
    EXPECT_TRUE(contains(log, "root part dev = sda\n"));
    EXPECT_TRUE(contains(log, ")dev already exist, name = sda1\n") ||
                contains(log, "]dev already exist, name = sda1\n"));
    EXPECT_EQ(disk_obj_has_dev(disk, "sda2"), 1);
    log = capture_stdout([&] { EXPECT_EQ(disk_obj_has_dev(nullptr, "sda"), 1); });
    EXPECT_TRUE(contains(log, "err!\n"));
}

TEST_F(DiskObj, clearing_a_part_zeroes_its_whole_slot_and_no_other)
{
    put_part(disk, 0, "sda1", 2000);
    put_part(disk, 1, "sda2", 2000);
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_obj_clear_part(disk, &disk->parts[1].part), 0); });
    EXPECT_TRUE(is_all_zero(disk->parts[1]));
    EXPECT_EQ(slots(), "sda1 - - - - - - -");
    EXPECT_TRUE(contains(log, "want clear dev = sda1, sda2\n"));
    EXPECT_TRUE(contains(log, "clear ok, find dev = sda2\n"));
}

TEST_F(DiskObj, the_root_is_not_found_for_clearing)
{
    put_part(disk, 0, "sda1", 2000);
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(disk_obj_clear_part(disk, &disk->root), 1); });
    EXPECT_TRUE(contains(log, "clear err, not find dev = sda\n"));
    EXPECT_EQ(slots(), "sda1 - - - - - - -");
}

TEST_F(DiskObj, a_disk_formatted_without_a_partition_table_counts_one_partition)
{
    EXPECT_EQ(disk_obj_count_parts(disk), 0);
    disk->root.fs_type = FS_EXT4;
    EXPECT_EQ(disk_obj_count_parts(disk), 1);
}

TEST_F(DiskObj, only_valid_partitions_are_counted)
{
    text_copy(put_part(disk, 0, "sda1", 2000)->disk_name, "disk1_part1");
    put_part(disk, 1, "sda2", 2000);  // not yet named
    part_info* part = put_part(disk, 6, "sda3", 2000);
    text_copy(part->disk_name, "disk1_part7");
    part->free_size = 2001;
    EXPECT_EQ(disk_obj_count_parts(disk), 1);
    disk->root.fs_type = FS_EXFAT;
    EXPECT_EQ(disk_obj_count_parts(disk), 2);
}

TEST_F(DiskObj, re_pointing_reaches_the_root_and_in_use_slots_and_leaves_free_ones_zero)
{
    put_part(disk, 3, "sda1", 2000);
    part_info other{};
    disk_obj_set_ref_root(disk, &other);
    EXPECT_EQ(disk->root.ref_root, &other);
    EXPECT_EQ(disk->parts[3].part.ref_root, &other);
    for (const int i : {0, 1, 2, 4, 5, 6, 7}) {
        EXPECT_TRUE(is_all_zero(disk->parts[i])) << i;
    }
}

TEST_F(DiskObj, sizes_are_read_with_the_hardware_sector_size_of_the_disk)
{
    plug_disk("sda", "", 50000);
    plug_part("sda", "sda1", "", 1500);
    support::write_file("/sys/block/sda/queue/hw_sector_size", "4096\n");
    put_part(disk, 0, "sda1", 0);
    const std::string log = capture_stdout([&] { disk_obj_read_sizes(disk); });
    EXPECT_EQ(disk->root.sector_size, 4096U);
    EXPECT_EQ(disk->root.total_len, 400000U);
    EXPECT_EQ(disk->parts[0].part.sector_size, 4096U);
    EXPECT_EQ(disk->parts[0].part.total_len, 12000U);
    EXPECT_TRUE(contains(log, "get size, dev = sda1, len = 12000\n"));
}

TEST_F(DiskObj, a_known_root_size_is_kept_while_slots_are_read_again)
{
    plug_disk("sda", "", 50000);
    plug_part("sda", "sda1", "", 1500);
    put_part(disk, 0, "sda1", 1);
    disk->root.sector_number = 7;
    disk->root.sector_size = 512;
    disk->root.total_len = 3;
    disk_obj_read_sizes(disk);
    EXPECT_EQ(disk->root.total_len, 3U);
    EXPECT_EQ(disk->parts[0].part.total_len, 1500U);
}

TEST_F(DiskObj, without_a_sector_size_the_slots_size_is_left_alone)
{
    put_part(disk, 0, "sda1", 1234);
    const std::string log = capture_stdout([&] { disk_obj_read_sizes(disk); });
    EXPECT_TRUE(contains(log, "Not set sector size!\n"));
    EXPECT_EQ(disk->parts[0].part.total_len, 1234U);
}

TEST_F(DiskObj, a_null_disk_is_answered_with_1_or_nothing)
{
    EXPECT_EQ(disk_obj_set_root(nullptr, "sda"), 1);
    EXPECT_EQ(disk_obj_add_sub_part(nullptr, "sda1"), 1);
    EXPECT_EQ(disk_obj_get_part(nullptr, "sda1"), nullptr);
    EXPECT_EQ(disk_obj_find_part_by_disk_name(nullptr, "disk1_part1"), nullptr);
    EXPECT_EQ(disk_obj_clear_part(nullptr, &disk->root), 1);
    EXPECT_EQ(disk_obj_clear_part(disk, nullptr), 1);
    EXPECT_EQ(disk_obj_drop_small_parts(nullptr), 1);
    EXPECT_EQ(disk_obj_sort_parts_by_size(nullptr), 1);
    EXPECT_EQ(disk_obj_set_ref_root(nullptr, nullptr), 1);
    EXPECT_EQ(disk_obj_read_sizes(nullptr), 1);
    EXPECT_EQ(disk_obj_refresh_sizes(nullptr), 1);
}

TEST_F(DiskObj, no_disk_is_dumped_as_nothing)
{
    EXPECT_EQ(support::log_of([] { disk_obj_dump(nullptr); }), "");
}
