// A router's outside as far as the inventory sees it: /sys/block, device nodes, blkid, the mount
// commands and their table. Everything is made of plain files and shell stubs.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "support/stubs.h"

namespace support {

inline constexpr char MOUNTS_FILE[] = "/run/mounts";  // what the stub mount lists
inline constexpr char BLKID_DIR[] = "/run/blkid";     // one file of blkid's output a device
inline constexpr char MOUNT_REFUSES[] = "/run/mount_refuses";  // exists: mounting does nothing
inline constexpr char PIDS_FILE[] = "/run/pids";               // what the stub pidof prints
inline constexpr char SDCARD_POINT[] = "/etc/tarn_utils/sdcard_point";
inline constexpr char UMOUNT_BUSY[] = "/run/umount_busy";  // so many bytes, so many refusals

class disk_world : public testing::Test {
protected:
    disk_world();

    // A disk of the kernel's: details is blkid's output behind the colon, empty when blkid does not
    // know it.
    static void plug_disk(const std::string& name, const std::string& details, uint64_t mib);
    static void plug_part(const std::string& disk, const std::string& name,
                          const std::string& details, uint64_t mib);
    static void unplug(const std::string& name);

    static void add_mount(const std::string& dev, const std::string& path);

    // The recorded calls without those that only ask.
    [[nodiscard]] std::vector<std::string> actions() const;
    [[nodiscard]] int times_called(const std::string& call) const;

    stub_programs stubs;

private:
    void add_stubs();
};

}  // namespace support
