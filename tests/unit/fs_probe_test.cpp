#include "fs/fs_probe.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <string>

#include "support/capture.h"
#include "support/images.h"
#include "support/text.h"

using support::image;
using support::log_of;

namespace {

constexpr off_t DEVICE_SIZE = 0x10000;

// An open device for one probe.
class device_fd {
public:
    explicit device_fd(const image& device) : fd(open(device.path(), O_RDONLY | O_CLOEXEC)) {}
    ~device_fd() { close(fd); }
    device_fd(const device_fd&) = delete;
    device_fd& operator=(const device_fd&) = delete;

    int fd;
};

constexpr fs_code EACH_CODE[] = {FS_NTFS,    FS_EXFAT,    FS_FAT, FS_EXT2,
                                 FS_HFSPLUS, FS_EXTENDED, FS_EFI, FS_MBR};

// What the probe for that code says.
fs_code probed_for(fs_code code, const image& device)
{
    device_fd open_device(device);
    fs_code found = FS_ERR;
    support::capture_stdout([&] { found = fs_probe_one(code, open_device.fd); });
    return found;
}

// What all probes say together.
fs_code probed(const image& device)
{
    device_fd open_device(device);
    fs_code found = FS_ERR;
    support::capture_stdout([&] { found = fs_probe_all(open_device.fd); });
    return found;
}

std::string bytes(std::initializer_list<int> values)
{
    std::string text;
    for (int value : values) {
        text.push_back(static_cast<char>(value));
    }
    return text;
}

std::string little_endian_32(uint32_t value)
{
    return bytes({static_cast<int>(value & 0xFF), static_cast<int>(value >> 8 & 0xFF),
                  static_cast<int>(value >> 16 & 0xFF), static_cast<int>(value >> 24)});
}

// A device whose superblock has the ext magic and these feature words.
fs_code ext_probed(uint32_t compat, uint32_t incompat, uint32_t ro_compat)
{
    image device(DEVICE_SIZE);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    device.write_at(1024 + 0x5C, little_endian_32(compat));
    device.write_at(1024 + 0x60, little_endian_32(incompat));
    device.write_at(1024 + 0x64, little_endian_32(ro_compat));
    return probed_for(FS_EXT2, device);
}

}  // namespace

TEST(FsProbe, a_blank_device_matches_nothing)
{
    image device(DEVICE_SIZE);
    for (fs_code code : EACH_CODE) {
        EXPECT_EQ(probed_for(code, device), FS_NONE) << code;
    }
    EXPECT_EQ(probed(device), FS_NONE);
}

TEST(FsProbe, an_empty_device_matches_nothing)
{
    image device(0);
    for (fs_code code : EACH_CODE) {
        EXPECT_EQ(probed_for(code, device), FS_NONE) << code;
    }
    EXPECT_EQ(probed(device), FS_NONE);
}

TEST(FsProbe, ntfs_is_its_oem_identifier_with_four_spaces)
{
    struct {
        const char* oem;
        int expected;
    } cases[] = {{"NTFS    ", 8}, {"NTFS   x", 0}, {"NTFS", 0}, {"ntfs    ", 0}, {" NTFS   ", 0}};
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(3, c.oem);
        EXPECT_EQ(probed_for(FS_NTFS, device), c.expected) << c.oem;
        EXPECT_EQ(probed(device), c.expected) << c.oem;
    }
}

TEST(FsProbe, exfat_is_five_bytes_of_its_oem_identifier)
{
    struct {
        const char* oem;
        int expected;
    } cases[] = {
        {"EXFAT   ", 10}, {"EXFATxyz", 10}, {"EXFAx   ", 0}, {"EXFAS", 0}, {"exfat   ", 0}};
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(3, c.oem);
        EXPECT_EQ(probed_for(FS_EXFAT, device), c.expected) << c.oem;
    }
}

