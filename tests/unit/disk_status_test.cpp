#include "disk/disk_status.h"

#include <cjson/cJSON.h>
#include <gtest/gtest.h>
#include <sys/mount.h>

#include <filesystem>
#include <memory>
#include <set>
#include <string>

#include "disk/disk_sets.h"
#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;
using support::put_part;
using support::put_root;
using support::read_file;

namespace {

using json_document = std::unique_ptr<cJSON, decltype(&cJSON_Delete)>;

json_document read_json(const std::string& path)
{
    return {cJSON_Parse(read_file(path).c_str()), cJSON_Delete};
}

json_document published()
{
    return read_json("/tmp/tarn_nas/disk.json");
}

const cJSON* field(const cJSON* object, const char* key)
{
    return cJSON_GetObjectItemCaseSensitive(object, key);
}

// The keys of an object in their order.
std::string keys(const cJSON* object)
{
    std::string text;
    for (const cJSON* item = object->child; item != nullptr; item = item->next) {
        text += (text.empty() ? "" : " ") + std::string(item->string);
    }
    return text;
}

double number(const cJSON* object, const char* key)
{
    const cJSON* item = cJSON_GetObjectItemCaseSensitive(object, key);
    return cJSON_IsNumber(item) != 0 ? item->valuedouble : -1;
}

std::string string(const cJSON* object, const char* key)
{
    const cJSON* item = cJSON_GetObjectItemCaseSensitive(object, key);
    return cJSON_IsString(item) != 0 ? item->valuestring : "(no text)";
}

const cJSON* array(const cJSON* object, const char* key)
{
    const cJSON* item = cJSON_GetObjectItemCaseSensitive(object, key);
    EXPECT_TRUE(cJSON_IsArray(item) != 0) << key;
    return item;
}

class DiskStatus : public support::disk_world {
protected:
    // A partition as it is once mounted.
    part_info* put_mounted(int place, int slot, const char* dev_name, const char* disk_name)
    {
        part_info* part = put_part(&sets.entries[place].disk, slot, dev_name, 4000);
        text_copy(part->disk_name, disk_name);
        text_copy(part->label, "Music");
        text_copy(part->uid, "U-1");
        part->fs_type = FS_NTFS;
        part->free_size = 1500;
        return part;
    }

    disk_sets sets{};
};

}  // namespace

TEST_F(DiskStatus, a_published_partition_carries_what_schema_and_documentation_say)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "disk1_part1");
    disk_sets_publish(&sets);
    const json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    const cJSON* part = cJSON_GetArrayItem(array(disk, "part"), 0);

    const json_document schema = read_json(std::string(CHECKOUT) + "/docs/disk.schema.json");
    const cJSON* definition = field(field(schema.get(), "definitions"), "part");
    std::string required;
    const cJSON* key = nullptr;
    cJSON_ArrayForEach(key, array(definition, "required"))
    {
        required += std::string(required.empty() ? "" : " ") + key->valuestring;
    }
    EXPECT_EQ(keys(part), required) << "the schema's list, in its order";
    EXPECT_EQ(keys(field(definition, "properties")), required) << "the schema's descriptions";
}

TEST_F(DiskStatus, each_partition_of_the_documented_example_has_the_keys_of_a_published_one)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "disk1_part1");
    disk_sets_publish(&sets);
    const json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    const std::string wanted = keys(cJSON_GetArrayItem(array(disk, "part"), 0));

    const std::string documentation = read_file(std::string(CHECKOUT) + "/docs/interfaces.md");
    const size_t begin = documentation.find("\n    {\n", documentation.find("\n## Status files\n"));
    ASSERT_NE(begin, std::string::npos);
    // The parser stops behind the example.
    const json_document example(cJSON_Parse(documentation.c_str() + begin), cJSON_Delete);
    ASSERT_NE(example, nullptr) << "the example is no JSON";
    int parts = 0;
    cJSON_ArrayForEach(disk, array(example.get(), "disk"))
    {
        const cJSON* part = nullptr;
        cJSON_ArrayForEach(part, array(disk, "part"))
        {
            EXPECT_EQ(keys(part), wanted)
                << string(part, "dev_name") << " in the example of docs/interfaces.md";
            ++parts;
        }
    }
    EXPECT_GT(parts, 0);
}

