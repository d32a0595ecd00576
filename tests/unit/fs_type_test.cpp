#include "fs/fs_type.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/files.h"
#include "support/images.h"
#include "support/stubs.h"
#include "support/text.h"

using support::contains;
using support::image;
using support::log_of;

namespace {

using lines = std::vector<std::string>;

constexpr off_t DEVICE_SIZE = 0x10000;
constexpr const char* SCRATCH = "/tmp/out.txt";
const std::string RULE = "fs_type.cpp(N)==========================\n";

// A device node and a blkid that answers as the test wants.
class FsType : public testing::Test {
protected:
    FsType()
    {
        support::remove_all(SCRATCH);
        answer("");
    }
    ~FsType() override { support::remove_all(SCRATCH); }

    void answer(const std::string& text)
    {
        support::write_file("/run/answer", text);
        stubs.add("blkid", "cat /run/answer");
    }

    [[nodiscard]] int32_t detected() const
    {
        fs_code fs_type = FS_ERR;
        log_of([&] { fs_type = fs_detect_type(device.path()); });
        return fs_type;
    }

    fs_code from_blkid(const std::string& text)
    {
        answer(text);
        fs_code fs_type = FS_ERR;
        log_of([&] { fs_type = fs_type_from_blkid("/dev/sda1"); });
        return fs_type;
    }

    void make_ext(char compat) const
    {
        device.write_at(1024 + 0x38, "\x53\xEF");
        device.write_at(1024 + 0x5C, std::string(1, compat));
    }

    support::stub_programs stubs;
    image device{DEVICE_SIZE};
};

// Real volumes and the real blkid.
class RealVolume : public testing::Test {
protected:
    RealVolume() { support::remove_all("/run/blkid"); }

    static fs_code detected(const std::string& command)
    {
        image volume(32 << 20, "/run/volume.img");
        volume.make_fs(command);
        fs_code fs_type = FS_ERR;
        log_of([&] { fs_type = fs_detect_type(volume.path()); });
        return fs_type;
    }
};

}  // namespace

TEST(FsTypeNames, stand_at_their_codes)
{
    for (const filesystem& row : FILESYSTEMS) {
        EXPECT_STREQ(fs_type_names[row.code], row.name);
        EXPECT_STREQ(fs_type_name(row.code), row.name);
    }
}

TEST(FsTypeNames, a_number_that_is_no_code_is_named_like_none)
{
    for (int32_t number : {-1, FS_CODE_COUNT, 1000, INT32_MAX, INT32_MIN}) {
        EXPECT_STREQ(fs_type_name(static_cast<fs_code>(number)), "ERR FS") << number;
    }
}

