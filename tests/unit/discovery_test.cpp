#include "disk/discovery.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <string>
#include <utility>
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
using support::is_all_zero;

namespace {

constexpr char TABLE_DETAILS[] = R"(PTUUID="12345678" PTTYPE="dos")";

std::string ext4_details(const std::string& uuid)
{
    return "UUID=\"" + uuid + R"(" TYPE="ext4")";
}

class Discovery : public support::disk_world {
protected:
    // A partitioned disk with one ext4 partition of each size, numbered from 1.
    void plug_with_parts(const std::string& disk, const std::vector<uint64_t>& sizes)
    {
        plug_disk(disk, TABLE_DETAILS, 50000);
        for (size_t i = 0; i < sizes.size(); ++i) {
            const std::string part = disk + std::to_string(i + 1);
            plug_part(disk, part, ext4_details("U-" + part), sizes[i]);
        }
    }

    [[nodiscard]] part_info* find(const char* name) { return disk_sets_find_part(&sets, name); }

    disk_sets sets{};
};

}  // namespace

TEST_F(Discovery, the_device_check_passes_only_when_blkid_begins_with_exactly_the_path)
{
    plug_disk("sda", TABLE_DETAILS, 1);
    std::string log = capture_stdout([] { EXPECT_EQ(dev_check_blkid("sda"), 0); });
    EXPECT_TRUE(contains(log, "buf = /dev/sda: PTUUID="));
    EXPECT_TRUE(contains(log, "dev = /dev/sda\n"));
    EXPECT_TRUE(contains(log, "=== ===> dev ok, dev = /dev/sda\n"));
    EXPECT_FALSE(std::filesystem::exists("/tmp/tmp_blkid"));

    log = capture_stdout([] { EXPECT_EQ(dev_check_blkid("sdb"), 1); });
    EXPECT_TRUE(contains(log, "=== ===> dev err, dev = /dev/sdb\n"));
    support::write_file("/run/blkid/sdc", " /dev/sdc: TYPE=\"ext4\"\n");
    EXPECT_EQ(dev_check_blkid("sdc"), 1);
    support::write_file("/run/blkid/sdd", "/dev/sdc: TYPE=\"ext4\"\n");
    EXPECT_EQ(dev_check_blkid("sdd"), 1);
    EXPECT_EQ(dev_check_blkid(nullptr), 1);
}

TEST_F(Discovery, a_very_long_answer_of_blkid_is_read_up_to_its_buffer)
{
    support::write_file("/run/blkid/sda", "/dev/sda: LABEL=\"" + std::string(2000, 'x') + "\"\n");
    EXPECT_EQ(dev_check_blkid("sda"), 0);
}

TEST_F(Discovery, a_blank_disk_is_never_added)
{
    plug_disk("sda", "", 50000);
    EXPECT_EQ(disk_sets_add_dev(&sets, "sda"), 0);
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Discovery, loop0_mtdblock3_sr0_and_others_are_never_added_although_blkid_knows_them)
{
    for (const char* name : {"loop0", "mtdblock3", "sr0", "ram0", "ubi0_0", "nvme0n1", "sd"}) {
        plug_disk(name, ext4_details("U-1"), 9000);
        EXPECT_EQ(disk_sets_add_dev(&sets, name), 0);
        EXPECT_TRUE(is_all_zero(sets)) << name;
    }
}

TEST_F(Discovery, a_name_with_shell_characters_runs_no_command_and_is_answered_with_dev_err)
{
    for (const char* name : {"sda;touch /run/harm", "sda$(touch /run/harm)", "sda`touch /run/harm`",
                             "sda&touch /run/harm", "sda|touch", "sda>x", "sda x", "sda'", "sda\"",
                             "sda\n", "../sda", "sda*", "sd\xc3\xa4"}) {
        const std::string log =
            capture_stdout([&] { EXPECT_EQ(disk_sets_add_dev(&sets, name), 0); });
        EXPECT_TRUE(contains(log, std::string("=== ===> dev err, dev = /dev/") + name)) << log;
        EXPECT_FALSE(contains(log, "exec cmd")) << log;
    }
    EXPECT_TRUE(stubs.calls().empty());
    EXPECT_FALSE(std::filesystem::exists("/run/harm"));
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Discovery, the_characters_of_kernel_names_do_reach_blkid)
{
    EXPECT_EQ(dev_check_blkid("sdA_9.x-y!z"), 1);
    EXPECT_EQ(times_called("blkid /dev/sdA_9.x-y!z"), 1);
}

