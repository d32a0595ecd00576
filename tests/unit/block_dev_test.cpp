#include "util/block_dev.h"

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <sys/vfs.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/files.h"
#include "support/images.h"
#include "support/listing.h"
#include "support/stubs.h"
#include "support/text.h"

using support::contains;
using support::log_of;
using support::make_dir;
using support::write_file;

namespace {

using lines = std::vector<std::string>;

const std::string SCRATCH = "/tmp/disk_uid.txt";
const std::string SCRIPT = "/usr/bin/disk_get_label.sh";
const std::string SCRIPT_OUTPUT = "/tmp/disk_label";

// What a call leaves in a buffer of that size, and that it touches nothing behind.
struct filled {
    static constexpr size_t ROOM = 256;
    char bytes[ROOM];

    filled() { memset(bytes, '#', ROOM); }

    [[nodiscard]] std::string first(size_t size) const
    {
        EXPECT_EQ(bytes[size], '#');
        return {bytes, size};
    }

    [[nodiscard]] std::string text(size_t size) const
    {
        std::string all = first(size);
        return all.substr(0, all.find('\0'));
    }
};

class SysBlock : public testing::Test {
protected:
    SysBlock() { clear(); }
    ~SysBlock() override { clear(); }

private:
    static void clear()
    {
        for (const char* path : {"/sys/block", "/sys/class/block"}) {
            for (const auto& entry : std::filesystem::directory_iterator(path)) {
                std::filesystem::remove_all(entry);
            }
        }
    }
};

class Blkid : public testing::Test {
protected:
    Blkid() { clear(); }
    ~Blkid() override { clear(); }

    // Makes blkid print that text, whatever it is asked.
    void answer(const std::string& text)
    {
        write_file("/run/answer", text);
        stubs.add("blkid", "cat /run/answer");
    }

    static std::string value(const char* key, size_t size = 128)
    {
        filled out;
        log_of([&] { blkid_get_value("sda1", key, out.bytes, size); });
        return out.text(size);
    }

    static std::string label(size_t size = 128)
    {
        filled out;
        log_of([&] { blkid_get_label("sda1", out.bytes, size); });
        return out.text(size);
    }

    support::stub_programs stubs;

private:
    static void clear()
    {
        support::remove_all(SCRATCH);
        support::remove_all("/run/blkid");
    }
};

class LabelScript : public testing::Test {
protected:
    LabelScript()
    {
        support::remove_all(SCRIPT);
        support::remove_all(SCRIPT_OUTPUT);
    }
    ~LabelScript() override
    {
        support::remove_all(SCRIPT);
        support::remove_all(SCRIPT_OUTPUT);
    }

    void answer(const std::string& text)
    {
        write_file("/run/answer", text);
        stubs.add_at(SCRIPT, "cat /run/answer");
    }

    static std::string label(size_t size = 128)
    {
        filled out;
        log_of([&] { EXPECT_EQ(script_get_label("sda1", out.bytes, size), 0); });
        return out.text(size);
    }

    support::stub_programs stubs;
};

const struct statfs* made_up_statfs = nullptr;
bool statfs_fails = false;

}  // namespace

// Stands in front of the C library's, whose parameters have reserved names, for filesystems that a
// test cannot have.
// NOLINTNEXTLINE(readability-inconsistent-declaration-parameter-name)
int statfs(const char* path, struct statfs* info)
{
    if (statfs_fails) {
        errno = EIO;
        return -1;
    }
    if (made_up_statfs != nullptr) {
        *info = *made_up_statfs;
        return 0;
    }
#ifdef SYS_statfs64
    // 32-bit machines: the C library's structure is that of this call.
    return static_cast<int>(syscall(SYS_statfs64, path, sizeof(*info), info));
#else
    return static_cast<int>(syscall(SYS_statfs, path, info));
#endif
}

TEST(DevNameIsDisk, takes_the_handled_names)
{
    for (const char* name : {"sda", "sdz", "sdaa", "sda1", "hdb", "hda1", "mmcblk0", "mmcblk0p1",
                             "mmcblk0boot0", "mmcblk", "sd1", "hd-"}) {
        EXPECT_EQ(dev_name_is_disk(name), 0) << name;
    }
}

