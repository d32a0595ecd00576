#include "util/paths.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "support/capture.h"

using support::log_of;

namespace {

using dev_path_maker = void (*)(std::span<char>, const char*);

std::string made(dev_path_maker maker, const char* name, size_t size = PATH_SIZE)
{
    char out[256];
    memset(out, '#', sizeof(out));
    maker({out, size}, name);
    EXPECT_EQ(out[size], '#') << name;
    return out;
}

}  // namespace

TEST(Paths, the_fixed_ones_are_those_that_other_programs_know)
{
    EXPECT_STREQ(RUNTIME_DIR, "/tmp/tarn_nas/");
    EXPECT_STREQ(PID_FILE, "/tmp/tarn_nas//disk_manager_pid");
    EXPECT_STREQ(DISK_JSON_FILE, "/tmp/tarn_nas//disk.json");
    EXPECT_STREQ(DISK_NUM_FILE, "/tmp/tarn_nas//disk_num.txt");
    EXPECT_STREQ(PIPE_ADD_REMOVE, "/tmp/tarn_nas/pipe_disk_add_remove");
    EXPECT_STREQ(PIPE_SAFE_REMOVE, "/tmp/tarn_nas/pipe_disk_safe_remove");
    EXPECT_STREQ(PIPE_REMOVE, "/tmp/tarn_nas/pipe_disk_remove");
    EXPECT_STREQ(DISK_DB_FILE, "/etc/config/tarn_nas/disk.db");
    EXPECT_STREQ(MOUNT_BASE, "/tmp/mountd");
    EXPECT_STREQ(HOTPLUG_MOUNT_HOOK, "/etc/hotplug.d/block/10-mount");
    EXPECT_STREQ(SYS_BLOCK, "/sys/block");
    EXPECT_STREQ(LABEL_SCRIPT, "/usr/bin/disk_get_label.sh");
}

TEST(Paths, the_scratch_files_stand_in_tmp)
{
    EXPECT_STREQ(SCRATCH_PGREP, "/tmp/disk_pid_tmp");
    EXPECT_STREQ(SCRATCH_PIDOF, "/tmp/pid");
    EXPECT_STREQ(SCRATCH_MOUNT, "/tmp/mount.txt");
    EXPECT_STREQ(SCRATCH_DEV_CHECK, "/tmp/tmp_blkid");
    EXPECT_STREQ(SCRATCH_BLKID_TYPE, "/tmp/out.txt");
    EXPECT_STREQ(SCRATCH_BLKID_VALUE, "/tmp/disk_uid.txt");
    EXPECT_STREQ(SCRATCH_LABEL, "/tmp/disk_label");
}

