#include "fs/fs_probe.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

#include "support/support.h"

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

int32_t probed(int32_t (*probe)(int), const image& device)
{
    device_fd open_device(device);
    int32_t fs_type = -1;
    support::capture_stdout([&] { fs_type = probe(open_device.fd); });
    return fs_type;
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
int32_t ext_probed(uint32_t compat, uint32_t incompat, uint32_t ro_compat)
{
    image device(DEVICE_SIZE);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    device.write_at(1024 + 0x5C, little_endian_32(compat));
    device.write_at(1024 + 0x60, little_endian_32(incompat));
    device.write_at(1024 + 0x64, little_endian_32(ro_compat));
    return probed(fs_probe_ext, device);
}

}  // namespace

TEST(FsProbe, ABlankDeviceMatchesNothing)
{
    image device(DEVICE_SIZE);
    for (auto probe : {fs_probe_ntfs, fs_probe_exfat, fs_probe_fat, fs_probe_ext, fs_probe_hfsplus,
                       fs_probe_extended, fs_probe_efi, fs_probe_mbr, fs_probe_all}) {
        EXPECT_EQ(probed(probe, device), 0);
    }
}

TEST(FsProbe, AnEmptyDeviceMatchesNothing)
{
    image device(0);
    for (auto probe : {fs_probe_ntfs, fs_probe_exfat, fs_probe_fat, fs_probe_ext, fs_probe_hfsplus,
                       fs_probe_extended, fs_probe_efi, fs_probe_mbr, fs_probe_all}) {
        EXPECT_EQ(probed(probe, device), 0);
    }
}

TEST(FsProbe, NtfsIsItsOemIdentifierWithFourSpaces)
{
    struct {
        const char* oem;
        int32_t expected;
    } cases[] = {{"NTFS    ", 8}, {"NTFS   x", 0}, {"NTFS", 0}, {"ntfs    ", 0}, {" NTFS   ", 0}};
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(3, c.oem);
        EXPECT_EQ(probed(fs_probe_ntfs, device), c.expected) << c.oem;
        EXPECT_EQ(probed(fs_probe_all, device), c.expected) << c.oem;
    }
}

TEST(FsProbe, ExfatIsFiveBytesOfItsOemIdentifier)
{
    struct {
        const char* oem;
        int32_t expected;
    } cases[] = {
        {"EXFAT   ", 10}, {"EXFATxyz", 10}, {"EXFAx   ", 0}, {"EXFAS", 0}, {"exfat   ", 0}};
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(3, c.oem);
        EXPECT_EQ(probed(fs_probe_exfat, device), c.expected) << c.oem;
    }
}

TEST(FsProbe, FatIsAJumpAndTheFirstSignatureByte)
{
    struct {
        int byte0;
        int byte2;
        int byte510;
        int byte511;
        int32_t expected;
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
        EXPECT_EQ(probed(fs_probe_fat, device), c.expected)
            << c.byte0 << ' ' << c.byte2 << ' ' << c.byte510;
    }
}

TEST(FsProbe, FatIsFoundWithoutTheLastSignatureByte)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x58, 0x90}));
    device.write_at(510, bytes({0x55}));
    EXPECT_EQ(probed(fs_probe_all, device), 5);
}

TEST(FsProbe, FatRefusesTheNtfsIdentifier)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x52, 0x90}) + "NTFS    ");
    device.write_at(510, bytes({0x55, 0xAA}));
    EXPECT_EQ(probed(fs_probe_fat, device), 0);
    EXPECT_EQ(probed(fs_probe_all, device), 8);
}

TEST(FsProbe, ExfatComesBeforeFat)
{
    image device(DEVICE_SIZE);
    device.write_at(0, bytes({0xEB, 0x76, 0x90}) + "EXFAT   ");
    device.write_at(510, bytes({0x55, 0xAA}));
    EXPECT_EQ(probed(fs_probe_fat, device), 5);
    EXPECT_EQ(probed(fs_probe_all, device), 10);
}

TEST(FsProbe, ExtIsItsMagicInLittleEndian)
{
    image device(DEVICE_SIZE);
    device.write_at(1024 + 0x38, bytes({0xEF, 0x53}));
    EXPECT_EQ(probed(fs_probe_ext, device), 0);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEE}));
    EXPECT_EQ(probed(fs_probe_ext, device), 0);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed(fs_probe_ext, device), 3);
}