TEST_F(Discovery, the_128_byte_command_is_cut_and_not_overrun)
{
    const std::string name = "sd" + std::string(200, 'a');
    const std::string log = capture_stdout([&] { EXPECT_EQ(dev_check_blkid(name.c_str()), 1); });
    // The path buffer of 128 holds 127 characters, the command buffer 127 of "blkid " and the path.
    const std::string path = ("/dev/" + name).substr(0, 127);
    EXPECT_TRUE(contains(log, "dev = " + path + "\n")) << log;
    EXPECT_TRUE(contains(log, "exec cmd = " + ("blkid " + path).substr(0, 127) + "\n")) << log;
}

TEST_F(Discovery, a_whole_disk_is_added_with_its_partitions_sorted_and_small_ones_dropped)
{
    plug_with_parts("sda", {2000, 500, 8000, 999, 1000});
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sda"); });
    ASSERT_EQ(disk_sets_count(&sets), 1);
    const disk_obj& disk = sets.entries[0].disk;
    EXPECT_STREQ(disk.root.dev_name, "sda");
    EXPECT_EQ(disk.root.total_len, 50000U);
    EXPECT_EQ(disk.root.fs_type, FS_NONE);
    EXPECT_STREQ(disk.parts[0].part.dev_name, "sda3");
    EXPECT_STREQ(disk.parts[1].part.dev_name, "sda1");
    EXPECT_STREQ(disk.parts[2].part.dev_name, "sda5");
    EXPECT_STREQ(disk.parts[2].part.uid, "U-sda5");
    EXPECT_EQ(disk.parts[2].part.fs_type, FS_EXT4);
    for (int i = 3; i < MAX_SUB_PARTS; ++i) {
        EXPECT_TRUE(is_all_zero(disk.parts[i])) << i;
    }
    EXPECT_TRUE(contains(log, "add dev name = sda\n"));
    EXPECT_TRUE(contains(log, "check path = /sys/block/sda\n"));
    EXPECT_EQ(support::count_of(log, "root part fs = ERR FS\n"), 3);
    EXPECT_EQ(disk.root.mount_point_num, 0) << "numbering waits for the first mount pass";
    EXPECT_EQ(disk.parts[0].part.mount_point_num, 0);
}

TEST_F(Discovery, a_partition_arriving_before_its_disk_adds_the_disk_and_is_then_already_present)
{
    plug_with_parts("sdb", {4000, 3000});
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sdb1"); });
    EXPECT_EQ(disk_sets_count(&sets), 1);
    ASSERT_NE(find("sdb"), nullptr);
    ASSERT_NE(find("sdb1"), nullptr);
    ASSERT_NE(find("sdb2"), nullptr);
    EXPECT_TRUE(contains(log, "not find disk obj, root dev name = sdb\n"));
    EXPECT_TRUE(contains(log, "dev already exist, name = sdb1\n"));
    EXPECT_EQ(sets.entries[0].disk.parts[2].in_use, 0) << "it is there only once";
}

TEST_F(Discovery, the_disk_of_an_arriving_partition_is_not_put_through_the_device_check)
{
    plug_disk("sdb", "", 50000);
    plug_part("sdb", "sdb1", ext4_details("U-1"), 4000);
    disk_sets_add_dev(&sets, "sdb1");
    EXPECT_NE(find("sdb"), nullptr);
    EXPECT_NE(find("sdb1"), nullptr);
}

TEST_F(Discovery, a_partition_without_a_disk_is_not_added)
{
    plug_part("sdq", "sdz1", ext4_details("U-1"), 4000);
    support::remove_all("/sys/block/sdq");
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sdz1"); });
    EXPECT_TRUE(contains(log, "not find dev name = sdz1\n"));
    EXPECT_TRUE(is_all_zero(sets));
}

TEST_F(Discovery, a_partition_of_a_17th_disk_is_not_added)
{
    for (disk_entry& entry : sets.entries) {
        support::put_root(&entry, "hda", 1);
    }
    plug_with_parts("sdb", {4000});
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sdb1"); });
    EXPECT_TRUE(contains(log, "disk sets is full\n"));
    EXPECT_TRUE(contains(log, ":") && contains(log, "]err!\n"));
    EXPECT_EQ(find("sdb1"), nullptr);
}

