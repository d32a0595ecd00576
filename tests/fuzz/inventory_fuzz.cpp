// An inventory of arbitrary records through the writer of the status files. The document must be
// JSON to the letter and hold exactly what the records say, byte by byte. Fields of a partition
// behind those known here are taken as they are.
//
// Fields: bytes that say which records are there and choose their numbers and texts, then the
// texts.

#include <cjson/cJSON.h>
#include <sys/stat.h>

#include <cmath>
#include <cstdlib>
#include <memory>

#include "disk/disk_status.h"
#include "fs/fs_type.h"
#include "fuzz.h"
#include "strict_json.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

// More than any device has: bytes are counted in 64 bits.
constexpr uint64_t LENGTH_MAX_MIB = UINT64_C(1) << (64 - MIB_SHIFT);

struct chooser {
    const std::string& bytes;
    const std::vector<std::string>& fields;
    size_t at = 0;

    uint8_t byte() { return at < bytes.size() ? static_cast<uint8_t>(bytes[at++]) : 0; }
    const char* text() { return fields[1 + byte() % (fields.size() - 1)].c_str(); }
    uint64_t number()
    {
        const uint64_t value = byte();
        return (value << 8 | byte()) << byte() % 64;
    }

    void fill(part_info* part)
    {
        text_copy(part->uid, text());
        text_copy(part->dev_name, text());
        text_copy(part->disk_name, text());
        text_copy(part->label, text());
        part->total_len = number();
        part->free_size = number();
        part->fs_type = static_cast<fs_code>(byte() % (FS_CODE_COUNT + 4) - 2);
    }

    void fill(disk_obj* disk)
    {
        disk->root.is_root_part = 1;
        disk->root.ref_root = &disk->root;
        const uint8_t flags = byte();
        disk->sd_card = flags & 1;
        if ((flags & 2) != 0) {
            fill(&disk->root);
        }
        const uint8_t used = byte();
        for (int i = 0; i < MAX_SUB_PARTS; ++i) {
            if ((used >> i & 1) != 0) {
                disk->parts[i].in_use = 1;
                disk->parts[i].part.ref_root = &disk->root;
                fill(&disk->parts[i].part);
            }
        }
    }
};

// Among the expected tokens: here further fields of a partition may stand, which nothing is known
// of but that each is a text or a number.
constexpr char FURTHER_FIELDS = '+';

struct document {
    json_tokens tokens;

    void add_number(const char* key, uint64_t value)
    {
        tokens.add('s', key);
        tokens.add('n', std::to_string(value));
    }
    void add_text(const char* key, const char* value)
    {
        tokens.add('s', key);
        tokens.add('s', value);
    }
    void open_array(const char* key)
    {
        tokens.add('s', key);
        tokens.add('[');
    }

    void add_part(const part_info& part)
    {
        tokens.add('{');
        add_text("dev_name", part.dev_name);
        add_text("disk_name", part.disk_name);
        add_text("fs_type", fs_type_name(part.fs_type));
        add_text("uid", part.uid);
        add_text("label", part.label[0] != '\0' ? part.label : part.dev_name);
        add_number("total_len", part.total_len);
        add_number("free_size", part.free_size);
        tokens.add(FURTHER_FIELDS);
        tokens.add('}');
    }

    void add_disk(const disk_obj& disk);
    void add_all(const std::vector<const disk_obj*>& disks);
};

// Kept from input to input for the memory that they hold.
document expected;
json_tokens printed;
disk_sets sets;

bool is_published(const part_info& part)
{
    return part.dev_name[0] != '\0' && part.disk_name[0] != '\0' && part.total_len > 0 &&
           part.free_size <= part.total_len;
}

std::vector<const part_info*> published_parts(const disk_obj& disk)
{
    std::vector<const part_info*> parts;
    if (disk.root.fs_type != FS_NONE && is_published(disk.root)) {
        parts.push_back(&disk.root);
    }
    for (const part_slot& slot : disk.parts) {
        if (slot.in_use == 1 && is_published(slot.part)) {
            parts.push_back(&slot.part);
        }
    }
    return parts;
}

// The whole disk counts by its filesystem alone, published or not.
uint64_t part_num(const disk_obj& disk)
{
    const bool own_fs = disk.root.fs_type != FS_NONE;
    const bool root_published = own_fs && is_published(disk.root);
    return published_parts(disk).size() + (own_fs && !root_published ? 1 : 0);
}

