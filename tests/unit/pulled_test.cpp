#include "disk/pulled.h"

#include <gtest/gtest.h>

#include <ctime>
#include <string>

#include "disk/discovery.h"
#include "disk/disk_db.h"
#include "disk/mount.h"
#include "disk/removal.h"
#include "support/capture.h"
#include "support/child.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;
using support::put_root;

namespace {

constexpr time_t NOW = 1000000;

class Pulled : public support::disk_world {
protected:
    // Larger than what is free in the directories of this world, which are not really mounted.
    void plug(const std::string& disk)
    {
        plug_disk(disk, R"(PTTYPE="dos")", 400001);
        plug_part(disk, disk + "1", "UUID=\"U-" + disk + R"(" TYPE="ext4")", 400000);
    }

    void pull(const std::string& disk)
    {
        unplug(disk + "1");
        unplug(disk);
    }

    // Under the same name there is another disk, or the same one once more.
    void replace(const std::string& disk)
    {
        pull(disk);
        // A file system may give the number of the last file that went to the next one.
        support::write_file("/dev/keeps_a_number", "");
        plug(disk);
        support::remove_all("/dev/keeps_a_number");
    }

    void take_in_and_mount(const std::string& disk)
    {
        plug(disk);
        disk_sets_add_dev(&sets, disk.c_str());
        mount_all(&sets);
        ASSERT_EQ(disk_of(disk)->parts[0].part.mount_status, 1);
        stubs.forget_calls();
        support::the_clock.slept_ms = 0;
    }

    disk_obj* disk_of(const std::string& disk)
    {
        disk_entry* entry = disk_sets_find_disk(&sets, disk.c_str());
        return entry != nullptr ? &entry->disk : nullptr;
    }

    static std::string mountd_of(const std::string& uid)
    {
        disk_db_record record{};
        return disk_db_get(uid.c_str(), &record) != 0 ? "no row"
               : record.mountd == 1                   ? "yes"
                                                      : "no";
    }

    support::fake_clock clock{NOW};
    disk_sets sets{};
};

}  // namespace

TEST_F(Pulled, a_disk_that_the_kernel_no_longer_lists_is_unmounted_and_forgotten)
{
    take_in_and_mount("sda");
    take_in_and_mount("sdb");
    pull("sda");
    const std::string log = capture_stdout([&] { EXPECT_TRUE(forget_pulled_disks(&sets)); });
    EXPECT_TRUE(contains(log, "]disk was pulled, dev = sda\n")) << log;
    EXPECT_EQ(disk_of("sda"), nullptr);
    EXPECT_NE(disk_of("sdb"), nullptr);
    EXPECT_EQ(times_called("umount /dev/sda1"), 1);
    EXPECT_EQ(times_called("umount /dev/sdb1"), 0);
    EXPECT_EQ(mountd_of("U-sda"), "no");
    EXPECT_EQ(mountd_of("U-sdb"), "yes");
    EXPECT_FALSE(forget_pulled_disks(&sets)) << "once";
}

TEST_F(Pulled, a_disk_under_the_name_of_an_earlier_one_is_another_disk)
{
    take_in_and_mount("sda");
    replace("sda");
    const std::string log = capture_stdout([&] { EXPECT_TRUE(forget_pulled_disks(&sets)); });
    EXPECT_TRUE(contains(log, "]disk was replaced, dev = sda\n")) << log;
    EXPECT_EQ(disk_sets_count(&sets), 0);
    EXPECT_EQ(support::read_file(support::MOUNTS_FILE), "");
}

TEST_F(Pulled, a_disk_without_its_node_that_the_kernel_still_lists_was_not_pulled)
{
    take_in_and_mount("sda");
    for (const char* node : {"/dev/sda1", "/dev/sda"}) {
        support::remove_all(node);
        EXPECT_FALSE(forget_pulled_disks(&sets)) << node;
    }
    EXPECT_NE(disk_of("sda"), nullptr);
    EXPECT_TRUE(actions().empty());
}

TEST_F(Pulled, a_node_that_was_not_there_when_the_disk_was_taken_in_proves_nothing)
{
    plug("sda");
    support::remove_all("/dev/sda");
    disk_sets_add_disk(&sets, "sda");
    EXPECT_EQ(disk_of("sda")->node_id, 0U);
    support::write_file("/dev/sda", "");
    EXPECT_FALSE(forget_pulled_disks(&sets));
    EXPECT_NE(disk_of("sda"), nullptr);
}

