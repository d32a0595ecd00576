// blkid's output through the TYPE, value and label readers, and through the record that is filled
// from them. What the readers take out of it is worked out here a second time.
//
// Fields: the output without and with "-d". The input's size chooses the reader.

#include <algorithm>
#include <cstring>

#include "disk/discovery.h"
#include "disk/part_info.h"
#include "fs/fs_type.h"
#include "fuzz.h"
#include "util/block_dev.h"

namespace {

constexpr char DEV_NAME[] = "sda1";
constexpr char DEV_PATH[] = "/dev/sda1";
constexpr size_t DEV_CHECK_MAX = 512;  // so much of the output tells whether a device is there

std::string plain_output;
std::string raw_output;

// The text behind the first key and one more character, up to one of the ends.
std::optional<std::string> value_of(const std::string& output, const std::string& key,
                                    const char* ends)
{
    const std::string text = c_text(output);
    const size_t match = text.find(key);
    if (match == std::string::npos) {
        return std::nullopt;
    }
    const std::string rest = text.substr(std::min(match + key.size() + 1, text.size()));
    return rest.substr(0, rest.find_first_of(ends));
}

std::string word_of(const std::string& output, const char* key)
{
    return value_of(output, key, "\" ").value_or("").substr(0, PART_UID_SIZE - 1);
}

fs_code code_of(const std::string& type)
{
    const std::string four = type.substr(0, 4);
    return four == "vfat"   ? FS_FAT
           : four == "ntfs" ? FS_NTFS
           : four == "ext2" ? FS_EXT2
           : four == "ext3" ? FS_EXT3
           : four == "ext4" ? FS_EXT4
           : four == "exfa" ? FS_EXFAT
                            : FS_NONE;
}

void check_value(const std::string& key, size_t size)
{
    std::string expected = value_of(plain_output, key, "\" ").value_or("");
    expected.resize(size);
    exact_buffer out(size);
    blkid_get_value(DEV_NAME, key.c_str(), out.data(), size);
    require(out.all() == expected, "a value ends at a quote, a space or the buffer, zero-filled");
}

void check_label(size_t size)
{
    std::string expected = value_of(raw_output, "LABEL=", "\" ").value_or("");
    expected.resize(size);
    exact_buffer out(size);
    blkid_get_label(DEV_NAME, out.data(), size);
    require(out.all() == expected, "the raw label likewise");
}

std::optional<std::string> expected_type()
{
    const std::optional<std::string> value = value_of(plain_output, "TYPE=", "\"");
    return value ? std::optional<std::string>(value->substr(0, FS_TYPE_TEXT_SIZE - 1)) : value;
}

void check_type()
{
    const std::optional<std::string> value = expected_type();
    exact_buffer out(FS_TYPE_TEXT_SIZE);
    memset(out.data(), 0, out.size());
    require(fs_blkid_type(DEV_PATH, out.data(), out.size()) == (value ? 0 : 1), "TYPE is found");
    require(out.text() == value.value_or(""), "the type ends at a quote, cut at 15 characters");
}

std::string expected_label(fs_code fs_type)
{
    const std::string label = word_of(plain_output, "LABEL=");
    const bool factory = fs_type == FS_FAT && std::count(label.begin(), label.end(), '-') >= 3;
    if (label.size() <= 1 || factory) {
        return DEV_NAME;
    }
    const std::string raw = word_of(raw_output, "LABEL=");
    return raw.empty() ? DEV_NAME : raw;
}

void check_record(bool is_root)
{
    const fs_code fs_type = code_of(expected_type().value_or(""));
    part_info part{};
    part.is_root_part = is_root ? 1 : 0;
    strcpy(part.dev_name, DEV_NAME);
    require(part_info_fill(&part) == 0, "a record is always filled");
    require(is_clean_text(part.uid) && is_clean_text(part.label), "its texts are terminated");
    require(part.fs_type == fs_type, "four characters of blkid's decide");
    const std::string uuid = word_of(plain_output, "UUID=");
    require(part.uid == (uuid.empty() ? word_of(plain_output, "PARTUUID=") : uuid), "its UUID too");
    require(part.label == (is_root ? "" : expected_label(fs_type)), "its label is the volume's");
    require(std::string(part.dev_name) == DEV_NAME, "its name stays");
}

void check_presence()
{
    const std::string seen = c_text(plain_output.substr(0, DEV_CHECK_MAX));
    const bool there = seen.rfind(DEV_PATH, 0) == 0;
    require(dev_check_blkid(DEV_NAME) == (there ? 0 : 1), "a device is there when blkid names it");
}

}  // namespace

// A device without any signature: blkid decides.
void fuzz_begin()
{
    put_file(DEV_PATH, std::string(4096, '\0'));
}

std::string fuzz_answer(const std::string& command)
{
    const bool raw = command == "blkid -d /dev/sda1";
    require(raw || command == "blkid /dev/sda1", "blkid is asked for the device");
    return raw ? raw_output : plain_output;
}

void fuzz_one(const std::string& input)
{
    const std::vector<std::string> fields = fields_of(input, 2);
    plain_output = fields[0];
    raw_output = fields.size() > 2 ? fields[1] : fields[0] + fields[1];

    const size_t size = 1 + input.size() / 8 % 40;
    switch (input.size() % 8) {
        case 0:
            check_value("UUID=", size);
            break;
        case 1:
            check_value("PARTUUID=", size);
            break;
        case 2:
            check_value("LABEL=", size);
            break;
        case 3:
            check_label(size);
            break;
        case 4:
            check_type();
            break;
        case 5:
            check_presence();
            break;
        case 6:
            check_record(true);
            break;
        default:
            check_record(false);
    }
}
