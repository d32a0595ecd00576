#include "util/block_dev.h"

#include <sys/stat.h>
#include <sys/vfs.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>

#include "log/log.h"
#include "util/blkid.h"
#include "util/file.h"
#include "util/guard.h"
#include "util/paths.h"
#include "util/scratch.h"
#include "util/text.h"

namespace {

constexpr size_t MIN_NAME_LENGTH = 3;
constexpr size_t NUMBER_SIZE = 128;
constexpr size_t LABEL_TEXT_SIZE = 128 + 1;
constexpr char LABEL_KEY[] = "LABEL=";

constexpr scratch_query VALUE_QUERY{SCRATCH_BLKID_VALUE, SCRATCH_DELETED};
constexpr scratch_query LABEL_QUERY{
    .path = SCRATCH_LABEL, .end = SCRATCH_KEPT, .starts_clear = true, .wants_end = true};

// The number in the first line of a sysfs file; its text, without the line end, is logged.
struct sysfs_number {
    char text[NUMBER_SIZE];
    uint64_t value;
};

// False when the file is not open or has no line.
bool read_number(FILE* file, sysfs_number* number)
{
    if (file == nullptr || fgets(number->text, sizeof(number->text), file) == nullptr) {
        return false;
    }
    number->text[strcspn(number->text, "\r\n")] = '\0';
    number->value = static_cast<uint64_t>(atoll(number->text));
    return true;
}

// A value as long as out leaves no zero in it; out is zero-filled already.
void copy_value(char* out, size_t size, const char* text, size_t length)
{
    memcpy(out, text, length < size ? length : size);
}

void query_blkid(const char* format, const char* dev_name, const char* key, char* out, size_t size)
{
    memset(out, 0, size);
    const scratch_text answer(VALUE_QUERY, format, {dev_name, SCRATCH_BLKID_VALUE});
    if (answer.text == nullptr) {
        return;
    }
    const blkid_value value = blkid_find(answer.text, key, BLKID_WORD_ENDS);
    if (value.text == nullptr) {
        return;
    }
    copy_value(out, size, value.text, value.length);
    log_info("get %s, %s = %.*s\n", dev_name, key, static_cast<int>(size), out);
}

// True, which is logged, when the disk's directory holds the partition.
bool is_parent(const char* root_dev, const char* part_name)
{
    if (dev_name_is_disk(root_dev) != MATCHES) {
        return false;
    }
    char path[PATH_SIZE];
    path_sys_disk(path, root_dev);
    if (dir_has_entry(path, part_name) != MATCHES) {
        return false;
    }
    log_info("find dev = %s, in root path = %s\n", part_name, path);
    return true;
}

}  // namespace

int dev_name_is_disk(const char* name)
{
    if (name == nullptr || strlen(name) < MIN_NAME_LENGTH || !name_is_plain(name)) {
        return NO_MATCH;
    }
    // Other names are those of devices that are not disks of a user's, and some that are: "Names
    // beginning with sd, hd and mmcblk only" in docs/limits.md.
    for (const char* prefix : {"sd", "hd", "mmcblk"}) {
        if (text_has_prefix(name, prefix)) {
            return MATCHES;
        }
    }
    return NO_MATCH;
}

int sys_block_has_dev(const char* name)
{
    return dir_has_entry(SYS_BLOCK, name);
}

int sys_block_find_parent(const char* part_name, char* out, size_t size)
{
    for (int walk = 0; walk < DIR_WALKS; ++walk) {
        dir_stream dir(SYS_BLOCK);
        if (dir.stream == nullptr) {
            log_err("open dir err, dir = %s\n", SYS_BLOCK);
            return NO_MATCH;
        }
        while (const char* root_dev = dir.next_name()) {
            if (is_parent(root_dev, part_name)) {
                text_copy({out, size}, root_dev);
                return MATCHES;
            }
        }
        if (!dir.failed) {
            break;
        }
    }
    return NO_MATCH;
}

uint64_t dev_node_id(const char* dev_name)
{
    char path[PATH_SIZE];
    path_dev_node(path, dev_name);
    struct stat node {};
    return stat(path, &node) == 0 ? node.st_ino : 0;
}

void dev_get_sectors(const char* disk_name, const char* dev_name, uint64_t* sectors)
{
    char path[PATH_SIZE];
    path_sys_size(path, dev_name);
    stream_guard file(fopen(path, "re"));
    if (file == nullptr) {
        path_sys_part_size(path, disk_name, dev_name);
        file.reset(fopen(path, "re"));
    }
    sysfs_number number;
    if (!read_number(file, &number)) {
        log_info("get size err, file = %s\n", path);
        return;
    }
    *sectors = number.value;
    log_info("dev = %s, get sector number = %s(%llu)\n", dev_name, number.text,
             static_cast<unsigned long long>(number.value));
}

void dev_get_sector_size(const char* disk_name, uint64_t* bytes)
{
    char path[PATH_SIZE];
    path_sys_sector_size(path, disk_name);
    const stream_guard file(fopen(path, "re"));
    sysfs_number number;
    if (!read_number(file, &number)) {
        log_info("get sector_size err, file = %s\n", path);
        return;
    }
    *bytes = number.value;
    log_info("dev = %s, get sector size = %s(%llu)\n", disk_name, number.text,
             static_cast<unsigned long long>(number.value));
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
    query_blkid("blkid /dev/%s > %s", dev_name, key, out, size);
}

void blkid_get_label(const char* dev_name, char* out, size_t size)
{
    if (dev_name == nullptr || out == nullptr) {
        log_err("err!\n");
        return;
    }
    // -d keeps blkid from encoding characters that do not print.
    query_blkid("blkid -d /dev/%s > %s", dev_name, LABEL_KEY, out, size);
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
    char text[LABEL_TEXT_SIZE];
    if (!scratch_read(LABEL_QUERY, text, "%s %s > %s", {LABEL_SCRIPT, dev_name, SCRATCH_LABEL})) {
        return 1;
    }
    copy_value(out, size, text, strcspn(text, "\t\n\r"));
    return 0;
}
