// The inventory's records, made by hand and compared.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>

#include "disk/disk_sets.h"

namespace support {

// A record that counts as a known partition of that size.
part_info make_part(const char* dev_name, uint64_t mib);

void put_root(disk_entry* entry, const char* dev_name, uint64_t mib);
part_info* put_part(disk_obj* disk, int slot, const char* dev_name, uint64_t mib);

template <typename T>
bool same_bytes(const T& a, const T& b)
{
    const auto* bytes = reinterpret_cast<const unsigned char*>(&a);
    return std::equal(bytes, bytes + sizeof(a), reinterpret_cast<const unsigned char*>(&b));
}

template <typename T>
bool is_all_zero(const T& object)
{
    const auto* bytes = reinterpret_cast<const unsigned char*>(&object);
    return std::all_of(bytes, bytes + sizeof(object), [](unsigned char byte) { return byte == 0; });
}

}  // namespace support