void document::add_disk(const disk_obj& disk)
{
    tokens.add('{');
    add_number("part_num", part_num(disk));
    add_number("sd_card", static_cast<uint64_t>(disk.sd_card));
    open_array("part");
    for (const part_info* part : published_parts(disk)) {
        add_part(*part);
    }
    tokens.add(']');
    tokens.add('}');
}

void document::add_all(const std::vector<const disk_obj*>& disks)
{
    tokens.clear();
    tokens.add('{');
    add_number("disk_number", disks.size());
    open_array("disk");
    for (const disk_obj* disk : disks) {
        add_disk(*disk);
    }
    tokens.add(']');
    tokens.add('}');
}

std::vector<const disk_obj*> published_disks()
{
    std::vector<const disk_obj*> disks;
    for (const disk_entry& entry : sets.entries) {
        if (entry.in_use == 1 && part_num(entry.disk) > 0) {
            disks.push_back(&entry.disk);
        }
    }
    return disks;
}

std::vector<const part_info*> unlabelled_parts(const std::vector<const disk_obj*>& disks)
{
    std::vector<const part_info*> parts;
    for (const disk_obj* disk : disks) {
        for (const part_info* part : published_parts(*disk)) {
            if (part->label[0] == '\0') {
                parts.push_back(part);
            }
        }
    }
    return parts;
}

// Sizes that a device can have stand as whole numbers, larger ones as near as a double is.
void require_number(const std::string& number, const std::string& promised)
{
    const uint64_t value = strtoull(promised.c_str(), nullptr, 10);
    if (value <= LENGTH_MAX_MIB) {
        require(number == promised, "a size is published as it is");
        return;
    }
    const auto wanted = static_cast<double>(value);
    const double read = strtod(number.c_str(), nullptr);
    require(std::fabs(read - wanted) <= wanted * 1e-15, "a large number keeps its digits");
}

// The place of the first printed token that belongs to no further field.
size_t behind_fields(size_t at)
{
    while (printed.kinds[at] == 's') {
        require(printed.kinds[at + 1] == 's' || printed.kinds[at + 1] == 'n',
                "a further field of a partition is a text or a number");
        at += 2;
    }
    return at;
}

void require_token(size_t at, size_t promised)
{
    require(printed.kinds[at] == expected.tokens.kinds[promised],
            "every record is published in the right form");
    if (printed.text(at) == expected.tokens.text(promised)) {
        return;
    }
    require(printed.kinds[at] == 'n', "a text is published byte by byte");
    require_number(std::string(printed.text(at)), std::string(expected.tokens.text(promised)));
}

void require_as_promised()
{
    size_t at = 0;
    for (size_t i = 0; i < expected.tokens.kinds.size(); ++i) {
        if (expected.tokens.kinds[i] == FURTHER_FIELDS) {
            at = behind_fields(at);
        } else {
            require_token(at++, i);
        }
    }
    require(at == printed.kinds.size(), "nothing else is published");
}

void check_files(size_t disk_count)
{
    const std::string text = content_of(DISK_JSON_FILE).value_or("");
    require(strict_json(text, &printed), "the document is JSON");
    require_as_promised();
    const std::unique_ptr<cJSON, decltype(&cJSON_Delete)> parsed(
        cJSON_ParseWithLengthOpts(text.c_str(), text.size() + 1, nullptr, 1), cJSON_Delete);
    require(parsed != nullptr, "others' parsers take it");
    require(content_of(DISK_NUM_FILE) == std::to_string(disk_count), "the count is the disks'");
}

}  // namespace

void fuzz_begin()
{
    mkdir(RUNTIME_DIR, 0755);
}

std::string fuzz_answer(const std::string& command)
{
    require(command.empty(), "no command is run");
    return "";
}

void fuzz_one(const std::string& input)
{
    const std::vector<std::string> fields = fields_of(input, 2);
    chooser choose{fields[0], fields};
    disk_sets_init(&sets);
    for (disk_entry& entry : sets.entries) {
        if (choose.at < fields[0].size() && (choose.byte() & 1) != 0) {
            entry.in_use = 1;
            choose.fill(&entry.disk);
        }
    }
    const std::vector<const disk_obj*> disks = published_disks();
    expected.add_all(disks);
    const std::vector<const part_info*> unlabelled = unlabelled_parts(disks);
    disk_sets_publish(&sets);
    check_files(disks.size());
    for (const part_info* part : unlabelled) {
        require(std::string(part->label) == part->dev_name, "the record keeps the label it got");
    }
    require(static_cast<size_t>(disk_sets_count(&sets)) == disks.size(),
            "disks with nothing to publish are forgotten");
}
