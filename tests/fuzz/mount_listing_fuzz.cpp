// The output of "mount" through the snapshot, the number parser and every check that takes one.
// Which lines count and what they say is worked out here a second time.
//
// The input is the listing; its size chooses which of the checks read it as well.

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "disk/mount_point.h"
#include "disk/mount_table.h"
#include "disk/removal.h"
#include "fuzz.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t LINE_MAX = 511;  // what the reader takes at a time
constexpr char DEV_PATH[] = "/dev/sda1";

std::string listing;
int unmounts_refused;  // so many commands are without effect, then nothing is mounted any more

struct expected_entry {
    std::string dev;
    std::string path;
    int32_t main = 0;
    int32_t sub = 0;
};

// The decimal number at the begin of text, or nothing when it does not fit.
std::optional<int32_t> number_at(const std::string& text)
{
    const size_t length = std::min(text.find_first_not_of("0123456789"), text.size());
    const size_t zeros = std::min(text.find_first_not_of('0'), length);
    if (length - zeros > 9) {
        return std::nullopt;
    }
    return static_cast<int32_t>(strtol(text.substr(0, length).c_str(), nullptr, 10));
}

struct expected_numbers {
    bool found = false;
    std::optional<int32_t> main;
    std::optional<int32_t> sub;
};

expected_numbers numbers_of(const std::string& path)
{
    const std::string digits = "0123456789";
    const size_t prefix = strlen("/tmp/mountd/disk");
    const size_t main_at = path.find_first_of(digits, std::min(prefix, path.size()));
    if (main_at == std::string::npos) {
        return {};
    }
    const size_t underscore = path.find('_', main_at);
    const size_t sub_at = path.find_first_of(digits, underscore);
    if (underscore == std::string::npos || sub_at == std::string::npos) {
        return {};
    }
    return {true, number_at(path.substr(main_at)), number_at(path.substr(sub_at))};
}

bool is_ours(const std::string& line)
{
    const bool device = line.rfind("/dev/sd", 0) == 0 || line.rfind("/dev/mmcblk0", 0) == 0;
    return device && line.find(MOUNT_BASE) != std::string::npos;
}

std::string up_to_blank(const std::string& text, size_t limit)
{
    return text.substr(0, text.find_first_of(" \n")).substr(0, limit);
}

std::vector<expected_entry> expected_table()
{
    std::vector<expected_entry> entries;
    for (size_t at = 0; at < listing.size() && entries.size() < MOUNT_TABLE_SIZE;) {
        const size_t newline = listing.find('\n', at);
        const size_t length = newline == std::string::npos ? listing.size() - at : newline - at + 1;
        const std::string line = c_text(listing.substr(at, std::min(length, LINE_MAX)));
        at += std::min(length, LINE_MAX);
        if (is_ours(line)) {
            entries.push_back(
                {up_to_blank(line, MOUNT_DEV_SIZE - 1),
                 up_to_blank(line.substr(line.find(MOUNT_BASE)), MOUNT_PATH_SIZE - 1)});
        }
    }
    return entries;
}

void require_numbers(const std::string& path, int32_t main, int32_t sub, int32_t untouched)
{
    const expected_numbers expected = numbers_of(path);
    if (!expected.found) {
        require(main == untouched && sub == untouched, "a path without numbers gives none");
        return;
    }
    require(!expected.main || *expected.main == main, "the disk number is the path's");
    require(!expected.sub || *expected.sub == sub, "the part number is the path's");
}

void check_numbers(const std::string& path)
{
    const int32_t untouched = -77;
    int32_t main = untouched;
    int32_t sub = untouched;
    parse_mount_point_num(path.c_str(), &main, &sub);
    require_numbers(path, main, sub, untouched);
    parse_mount_point_num(path.c_str(), nullptr, nullptr);
}