TEST(Paths, are_made_from_device_names)
{
    struct {
        dev_path_maker maker;
        const char* name;
        const char* expected;
    } cases[] = {
        {path_dev_node, "sda1", "/dev/sda1"},
        {path_dev_node, "mmcblk0p1", "/dev/mmcblk0p1"},
        {path_dev_node, "", "/dev/"},
        {path_sys_disk, "sda", "/sys/block/sda"},
        {path_sys_size, "sda1", "/sys/class/block/sda1/size"},
        {path_sys_sector_size, "sda", "/sys/block/sda/queue/hw_sector_size"},
        {path_mount_dir, "disk1_part1", "/tmp/mountd/disk1_part1"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(made(c.maker, c.name), c.expected);
    }
}

TEST(Paths, the_size_of_a_partition_stands_below_its_disk)
{
    char out[PATH_SIZE];
    path_sys_part_size(out, "sda", "sda1");
    EXPECT_STREQ(out, "/sys/block/sda/sda1/size");
}

TEST(Paths, are_cut_to_their_buffer)
{
    for (size_t length : {122U, 123U, 200U}) {
        std::string name(length, 'a');
        EXPECT_EQ(made(path_dev_node, name.c_str(), 128), ("/dev/" + name).substr(0, 127))
            << length;
    }
}

TEST(Paths, the_mount_name_holds_both_numbers)
{
    struct {
        int32_t disk;
        int32_t part;
        const char* expected;
    } cases[] = {{1, 1, "disk1_part1"},
                 {16, 8, "disk16_part8"},
                 {0, 0, "disk0_part0"},
                 {-1, 2, "disk-1_part2"}};
    for (const auto& c : cases) {
        char out[32];
        path_mount_name(out, c.disk, c.part);
        EXPECT_STREQ(out, c.expected);
    }
}

TEST(MountPathToName, drops_the_length_of_the_mount_base_and_one_slash)
{
    struct {
        const char* path;
        const char* expected;
    } good[] = {
        {"/tmp/mountd/disk1_part1", "disk1_part1"},
        {"/tmp/mountd", ""},
        {"/tmp/mountd/", ""},
        {"/tmp/mountd//x", "/x"},
        {"/tmp/mountdx", "x"},
        // Only the length of the base counts.
        {"/mnt/usb/disk1", "sk1"},
        {"aaaaaaaaaaa", ""},
    };
    for (const auto& c : good) {
        char out[32] = "rubbish";
        EXPECT_EQ(mount_path_to_name(c.path, out, sizeof(out)), 0) << c.path;
        EXPECT_STREQ(out, c.expected) << c.path;
    }
}

TEST(MountPathToName, refuses_a_path_shorter_than_the_mount_base)
{
    for (const char* path : {"", "/", "/tmp/mount", "0123456789"}) {
        char out[32] = "kept";
        std::string log = log_of([&] { EXPECT_EQ(mount_path_to_name(path, out, sizeof(out)), 1); });
        EXPECT_EQ(log, std::string("ERROR[paths.cpp:N]err mount = ") + path + "\n");
    }
}

TEST(MountPathToName, refuses_a_null_argument)
{
    char out[32];
    std::string log = log_of([&] {
        EXPECT_EQ(mount_path_to_name(nullptr, out, sizeof(out)), 1);
        EXPECT_EQ(mount_path_to_name("/tmp/mountd/disk1_part1", nullptr, 32), 1);
    });
    EXPECT_EQ(log, "ERROR[paths.cpp:N]err!\nERROR[paths.cpp:N]err!\n");
}

TEST(MountPathToName, is_bounded_by_the_buffer)
{
    char out[9] = "########";
    EXPECT_EQ(mount_path_to_name("/tmp/mountd/1234567", out, 8), 0);
    EXPECT_STREQ(out, "1234567");
    EXPECT_EQ(mount_path_to_name("/tmp/mountd/12345678", out, 8), 0);
    EXPECT_STREQ(out, "1234567");
}

TEST(NameIsPlain, takes_kernel_names)
{
    for (const char* name : {"sda", "sda15", "hdb", "mmcblk0p1", "mmcblk0boot0", "loop0", "dm-0",
                             "nvme0n1", "cciss!c0d0", "md127", "a.b_c", "SDA"}) {
        EXPECT_TRUE(name_is_plain(name)) << name;
    }
}

TEST(NameIsPlain, refuses_what_the_shell_would_read)
{
    for (const char* name :
         {"sda1;reboot", "sda 1", "sda1\n", "sda\t1", "$(reboot)", "`reboot`",  "sda1&",
          "sda|cat",     "sda>x", "sda<x",  "sda'",   "sda\"",     "sda\\",     "../sda",
          "/dev/sda",    "sda*",  "sda?",   "[sda]",  "sda{1,2}",  "~sda",      "#sda",
          "sda=1",       "sda:1", "sda,1",  "sda%",   "sda(1)",    "sd\xc3\xa4"}) {
        EXPECT_FALSE(name_is_plain(name)) << name;
    }
}

TEST(MountPathIsUsable, takes_names_directly_below_the_mount_base)
{
    for (const char* path : {"/tmp/mountd/disk1_part1", "/tmp/mountd/disk16_part8", "/tmp/mountd/a",
                             "/tmp/mountd/a.b"}) {
        EXPECT_TRUE(mount_path_is_usable(path)) << path;
    }
}

TEST(MountPathIsUsable, refuses_every_other_path)
{
    for (const char* path :
         {"", "/", "/tmp", "/tmp/mount", "/tmp/mountd", "/tmp/mountd/", "/tmp/mountdx/disk1_part1",
          "/tmp/mountd/.", "/tmp/mountd/..", "/tmp/mountd/../x", "/tmp/mountd/.hidden",
          "/tmp/mountd/a/b", "/tmp/mountd//a", "/tmp/mountd/a b", "/tmp/mountd/a;reboot",
          "/tmp/mountd/$(reboot)", "tmp/mountd/a", "/mnt/mountd/a", "/tmp/mountd/a\n"}) {
        EXPECT_FALSE(mount_path_is_usable(path)) << path;
    }
}

TEST(MountPathIsUsable, takes_names_that_fit_into_a_record)
{
    const std::string name(MOUNT_NAME_SIZE - 1, 'a');
    EXPECT_TRUE(mount_path_is_usable(("/tmp/mountd/" + name).c_str()));
    EXPECT_FALSE(mount_path_is_usable(("/tmp/mountd/" + name + "a").c_str()));
}
