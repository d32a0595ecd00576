#include "util/fs_code.h"

#include <cstddef>
#include <string_view>

namespace {

constexpr size_t BLKID_TYPE_MAX = 4;

constexpr int count_words(std::string_view command)
{
    int count = 0;
    for (size_t at = command.find("%s"); at != command.npos; at = command.find("%s", at + 1)) {
        ++count;
    }
    return count;
}

constexpr bool takes_words(const char* command, int count)
{
    return command == NO_TEXT || count_words(command) == count;
}

constexpr bool rows_hold(bool (*promise)(const filesystem&))
{
    for (const filesystem& row : FILESYSTEMS) {
        if (!promise(row)) {
            return false;
        }
    }
    return true;
}

static_assert(rows_hold([](const filesystem& row) { return &row == FILESYSTEMS + row.code; }),
              "each row stands at its code");
static_assert(rows_hold([](const filesystem& row) { return row.name != NO_TEXT; }),
              "each row has a name");
static_assert(rows_hold([](const filesystem& row) {
                  return row.blkid_type == NO_TEXT ||
                         std::string_view(row.blkid_type).size() <= BLKID_TYPE_MAX;
              }),
              "at most four characters of blkid's type are compared");
static_assert(rows_hold([](const filesystem& row) { return takes_words(row.mount, 2); }),
              "a mount command takes a device node and a directory");
static_assert(rows_hold([](const filesystem& row) { return takes_words(row.repair, 1); }),
              "a repair command takes a device node");

}  // namespace

const filesystem& filesystem_of(fs_code code)
{
    const bool known = code >= 0 && code < FS_CODE_COUNT;
    return FILESYSTEMS[known ? code : FS_NONE];
}