TEST(DevNameIsDisk, refuses_every_other_name)
{
    for (const char* name :
         {"",        "s",     "sd",   "hd",        "mm",          "mmc0", "mmcbl", "mmcbl0",
          "nvme0n1", "loop0", "ram0", "mtdblock0", "ubiblock0_0", "ubi0", "zram0", "dm-0",
          "md0",     "sr0",   "SDA",  "asda",      ".",           ".."}) {
        EXPECT_EQ(dev_name_is_disk(name), 1) << name;
    }
    EXPECT_EQ(dev_name_is_disk(nullptr), 1);
}

TEST(DevNameIsDisk, refuses_names_that_a_shell_would_read)
{
    for (const char* name :
         {"sda;reboot", "sd$(reboot)", "sda 1", "sda`x`", "mmcblk0|x", "sda/1"}) {
        EXPECT_EQ(dev_name_is_disk(name), 1) << name;
    }
}

TEST_F(SysBlock, whole_disks_are_its_entries)
{
    make_dir("/sys/block/sda/sda1");
    EXPECT_EQ(sys_block_has_dev("sda"), 0);
    EXPECT_EQ(sys_block_has_dev("sda1"), 1);
    EXPECT_EQ(sys_block_has_dev("sd"), 1);
    EXPECT_EQ(sys_block_has_dev(nullptr), 1);
}

TEST_F(SysBlock, the_parent_is_the_disk_whose_directory_holds_the_partition)
{
    make_dir("/sys/block/sda/sda1");
    make_dir("/sys/block/sdb/sdb1");
    make_dir("/sys/block/mmcblk0/mmcblk0p1");
    struct {
        const char* part;
        const char* disk;
    } cases[] = {{"sda1", "sda"}, {"sdb1", "sdb"}, {"mmcblk0p1", "mmcblk0"}};
    for (const auto& c : cases) {
        filled out;
        std::string log =
            log_of([&] { EXPECT_EQ(sys_block_find_parent(c.part, out.bytes, 32), 0); });
        EXPECT_EQ(out.text(32), c.disk);
        EXPECT_EQ(log, std::string("block_dev.cpp(N)find dev = ") + c.part +
                           ", in root path = /sys/block/" + c.disk + "\n");
    }
}

TEST_F(SysBlock, a_disk_has_no_parent)
{
    make_dir("/sys/block/sda/sda1");
    filled out;
    log_of([&] {
        EXPECT_EQ(sys_block_find_parent("sda", out.bytes, 32), 1);
        EXPECT_EQ(sys_block_find_parent("sda2", out.bytes, 32), 1);
        EXPECT_EQ(sys_block_find_parent("sda11", out.bytes, 32), 1);
    });
}

TEST_F(SysBlock, only_handled_disks_are_parents)
{
    make_dir("/sys/block/nvme0n1/nvme0n1p1");
    make_dir("/sys/block/loop0/sda1");
    filled out;
    log_of([&] {
        EXPECT_EQ(sys_block_find_parent("nvme0n1p1", out.bytes, 32), 1);
        EXPECT_EQ(sys_block_find_parent("sda1", out.bytes, 32), 1);
    });
}

TEST_F(SysBlock, the_parent_is_cut_to_its_buffer)
{
    make_dir("/sys/block/mmcblk0/mmcblk0p1");
    filled out;
    log_of([&] { EXPECT_EQ(sys_block_find_parent("mmcblk0p1", out.bytes, 4), 0); });
    EXPECT_EQ(out.text(4), "mmc");
}

TEST_F(SysBlock, the_parent_is_looked_for_anew_when_the_list_of_disks_breaks_off_twice)
{
    make_dir("/sys/block/sda/sda1");
    make_dir("/sys/block/sdb/sdb1");
    const std::string disk = support::last_listed("/sys/block");
    const support::broken_listing broken("/sys/block", disk, 2);
    filled out;
    const std::string log =
        log_of([&] { EXPECT_EQ(sys_block_find_parent((disk + "1").c_str(), out.bytes, 32), 0); });
    EXPECT_EQ(out.text(32), disk);
    EXPECT_EQ(support::count_of(log, "read dir err\n"), 2) << log;
}