TEST(FsProbe, TheFeatureWordsTellTheMembersOfTheExtFamily)
{
    struct {
        uint32_t compat;
        uint32_t incompat;
        uint32_t ro_compat;
        int32_t expected;
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

TEST(FsProbe, HfsplusIsItsSignatureWithoutTheJournal)
{
    struct {
        const char* signature;
        int attributes;
        int32_t expected;
    } cases[] = {
        {"H+", 0x00, 6}, {"H+", 0xDF, 6}, {"H+", 0x20, 0}, {"H+", 0xFF, 0},
        {"HX", 0x00, 0}, {"+H", 0x00, 0}, {"h+", 0x00, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(1024, c.signature);
        device.write_at(1024 + 6, bytes({c.attributes}));
        EXPECT_EQ(probed(fs_probe_hfsplus, device), c.expected) << c.signature << c.attributes;
        EXPECT_EQ(probed(fs_probe_all, device), c.expected) << c.signature << c.attributes;
    }
}

TEST(FsProbe, AnotherAttributeByteIsNotTheJournalFlag)
{
    image device(DEVICE_SIZE);
    device.write_at(1024, "H+");
    device.write_at(1024 + 4, bytes({0x20, 0x20, 0x00, 0x20}));
    EXPECT_EQ(probed(fs_probe_hfsplus, device), 6);
}

TEST(FsProbe, AnExtendedRecordIsTheSignatureWithoutAJump)
{
    struct {
        int byte0;
        int byte2;
        int byte510;
        int byte511;
        int32_t expected;
    } cases[] = {
        {0x00, 0x00, 0x55, 0xAA, 9}, {0xFA, 0x90, 0x55, 0xAA, 9}, {0xEB, 0x00, 0x55, 0xAA, 9},
        {0xEB, 0x90, 0x55, 0xAA, 0}, {0xE9, 0x00, 0x55, 0xAA, 0}, {0x00, 0x00, 0x55, 0x00, 0},
        {0x00, 0x00, 0x00, 0xAA, 0}, {0x00, 0x00, 0xAA, 0x55, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(0, bytes({c.byte0, 0, c.byte2}));
        device.write_at(510, bytes({c.byte510, c.byte511}));
        EXPECT_EQ(probed(fs_probe_extended, device), c.expected) << c.byte0 << ' ' << c.byte2;
    }
}

TEST(FsProbe, AGptHeaderStandsInTheSecondSector)
{
    image device(DEVICE_SIZE);
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(fs_probe_efi, device), 7);
    EXPECT_EQ(probed(fs_probe_all, device), 7);
    device.write_at(512, "EFI PARt");
    EXPECT_EQ(probed(fs_probe_efi, device), 0);
    device.write_at(0, "EFI PART");
    EXPECT_EQ(probed(fs_probe_efi, device), 0);
}

TEST(FsProbe, TheProtectiveRecordOfAGptDiskIsExtended)
{
    image device(DEVICE_SIZE);
    device.write_at(446 + 4, bytes({0xEE}));
    device.write_at(510, bytes({0x55, 0xAA}));
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(fs_probe_efi, device), 7);
    EXPECT_EQ(probed(fs_probe_all, device), 9);
}

TEST(FsProbe, AnMbrIsTheWholeSignatureWhateverStandsBefore)
{
    struct {
        int byte0;
        int byte510;
        int byte511;
        int32_t expected;
    } cases[] = {
        {0x00, 0x55, 0xAA, 2}, {0xE9, 0x55, 0xAA, 2}, {0xFA, 0x55, 0xAA, 2},
        {0x00, 0x55, 0x00, 0}, {0x00, 0x00, 0xAA, 0}, {0x00, 0xAA, 0x55, 0},
    };
    for (const auto& c : cases) {
        image device(DEVICE_SIZE);
        device.write_at(0, bytes({c.byte0}));
        device.write_at(510, bytes({c.byte510, c.byte511}));
        EXPECT_EQ(probed(fs_probe_mbr, device), c.expected);
    }
}

TEST(FsProbe, TheOrderDecidesBetweenTwoMatches)
{
    image device(DEVICE_SIZE);
    device.write_at(510, bytes({0x55, 0xAA}));
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(fs_probe_all, device), 9);
    device.write_at(1024, "H+");
    EXPECT_EQ(probed(fs_probe_all, device), 6);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed(fs_probe_all, device), 3);
    device.write_at(0, bytes({0xEB, 0x58, 0x90}));
    EXPECT_EQ(probed(fs_probe_all, device), 5);
    device.write_at(3, "EXFAT   ");
    EXPECT_EQ(probed(fs_probe_all, device), 10);
    device.write_at(3, "NTFS    ");
    EXPECT_EQ(probed(fs_probe_all, device), 8);
}

TEST(FsProbe, EachProbeNeedsItsWholeRegion)
{
    struct {
        int32_t (*probe)(int);
        off_t region_end;
        off_t offset;
        std::string mark;
        int32_t expected;
    } cases[] = {
        {fs_probe_ntfs, 512, 3, "NTFS    ", 8},
        {fs_probe_exfat, 512, 3, "EXFAT", 10},
        {fs_probe_ext, 2048, 1024 + 0x38, bytes({0x53, 0xEF}), 3},
        {fs_probe_hfsplus, 1536, 1024, "H+", 6},
        {fs_probe_efi, 1024, 512, "EFI PART", 7},
    };
    for (const auto& c : cases) {
        for (off_t size : {c.region_end - 1, c.region_end, c.region_end + 1}) {
            image device(size);
            device.write_at(c.offset, c.mark);
            EXPECT_EQ(probed(c.probe, device), size < c.region_end ? 0 : c.expected) << size;
        }
    }
}

TEST(FsProbe, ADeviceShorterThan2048BytesIsProbedByTheOtherTests)
{
    image device(1536);
    device.write_at(1024 + 0x38, bytes({0x53, 0xEF}));
    EXPECT_EQ(probed(fs_probe_all, device), 0);
    device.write_at(512, "EFI PART");
    EXPECT_EQ(probed(fs_probe_all, device), 7);
    device.write_at(1024, "H+");
    EXPECT_EQ(probed(fs_probe_all, device), 6);
}

TEST(FsReadAt, ReadsExactlyTheRegion)
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

TEST(FsReadAt, AShortReadIsLoggedWithTheBufferAsText)
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

TEST(FsReadAt, AFailedSeekIsLogged)
{
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    char buffer[8] = "";
    std::string log = log_of([&] { EXPECT_EQ(fs_read_at(ends[0], buffer, 0, 4), -1); });
    EXPECT_EQ(log, "ERROR[fs_probe.cpp:N](" + std::string(strerror(ESPIPE)) + ")seek err!\n");
    close(ends[0]);
    close(ends[1]);
}