TEST_F(DiskStatus, a_published_partition_begins_with_its_seven_first_keys_in_order)
{
    put_root(&sets.entries[0], "sda", 5000);
    sets.entries[0].disk.sd_card = 1;
    put_mounted(0, 3, "sda1", "disk1_part4");
    const std::string log = capture_stdout([&] { disk_sets_publish(&sets); });
    EXPECT_TRUE(contains(log, "===> get part num = 1\n"));

    const json_document root = published();
    ASSERT_NE(root, nullptr);
    EXPECT_EQ(keys(root.get()), "disk_number disk");
    EXPECT_EQ(number(root.get(), "disk_number"), 1);
    ASSERT_EQ(cJSON_GetArraySize(array(root.get(), "disk")), 1);
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(keys(disk), "part_num sd_card part");
    EXPECT_EQ(number(disk, "part_num"), 1);
    EXPECT_EQ(number(disk, "sd_card"), 1);
    ASSERT_EQ(cJSON_GetArraySize(array(disk, "part")), 1);
    const cJSON* part = cJSON_GetArrayItem(array(disk, "part"), 0);
    // Those to come stand behind these.
    EXPECT_EQ(keys(part).find("dev_name disk_name fs_type uid label total_len free_size"), 0U);
    EXPECT_EQ(string(part, "dev_name"), "sda1");
    EXPECT_EQ(string(part, "disk_name"), "disk1_part4");
    EXPECT_EQ(string(part, "fs_type"), "NTFS");
    EXPECT_EQ(string(part, "uid"), "U-1");
    EXPECT_EQ(string(part, "label"), "Music");
    EXPECT_EQ(number(part, "total_len"), 4000);
    EXPECT_EQ(number(part, "free_size"), 1500);
}

TEST_F(DiskStatus, the_document_is_the_formatted_printers_text_without_a_newline_at_its_end)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "disk1_part1");
    disk_sets_publish(&sets);
    const std::string text = read_file(DISK_JSON_FILE);
    EXPECT_EQ(text.substr(0, 4), "{\n\t\"");
    EXPECT_EQ(text.back(), '}');
}

TEST_F(DiskStatus, large_sizes_print_as_whole_numbers)
{
    put_root(&sets.entries[0], "sda", 5000);
    part_info* part = put_mounted(0, 0, "sda1", "disk1_part1");
    part->total_len = 19074048;
    part->free_size = 19074047;
    disk_sets_publish(&sets);
    EXPECT_TRUE(contains(read_file(DISK_JSON_FILE), "\"total_len\":\t19074048"));
    EXPECT_TRUE(contains(read_file(DISK_JSON_FILE), "\"free_size\":\t19074047"));
}

TEST_F(DiskStatus, a_disk_whose_partitions_lack_their_names_is_listed_with_part_num_0)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "");
    put_mounted(0, 1, "sda2", "");
    EXPECT_EQ(disk_status_write_json(&sets), 0);
    const json_document root = published();
    EXPECT_EQ(number(root.get(), "disk_number"), 1);
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(number(disk, "part_num"), 0);
    EXPECT_EQ(cJSON_GetArraySize(array(disk, "part")), 0);
}

TEST_F(DiskStatus, publishing_clears_such_a_disk_before_it_writes)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "");
    disk_sets_publish(&sets);
    EXPECT_EQ(disk_sets_count(&sets), 0);
    EXPECT_EQ(number(published().get(), "disk_number"), 0);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "0");
}

TEST_F(DiskStatus, a_whole_disk_filesystem_is_the_first_and_only_part)
{
    put_root(&sets.entries[0], "sda", 5000);
    part_info* root_part = &sets.entries[0].disk.root;
    root_part->fs_type = FS_FAT;
    text_copy(root_part->disk_name, "disk1_part1");
    disk_sets_publish(&sets);
    json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(number(disk, "part_num"), 1);
    ASSERT_EQ(cJSON_GetArraySize(array(disk, "part")), 1);
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "dev_name"), "sda");
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "fs_type"), "FAT");

    put_mounted(0, 0, "sda1", "disk1_part2");
    disk_sets_publish(&sets);
    root = published();
    disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(number(disk, "part_num"), 2);
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "dev_name"), "sda");
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 1), "dev_name"), "sda1");
}

TEST_F(DiskStatus, an_unmounted_whole_disk_counts_as_a_part_and_is_not_listed)
{
    put_root(&sets.entries[0], "sda", 5000);
    sets.entries[0].disk.root.fs_type = FS_FAT;
    disk_sets_publish(&sets);
    const json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(number(disk, "part_num"), 1);
    EXPECT_EQ(cJSON_GetArraySize(array(disk, "part")), 0);
}

TEST_F(DiskStatus, an_empty_label_is_published_as_the_device_name_and_stays_in_the_record)
{
    put_root(&sets.entries[0], "sda", 5000);
    part_info* part = put_mounted(0, 0, "sda1", "disk1_part1");
    text_copy(part->label, "");
    disk_sets_publish(&sets);
    const json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "label"), "sda1");
    EXPECT_STREQ(part->label, "sda1");
}

TEST_F(DiskStatus, three_disks_in_entries_0_2_and_5_are_listed_in_that_order)
{
    for (const int place : {5, 0, 2}) {
        const std::string name = "sd" + std::string(1, static_cast<char>('a' + place));
        put_root(&sets.entries[place], name.c_str(), 5000);
        put_mounted(place, 0, (name + "1").c_str(), "disk1_part1");
    }
    disk_sets_publish(&sets);
    const json_document root = published();
    EXPECT_EQ(number(root.get(), "disk_number"), 3);
    std::string order;
    for (int i = 0; i < cJSON_GetArraySize(array(root.get(), "disk")); ++i) {
        const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), i);
        order += string(cJSON_GetArrayItem(array(disk, "part"), 0), "dev_name") + " ";
    }
    EXPECT_EQ(order, "sda1 sdc1 sdf1 ");
    EXPECT_EQ(read_file("/tmp/tarn_nas//disk_num.txt"), "3");
}