TEST_F(SysBlock, a_list_of_disks_that_breaks_off_a_third_time_gives_no_parent)
{
    make_dir("/sys/block/sda/sda1");
    make_dir("/sys/block/sdb/sdb1");
    const std::string disk = support::last_listed("/sys/block");
    const support::broken_listing broken("/sys/block", disk, 100);
    filled out;
    const std::string log =
        log_of([&] { EXPECT_EQ(sys_block_find_parent((disk + "1").c_str(), out.bytes, 32), 1); });
    EXPECT_EQ(out.first(32), std::string(32, '#')) << "and no name";
    EXPECT_EQ(broken.left(), 100 - 3);
    EXPECT_EQ(support::count_of(log, "read dir err\n"), 3) << log;
}

TEST_F(SysBlock, a_partition_is_not_overlooked_when_the_list_of_partitions_breaks_off)
{
    make_dir("/sys/block/sda/sda1");
    make_dir("/sys/block/sda/sda2");
    const std::string part = support::last_listed("/sys/block/sda");
    const support::broken_listing broken("/sys/block/sda", part, 2);
    filled out;
    const std::string log =
        log_of([&] { EXPECT_EQ(sys_block_find_parent(part.c_str(), out.bytes, 32), 0); });
    EXPECT_EQ(out.text(32), "sda");
    EXPECT_EQ(support::count_of(log, "read dir err\n"), 2) << log;
}

TEST_F(SysBlock, the_sectors_are_the_number_in_the_size_file)
{
    struct {
        const char* content;
        uint64_t expected;
        const char* text;
    } cases[] = {
        {"2048\n", 2048, "2048"},     {"2048", 2048, "2048"},
        {"2048\r\n", 2048, "2048"},   {"7814037168\n1\n", 7814037168ULL, "7814037168"},
        {"  12abc\n", 12, "  12abc"}, {"\n", 0, ""},
        {"none\n", 0, "none"},
    };
    for (const auto& c : cases) {
        write_file("/sys/class/block/sda1/size", c.content);
        uint64_t sectors = 77;
        std::string log = log_of([&] { dev_get_sectors("sda", "sda1", &sectors); });
        EXPECT_EQ(sectors, c.expected) << c.content;
        EXPECT_EQ(log, std::string("block_dev.cpp(N)dev = sda1, get sector number = ") + c.text +
                           "(" + std::to_string(c.expected) + ")\n");
    }
}

TEST_F(SysBlock, the_sectors_come_from_the_disks_directory_as_a_fallback)
{
    write_file("/sys/block/sda/sda1/size", "4096\n");
    uint64_t sectors = 0;
    log_of([&] { dev_get_sectors("sda", "sda1", &sectors); });
    EXPECT_EQ(sectors, 4096U);

    write_file("/sys/class/block/sda1/size", "2048\n");
    log_of([&] { dev_get_sectors("sda", "sda1", &sectors); });
    EXPECT_EQ(sectors, 2048U);
}

TEST_F(SysBlock, missing_sectors_leave_the_value_and_name_the_fallback)
{
    uint64_t sectors = 77;
    std::string log = log_of([&] { dev_get_sectors("sda", "sda1", &sectors); });
    EXPECT_EQ(sectors, 77U);
    EXPECT_EQ(log, "block_dev.cpp(N)get size err, file = /sys/block/sda/sda1/size\n");
}

TEST_F(SysBlock, an_empty_size_file_leaves_the_value_and_is_logged)
{
    write_file("/sys/class/block/sda1/size", "");
    write_file("/sys/block/sda/sda1/size", "4096\n");
    uint64_t sectors = 77;
    std::string log = log_of([&] { dev_get_sectors("sda", "sda1", &sectors); });
    EXPECT_EQ(sectors, 77U);
    EXPECT_EQ(log, "block_dev.cpp(N)get size err, file = /sys/class/block/sda1/size\n");
}

