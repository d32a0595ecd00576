#include "util/block_dev.h"

#include <sys/vfs.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>

#include "log/log.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr size_t MIN_NAME_LENGTH = 3;
constexpr size_t NUMBER_SIZE = 128;
constexpr int32_t LABEL_TEXT_SIZE = 128;
constexpr char LABEL_KEY[] = "LABEL=";
constexpr char BLKID_FORMAT[] = "blkid /dev/%s > %s";
constexpr char BLKID_RAW_FORMAT[] = "blkid -d /dev/%s > %s";

// Reads the first line of a sysfs file, without its line end, and closes it. False when the file
// is not open or has no line.
bool read_line_and_close(FILE* file, char (&text)[NUMBER_SIZE])
{
    if (file == nullptr) {
        return false;
    }
    char line[NUMBER_SIZE]{};
    const bool found = fgets(line, sizeof(line), file) != nullptr;
    fclose(file);
    text_copy_n(text, sizeof(text), line, strcspn(line, "\r\n"));
    return found;
}

uint64_t to_number(const char* text)
{
    return static_cast<uint64_t>(atoll(text));
}

void query_blkid(const char* command, const char* dev_name, const char* key, char* out, size_t size)
{
    memset(out, 0, size);
    if (exec_cmd_into(command, SCRATCH_BLKID_VALUE) < 0) {
        return;
    }
    char* text = file_read_all(SCRATCH_BLKID_VALUE);
    // The key matches anywhere, so a longer key that ends the same and stands first wins.
    const char* value = text != nullptr ? text_quoted_value(text, key) : nullptr;
    if (value != nullptr) {
        const size_t length = strcspn(value, "\" ");
        memcpy(out, value, length < size ? length : size);
        log_info("get %s, %s = %.*s\n", dev_name, key, static_cast<int>(size), out);
    }
    free(text);
    file_delete(SCRATCH_BLKID_VALUE);
}

}  // namespace

int dev_name_is_disk(const char* name)
{
    if (name == nullptr || strlen(name) < MIN_NAME_LENGTH || !name_is_shell_safe(name)) {
        return 1;
    }
    for (const char* prefix : {"sd", "hd", "mmcblk"}) {
        if (text_has_prefix(name, prefix)) {
            return 0;
        }
    }
    return 1;
}

int sys_block_has_dev(const char* name)
{
    return dir_has_entry(SYS_BLOCK, name);
}

int sys_block_find_parent(const char* part_name, char* out, size_t size)
{
    dir_stream dir(SYS_BLOCK);
    if (dir.stream == nullptr) {
        log_err("open dir err, dir = %s\n", SYS_BLOCK);
        return 1;
    }
    while (const char* disk_name = dir.next_name()) {
        if (dev_name_is_disk(disk_name) != 0) {
            continue;
        }
        char path[PATH_SIZE];
        path_sys_disk(path, sizeof(path), disk_name);
        if (dir_has_entry(path, part_name) == 0) {
            log_info("find dev = %s, in root path = %s\n", part_name, path);
            text_copy(out, size, disk_name);
            return 0;
        }
    }
    return 1;
}

void dev_get_sectors(const char* disk_name, const char* dev_name, uint64_t* sectors)
{
    char path[PATH_SIZE];
    path_sys_size(path, sizeof(path), dev_name);
    FILE* file = fopen(path, "re");
    if (file == nullptr) {
        path_sys_part_size(path, sizeof(path), disk_name, dev_name);
        file = fopen(path, "re");
    }
    char text[NUMBER_SIZE];
    if (!read_line_and_close(file, text)) {
        log_info("get size err, file = %s\n", path);
        return;
    }
    *sectors = to_number(text);
    log_info("dev = %s, get sector number = %s(%llu)\n", dev_name, text,
             static_cast<unsigned long long>(*sectors));
}

void dev_get_sector_size(const char* disk_name, uint64_t* bytes)
{
    char path[PATH_SIZE];
    path_sys_sector_size(path, sizeof(path), disk_name);
    FILE* file = fopen(path, "re");
    char text[NUMBER_SIZE];
    if (!read_line_and_close(file, text)) {
        log_info("get sector_size err, file = %s\n", path);
        return;
    }
    *bytes = to_number(text);
    log_info("dev = %s, get sector size = %s(%llu)\n", disk_name, text,
             static_cast<unsigned long long>(*bytes));
}

int path_get_space(const char* path, uint64_t* total, uint64_t* free_bytes)
{
    if (!path_exists(path)) {
        log_err("file not exist, file = %s\n", path);
        return 1;
    }
    struct statfs info {};
    if (statfs(path, &info) != 0) {
        log_errno("err file = %s\n", path);
        return 1;
    }
    const auto block_size = static_cast<uint64_t>(info.f_bsize);
    if (total != nullptr) {
        *total = static_cast<uint64_t>(info.f_blocks) * block_size;
    }
    if (free_bytes != nullptr) {
        *free_bytes = static_cast<uint64_t>(info.f_bfree) * block_size;
    }
    return 0;
}

void blkid_get_value(const char* dev_name, const char* key, char* out, size_t size)
{
    if (dev_name == nullptr || key == nullptr || out == nullptr) {
        log_err("err!\n");
        return;
    }
    char command[COMMAND_SIZE];
    text_format(command, sizeof(command), BLKID_FORMAT, dev_name, SCRATCH_BLKID_VALUE);
    query_blkid(command, dev_name, key, out, size);
}

void blkid_get_label(const char* dev_name, char* out, size_t size)
{
    if (dev_name == nullptr || out == nullptr) {
        log_err("err!\n");
        return;
    }
    // -d keeps blkid from encoding characters that do not print.
    char command[COMMAND_SIZE];
    text_format(command, sizeof(command), BLKID_RAW_FORMAT, dev_name, SCRATCH_BLKID_VALUE);
    query_blkid(command, dev_name, LABEL_KEY, out, size);
}

int script_get_label(const char* dev_name, char* out, size_t size)
{
    if (dev_name == nullptr || out == nullptr) {
        log_err("err!\n");
        return 1;
    }
    memset(out, 0, size);
    if (!path_exists(LABEL_SCRIPT)) {
        return 1;
    }
    file_delete(SCRATCH_LABEL);
    char command[COMMAND_SIZE];
    text_format(command, sizeof(command), "%s %s > %s", LABEL_SCRIPT, dev_name, SCRATCH_LABEL);
    if (exec_cmd_into(command, SCRATCH_LABEL) != 0) {
        return 1;
    }
    char text[LABEL_TEXT_SIZE + 1]{};
    if (file_read_buf(SCRATCH_LABEL, text, LABEL_TEXT_SIZE) != 0) {
        return 1;
    }
    const size_t length = strcspn(text, "\t\n\r");
    memcpy(out, text, length < size ? length : size);
    return 0;
}