TEST_F(Discovery, sixteen_disks_are_held_and_the_17th_is_refused)
{
    for (int i = 0; i <= MAX_DISKS; ++i) {
        const std::string name = "sd" + std::string(1, static_cast<char>('a' + i));
        plug_disk(name, TABLE_DETAILS, 1000);
        disk_sets_add_dev(&sets, name.c_str());
    }
    EXPECT_EQ(disk_sets_count(&sets), 16);
    EXPECT_NE(find("sdp"), nullptr);
    EXPECT_EQ(find("sdq"), nullptr);
}

TEST_F(Discovery, a_disk_with_9_partitions_keeps_8_of_them_in_descending_size_order)
{
    plug_with_parts("sda", {1001, 1002, 1003, 1004, 1005, 1006, 1007, 1008, 1009});
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sda"); });
    EXPECT_EQ(support::count_of(log, "sub part full, root dev name = sda, sub dev = sda"), 1);
    const part_slot* parts = sets.entries[0].disk.parts;
    for (int i = 0; i < MAX_SUB_PARTS; ++i) {
        ASSERT_EQ(parts[i].in_use, 1) << i;
        if (i > 0) {
            EXPECT_GT(parts[i - 1].part.total_len, parts[i].part.total_len) << i;
        }
    }
}

TEST_F(Discovery, a_ninth_partition_that_arrives_later_is_refused)
{
    plug_with_parts("sda", {1001, 1002, 1003, 1004, 1005, 1006, 1007, 1008});
    disk_sets_add_dev(&sets, "sda");
    const disk_sets before = sets;
    plug_part("sda", "sda9", ext4_details("U-9"), 9000);
    disk_sets_add_dev(&sets, "sda9");
    EXPECT_TRUE(support::same_bytes(before, sets));
}

TEST_F(Discovery, a_whole_disk_with_a_filesystem_has_a_root_type_and_no_slots)
{
    plug_disk("sda", R"(LABEL="STICK" UUID="AA-BB" TYPE="vfat")", 4000);
    disk_sets_add_dev(&sets, "sda");
    const disk_obj& disk = sets.entries[0].disk;
    EXPECT_EQ(disk.root.fs_type, FS_FAT);
    EXPECT_STREQ(disk.root.uid, "AA-BB");
    for (const part_slot& slot : disk.parts) {
        EXPECT_TRUE(is_all_zero(slot));
    }
}

TEST_F(Discovery, adding_a_name_twice_logs_it_and_changes_nothing)
{
    plug_with_parts("sda", {4000, 3000});
    disk_sets_add_dev(&sets, "sda");
    const disk_sets before = sets;
    for (const char* name : {"sda", "sda1", "sda2"}) {
        const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, name); });
        EXPECT_TRUE(
            contains(log, std::string("=== ===> dev is already add! dev name = ") + name + "\n"));
    }
    EXPECT_TRUE(support::same_bytes(before, sets));
}

TEST_F(Discovery, a_partition_arriving_on_a_known_disk_gets_its_size_and_other_slots_stay)
{
    plug_with_parts("sda", {2000, 3000});
    disk_sets_add_dev(&sets, "sda");
    sets.entries[0].disk.parts[0].part.mount_point_num = 1;
    sets.entries[0].disk.parts[1].part.mount_status = 1;
    plug_part("sda", "sda3", ext4_details("U-3"), 8000);
    disk_sets_add_dev(&sets, "sda3");
    const part_slot* parts = sets.entries[0].disk.parts;
    EXPECT_STREQ(parts[0].part.dev_name, "sda2");
    EXPECT_EQ(parts[0].part.mount_point_num, 1);
    EXPECT_STREQ(parts[1].part.dev_name, "sda1");
    EXPECT_EQ(parts[1].part.mount_status, 1);
    EXPECT_STREQ(parts[2].part.dev_name, "sda3");
    EXPECT_EQ(parts[2].part.total_len, 8000U);
    EXPECT_EQ(parts[2].part.ref_root, &sets.entries[0].disk.root);
    EXPECT_EQ(disk_sets_drop_small_parts(&sets), 0);
    EXPECT_EQ(parts[2].in_use, 1) << "the next mount pass does not drop it";
}