TEST_F(SysBlock, the_sector_size_stands_in_the_disks_queue)
{
    write_file("/sys/block/sda/queue/hw_sector_size", "4096\n");
    uint64_t bytes = 0;
    std::string log = log_of([&] { dev_get_sector_size("sda", &bytes); });
    EXPECT_EQ(bytes, 4096U);
    EXPECT_EQ(log, "block_dev.cpp(N)dev = sda, get sector size = 4096(4096)\n");
}

TEST_F(SysBlock, a_partition_has_no_sector_size)
{
    write_file("/sys/block/sda/queue/hw_sector_size", "4096\n");
    uint64_t bytes = 77;
    std::string log = log_of([&] { dev_get_sector_size("sda1", &bytes); });
    EXPECT_EQ(bytes, 77U);
    EXPECT_EQ(log,
              "block_dev.cpp(N)get sector_size err, file = /sys/block/sda1/queue/hw_sector_size\n");

    write_file("/sys/block/sda/queue/hw_sector_size", "");
    log_of([&] { dev_get_sector_size("sda", &bytes); });
    EXPECT_EQ(bytes, 77U);
}

TEST(PathGetSpace, counts_the_blocks_reserved_for_the_superuser_as_free)
{
    struct statfs reserved {};
    reserved.f_bsize = 4096;
    reserved.f_blocks = 3000000000ULL;
    reserved.f_bfree = 2000000000ULL;
    reserved.f_bavail = 1000000000ULL;
    uint64_t total = 0;
    uint64_t free_bytes = 0;
    made_up_statfs = &reserved;
    EXPECT_EQ(path_get_space("/tmp", &total, &free_bytes), 0);
    made_up_statfs = nullptr;
    EXPECT_EQ(total, 3000000000ULL * 4096);
    EXPECT_EQ(free_bytes, 2000000000ULL * 4096);
}

TEST(PathGetSpace, a_failed_query_gives_the_systems_error)
{
    uint64_t total = 77;
    statfs_fails = true;
    std::string log = log_of([&] { EXPECT_EQ(path_get_space("/tmp", &total, nullptr), 1); });
    statfs_fails = false;
    EXPECT_EQ(total, 77U);
    EXPECT_EQ(log, "ERROR[block_dev.cpp:N](" + std::string(strerror(EIO)) + ")err file = /tmp\n");
}

TEST(PathGetSpace, either_output_may_be_missing)
{
    uint64_t total = 0;
    uint64_t free_bytes = 0;
    EXPECT_EQ(path_get_space("/tmp", nullptr, nullptr), 0);
    EXPECT_EQ(path_get_space("/tmp", &total, nullptr), 0);
    EXPECT_EQ(path_get_space("/tmp", nullptr, &free_bytes), 0);
    EXPECT_GT(total, 0U);
    EXPECT_GT(free_bytes, 0U);
}

TEST(PathGetSpace, of_a_missing_path_fails)
{
    uint64_t total = 77;
    std::string log =
        log_of([&] { EXPECT_EQ(path_get_space("/tmp/missing", &total, nullptr), 1); });
    EXPECT_EQ(total, 77U);
    EXPECT_EQ(log, "ERROR[block_dev.cpp:N]file not exist, file = /tmp/missing\n");
}

TEST_F(Blkid, is_asked_through_a_scratch_file_that_is_deleted)
{
    answer("/dev/sda1: UUID=\"12-34\" TYPE=\"vfat\"\n");
    filled out;
    std::string log = log_of([&] { blkid_get_value("sda1", "UUID=", out.bytes, 128); });
    EXPECT_EQ(stubs.calls(), lines{"blkid /dev/sda1"});
    EXPECT_TRUE(contains(log, "exec cmd = blkid /dev/sda1 > /tmp/disk_uid.txt\n")) << log;
    EXPECT_TRUE(contains(log, "block_dev.cpp(N)get sda1, UUID= = 12-34\n")) << log;
    EXPECT_EQ(out.text(128), "12-34");
    EXPECT_FALSE(std::filesystem::exists(SCRATCH));
}

