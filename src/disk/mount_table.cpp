#include "disk/mount_table.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "log/log.h"
#include "util/paths.h"
#include "util/scratch.h"
#include "util/text.h"

namespace {

constexpr size_t LINE_SIZE = 512;
constexpr char BLANKS[] = " \n";
constexpr char DIGITS[] = "0123456789";
constexpr scratch_query MOUNT_QUERY{SCRATCH_MOUNT, SCRATCH_DELETED_WHEN_READ};

// "%s/disk" of the mount base; of a path only as many characters are skipped, not compared.
constexpr size_t PATH_PREFIX_LENGTH = sizeof(MOUNT_BASE) - 1 + sizeof("/disk") - 1;

const char* first_digit(const char* text)
{
    return strpbrk(text, DIGITS);
}

const char* skip_prefix(const char* path)
{
    const size_t length = strlen(path);
    return path + (length < PATH_PREFIX_LENGTH ? length : PATH_PREFIX_LENGTH);
}

}  // namespace

int read_mount_table(mount_table* table)
{
    if (table == nullptr) {
        return 1;
    }
    memset(table, 0, sizeof(*table));
    const scratch_lines listing(MOUNT_QUERY, "mount > %s", {SCRATCH_MOUNT});
    if (listing.stream == nullptr) {
        log_err("err, fn = %s\n", SCRATCH_MOUNT);
        return 1;
    }
    char line[LINE_SIZE];
    while (fgets(line, sizeof(line), listing.stream) != nullptr) {
        parse_mount_line(table, line);
    }
    return 0;
}

int parse_mount_line(mount_table* table, const char* line)
{
    if (table == nullptr || line == nullptr) {
        return 1;
    }
    const char* path = strstr(line, MOUNT_BASE);
    if (path == nullptr) {
        return 1;
    }
    if (!text_has_prefix(line, SD_NODE_PREFIX) && !text_has_prefix(line, CARD_NODE_PREFIX)) {
        return 1;
    }
    if (table->num >= MOUNT_TABLE_SIZE) {
        return 1;
    }
    const int32_t index = table->num;
    mount_entry* entry = &table->entries[index];
    text_copy_n(entry->dev, line, strcspn(line, BLANKS));
    text_copy_n(entry->path, path, strcspn(path, BLANKS));
    parse_mount_point_num(entry->path, &entry->main, &entry->sub);
    log_info("get dev mount[%d] %s ==> %s\n", index, entry->dev, entry->path);
    log_info("mount pont[%d] main = %d, sub = %d\n", index, entry->main, entry->sub);
    ++table->num;
    return 0;
}

void parse_mount_point_num(const char* path, int32_t* main_number, int32_t* sub_number)
{
    if (path == nullptr) {
        log_err("err!\n");
        return;
    }
    const char* rest = skip_prefix(path);
    const char* main_text = first_digit(rest);
    const char* underscore = main_text != nullptr ? strchr(main_text, '_') : nullptr;
    const char* sub_text = underscore != nullptr ? first_digit(underscore) : nullptr;
    if (sub_text == nullptr) {
        log_err("err str = %s\n", rest);
        return;
    }
    const auto main_value = static_cast<int32_t>(strtol(main_text, nullptr, 10));
    const auto sub_value = static_cast<int32_t>(strtol(sub_text, nullptr, 10));
    if (main_number != nullptr) {
        *main_number = main_value;
    }
    if (sub_number != nullptr) {
        *sub_number = sub_value;
    }
    log_info("get port = %d %d\n", main_value, sub_value);
}

int find_mount_by_dev(const mount_table* table, const char* dev_path)
{
    for (int i = 0; table != nullptr && i < table->num; ++i) {
        if (str_equal_nullsafe(table->entries[i].dev, dev_path) == MATCHES) {
            return i;
        }
    }
    return -1;
}

int find_mount_by_path(const mount_table* table, const char* path)
{
    for (int i = 0; table != nullptr && i < table->num; ++i) {
        if (str_equal_nullsafe(table->entries[i].path, path) == MATCHES) {
            return i;
        }
    }
    return -1;
}

int is_dev_mounted(const char* dev_path)
{
    return get_dev_mount_path(dev_path, nullptr);
}

int is_path_mounted(const char* path)
{
    if (path == nullptr) {
        log_err("err!\n");
        return YES;
    }
    mount_table table;
    if (read_mount_table(&table) != 0) {
        return NO;
    }
    return find_mount_by_path(&table, path) >= 0 ? YES : NO;
}

int get_dev_mount_path(const char* dev_path, char* out)
{
    if (dev_path == nullptr) {
        log_err("err!\n");
        return YES;
    }
    mount_table table;
    if (read_mount_table(&table) != 0) {
        return NO;
    }
    int mounted = NO;
    for (int i = 0; i < table.num; ++i) {
        const mount_entry* entry = &table.entries[i];
        if (str_equal(entry->dev, dev_path) != MATCHES) {
            continue;
        }
        mounted = YES;
        if (out != nullptr) {
            text_copy({out, MOUNT_PATH_SIZE}, entry->path);
        }
    }
    return mounted;
}