TEST_F(Pulled, a_list_that_cannot_be_read_makes_no_disk_a_pulled_one)
{
    take_in_and_mount("sda");
    pull("sda");
    const std::string log = support::expect_in_child([&] {
        support::allow_no_open_files();
        EXPECT_FALSE(forget_pulled_disks(&sets));
        EXPECT_NE(disk_of("sda"), nullptr);
    });
    EXPECT_TRUE(contains(log, "]open dir err, dir = /sys/block\n")) << log;
}

TEST_F(Pulled, a_disk_whose_nodes_have_gone_gets_a_second_to_leave_itself)
{
    take_in_and_mount("sda");
    support::remove_all("/dev/sda1");
    support::the_clock.on_sleep = [&] { pull("sda"); };
    EXPECT_TRUE(forget_leaving_disks(&sets));
    EXPECT_EQ(disk_sets_count(&sets), 0);
    EXPECT_EQ(support::the_clock.slept_ms, 1000);
}

TEST_F(Pulled, nobody_waits_when_every_disk_has_its_nodes)
{
    take_in_and_mount("sda");
    EXPECT_FALSE(forget_leaving_disks(&sets));
    EXPECT_EQ(support::the_clock.slept_ms, 0);
    support::remove_all("/dev/sda1");
    EXPECT_FALSE(forget_leaving_disks(&sets));
    EXPECT_EQ(support::the_clock.slept_ms, 1000);
    EXPECT_NE(disk_of("sda"), nullptr);
}

TEST_F(Pulled, a_message_may_mean_the_disk_that_had_the_name_before)
{
    take_in_and_mount("sda");
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1")) << "it never left";
    replace("sda");
    EXPECT_TRUE(forget_replaced_disks(&sets));
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1")) << "nobody has the name";
    disk_sets_add_dev(&sets, "sda");
    EXPECT_TRUE(may_mean_former_disk(&sets, "sda1"));
    EXPECT_TRUE(may_mean_former_disk(&sets, "sda"));
    support::remove_all("/dev/sda1");
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1")) << "it leaves now";
}

TEST_F(Pulled, after_a_while_a_message_is_about_the_disk_that_is_there)
{
    take_in_and_mount("sda");
    replace("sda");
    EXPECT_TRUE(forget_replaced_disks(&sets));
    disk_sets_add_dev(&sets, "sda");
    support::the_clock.now += FORMER_DISK_SECONDS - 1;
    EXPECT_TRUE(may_mean_former_disk(&sets, "sda1"));
    support::the_clock.now += 1;
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1"));
}

TEST_F(Pulled, a_message_that_tells_of_the_pull_itself_is_about_that_and_its_copy_may_be_late)
{
    take_in_and_mount("sda");
    pull("sda");
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1"));
    EXPECT_TRUE(forget_pulled_disks(&sets));
    replace("sda");
    disk_sets_add_dev(&sets, "sda");
    EXPECT_TRUE(may_mean_former_disk(&sets, "sda1"));
}

TEST_F(Pulled, the_seventeenth_departure_pushes_out_the_oldest)
{
    for (int i = 0; i <= MAX_DISKS; ++i) {
        const std::string disk = "sd" + std::string(1, static_cast<char>('a' + i));
        put_root(&sets.entries[0], disk.c_str(), 5000);
        EXPECT_EQ(remove_pulled_disk(&sets, disk.c_str()), 0);
        support::the_clock.now += 1;
    }
    take_in_and_mount("sda");
    take_in_and_mount("sdb");
    EXPECT_FALSE(may_mean_former_disk(&sets, "sda1"));
    EXPECT_TRUE(may_mean_former_disk(&sets, "sdb1"));
}

TEST_F(Pulled, a_null_table_holds_no_disk)
{
    EXPECT_FALSE(forget_pulled_disks(nullptr));
    EXPECT_FALSE(forget_replaced_disks(nullptr));
    EXPECT_FALSE(forget_leaving_disks(nullptr));
    EXPECT_EQ(remove_pulled_disk(nullptr, "sda"), 1);
    EXPECT_FALSE(may_mean_former_disk(nullptr, "sda"));
}