TEST(FsProbe, fat_is_a_jump_and_the_first_signature_byte)
{
    struct {
        int byte0;
        int byte2;
        int byte510;
        int byte511;
        int expected;
    } cases[] = {
        {0xEB, 0x90, 0x55, 0xAA, 5}, {0xEB, 0x90, 0x55, 0x00, 5}, {0xEB, 0x90, 0x55, 0xFF, 5},
        {0xE9, 0x00, 0x55, 0xAA, 5}, {0xE9, 0x90, 0x55, 0x00, 5}, {0xEB, 0x90, 0x54, 0xAA, 0},
        {0xEB, 0x90, 0x00, 0xAA, 0}, {0xEB, 0x91, 0x55, 0xAA, 0}, {0xEA, 0x90, 0x55, 0xAA, 0},
        {0x00, 0x90, 0x55, 0xAA, 0}, {0xE9, 0x00, 0x00, 0xAA, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(0, bytes({c.byte0, 0x3C, c.byte2}));
        device.write_at(510, bytes({c.byte510, c.byte511}));
        EXPECT_EQ(probed_for(FS_FAT, device), c.expected)
            << c.byte0 << ' ' << c.byte2 << ' ' << c.byte510;
    }
}

TEST(FsProbe, fat_is_found_without_the_last_signature_byte)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x58, 0x90}));
    device.write_at(510, bytes({0x55}));
    EXPECT_EQ(probed(device), 5);
}

TEST(FsProbe, fat_refuses_the_ntfs_identifier)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x52, 0x90}) + "NTFS    ");
    device.write_at(510, bytes({0x55, 0xAA}));
    EXPECT_EQ(probed_for(FS_FAT, device), 0);
    EXPECT_EQ(probed(device), 8);
}

TEST(FsProbe, exfat_comes_before_fat)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x76, 0x90}) + "EXFAT   ");
    device.write_at(510, bytes({0x55, 0xAA}));
    EXPECT_EQ(probed_for(FS_FAT, device), 5);
    EXPECT_EQ(probed(device), 10);
}

TEST(FsProbe, ext_is_its_magic_in_little_endian)
{
    image device(DEVICE_SIZE);
    device.write_at(1024 + 0x38, bytes({0xEF, 0x53}));
    EXPECT_EQ(probed_for(FS_EXT2, device), 0);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEE}));
    EXPECT_EQ(probed_for(FS_EXT2, device), 0);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed_for(FS_EXT2, device), 3);
}

TEST(FsProbe, the_feature_words_tell_the_members_of_the_ext_family)
{
    struct {
        uint32_t compat;
        uint32_t incompat;
        uint32_t ro_compat;
        int expected;
    } cases[] = {
        // Without a journal it is ext2, whatever the other words hold.
        {0, 0, 0, 3},
        {0, 0x40, 8, 3},
        {0xFB, 0xFFFFFFFF, 0xFFFFFFFF, 3},
        {0x400, 0x40, 8, 3},
        // Of the first word only the lowest byte counts.
        {0xFFFFFF00, 0x40, 8, 3},
        {0x4, 0, 0, 4},
        {0xFF, 0, 0, 4},
        {0xFFFFFFFF, 0, 0, 4},
        // Both comparisons are of size, not of single bits.
        {0x4, 0x3F, 0, 4},
        {0x4, 0x40, 0, 11},
        {0x4, 0x41, 0, 11},
        {0x4, 0x80, 0, 11},
        {0x4, 0x10000, 0, 11},
        {0x4, 0x80000000, 0, 11},
        {0x4, 0, 7, 4},
        {0x4, 0, 8, 11},
        {0x4, 0, 16, 11},
        {0x4, 0, 0x100, 11},
        {0x4, 0, 0x80000000, 11},
        {0x4, 0x3F, 7, 4},
        {0x4, 0x3F, 8, 11},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(ext_probed(c.compat, c.incompat, c.ro_compat), c.expected)
            << std::hex << c.compat << ' ' << c.incompat << ' ' << c.ro_compat;
    }
}