TEST_F(Blkid, the_first_place_of_the_key_wins)
{
    struct {
        const char* line;
        const char* key;
        const char* expected;
    } cases[] = {
        {"/dev/sda1: LABEL=\"L\" UUID=\"u-1\" TYPE=\"ext4\"", "UUID=", "u-1"},
        {"/dev/sda1: LABEL=\"L\" UUID=\"u-1\" TYPE=\"ext4\"", "LABEL=", "L"},
        // A longer key that ends the same.
        {"/dev/sda1: PARTUUID=\"p-1\"", "UUID=", "p-1"},
        {"/dev/sda1: PARTUUID=\"p-1\" UUID=\"u-1\"", "UUID=", "p-1"},
        {"/dev/sda1: UUID=\"u-1\" UUID_SUB=\"s-1\"", "UUID=", "u-1"},
        {"/dev/sda1: PARTLABEL=\"part\" LABEL=\"L\"", "LABEL=", "part"},
        {"/dev/sda1: PARTUUID=\"p-1\"", "PARTUUID=", "p-1"},
        {"/dev/sda1: UUID=\"u-1\"", "PARTUUID=", ""},
        {"/dev/sda1: UUID_SUB=\"s-1\"", "UUID=", ""},
        {"/dev/sda1: TYPE=\"vfat\"", "UUID=", ""},
        {"/dev/sda1: LABEL=\"\" UUID=\"u-1\"", "LABEL=", ""},
        // A space ends the value.
        {"/dev/sda1: LABEL=\"My Disk\" UUID=\"u-1\"", "LABEL=", "My"},
        // Cut output.
        {"/dev/sda1: UUID=\"u-1", "UUID=", "u-1"},
        {"/dev/sda1: UUID=\"", "UUID=", ""},
        {"/dev/sda1: UUID=", "UUID=", ""},
    };
    for (const auto& c : cases) {
        answer(c.line);
        EXPECT_EQ(value(c.key), c.expected) << c.line << " " << c.key;
    }
}

TEST_F(Blkid, a_device_with_a_partuuid_alone_yields_it_on_the_uuid_query)
{
    answer("/dev/sda1: PARTUUID=\"6a1b2c3d-01\"\n");
    EXPECT_EQ(value("UUID="), "6a1b2c3d-01");
}

TEST_F(Blkid, copies_at_most_the_buffers_size_without_a_terminating_zero)
{
    struct {
        const char* value;
        std::string expected;
    } cases[] = {
        {"1234567", std::string("1234567\0", 8)},
        {"12345678", "12345678"},
        {"123456789", "12345678"},
    };
    for (const auto& c : cases) {
        answer(std::string("/dev/sda1: LABEL=\"") + c.value + "\" TYPE=\"vfat\"\n");
        filled out;
        log_of([&] { blkid_get_value("sda1", "LABEL=", out.bytes, 8); });
        EXPECT_EQ(out.first(8), c.expected);
        filled raw;
        log_of([&] { blkid_get_label("sda1", raw.bytes, 8); });
        EXPECT_EQ(raw.first(8), c.expected);
    }
}

TEST_F(Blkid, a_whole_array_always_ends_with_a_zero)
{
    for (const char* text : {"123456", "1234567", "12345678"}) {
        answer(std::string("/dev/sda1: LABEL=\"") + text + "\"\n");
        char value[8] = {'#', '#', '#', '#', '#', '#', '#', '#'};
        char raw[8] = {'#', '#', '#', '#', '#', '#', '#', '#'};
        log_of([&] {
            blkid_get_value("sda1", "LABEL=", value);
            blkid_get_label("sda1", raw);
        });
        EXPECT_EQ(std::string(value, 8).c_str(), std::string(text).substr(0, 7)) << text;
        EXPECT_EQ(value[7], '\0') << text;
        EXPECT_EQ(std::string(raw, 8), std::string(value, 8)) << text;
    }
}