void check_table(const mount_table& table, const std::vector<expected_entry>& expected)
{
    require(table.num == static_cast<int32_t>(expected.size()), "every line of ours is taken");
    for (size_t i = 0; i < expected.size(); ++i) {
        const mount_entry& entry = table.entries[i];
        require(is_clean_text(entry.dev) && is_clean_text(entry.path), "entries are terminated");
        require(entry.dev == expected[i].dev, "the device is the line's first word");
        require(entry.path == expected[i].path, "the path is the word that begins with the base");
        require_numbers(entry.path, entry.main, entry.sub, 0);
    }
}

void check_questions(const std::vector<expected_entry>& expected)
{
    const auto is_ours = [](const expected_entry& entry) { return entry.dev == DEV_PATH; };
    const auto last = std::find_if(expected.rbegin(), expected.rend(), is_ours);
    const bool mounted = last != expected.rend();
    char path[MOUNT_PATH_SIZE]{};
    require(get_dev_mount_path(DEV_PATH, path) == (mounted ? 1 : 0), "a listed device is mounted");
    require(path == (mounted ? last->path : ""), "its last path is given");

    bool twice = false;
    for (size_t i = 0; i < expected.size(); ++i) {
        for (size_t j = 0; j < i; ++j) {
            twice = twice || expected[i].path == expected[j].path;
        }
    }
    if (!expected.empty()) {
        require(is_path_mounted(expected.back().path.c_str()) == 1, "a listed path is mounted");
    }
    require(check_mount_path_dup() == (twice ? 1 : 0), "two devices on one path are noticed");
    check_mount_dev_exist();
}

void check_numbering()
{
    disk_sets sets{};
    sets.entries[0].in_use = sets.entries[3].in_use = 1;
    sets.entries[3].disk.parts[0].in_use = 1;
    const int32_t number = get_mount_point_num(&sets);
    require(number >= 1 && number <= 2 * MOUNT_TABLE_SIZE, "a number is found near the first");
    set_all_mount_point_num(&sets);
    const int32_t first = sets.entries[0].disk.root.mount_point_num;
    const int32_t second = sets.entries[3].disk.root.mount_point_num;
    require(first >= 1 && second > first, "disks get numbers of their own");
    for (const expected_entry& entry : expected_table()) {
        const expected_numbers used = numbers_of(entry.path);
        const bool taken = used.found && (used.main == number || used.main == first);
        require(!taken, "no number is given under which something is mounted");
    }
}

void check_part(const char* dev_name)
{
    part_info part{};
    text_copy(part.dev_name, dev_name);
    check_part_mounted(&part);
    require(is_clean_text(part.mount_path) && is_clean_text(part.disk_name),
            "the part's texts stay terminated");
    unmounts_refused = 2;
    umount_part(&part);
}

void check_forced_unmount()
{
    unmounts_refused = 2 * MOUNT_TABLE_SIZE;
    umount_all_force();
}

}  // namespace

void fuzz_begin() {}

std::string fuzz_answer(const std::string& command)
{
    if (command == "mount") {
        return listing;
    }
    require(text_has_prefix(command.c_str(), "umount "), "nothing but an unmount is run");
    require((command + "/").find("/../") == std::string::npos, "no path climbs");
    if (unmounts_refused-- == 0) {
        listing = "\n";
    }
    return "";
}

void fuzz_one(const std::string& input)
{
    listing = input;
    const std::vector<expected_entry> expected = expected_table();
    mount_table table;
    memset(&table, 0x7e, sizeof(table));
    require(read_mount_table(&table) == 0, "a listing is read");
    check_table(table, expected);
    check_numbers(c_text(input));
    switch (input.size() % 4) {
        case 0:
            check_questions(expected);
            break;
        case 1:
            check_numbering();
            break;
        case 2:
            check_forced_unmount();
            break;
        default:
            check_part("sda1");
    }
    char name[PART_DISK_NAME_SIZE];
    if (mount_path_to_name(c_text(input).c_str(), name, sizeof(name)) == 0) {
        require(is_clean_text(name), "a name is terminated");
    }
}