TEST(FsProbe, hfsplus_is_its_signature_without_the_journal)
{
    struct {
        const char* signature;
        int attributes;
        int expected;
    } cases[] = {
        {"H+", 0x00, 6}, {"H+", 0xDF, 6}, {"H+", 0x20, 0}, {"H+", 0xFF, 0},
        {"HX", 0x00, 0}, {"+H", 0x00, 0}, {"h+", 0x00, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(1024, c.signature);
        device.write_at(1024 + 6, bytes({c.attributes}));
        EXPECT_EQ(probed_for(FS_HFSPLUS, device), c.expected) << c.signature << c.attributes;
        EXPECT_EQ(probed(device), c.expected) << c.signature << c.attributes;
    }
}

TEST(FsProbe, another_attribute_byte_is_not_the_journal_flag)
{
    image device(DEVICE_SIZE);
    device.write_at(1024, "H+");
    device.write_at(1024 + 4, bytes({0x20, 0x20, 0x00, 0x20}));
    EXPECT_EQ(probed_for(FS_HFSPLUS, device), 6);
}

TEST(FsProbe, an_extended_record_is_the_signature_without_a_jump)
{
    struct {
        int byte0;
        int byte2;
        int byte510;
        int byte511;
        int expected;
    } cases[] = {
        {0x00, 0x00, 0x55, 0xAA, 9}, {0xFA, 0x90, 0x55, 0xAA, 9}, {0xEB, 0x00, 0x55, 0xAA, 9},
        {0xEB, 0x90, 0x55, 0xAA, 0}, {0xE9, 0x00, 0x55, 0xAA, 0}, {0x00, 0x00, 0x55, 0x00, 0},
        {0x00, 0x00, 0x00, 0xAA, 0}, {0x00, 0x00, 0xAA, 0x55, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(0, bytes({c.byte0, 0, c.byte2}));
        device.write_at(510, bytes({c.byte510, c.byte511}));
        EXPECT_EQ(probed_for(FS_EXTENDED, device), c.expected) << c.byte0 << ' ' << c.byte2;
    }
}

TEST(FsProbe, a_gpt_header_stands_in_the_second_sector)
{
    image device(DEVICE_SIZE);
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed_for(FS_EFI, device), 7);
    EXPECT_EQ(probed(device), 7);
    device.write_at(512, "EFI PARt");
    EXPECT_EQ(probed_for(FS_EFI, device), 0);
    device.write_at(0, "EFI PART");
    EXPECT_EQ(probed_for(FS_EFI, device), 0);
}

TEST(FsProbe, the_protective_record_of_a_gpt_disk_is_extended)
{
    image device(DEVICE_SIZE);
    device.write_at(446 + 4, bytes({0xEE}));
    device.write_at(510, bytes({0x55, 0xAA}));
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed_for(FS_EFI, device), 7);
    EXPECT_EQ(probed(device), 9);
}

TEST(FsProbe, an_mbr_is_the_whole_signature_whatever_stands_before)
{
    struct {
        int byte0;
        int byte510;
        int byte511;
        int expected;
    } cases[] = {
        {0x00, 0x55, 0xAA, 2}, {0xE9, 0x55, 0xAA, 2}, {0xFA, 0x55, 0xAA, 2},
        {0x00, 0x55, 0x00, 0}, {0x00, 0x00, 0xAA, 0}, {0x00, 0xAA, 0x55, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(0, bytes({c.byte0}));
        device.write_at(510, bytes({c.byte510, c.byte511}));
        EXPECT_EQ(probed_for(FS_MBR, device), c.expected);
    }
}

TEST(FsProbe, one_probe_serves_the_whole_ext_family_and_none_serves_no_filesystem)
{
    image device(DEVICE_SIZE);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    for (fs_code code : {FS_EXT2, FS_EXT3, FS_EXT4}) {
        EXPECT_EQ(probed_for(code, device), FS_EXT2);
    }
    device.write_at(3, "NTFS    ");
    EXPECT_EQ(probed_for(FS_NTFS, device), FS_NTFS);
    for (fs_code code : {FS_NONE, FS_ERR, static_cast<fs_code>(1000)}) {
        EXPECT_EQ(probed_for(code, device), FS_NONE) << code;
    }
}

TEST(FsProbe, the_order_decides_between_two_matches)
{
    image device(DEVICE_SIZE);
    device.write_at(510, bytes({0x55, 0xAA}));
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(device), 9);
    device.write_at(1024, "H+");
    EXPECT_EQ(probed(device), 6);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed(device), 3);
    device.write_at(0, bytes({0xEB, 0x58, 0x90}));
    EXPECT_EQ(probed(device), 5);
    device.write_at(3, "EXFAT   ");
    EXPECT_EQ(probed(device), 10);
    device.write_at(3, "NTFS    ");
    EXPECT_EQ(probed(device), 8);
}

