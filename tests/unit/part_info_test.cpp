#include "disk/part_info.h"

#include <gtest/gtest.h>
#include <sys/vfs.h>

#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;
using support::make_part;
using support::write_file;

namespace {

class PartInfo : public support::disk_world {
protected:
    // Fills the record of a partition that blkid describes so.
    part_info fill(const std::string& details)
    {
        plug_part("sda", "sda1", details, 2000);
        part_info part = make_part("sda1", 0);
        EXPECT_EQ(part_info_fill(&part), 0);
        return part;
    }
};

part_info valid_part()
{
    part_info part = make_part("sda1", 2000);
    text_copy(part.disk_name, "disk1_part1");
    part.free_size = 100;
    return part;
}

}  // namespace

TEST_F(PartInfo, the_fields_have_their_sizes_and_their_order)
{
    EXPECT_EQ(sizeof(part_info::uid), 128U);
    EXPECT_EQ(sizeof(part_info::dev_name), 16U);
    EXPECT_EQ(sizeof(part_info::disk_name), 32U);
    EXPECT_EQ(sizeof(part_info::label), 128U);
    EXPECT_EQ(sizeof(part_info::mount_path), 128U);
    EXPECT_LT(offsetof(part_info, mount_path), offsetof(part_info, total_len));
    EXPECT_LT(offsetof(part_info, used_len), offsetof(part_info, is_root_part));
    EXPECT_LT(offsetof(part_info, ref_root), offsetof(part_info, fs_type));
    EXPECT_LT(offsetof(part_info, mount_point_num), offsetof(part_info, mount_status));
}

TEST_F(PartInfo, a_record_with_both_names_a_size_and_no_more_free_space_than_size_is_valid)
{
    part_info part = valid_part();
    EXPECT_TRUE(part_info_is_valid(&part));
    part.free_size = part.total_len;
    EXPECT_TRUE(part_info_is_valid(&part));
}

TEST_F(PartInfo, each_missing_thing_makes_a_record_invalid)
{
    part_info part = valid_part();
    part.dev_name[0] = '\0';
    EXPECT_FALSE(part_info_is_valid(&part));
    part = valid_part();
    part.disk_name[0] = '\0';
    EXPECT_FALSE(part_info_is_valid(&part));
    part = valid_part();
    part.total_len = 0;
    part.free_size = 0;
    EXPECT_FALSE(part_info_is_valid(&part));
    part = valid_part();
    part.free_size = part.total_len + 1;
    EXPECT_FALSE(part_info_is_valid(&part));
}

TEST_F(PartInfo, the_length_is_cut_down_to_whole_mib_and_does_not_wrap_at_4_gib)
{
    part_info part{};
    part.sector_size = 512;
    part.sector_number = 2 * 2048 - 1;
    part_info_set_length(&part);
    EXPECT_EQ(part.total_len, 1U);
    part.sector_number = 39063650304;  // 20 TB
    part_info_set_length(&part);
    EXPECT_EQ(part.total_len, 19074048U);
    part.sector_size = 4096;  // the product takes the hardware's sector size as it is
    part.sector_number = 2048;
    part_info_set_length(&part);
    EXPECT_EQ(part.total_len, 8U);
}

TEST_F(PartInfo, free_space_counts_the_free_blocks_of_the_mounted_directory)
{
    struct statfs info {};
    ASSERT_EQ(statfs("/run", &info), 0);
    part_info part = make_part("sda1", 2000);
    text_copy(part.mount_path, "/run");
    part_info_refresh_free(&part);
    const uint64_t expected =
        static_cast<uint64_t>(info.f_bfree) * static_cast<uint64_t>(info.f_bsize) >> 20U;
    EXPECT_NEAR(static_cast<double>(part.free_size), static_cast<double>(expected), 16);
    EXPECT_GT(part.free_size, 0U);
}

TEST_F(PartInfo, without_a_mount_path_or_with_one_that_is_gone_there_is_no_free_space)
{
    part_info part = make_part("sda1", 2000);
    part.free_size = 77;
    part_info_refresh_free(&part);
    EXPECT_EQ(part.free_size, 0U);

    part.free_size = 77;
    text_copy(part.mount_path, "/tmp/mountd/disk9_part9");
    part_info_refresh_free(&part);
    EXPECT_EQ(part.free_size, 0U);
}

