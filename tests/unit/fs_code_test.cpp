// Walks the table of filesystems. Whoever adds one says in EXPECTED what it must have, and learns
// from the failures what is still missing, in the program, its documents and its package.
#include "util/fs_code.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <cstdint>
#include <initializer_list>
#include <iterator>
#include <string>

#include "fs/fs_probe.h"
#include "fs/fs_type.h"
#include "support/capture.h"
#include "support/files.h"
#include "support/images.h"
#include "support/stubs.h"
#include "support/text.h"

using support::contains;

namespace {

struct mark {
    off_t offset;
    std::string bytes;
};

// Texts that a filesystem is to do without are empty.
struct expectation {
    int number;
    std::string name;
    std::string blkid_type;          // as blkid prints it
    std::string mount;               // for sda1 and /tmp/mountd/d
    std::string repair;              // for sda1
    std::string document;            // its row of docs/interfaces.md
    std::string package;             // what the router's package draws in for it
    std::array<mark, 2> superblock;  // what tells it on a device of zero bytes
};

const std::string SIGNATURE = "\x55\xAA";
const std::string MAGIC = "\x53\xEF";
const std::string JOURNAL_AND_EXTENTS("\x04\0\0\0\x40", 5);

const expectation EXPECTED[] = {
    {0, "ERR FS", "", "", "", "", "", {}},
    {1, "ERR FS", "", "", "", "", "", {}},
    {2, "MBR", "", "", "", "", "", {{{510, SIGNATURE}}}},
    {3,
     "EXT2",
     "ext2",
     "mount -t ext2 -o rw,defaults /dev/sda1 /tmp/mountd/d",
     "fsck.ext2 -a /dev/sda1",
     "mount -t ext2\\|ext3\\|ext4 -o rw,defaults`",
     "kmod-fs-ext4",
     {{{1024 + 0x38, MAGIC}}}},
    {4,
     "EXT3",
     "ext3",
     "mount -t ext3 -o rw,defaults /dev/sda1 /tmp/mountd/d",
     "fsck.ext3 -a /dev/sda1",
     "mount -t ext2\\|ext3\\|ext4 -o rw,defaults`",
     "kmod-fs-ext4",
     {{{1024 + 0x38, MAGIC}, {1024 + 0x5C, "\x04"}}}},
    {5,
     "FAT",
     "vfat",
     "mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8 /dev/sda1 /tmp/mountd/d",
     "fsck.fat -a /dev/sda1",
     "| FAT | `mount -t vfat -o rw,uid=1000,gid=1000,iocharset=utf8`",
     "kmod-fs-vfat",
     {{{0, "\xEB\x58\x90"}, {510, SIGNATURE}}}},
    {6,
     "HFSPLUS",
     "",
     "mount -t hfsplus -o rw,defaults,uid=1000,gid=1000 /dev/sda1 /tmp/mountd/d",
     "",
     "| HFS+ | `mount -t hfsplus -o rw,defaults,uid=1000,gid=1000`",
     "kmod-fs-hfsplus",
     {{{1024, "H+"}}}},
    {7, "EFI", "", "", "", "", "", {{{512, "EFI PART"}}}},
    {8,
     "NTFS",
     "ntfs",
     "mount.ntfs-3g -o noatime,big_writes,async,force /dev/sda1 /tmp/mountd/d",
     "ntfsfix /dev/sda1",
     "| NTFS | `mount.ntfs-3g -o noatime,big_writes,async,force`",
     "ntfs-3g",
     {{{3, "NTFS    "}}}},
    {9, "EXTENDED", "", "", "", "", "", {{{510, SIGNATURE}}}},
    {10,
     "EXFAT",
     "exfat",
     "mount -t exfat /dev/sda1 /tmp/mountd/d",
     "fsck.exfat /dev/sda1",
     "| exFAT | `mount -t exfat`",
     "kmod-fs-exfat",
     {{{3, "EXFAT   "}}}},
    {11,
     "EXT4",
     "ext4",
     "mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/d",
     "fsck.ext4 -a /dev/sda1",
     "mount -t ext2\\|ext3\\|ext4 -o rw,defaults`",
     "kmod-fs-ext4",
     {{{1024 + 0x38, MAGIC}, {1024 + 0x5C, JOURNAL_AND_EXTENTS}}}},
};

// blkid's word for it does not tell a journal. A repair command is whatever EXPECTED says.
bool may_lack_blkid_type(const std::string& name)
{
    return name == "HFSPLUS";
}

// The rest are partition tables and the words for nothing.
bool is_mounted(fs_code code)
{
    for (const fs_code other : {FS_NONE, FS_ERR, FS_MBR, FS_EFI, FS_EXTENDED}) {
        if (code == other) {
            return false;
        }
    }
    return true;
}

std::string filled_in(std::string format, std::initializer_list<const char*> words)
{
    for (const char* word : words) {
        const size_t at = format.find("%s");
        if (at != std::string::npos) {
            format.replace(at, 2, word);
        }
    }
    return format;
}

std::string text_of(const char* text)
{
    return text != NO_TEXT ? text : "";
}

fs_code probed(const expectation& wanted)
{
    const support::image device(0x10000);
    for (const mark& m : wanted.superblock) {
        device.write_at(m.offset, m.bytes);
    }
    const int fd = open(device.path(), O_RDONLY | O_CLOEXEC);
    const fs_code found = fs_probe_one(static_cast<fs_code>(wanted.number), fd);
    close(fd);
    return found;
}

fs_code named_by_blkid(const std::string& type)
{
    support::stub_programs stubs;
    stubs.add("blkid", "echo '/dev/sda1: TYPE=\"" + type + "\"'");
    fs_code found = FS_ERR;
    support::log_of([&] { found = fs_type_from_blkid("/dev/sda1"); });
    return found;
}

bool stands_in(const char* document, const std::string& text)
{
    const std::string content = support::read_file(std::string(CHECKOUT) + "/" + document);
    EXPECT_FALSE(content.empty()) << "cannot read " << document;
    return contains(content, text);
}

// What the row of a filesystem is without, or has otherwise than it should.
std::string lacks(const filesystem& row)
{
    const size_t place = static_cast<size_t>(row.code);
    if (place >= std::size(EXPECTED)) {
        return "a row in EXPECTED";
    }
    const expectation& wanted = EXPECTED[place];
    const bool mounted = is_mounted(row.code);
    const bool in_blkid = mounted && !may_lack_blkid_type(wanted.name);
    const bool detected = row.code != FS_NONE && row.code != FS_ERR;
    const struct {
        const char* what;
        bool there;
    } promises[] = {
        {"its number", static_cast<int>(row.code) == wanted.number},
        {"its name", text_of(row.name) == wanted.name},
        {"its mount command",
         filled_in(text_of(row.mount), {"/dev/sda1", "/tmp/mountd/d"}) == wanted.mount &&
             wanted.mount.empty() != mounted},
        {"its repair command", filled_in(text_of(row.repair), {"/dev/sda1"}) == wanted.repair &&
                                   (mounted || wanted.repair.empty())},
        {"blkid's word", in_blkid == !wanted.blkid_type.empty() &&
                             (!in_blkid || named_by_blkid(wanted.blkid_type) == row.code)},
        {"a probe for its superblock", !detected || probed(wanted) == row.code},
        {"its name in docs/disk.schema.json",
         stands_in("docs/disk.schema.json", "\"" + wanted.name + "\"")},
        {"its row in docs/interfaces.md",
         !mounted || stands_in("docs/interfaces.md", wanted.document)},
        {"its package in openwrt/tarn-nas-diskmanager/Makefile",
         !mounted || stands_in("openwrt/tarn-nas-diskmanager/Makefile", wanted.package)},
    };
    std::string missing;
    for (const auto& promise : promises) {
        if (!promise.there) {
            missing += std::string(missing.empty() ? "" : ", ") + promise.what;
        }
    }
    return missing;
}

}  // namespace

TEST(FilesystemTable, each_row_has_what_its_filesystem_needs)
{
    for (const filesystem& row : FILESYSTEMS) {
        EXPECT_EQ(lacks(row), "") << "is what " << row.name << " lacks";
    }
}

TEST(FilesystemTable, has_a_row_for_each_expectation)
{
    EXPECT_EQ(std::size(FILESYSTEMS), std::size(EXPECTED));
    EXPECT_EQ(static_cast<size_t>(FS_CODE_COUNT), std::size(EXPECTED));
}

TEST(FilesystemTable, a_number_that_is_no_code_has_the_row_of_none)
{
    for (const int32_t number : {-1, FS_CODE_COUNT, 1000, INT32_MAX, INT32_MIN}) {
        EXPECT_EQ(&filesystem_of(static_cast<fs_code>(number)), &FILESYSTEMS[FS_NONE]) << number;
    }
}