TEST_F(FsType, a_probed_type_is_reported_without_blkid)
{
    device.write_at(3, "NTFS    ");
    std::string log = log_of([&] { EXPECT_EQ(fs_detect_type(device.path()), 8); });
    EXPECT_EQ(log, RULE + "fs_type.cpp(N)check dev fs, dev = /run/image\n" + RULE +
                       "fs_type.cpp(N)===> dev type = 8\n"
                       "fs_type.cpp(N)check fs, dev = /run/image, fs = NTFS\n");
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(FsType, a_device_that_cannot_be_opened_is_none_and_blkid_is_not_asked)
{
    std::string log;
    std::string errors = support::capture_stderr(
        [&] { log = log_of([] { EXPECT_EQ(fs_detect_type("/dev/missing"), 0); }); });
    EXPECT_EQ(log, RULE + "fs_type.cpp(N)check dev fs, dev = /dev/missing\n" + RULE +
                       "fs_type.cpp(N)err, open dev = /dev/missing\n");
    EXPECT_EQ(errors, "open device err!\n: No such file or directory\n");
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(FsType, any_ext_volume_ends_with_blkids_opinion)
{
    for (char compat : {'\0', '\4'}) {
        make_ext(compat);
        answer("/run/image: UUID=\"1\" TYPE=\"ext4\"\n");
        EXPECT_EQ(detected(), 11);
        answer("/run/image: UUID=\"1\" TYPE=\"ext3\"\n");
        EXPECT_EQ(detected(), 4);
        answer("/run/image: UUID=\"1\" TYPE=\"ext2\"\n");
        EXPECT_EQ(detected(), 3);
        // Even when it contradicts the superblock.
        answer("/run/image: UUID=\"1\" TYPE=\"vfat\"\n");
        EXPECT_EQ(detected(), 5);
    }
}

TEST_F(FsType, an_ext_volume_is_none_when_blkid_fails)
{
    make_ext('\4');
    stubs.add("blkid", "exit 2");
    std::string log = log_of([&] { EXPECT_EQ(fs_detect_type(device.path()), 0); });
    EXPECT_TRUE(contains(log, "fs_type.cpp(N)===> dev type = 0\n"
                              "fs_type.cpp(N)check fs, dev = /run/image, fs = FS_NONE\n"))
        << log;
    EXPECT_EQ(stubs.calls(), lines{"blkid /run/image"});
}

TEST_F(FsType, blkid_decides_when_no_probe_matches)
{
    answer("/run/image: UUID=\"1\" TYPE=\"ntfs\"\n");
    std::string log = log_of([&] { EXPECT_EQ(fs_detect_type(device.path()), 8); });
    EXPECT_TRUE(contains(log, "exec cmd = blkid /run/image > /tmp/out.txt\n")) << log;
    EXPECT_TRUE(contains(log, "fs_type.cpp(N)dev = /run/image, get type = ntfs\n"
                              "fs_type.cpp(N)===> dev type = 8\n"
                              "fs_type.cpp(N)check fs, dev = /run/image, fs = NTFS\n"))
        << log;
}

TEST_F(FsType, a_journaled_hfsplus_volume_is_none)
{
    device.write_at(1024, "H+");
    device.write_at(1024 + 6, "\x20");
    answer("/run/image: UUID=\"1\" TYPE=\"hfsplus\"\n");
    EXPECT_EQ(detected(), 0);
    EXPECT_EQ(stubs.calls(), lines{"blkid /run/image"});
}

TEST_F(FsType, an_hfsplus_volume_without_a_journal_is_found)
{
    device.write_at(1024, "H+");
    EXPECT_EQ(detected(), 6);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(FsType, an_extended_container_is_extended)
{
    device.write_at(446, "table");
    device.write_at(510, "\x55\xAA");
    EXPECT_EQ(detected(), 9);
}

TEST_F(FsType, a_whole_gpt_disk_is_extended)
{
    device.write_at(510, "\x55\xAA");
    device.write_at(512, "EFI PART");
    EXPECT_EQ(detected(), 9);
}

TEST_F(FsType, an_unrecognised_fat_volume_with_sec_type_first_is_none)
{
    answer("/run/image: SEC_TYPE=\"msdos\" UUID=\"12-34\" TYPE=\"vfat\"\n");
    EXPECT_EQ(detected(), 0);
}

TEST_F(FsType, detection_only_reads_the_device)
{
    device.write_at(3, "EXFAT   ");
    std::string before = support::read_file(device.path());
    EXPECT_EQ(detected(), 10);
    EXPECT_EQ(support::read_file(device.path()), before);
}

TEST_F(FsType, detection_closes_the_device)
{
    int before = dup(STDIN_FILENO);
    close(before);
    for (int i = 0; i < 5; i++) {
        EXPECT_EQ(detected(), 0);
    }
    int after = dup(STDIN_FILENO);
    close(after);
    EXPECT_EQ(after, before);
}

TEST_F(FsType, the_first_four_characters_of_blkids_type_decide)
{
    struct {
        const char* type;
        int expected;
    } cases[] = {
        {"vfat", 5},    {"ntfs", 8},     {"ext2", 3},     {"ext3", 4},  {"ext4", 11},
        {"exfat", 10},  {"exfa", 10},    {"ext4dev", 11}, {"ntfs3", 8}, {"vfatx", 5},
        {"hfsplus", 0}, {"nofs", 0},     {"btrfs", 0},    {"swap", 0},  {"iso9660", 0},
        {"msdos", 0},   {"squashfs", 0}, {"", 0},         {"ext", 0},   {"exf", 0},
        {"VFAT", 0},    {"fat", 0},      {"dos", 0},      {"gpt", 0},   {"ext5", 0},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(from_blkid(std::string("/dev/sda1: UUID=\"1\" TYPE=\"") + c.type + "\"\n"),
                  c.expected)
            << c.type;
    }
}

TEST_F(FsType, the_first_type_field_wins)
{
    EXPECT_EQ(from_blkid("/dev/sda: PTTYPE=\"dos\" TYPE=\"vfat\"\n"), 0);
    EXPECT_EQ(from_blkid("/dev/sda: SEC_TYPE=\"ext2\" TYPE=\"ext3\"\n"), 3);
    EXPECT_EQ(from_blkid("/dev/sda: TYPE=\"ext3\" SEC_TYPE=\"ext2\"\n"), 4);
}

TEST_F(FsType, unusable_answers_are_none)
{
    for (const char* text : {"", "/dev/sda1: UUID=\"1\"\n", "TYPE=", "TYPE=\"", "TYP=\"vfat\""}) {
        EXPECT_EQ(from_blkid(text), 0) << text;
    }
}

TEST_F(FsType, the_type_text_is_taken_up_to_its_quote)
{
    answer("/dev/sda1: LABEL=\"a\" TYPE=\"ext4\" PARTUUID=\"p\"\n");
    char out[16] = "";
    std::string log = log_of([&] { EXPECT_EQ(fs_blkid_type("/dev/sda1", out, sizeof(out)), 0); });
    EXPECT_STREQ(out, "ext4");
    EXPECT_TRUE(contains(log, "fs_type.cpp(N)dev = /dev/sda1, get type = ext4\n")) << log;
    EXPECT_FALSE(std::filesystem::exists(SCRATCH));
}

TEST_F(FsType, the_type_text_stops_at_15_characters)
{
    ASSERT_EQ(FS_TYPE_TEXT_SIZE, 16U);
    for (size_t length : {14U, 15U, 16U, 200U}) {
        std::string type = "ext4" + std::string(length - 4, 'x');
        answer("/dev/sda1: TYPE=\"" + type + "\"\n");
        char out[17];
        memset(out, '#', sizeof(out));
        log_of([&] { EXPECT_EQ(fs_blkid_type("/dev/sda1", out, 16), 0); });
        EXPECT_EQ(out[16], '#');
        EXPECT_STREQ(out, type.substr(0, 15).c_str()) << length;
        EXPECT_EQ(from_blkid("/dev/sda1: TYPE=\"" + type + "\"\n"), 11);
    }
}

TEST_F(FsType, without_a_type_the_scratch_file_is_deleted_too)
{
    answer("/dev/sda1: UUID=\"1\"\n");
    char out[16] = "";
    log_of([&] { EXPECT_EQ(fs_blkid_type("/dev/sda1", out, sizeof(out)), 1); });
    EXPECT_STREQ(out, "");
    EXPECT_FALSE(std::filesystem::exists(SCRATCH));
}

TEST_F(FsType, a_missing_scratch_file_is_no_type)
{
    stubs.add("blkid", "rm -f /tmp/out.txt");
    char out[16] = "";
    std::string log = log_of([&] { EXPECT_EQ(fs_blkid_type("/dev/sda1", out, sizeof(out)), 1); });
    EXPECT_FALSE(contains(log, "del err!")) << log;
}

TEST_F(FsType, a_command_of_more_than_127_characters_is_cut)
{
    answer("TYPE=\"vfat\"");
    // "blkid ", " > " and the scratch file are 21 characters.
    for (size_t length : {105U, 106U, 107U}) {
        std::string path(length, 'a');
        char out[16] = "";
        log_of([&] {
            EXPECT_EQ(fs_blkid_type(path.c_str(), out, sizeof(out)), length <= 106 ? 0 : 1);
        });
    }
    EXPECT_TRUE(std::filesystem::exists("/tmp/out.tx"));
    support::remove_all("/tmp/out.tx");
}

TEST_F(FsType, a_device_has_a_type_when_blkid_names_one)
{
    answer("/dev/sda1: TYPE=\"nofs\"\n");
    log_of([] { EXPECT_EQ(dev_has_fs_type("sda1"), 1); });
    EXPECT_EQ(stubs.calls(), lines{"blkid /dev/sda1"});
    answer("/dev/sda1: UUID=\"1\"\n");
    log_of([] { EXPECT_EQ(dev_has_fs_type("sda1"), 0); });
    answer("");
    log_of([] { EXPECT_EQ(dev_has_fs_type("sda1"), 0); });
}

TEST_F(FsType, the_device_path_of_that_query_is_cut_at_63_characters)
{
    answer("TYPE=\"vfat\"");
    std::string name(70, 'a');
    log_of([&] { dev_has_fs_type(name.c_str()); });
    EXPECT_EQ(stubs.calls(), lines{"blkid " + ("/dev/" + name).substr(0, 63)});
}

TEST(FsTypeHook, does_nothing)
{
    EXPECT_EQ(log_of([] {
                  EXPECT_EQ(fs_type_hook(FS_EXT4, "/dev/sda1"), 0);
                  EXPECT_EQ(fs_type_hook(FS_NONE, "/dev/sda1"), 0);
              }),
              "");
}

TEST_F(RealVolume, ext2)
{
    EXPECT_EQ(detected("mkfs.ext2 -q -F"), 3);
}

TEST_F(RealVolume, ext3_is_taken_for_ext2_because_its_sec_type_comes_first)
{
    EXPECT_EQ(detected("mkfs.ext3 -q -F"), 3);
}

TEST_F(RealVolume, ext4)
{
    EXPECT_EQ(detected("mkfs.ext4 -q -F"), 11);
}

TEST_F(RealVolume, ext4_without_a_journal_is_still_blkids_ext4)
{
    EXPECT_EQ(detected("mkfs.ext4 -q -F -O ^has_journal"), 11);
}

TEST_F(RealVolume, fat12)
{
    EXPECT_EQ(detected("mkfs.vfat -F 12 -s 32"), 5);
}

TEST_F(RealVolume, fat16)
{
    EXPECT_EQ(detected("mkfs.vfat -F 16"), 5);
}

TEST_F(RealVolume, fat32)
{
    EXPECT_EQ(detected("mkfs.vfat -F 32 -s 1"), 5);
}

TEST_F(RealVolume, exfat)
{
    EXPECT_EQ(detected("mkfs.exfat"), 10);
}

TEST_F(RealVolume, ntfs)
{
    EXPECT_EQ(detected("mkntfs -q -F -f"), 8);
}

TEST_F(RealVolume, nothing_known)
{
    EXPECT_EQ(detected("true"), 0);
}