TEST_F(PartInfo, filling_a_partition_takes_type_label_and_uuid)
{
    const part_info part = fill(R"(LABEL="Music" UUID="1234-ABCD" TYPE="ext4")");
    EXPECT_EQ(part.fs_type, FS_EXT4);
    EXPECT_STREQ(part.label, "Music");
    EXPECT_STREQ(part.uid, "1234-ABCD");
}

TEST_F(PartInfo, a_partition_without_a_uuid_is_known_by_its_partition_uuid)
{
    EXPECT_STREQ(fill(R"(TYPE="ext4" PARTUUID="beef-01")").uid, "beef-01");
}

TEST_F(PartInfo, a_device_with_neither_uuid_keeps_an_empty_uid)
{
    EXPECT_STREQ(fill(R"(TYPE="ext4")").uid, "");
}

TEST_F(PartInfo, a_label_of_one_character_or_none_is_replaced_by_the_device_name)
{
    EXPECT_STREQ(fill(R"(TYPE="ext4")").label, "sda1");
    EXPECT_STREQ(fill(R"(LABEL="M" TYPE="ext4")").label, "sda1");
    EXPECT_STREQ(fill(R"(LABEL="My" TYPE="ext4")").label, "My");
}

TEST_F(PartInfo, a_fat_label_of_three_hyphens_shows_the_device_name_and_an_ntfs_one_is_kept)
{
    EXPECT_STREQ(fill(R"(LABEL="12-34-56-78" TYPE="vfat")").label, "sda1");
    EXPECT_STREQ(fill(R"(LABEL="12-34-5678" TYPE="vfat")").label, "12-34-5678");
    EXPECT_STREQ(fill(R"(LABEL="12-34-56-78" TYPE="ntfs")").label, "12-34-56-78");
}

TEST_F(PartInfo, the_label_script_gives_the_whole_label_with_its_spaces)
{
    stubs.add_at("/usr/bin/disk_get_label.sh", "printf 'My Music Disk\\nsecond line\\n'");
    EXPECT_STREQ(fill(R"(LABEL="My Music Disk" TYPE="ext4")").label, "My Music Disk");
    EXPECT_EQ(times_called("/usr/bin/disk_get_label.sh sda1"), 1);
}

TEST_F(PartInfo, without_the_label_script_the_label_ends_at_its_first_space)
{
    EXPECT_STREQ(fill(R"(LABEL="My Music" TYPE="ext4")").label, "My");
    EXPECT_EQ(times_called("blkid -d /dev/sda1"), 1);
}

TEST_F(PartInfo, an_empty_answer_of_the_label_script_is_replaced_by_the_device_name)
{
    stubs.add_at("/usr/bin/disk_get_label.sh");
    EXPECT_STREQ(fill(R"(LABEL="Music" TYPE="ext4")").label, "sda1");
}

TEST_F(PartInfo, what_a_killed_label_script_has_said_is_no_label_and_blkids_is_taken)
{
    // The shell is killed, also one that gives its process to its only command.
    stubs.add_at("/usr/bin/disk_get_label.sh",
                 "echo 'My Mu'\n"
                 R"x([ "$(cat /proc/$PPID/comm)" = sh ] && kill -KILL $PPID || kill -KILL $$)x");
    support::capture_stderr(
        [&] { EXPECT_STREQ(fill(R"(LABEL="Their Music" TYPE="ext4")").label, "Their"); });
    EXPECT_EQ(times_called("/usr/bin/disk_get_label.sh sda1"), 1);
    EXPECT_EQ(times_called("blkid -d /dev/sda1"), 1);
}

TEST_F(PartInfo, a_uuid_and_a_label_of_128_characters_and_more_stay_terminated)
{
    const std::string text(200, 'u');
    const part_info part = fill("LABEL=\"" + text + "\" UUID=\"" + text + R"(" TYPE="ext4")");
    EXPECT_EQ(std::string(part.uid), text.substr(0, 127));
    EXPECT_EQ(std::string(part.label), text.substr(0, 127));
}