TEST_F(DiskStatus, more_free_space_than_size_is_neither_published_nor_counted)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "disk1_part1");
    put_mounted(0, 1, "sda2", "disk1_part2")->free_size = 4001;
    disk_sets_publish(&sets);
    const json_document root = published();
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(number(disk, "part_num"), 1);
    ASSERT_EQ(cJSON_GetArraySize(array(disk, "part")), 1);
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "dev_name"), "sda1");
}

TEST_F(DiskStatus, labels_with_quotes_and_utf_8_come_back_as_they_were)
{
    put_root(&sets.entries[0], "sda", 5000);
    part_info* part = put_mounted(0, 0, "sda1", "disk1_part1");
    const char* const label = "a\"b\\c\td \xc3\xa4\xe2\x82\xac";
    text_copy(part->label, label);
    disk_sets_publish(&sets);
    const json_document root = published();
    ASSERT_NE(root, nullptr);
    const cJSON* disk = cJSON_GetArrayItem(array(root.get(), "disk"), 0);
    EXPECT_EQ(string(cJSON_GetArrayItem(array(disk, "part"), 0), "label"), label);
}

TEST_F(DiskStatus, a_full_table_of_16_disks_with_8_partitions_is_published_whole)
{
    for (int place = 0; place < MAX_DISKS; ++place) {
        put_root(&sets.entries[place], "sda", 5000);
        for (int slot = 0; slot < MAX_SUB_PARTS; ++slot) {
            put_mounted(place, slot, "sda1", "disk1_part1");
        }
    }
    disk_sets_publish(&sets);
    const json_document root = published();
    EXPECT_EQ(number(root.get(), "disk_number"), 16);
    int parts = 0;
    for (int i = 0; i < cJSON_GetArraySize(array(root.get(), "disk")); ++i) {
        parts +=
            cJSON_GetArraySize(array(cJSON_GetArrayItem(array(root.get(), "disk"), i), "part"));
    }
    EXPECT_EQ(parts, 128);
}

TEST_F(DiskStatus, the_document_of_no_disk_at_all_is_exactly_30_bytes)
{
    support::write_file(DISK_NUM_FILE, "untouched");
    EXPECT_EQ(disk_status_write_empty_json(), 0);
    EXPECT_EQ(read_file("/tmp/tarn_nas/disk.json"), "{\"disk_number\": 0, \"disk\": []}");
    EXPECT_EQ(read_file("/tmp/tarn_nas/disk.json").size(), 30U);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "untouched");
}

TEST_F(DiskStatus, a_shorter_document_leaves_nothing_of_the_longer_one_before)
{
    support::write_file(DISK_JSON_FILE, std::string(100000, 'x'));
    support::write_file(DISK_NUM_FILE, "123456");
    disk_sets_publish(&sets);
    EXPECT_NE(published(), nullptr);
    EXPECT_LT(read_file(DISK_JSON_FILE).size(), 100U);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "0");
}

TEST_F(DiskStatus, in_a_full_tmp_both_files_stay_as_they_were_and_results_say_so)
{
    put_root(&sets.entries[0], "sda", 5000);
    put_mounted(0, 0, "sda1", "disk1_part1");
    ASSERT_EQ(mount("tmpfs", RUNTIME_DIR, "tmpfs", 0, "size=8k"), 0);
    disk_sets_publish(&sets);
    const std::string document = read_file(DISK_JSON_FILE);
    put_mounted(0, 1, "sda2", "disk1_part2");
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_status_write_json(&sets), 0);
        EXPECT_EQ(disk_status_write_count(&sets), 1);
        EXPECT_EQ(disk_status_write_empty_json(), 1);
    });
    EXPECT_EQ(support::count_of(log, "(No space left on device)publish err, fn = "), 3) << log;
    EXPECT_EQ(read_file(DISK_JSON_FILE), document);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "1");
    EXPECT_EQ(umount(RUNTIME_DIR), 0);
}

TEST_F(DiskStatus, nothing_stays_beside_the_two_files)
{
    support::write_file(STATUS_NEW_FILE, "left by a run that was killed");
    disk_sets_publish(&sets);
    EXPECT_EQ(disk_status_write_empty_json(), 0);
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(RUNTIME_DIR)) {
        names.insert(entry.path().filename());
    }
    EXPECT_EQ(names, (std::set<std::string>{"disk.json", "disk_num.txt"}));
}

TEST_F(DiskStatus, a_missing_runtime_directory_is_only_reported)
{
    support::remove_all("/tmp/tarn_nas");
    const std::string log = capture_stdout([&] { disk_sets_publish(&sets); });
    EXPECT_TRUE(contains(log, "file not exist, fn = /tmp/tarn_nas//disk.json\n"));
}
