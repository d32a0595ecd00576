#include "support/records.h"

#include "util/text.h"

namespace support {

part_info make_part(const char* dev_name, uint64_t mib)
{
    part_info part{};
    text_copy(part.dev_name, dev_name);
    part.total_len = mib;
    return part;
}

void put_root(disk_entry* entry, const char* dev_name, uint64_t mib)
{
    entry->in_use = 1;
    entry->disk.root = make_part(dev_name, mib);
    entry->disk.root.is_root_part = 1;
    entry->disk.root.ref_root = &entry->disk.root;
}

part_info* put_part(disk_obj* disk, int slot, const char* dev_name, uint64_t mib)
{
    disk->parts[slot].in_use = 1;
    disk->parts[slot].part = make_part(dev_name, mib);
    disk->parts[slot].part.ref_root = &disk->root;
    return &disk->parts[slot].part;
}

}  // namespace support