TEST(FsProbe, each_probe_needs_its_whole_region)
{
    struct {
        fs_code code;
        off_t region_end;
        off_t offset;
        std::string mark;
        int expected;
    } cases[] = {
        {FS_NTFS, 512, 3, "NTFS    ", 8},
        {FS_EXFAT, 512, 3, "EXFAT", 10},
        {FS_EXT2, 2048, 1024 + 0x38, bytes({0x53, 0xEF}), 3},
        {FS_HFSPLUS, 1536, 1024, "H+", 6},
        {FS_EFI, 1024, 512, "EFI PART", 7},
    };
    for (const auto& c : cases) {
        for (off_t size : {c.region_end - 1, c.region_end, c.region_end + 1}) {
            image device(size);
            device.write_at(c.offset, c.mark);
            EXPECT_EQ(probed_for(c.code, device), size < c.region_end ? 0 : c.expected) << size;
        }
    }
}

TEST(FsProbe, a_device_shorter_than_2048_bytes_is_probed_by_the_other_tests)
{
    image device(1536);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed(device), 0);
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(device), 7);
    device.write_at(1024, "H+");
    EXPECT_EQ(probed(device), 6);
}

TEST(FsReadAt, reads_exactly_the_region)
{
    image device(1024);
    device.write_at(500, "0123456789");
    device_fd open_device(device);
    char buffer[8] = "#######";
    EXPECT_EQ(fs_read_at(open_device.fd, buffer, 502, 4), 0);
    EXPECT_STREQ(buffer, "2345###");
    EXPECT_EQ(fs_read_at(open_device.fd, buffer, 500, 2), 0);
    EXPECT_STREQ(buffer, "0145###");
    EXPECT_EQ(fs_read_at(open_device.fd, buffer, 1020, 4), 0);
}

TEST(FsReadAt, a_short_read_is_logged_with_the_buffer_as_text)
{
    image device(1024);
    device.write_at(1021, "xyz");
    device_fd open_device(device);
    char buffer[8] = "";
    std::string log = log_of([&] {
        errno = EIO;
        EXPECT_EQ(fs_read_at(open_device.fd, buffer, 1021, 4), -1);
    });
    EXPECT_EQ(log, "ERROR[fs_probe.cpp:N](" + std::string(strerror(EIO)) +
                       ")read err! b = xyz, len = 4\n");
}

TEST(FsReadAt, a_full_buffer_of_a_short_read_is_printed_up_to_its_length)
{
    image device(1024);
    device_fd open_device(device);
    char buffer[8] = {'1', '2', '3', '4', '5', '6', '7', '8'};
    std::string log = log_of([&] { EXPECT_EQ(fs_read_at(open_device.fd, buffer, 1024, 4), -1); });
    EXPECT_TRUE(support::contains(log, "read err! b = 1234, len = 4\n")) << log;
}

TEST(FsReadAt, a_failed_seek_is_logged)
{
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    char buffer[8] = "";
    std::string log = log_of([&] { EXPECT_EQ(fs_read_at(ends[0], buffer, 0, 4), -1); });
    EXPECT_EQ(log, "ERROR[fs_probe.cpp:N](" + std::string(strerror(ESPIPE)) + ")seek err!\n");
    close(ends[0]);
    close(ends[1]);
}