TEST_F(PartInfo, a_whole_disk_is_asked_through_blkid_alone_and_gets_no_label)
{
    plug_disk("sda", R"(LABEL="Stick" UUID="AA-BB" TYPE="vfat")", 4000);
    part_info root = make_part("sda", 0);
    root.is_root_part = 1;
    const std::string log = capture_stdout([&] { part_info_fill(&root); });
    EXPECT_EQ(root.fs_type, FS_FAT);
    EXPECT_STREQ(root.uid, "AA-BB");
    EXPECT_STREQ(root.label, "");
    EXPECT_TRUE(contains(log, "dev /dev/sda fs = FAT\n"));
}

TEST_F(PartInfo, a_whole_disk_with_a_partition_table_has_no_filesystem)
{
    plug_disk("sda", R"(PTUUID="12345678" PTTYPE="dos")", 4000);
    part_info root = make_part("sda", 0);
    root.is_root_part = 1;
    part_info_fill(&root);
    EXPECT_EQ(root.fs_type, FS_NONE);
}

TEST_F(PartInfo, an_extended_partition_logs_its_error_lines_and_the_record_is_kept)
{
    plug_part("sda", "sda2", R"(PTTYPE="dos" PARTUUID="01-02")", 2000);
    // The container of logical partitions: a table of its own with one more container in it.
    std::string sector(512, '\0');
    sector[446 + 4] = '\x83';
    sector[446 + 16 + 4] = '\x05';
    sector[510] = '\x55';
    sector[511] = '\xAA';
    write_file("/dev/sda2", sector + std::string(200000, '\0'));
    part_info part = make_part("sda2", 0);
    const std::string log = capture_stdout([&] { part_info_fill(&part); });
    EXPECT_EQ(part.fs_type, FS_EXTENDED) << log;
    EXPECT_TRUE(contains(log, "dev = /dev/sda2, get err fs type = EXTENDED\n")) << log;
    EXPECT_GE(support::count_of(log, ")=======================\n"), 2) << log;
    EXPECT_STREQ(part.dev_name, "sda2");
    EXPECT_STREQ(part.label, "sda2");
}

TEST_F(PartInfo, the_dump_prints_every_field_between_two_rules)
{
    part_info root = make_part("sda", 5000);
    part_info part = valid_part();
    part.ref_root = &root;
    text_copy(part.uid, "U-1");
    text_copy(part.label, "Music");
    text_copy(part.mount_path, "/tmp/mountd/disk1_part1");
    part.fs_type = FS_NTFS;
    part.sector_number = 4096000;
    part.sector_size = 512;
    part.mount_point_num = 3;
    part.mount_status = 1;
    const std::string log = capture_stdout([&] { part_info_dump(&part); });
    const char* const expected[] = {"================================",
                                    "uid = U-1",
                                    "dev name = sda1",
                                    "ref root dev name = sda",
                                    "disk name = disk1_part1",
                                    "label name = Music",
                                    "total len = 2000",
                                    "free size = 100",
                                    "used len = 0",
                                    "is root part = 0",
                                    "sector number = 4096000",
                                    "sector size = 512",
                                    "fs type = NTFS",
                                    "mount path = /tmp/mountd/disk1_part1",
                                    "mount point num = 3",
                                    "mount status = 1",
                                    "================================"};
    const std::vector<std::string> lines = support::lines_of(log);
    ASSERT_EQ(lines.size(), std::size(expected)) << log;
    for (size_t i = 0; i < lines.size(); ++i) {
        EXPECT_EQ(lines[i].substr(lines[i].find(')') + 1), expected[i]);
    }
}

TEST_F(PartInfo, a_dump_without_a_root_leaves_its_line_out)
{
    const part_info part = valid_part();
    const std::string log = capture_stdout([&] { part_info_dump(&part); });
    EXPECT_FALSE(contains(log, "ref root dev name"));
    EXPECT_TRUE(contains(log, "fs type = ERR FS\n"));
}

TEST_F(PartInfo, no_record_is_not_valid_and_is_dumped_as_nothing)
{
    EXPECT_FALSE(part_info_is_valid(nullptr));
    EXPECT_EQ(support::log_of([] { part_info_dump(nullptr); }), "");
}