TEST_F(Blkid, the_buffer_is_zero_filled_also_when_nothing_is_found)
{
    answer("");
    filled out;
    std::string log = log_of([&] { blkid_get_value("sda1", "UUID=", out.bytes, 128); });
    EXPECT_EQ(out.first(128), std::string(128, '\0'));
    EXPECT_FALSE(contains(log, "get sda1"));
    EXPECT_FALSE(std::filesystem::exists(SCRATCH));
}

TEST_F(Blkid, a_failure_leaves_an_empty_value)
{
    stubs.add("blkid", "exit 2");
    EXPECT_EQ(value("UUID="), "");
    stubs.add("blkid", "rm -f /tmp/disk_uid.txt");
    std::string log = log_of([] {
        filled out;
        blkid_get_value("sda1", "UUID=", out.bytes, 128);
    });
    EXPECT_TRUE(contains(log, "del err! not exist file = /tmp/disk_uid.txt\n")) << log;
}

TEST_F(Blkid, an_old_answer_is_not_taken_for_a_new_one)
{
    write_file(SCRATCH, "/dev/sdb1: UUID=\"old\"\n");
    answer("/dev/sda1: TYPE=\"vfat\"\n");
    EXPECT_EQ(value("UUID="), "");
}

TEST_F(Blkid, a_null_argument_is_logged_and_asks_nothing)
{
    answer("");
    filled out;
    std::string log = log_of([&] {
        blkid_get_value(nullptr, "UUID=", out.bytes, 128);
        blkid_get_value("sda1", nullptr, out.bytes, 128);
        blkid_get_value("sda1", "UUID=", nullptr, 128);
        blkid_get_label(nullptr, out.bytes, 128);
        blkid_get_label("sda1", nullptr, 128);
    });
    EXPECT_EQ(support::count_of(log, "ERROR[block_dev.cpp:N]err!\n"), 5);
    EXPECT_EQ(support::lines_of(log).size(), 5U);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Blkid, the_label_is_asked_without_encoding)
{
    answer("/dev/sda1: LABEL=\"Disk\" UUID=\"1\"\n");
    filled out;
    std::string log = log_of([&] { blkid_get_label("sda1", out.bytes, 128); });
    EXPECT_EQ(stubs.calls(), lines{"blkid -d /dev/sda1"});
    EXPECT_TRUE(contains(log, "exec cmd = blkid -d /dev/sda1 > /tmp/disk_uid.txt\n")) << log;
    EXPECT_TRUE(contains(log, "block_dev.cpp(N)get sda1, LABEL= = Disk\n")) << log;
    EXPECT_EQ(out.text(128), "Disk");
    EXPECT_FALSE(std::filesystem::exists(SCRATCH));
}

TEST_F(Blkid, a_label_with_a_space_is_cut_there_in_both_queries)
{
    answer("/dev/sda1: LABEL=\"My Disk\" UUID=\"1\"\n");
    EXPECT_EQ(value("LABEL="), "My");
    EXPECT_EQ(label(), "My");
}

TEST_F(Blkid, a_command_of_more_than_127_characters_is_cut)
{
    stubs.add("blkid", "echo 'UUID=\"1\"'");
    // "blkid /dev/", " > " and the scratch file are 31 characters.
    for (size_t length : {95U, 96U}) {
        filled out;
        std::string name(length, 'a');
        log_of([&] { blkid_get_value(name.c_str(), "UUID=", out.bytes, 128); });
        EXPECT_EQ(out.text(128), "1") << length;
    }
    filled out;
    std::string name(97, 'a');
    log_of([&] { blkid_get_value(name.c_str(), "UUID=", out.bytes, 128); });
    EXPECT_EQ(out.text(128), "");
    EXPECT_TRUE(std::filesystem::exists("/tmp/disk_uid.tx"));
    support::remove_all("/tmp/disk_uid.tx");
}

