#include "disk/system_disk.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <string>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"

using support::capture_stdout;
using support::count_of;
using support::is_all_zero;

namespace {

constexpr char EXT4[] = R"(UUID="U-1" TYPE="ext4")";

dev_t number_below(const char* dir)
{
    struct stat info {};
    EXPECT_EQ(stat(dir, &info), 0) << dir;
    return info.st_dev;
}

class SystemDisk : public support::disk_world {
protected:
    SystemDisk()
    {
        plug_disk("sda", R"(PTUUID="12345678" PTTYPE="dos")", 50000);
        plug_part("sda", "sda1", EXT4, 9000);
        plug_part("sda", "sda2", EXT4, 9000);
    }
    ~SystemDisk() override
    {
        for (const char* node : {"/dev/sda", "/dev/sda1", "/dev/sda2"}) {
            support::remove_all(node);
        }
    }

    // Makes the name's node one of the device with that number.
    static void make_node(const std::string& name, dev_t number)
    {
        const std::string path = "/dev/" + name;
        support::remove_all(path);
        ASSERT_EQ(mknod(path.c_str(), S_IFBLK | 0600, number), 0) << path;
    }

    disk_sets sets{};
};

}  // namespace

TEST_F(SystemDisk, a_disk_one_of_whose_partitions_holds_the_root_is_the_routers_own)
{
    make_node("sda", makedev(250, 0));
    make_node("sda1", makedev(250, 1));
    make_node("sda2", makedev(250, 2));
    EXPECT_FALSE(is_system_disk("sda"));
    make_node("sda2", number_below("/"));
    EXPECT_TRUE(is_system_disk("sda"));
}

TEST_F(SystemDisk, a_whole_device_with_the_root_is_the_routers_own)
{
    make_node("sda", number_below("/"));
    EXPECT_TRUE(is_system_disk("sda"));
}

TEST_F(SystemDisk, a_disk_that_holds_boot_is_the_routers_own)
{
    if (access("/boot", F_OK) != 0) {
        GTEST_SKIP() << "needs a directory /boot";
    }
    make_node("sda1", number_below("/boot"));
    EXPECT_TRUE(is_system_disk("sda"));
}

TEST_F(SystemDisk, a_node_that_is_no_block_device_is_nobodys)
{
    EXPECT_FALSE(is_system_disk("sda"));
    make_node("sda1", 0);
    EXPECT_FALSE(is_system_disk("sda"));
    EXPECT_FALSE(is_system_disk("sdz"));
}

TEST_F(SystemDisk, the_routers_own_disk_is_added_neither_by_its_own_name_nor_by_a_partitions)
{
    make_node("sda2", number_below("/"));
    for (const char* name : {"sda", "sda1", "sda2"}) {
        const std::string log =
            capture_stdout([&] { EXPECT_EQ(disk_sets_add_dev(&sets, name), 0); });
        EXPECT_EQ(count_of(log, "router's own disk, dev = sda\n"), 1) << name;
        EXPECT_TRUE(is_all_zero(sets)) << name;
    }
}

TEST_F(SystemDisk, other_disks_are_added_beside_it)
{
    make_node("sda2", number_below("/"));
    plug_disk("sdb", EXT4, 9000);
    disk_sets_add_dev(&sets, "sda");
    disk_sets_add_dev(&sets, "sdb");
    EXPECT_EQ(disk_sets_count(&sets), 1);
    EXPECT_STREQ(sets.entries[0].disk.root.dev_name, "sdb");
}

TEST_F(SystemDisk, a_disk_whose_directory_is_none_is_nobodys)
{
    support::remove_all("/sys/block/sda");
    support::write_file("/sys/block/sda", "");
    EXPECT_FALSE(is_system_disk("sda"));
}
