// The first sectors of a device through the whole detection chain. Which signature wins is worked
// out here a second time, from the order in which the formats are looked for. A filesystem that is
// not known here may be found wherever its own probe finds it.
//
// Input: two bytes of device size, one that chooses blkid's answer, then records: two bytes of
// offset, one of length, and that many bytes. All else of the device is zero.

#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>

#include "fs/fs_probe.h"
#include "fs/fs_type.h"
#include "fuzz.h"
#include "util/text.h"

namespace {

constexpr size_t DEVICE_MAX = 4096;

struct blkid_answer {
    const char* output;
    fs_code code;
};

constexpr blkid_answer ANSWERS[] = {
    {"", FS_NONE},
    {"/dev/x: UUID=\"1\"\n", FS_NONE},
    {"/dev/x: UUID=\"1\" TYPE=\"ext4\"\n", FS_EXT4},
    {"/dev/x: TYPE=\"ext3\"\n", FS_EXT3},
    {"/dev/x: TYPE=\"ext2\"\n", FS_EXT2},
    {"/dev/x: TYPE=\"vfat\"\n", FS_FAT},
    {"/dev/x: SEC_TYPE=\"msdos\" TYPE=\"vfat\"\n", FS_NONE},
    {"/dev/x: TYPE=\"hfsplus\"\n", FS_NONE},
};

int device = -1;
std::string device_path;
blkid_answer answer;

size_t number_at(const std::string& bytes, size_t at)
{
    return static_cast<uint8_t>(bytes[at]) |
           static_cast<size_t>(static_cast<uint8_t>(bytes[at + 1])) << 8;
}

std::string unpack(const std::string& input)
{
    std::string image(number_at(input, 0) % (DEVICE_MAX + 1), '\0');
    for (size_t at = 3; at + 3 <= input.size();) {
        const size_t offset = number_at(input, at);
        const auto length = static_cast<uint8_t>(input[at + 2]);
        const std::string bytes = input.substr(at + 3, length);
        at += 3U + length;
        if (offset < image.size()) {
            const size_t fitting = std::min(bytes.size(), image.size() - offset);
            image.replace(offset, fitting, bytes, 0, fitting);
        }
    }
    return image;
}

struct device_view {
    const std::string& image;

    [[nodiscard]] bool readable(size_t end) const { return image.size() >= end; }
    [[nodiscard]] uint8_t byte(size_t at) const { return static_cast<uint8_t>(image[at]); }
    [[nodiscard]] uint64_t word(size_t at, int bytes) const
    {
        uint64_t value = 0;
        for (int i = bytes - 1; i >= 0; --i) {
            value = value << 8 | byte(at + static_cast<size_t>(i));
        }
        return value;
    }
    [[nodiscard]] bool holds(size_t at, const char* text) const
    {
        return image.compare(at, strlen(text), text) == 0;
    }
    [[nodiscard]] bool jumps() const
    {
        return byte(0) == 0xE9 || (byte(0) == 0xEB && byte(2) == 0x90);
    }
};

fs_code expected_ext(const device_view& view)
{
    const bool journal = (view.byte(1024 + 0x5C) & 4) != 0;
    const bool later = view.word(1024 + 0x60, 4) >= 0x40 || view.word(1024 + 0x64, 4) >= 8;
    return !journal ? FS_EXT2 : later ? FS_EXT4 : FS_EXT3;
}

using expectation = fs_code (*)(const device_view&);

// In the order in which they are looked for.
constexpr expectation EXPECTATIONS[] = {
    [](const device_view& v) -> fs_code {
        return v.readable(512) && v.holds(3, "NTFS    ") ? FS_NTFS : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(512) && v.holds(3, "EXFAT") ? FS_EXFAT : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(512) && v.jumps() && v.byte(510) == 0x55 && !v.holds(3, "NTFS    ")
                   ? FS_FAT
                   : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(2048) && v.word(1024 + 0x38, 2) == 0xEF53 ? expected_ext(v) : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(1536) && (v.byte(1030) & 0x20) == 0 && v.holds(1024, "H+") ? FS_HFSPLUS
                                                                                     : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(512) && v.word(510, 2) == 0xAA55 && !v.jumps() ? FS_EXTENDED : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(1024) && v.holds(512, "EFI PART") ? FS_EFI : FS_NONE;
    },
    [](const device_view& v) -> fs_code {
        return v.readable(512) && v.word(510, 2) == 0xAA55 ? FS_MBR : FS_NONE;
    },
};

// One code of each.
constexpr fs_code PROBES[] = {
    FS_NTFS, FS_EXFAT, FS_FAT, FS_EXT2, FS_HFSPLUS, FS_EXTENDED, FS_EFI, FS_MBR,
};

// Whether the probes of EXPECTATIONS can find it.
bool is_known_here(fs_code code)
{
    return code == FS_EXT3 || code == FS_EXT4 ||
           std::find(std::begin(PROBES), std::end(PROBES), code) != std::end(PROBES);
}

fs_code check_probes(const device_view& view)
{
    fs_code first = FS_NONE;
    for (size_t i = 0; i < std::size(PROBES); ++i) {
        const fs_code expected = EXPECTATIONS[i](view);
        require(fs_probe_one(PROBES[i], device) == expected, "each probe knows its signature");
        first = first != FS_NONE ? first : expected;
    }
    const fs_code found = fs_probe_all(device);
    if (found != FS_NONE && !is_known_here(found)) {
        require(fs_probe_one(found, device) == found, "another filesystem has its signature");
        return found;
    }
    require(found == first, "the first signature wins");
    return found;
}

void check_reading(const std::string& image, size_t offset, size_t length)
{
    exact_buffer buffer(length);
    memset(buffer.data(), 0, buffer.size());
    const int ret =
        fs_read_at(device, buffer.data(), static_cast<int>(offset), static_cast<int>(length));
    const bool whole = offset + length <= image.size();
    require(ret == (whole ? 0 : -1), "a short read fails");
    require(!whole || buffer.all().compare(0, length, image, offset, length) == 0,
            "what is read is what stands there, and nothing behind it is touched");
}

}  // namespace

void fuzz_begin()
{
    device = memfd_create("device", MFD_CLOEXEC);
    device_path = "/proc/self/fd/" + std::to_string(device);
}

std::string fuzz_answer(const std::string& command)
{
    require(command == "blkid " + device_path, "blkid is asked for the device");
    return answer.output;
}

void fuzz_one(const std::string& input)
{
    if (input.size() < 3) {
        return;
    }
    const std::string image = unpack(input);
    answer = ANSWERS[static_cast<uint8_t>(input[2]) % std::size(ANSWERS)];
    require(ftruncate(device, 0) == 0 && ftruncate(device, static_cast<off_t>(image.size())) == 0 &&
                pwrite(device, image.data(), image.size(), 0) == static_cast<ssize_t>(image.size()),
            "the fuzz program can write its device");

    const fs_code probed = check_probes({image});
    const bool ext = probed == FS_EXT2 || probed == FS_EXT3 || probed == FS_EXT4;
    const fs_code expected = probed == FS_NONE || ext ? answer.code : probed;
    require(fs_detect_type(device_path.c_str()) == expected, "blkid is asked when it is its turn");
    require(strlen(fs_type_name(expected)) > 0, "every result has a name");
    check_reading(image, number_at(input, 0) / 2, 1 + input.size() % 600);
}