TEST(RealBlkid, tells_uuid_and_label_of_a_volume)
{
    support::remove_all("/run/blkid");
    support::image disk(16 << 20, "/dev/sdy1");
    disk.make_fs("mkfs.ext4 -q -F -L 'My Disk' -U 01234567-89ab-cdef-0123-456789abcdef");
    filled uuid;
    filled encoded;
    filled raw;
    log_of([&] {
        blkid_get_value("sdy1", "UUID=", uuid.bytes, 128);
        blkid_get_value("sdy1", "LABEL=", encoded.bytes, 128);
        blkid_get_label("sdy1", raw.bytes, 128);
    });
    EXPECT_EQ(uuid.text(128), "01234567-89ab-cdef-0123-456789abcdef");
    EXPECT_EQ(encoded.text(128), "My");
    EXPECT_EQ(raw.text(128), "My");
}

TEST_F(LabelScript, its_first_line_is_the_label_spaces_kept)
{
    struct {
        const char* output;
        const char* expected;
    } cases[] = {
        {"My Disk\n", "My Disk"},
        {"My Disk", "My Disk"},
        {"one\ntwo\n", "one"},
        {"before\tafter\n", "before"},
        {"dos\r\n", "dos"},
        {"", ""},
        {"\n", ""},
        {" lead\n", " lead"},
    };
    for (const auto& c : cases) {
        answer(c.output);
        EXPECT_EQ(label(), c.expected) << c.output;
    }
}

TEST_F(LabelScript, gets_the_bare_device_name_and_its_output_stays)
{
    answer("Disk\n");
    filled out;
    std::string log = log_of([&] { script_get_label("sda1", out.bytes, 128); });
    EXPECT_EQ(stubs.calls(), lines{SCRIPT + " sda1"});
    EXPECT_TRUE(contains(log, "exec cmd = /usr/bin/disk_get_label.sh sda1 > /tmp/disk_label\n"));
    EXPECT_TRUE(contains(log, "del err! not exist file = /tmp/disk_label\n")) << log;
    EXPECT_EQ(support::read_file(SCRIPT_OUTPUT), "Disk\n");
}

TEST_F(LabelScript, without_the_script_there_is_no_label_and_no_log)
{
    filled out;
    std::string log = log_of([&] { EXPECT_EQ(script_get_label("sda1", out.bytes, 128), 1); });
    EXPECT_EQ(log, "");
    EXPECT_EQ(out.first(128), std::string(128, '\0'));
}

TEST_F(LabelScript, without_its_output_there_is_no_label)
{
    write_file(SCRIPT_OUTPUT, "old\n");
    stubs.add_at(SCRIPT, "rm -f /tmp/disk_label");
    filled out;
    log_of([&] { EXPECT_EQ(script_get_label("sda1", out.bytes, 128), 1); });
    EXPECT_EQ(out.first(128), std::string(128, '\0'));
}

TEST_F(LabelScript, a_null_argument_is_logged)
{
    filled out;
    std::string log = log_of([&] {
        EXPECT_EQ(script_get_label(nullptr, out.bytes, 128), 1);
        EXPECT_EQ(script_get_label("sda1", nullptr, 128), 1);
    });
    EXPECT_EQ(log, "ERROR[block_dev.cpp:N]err!\nERROR[block_dev.cpp:N]err!\n");
}

TEST_F(LabelScript, a_whole_array_always_ends_with_a_zero)
{
    answer("12345678\n");
    char out[8] = {'#', '#', '#', '#', '#', '#', '#', '#'};
    log_of([&] { EXPECT_EQ(script_get_label("sda1", out), 0); });
    EXPECT_EQ(std::string(out, 8), std::string("1234567\0", 8));
}

TEST_F(LabelScript, a_long_label_stays_inside_its_buffer)
{
    for (size_t length : {7U, 8U, 9U}) {
        std::string text(length, 'x');
        answer(text + "\n");
        EXPECT_EQ(label(8), text.substr(0, 8));
    }
    for (size_t length : {127U, 128U, 129U, 200U}) {
        std::string text(length, 'x');
        answer(text + "\n");
        EXPECT_EQ(label(200), text.substr(0, 128)) << length;
    }
}
