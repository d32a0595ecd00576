#include "disk/disk_status.h"

#include <cjson/cJSON.h>

#include "fs/fs_type.h"
#include "log/log.h"
#include "util/guard.h"
#include "util/paths.h"
#include "util/publish.h"
#include "util/text.h"

namespace {

constexpr size_t COUNT_SIZE = 32;
using json_guard = guard<cJSON*, nullptr, cJSON_Delete>;

constexpr char NO_DISK_JSON[] = "{\"disk_number\": 0, \"disk\": []}";

// Gives the item to the object. What cannot be added is let go: the document gets smaller.
bool add_item(cJSON* object, const char* key, cJSON* item)
{
    if (item != nullptr && cJSON_AddItemToObject(object, key, item) != 0) {
        return true;
    }
    log_err("err!\n");
    cJSON_Delete(item);
    return false;
}

void add_string(cJSON* object, const char* key, const char* value)
{
    add_item(object, key, cJSON_CreateString(value));
}

void add_number(cJSON* object, const char* key, double value)
{
    add_item(object, key, cJSON_CreateNumber(value));
}

void add_part(cJSON* array, part_info* part)
{
    if (!part_info_is_valid(part)) {
        return;
    }
    cJSON* object = cJSON_CreateObject();
    if (object == nullptr) {
        log_err("err!\n");
        return;
    }
    if (part->label[0] == '\0') {
        text_copy(part->label, part->dev_name);
    }
    cJSON_AddItemToArray(array, object);
    add_string(object, "dev_name", part->dev_name);
    add_string(object, "disk_name", part->disk_name);
    add_string(object, "fs_type", fs_type_name(part->fs_type));
    add_string(object, "uid", part->uid);
    add_string(object, "label", part->label);
    add_number(object, "total_len", static_cast<double>(part->total_len));
    add_number(object, "free_size", static_cast<double>(part->free_size));
}

void fill_disk(cJSON* object, disk_obj* disk)
{
    cJSON* parts = cJSON_CreateArray();
    if (parts == nullptr) {
        log_err("err!\n");
        return;
    }
    const int part_num = disk_obj_count_parts(disk);
    log_info("===> get part num = %d\n", part_num);
    add_number(object, "part_num", part_num);
    add_number(object, "sd_card", disk->sd_card);
    if (!add_item(object, "part", parts)) {
        return;
    }
    if (disk->root.fs_type != FS_NONE) {
        add_part(parts, &disk->root);
    }
    for (part_slot& slot : disk->parts) {
        if (slot.in_use == 1) {
            add_part(parts, &slot.part);
        }
    }
}

void add_disk(cJSON* array, disk_obj* disk)
{
    cJSON* object = cJSON_CreateObject();
    if (object == nullptr) {
        log_err("err!\n");
        return;
    }
    cJSON_AddItemToArray(array, object);
    fill_disk(object, disk);
}

bool publish(const char* path, const char* text)
{
    return file_publish(path, STATUS_NEW_FILE, text);
}

}  // namespace

void disk_sets_publish(disk_sets* sets)
{
    // A disk that waits for its first mount pass would count as empty and go too: nobody publishes
    // before that.
    disk_sets_clear_empty(sets);
    disk_status_write_json(sets);
    disk_status_write_count(sets);
}

int disk_status_write_json(disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    const json_guard root(cJSON_CreateObject());
    if (root == nullptr) {
        log_err("err!\n");
        return 1;
    }
    cJSON* disks = cJSON_CreateArray();
    if (disks == nullptr) {
        log_err("err!\n");
        return 1;
    }
    add_number(root, "disk_number", disk_sets_count(sets));
    // Without its list a document says nothing: the old file stays.
    if (!add_item(root, "disk", disks)) {
        return 1;
    }
    for (disk_entry& entry : sets->entries) {
        if (entry.in_use == 1) {
            add_disk(disks, &entry.disk);
        }
    }
    const text_guard text(cJSON_Print(root));
    if (text == nullptr) {
        return 0;
    }
    // A failure is logged, the old document stays, and the next publication comes in any case.
    static_cast<void>(publish(DISK_JSON_FILE, text));
    return 0;
}

int disk_status_write_count(const disk_sets* sets)
{
    if (sets == nullptr) {
        return 1;
    }
    char text[COUNT_SIZE];
    text_format(text, "%d", disk_sets_count(sets));
    return publish(DISK_NUM_FILE, text) ? 0 : 1;
}

int disk_status_write_empty_json()
{
    return publish(DISK_JSON_FILE, NO_DISK_JSON) ? 0 : 1;
}