TEST_F(Discovery, attribute_entries_of_the_disks_directory_are_no_partitions)
{
    plug_with_parts("sda", {4000});
    for (const char* entry : {"power", "slaves", "holders", "device", "trace"}) {
        support::make_dir(std::string("/sys/block/sda/") + entry);
    }
    disk_sets_add_dev(&sets, "sda");
    EXPECT_EQ(sets.entries[0].disk.parts[0].in_use, 1);
    EXPECT_EQ(sets.entries[0].disk.parts[1].in_use, 0);
}

TEST_F(Discovery, a_disk_directory_that_cannot_be_opened_is_named_sys_block_in_the_log)
{
    support::put_root(&sets.entries[0], "sdx", 1);
    const std::string log = capture_stdout([&] { disk_obj_scan_parts(&sets.entries[0].disk); });
    EXPECT_TRUE(contains(log, "check path = /sys/block/sdx\n"));
    EXPECT_TRUE(contains(log, "open dir err, dir = /sys/block\n"));
}

TEST_F(Discovery, a_disk_added_after_the_first_mount_pass_is_numbered_at_once)
{
    sets.sorted_once = 1;
    support::put_root(&sets.entries[0], "sda", 9000);
    sets.entries[0].disk.root.mount_point_num = 1;
    plug_with_parts("sdb", {4000, 3000});
    const std::string log = capture_stdout([&] { disk_sets_add_dev(&sets, "sdb"); });
    EXPECT_EQ(find("sdb")->mount_point_num, 2);
    EXPECT_EQ(find("sdb1")->mount_point_num, 1);
    EXPECT_EQ(find("sdb2")->mount_point_num, 2);
    EXPECT_TRUE(contains(log, "=== ===> set mount point num = 2\n"));
}

TEST_F(Discovery, every_mmc_disk_is_the_sd_card)
{
    plug_disk("mmcblk0", TABLE_DETAILS, 30000);
    plug_part("mmcblk0", "mmcblk0p1", ext4_details("U-1"), 20000);
    disk_sets_add_dev(&sets, "mmcblk0");
    EXPECT_EQ(sets.entries[0].disk.sd_card, 1);
    EXPECT_NE(find("mmcblk0p1"), nullptr);
}

TEST_F(Discovery, a_disk_whose_device_path_holds_the_slots_identifier_is_the_sd_card)
{
    // As the kernel has it: the entry of /sys/block is a link into the tree of devices.
    for (const auto& [name, place] : {std::pair{"sda", "/run/devices/xhci/1-2/sda"},
                                      std::pair{"sdb", "/run/devices/xhci/1-3/sdb"}}) {
        plug_disk(name, TABLE_DETAILS, 30000);
        const std::string entry = std::string("/sys/block/") + name;
        support::make_dir(place);
        std::filesystem::copy(entry, place, std::filesystem::copy_options::recursive);
        support::remove_all(entry);
        std::filesystem::create_symlink(place, entry);
    }
    support::write_file(support::SDCARD_POINT, "/1-3/\n");
    const std::string log = capture_stdout([&] {
        disk_sets_add_dev(&sets, "sda");
        disk_sets_add_dev(&sets, "sdb");
    });
    EXPECT_EQ(sets.entries[0].disk.sd_card, 0);
    EXPECT_EQ(sets.entries[1].disk.sd_card, 1);
    EXPECT_TRUE(contains(log, "read link path = /run/devices/xhci/1-3/sdb\n"));
    EXPECT_TRUE(contains(log, "find sd card ok, dev = /sys/block/sdb\n"));
    support::remove_all("/run/devices");
}

TEST_F(Discovery, without_an_identifier_no_disk_is_the_sd_card)
{
    plug_disk("sda", TABLE_DETAILS, 30000);
    disk_sets_add_dev(&sets, "sda");
    EXPECT_EQ(sets.entries[0].disk.sd_card, 0);
}

TEST_F(Discovery, a_null_table_is_answered_with_1)
{
    EXPECT_EQ(disk_sets_add_dev(nullptr, "sda"), 1);
    EXPECT_TRUE(stubs.calls().empty());
}
