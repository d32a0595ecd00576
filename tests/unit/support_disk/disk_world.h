// A router's outside as far as the inventory sees it: /sys/block, device nodes, blkid, the mount
// commands and their table. Everything is made of plain files and shell stubs.
#pragma once

#include <linux/magic.h>
#include <sys/vfs.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "disk/disk_sets.h"
#include "support/support.h"
#include "support_disk/child.h"
#include "support_disk/clock.h"
#include "util/paths.h"
#include "util/text.h"

namespace support_disk {

inline constexpr char MOUNTS_FILE[] = "/run/mounts";  // what the stub mount lists
inline constexpr char BLKID_DIR[] = "/run/blkid";     // one file of blkid's output a device
inline constexpr char MOUNT_REFUSES[] = "/run/mount_refuses";  // exists: mounting does nothing
inline constexpr char PIDS_FILE[] = "/run/pids";               // what the stub pidof prints
inline constexpr char SDCARD_POINT[] = "/etc/tarn_utils/sdcard_point";
inline constexpr char UMOUNT_BUSY[] = "/run/umount_busy";  // so many bytes, so many refusals

// Only ever a directory of the private world: outside of it these hold the machine's own files.
inline void empty_dir(const std::string& path)
{
    struct statfs info {};
    if (statfs(path.c_str(), &info) != 0 || info.f_type != TMPFS_MAGIC) {
        fprintf(stderr, "%s is not private: start the tests through run_private\n", path.c_str());
        abort();
    }
    for (const auto& entry : std::filesystem::directory_iterator(path)) {
        support::remove_all(entry.path());
    }
}

class disk_world : public testing::Test {
protected:
    disk_world()
    {
        for (const char* dir :
             {"/sys/block", "/sys/class/block", "/etc/config", "/etc/init.d", "/etc/hotplug.d"}) {
            empty_dir(dir);
        }
        for (const char* path :
             {"/tmp/tarn_nas", MOUNT_BASE, "/tmp/log", SCRATCH_PGREP, SCRATCH_PIDOF, SCRATCH_MOUNT,
              SCRATCH_DEV_CHECK, SCRATCH_BLKID_TYPE, SCRATCH_BLKID_VALUE, SCRATCH_LABEL, BLKID_DIR,
              MOUNTS_FILE, MOUNT_REFUSES, UMOUNT_BUSY, PIDS_FILE, SDCARD_POINT, LABEL_SCRIPT}) {
            support::remove_all(path);
        }
        forget_nodes();
        support::make_dir("/tmp/tarn_nas");
        add_stubs();
    }

    // A disk of the kernel's: details is blkid's output behind the colon, empty when blkid does not
    // know it.
    void plug_disk(const std::string& name, const std::string& details, uint64_t mib)
    {
        support::write_file("/sys/block/" + name + "/queue/hw_sector_size", "512\n");
        plug(name, "/sys/block/" + name, details, mib);
    }

    void plug_part(const std::string& disk, const std::string& name, const std::string& details,
                   uint64_t mib)
    {
        plug(name, "/sys/block/" + disk + "/" + name, details, mib);
    }

    static void unplug(const std::string& name)
    {
        support::remove_all("/sys/block/" + name);
        support::remove_all("/sys/class/block/" + name);
        support::remove_all("/dev/" + name);
        support::remove_all(std::string(BLKID_DIR) + "/" + name);
    }

    static void add_mount(const std::string& dev, const std::string& path)
    {
        support::write_file(MOUNTS_FILE, support::read_file(MOUNTS_FILE) + dev + " on " + path +
                                             " type ext4 (rw)\n");
    }

    // The recorded calls without those that only ask.
    [[nodiscard]] std::vector<std::string> actions() const
    {
        std::vector<std::string> kept;
        for (const std::string& call : stubs.calls()) {
            if (call != "mount" && call.rfind("blkid", 0) != 0) {
                kept.push_back(call);
            }
        }
        return kept;
    }

    [[nodiscard]] int times_called(const std::string& call) const
    {
        int count = 0;
        for (const std::string& one : stubs.calls()) {
            count += one == call ? 1 : 0;
        }
        return count;
    }

    support::stub_programs stubs;

private:
    // Plain files stand for the nodes of disks; a test's child may have left some.
    static void forget_nodes()
    {
        std::vector<std::filesystem::path> nodes;
        for (const auto& entry : std::filesystem::directory_iterator("/dev")) {
            if (entry.symlink_status().type() == std::filesystem::file_type::regular) {
                nodes.push_back(entry.path());
            }
        }
        for (const auto& node : nodes) {
            support::remove_all(node);
        }
    }

    void add_stubs()
    {
        stubs.add("blkid",
                  "for node; do :; done; cat /run/blkid/${node#/dev/} 2>/dev/null; exit 0");
        const std::string mounting =
            "for word; do node=$place; place=$word; done\n"
            "[ -e /run/mount_refuses ] || echo \"$node on $place type x (rw)\" >>/run/mounts";
        stubs.add("mount", "[ $# -gt 0 ] || { cat /run/mounts 2>/dev/null; exit 0; }\n" + mounting);
        stubs.add("mount.ntfs-3g", mounting);
        stubs.add(
            "umount",
            "for place; do :; done\n"
            "if [ -s /run/umount_busy ]; then\n"
            "    left=$(tail -c +2 /run/umount_busy); printf %s \"$left\" >/run/umount_busy\n"
            "    exit 1\n"
            "fi\n"
            "[ -e /run/mounts ] || exit 1\n"
            "grep -v -e \"^$place on \" -e \" on $place type \" /run/mounts >/run/mounts.new\n"
            "mv /run/mounts.new /run/mounts");
        stubs.add("pidof", "cat /run/pids 2>/dev/null");
        for (const char* service : {"samba4", "nas_samba3", "tarn_nas_sys_dl", "tarn_nas_sys_up"}) {
            stubs.add_at(std::string("/etc/init.d/") + service);
        }
    }

    void plug(const std::string& name, const std::string& dir, const std::string& details,
              uint64_t mib)
    {
        constexpr uint64_t sectors_of_a_mib = 2048;
        const std::string size = std::to_string(mib * sectors_of_a_mib) + "\n";
        support::write_file(dir + "/size", size);
        support::write_file("/sys/class/block/" + name + "/size", size);
        support::write_file("/dev/" + name, "");
        if (!details.empty()) {
            support::write_file(std::string(BLKID_DIR) + "/" + name,
                                "/dev/" + name + ": " + details + "\n");
        }
    }
};

// A record that counts as a known partition of that size.
inline part_info make_part(const char* dev_name, uint64_t mib)
{
    part_info part{};
    text_copy(part.dev_name, dev_name);
    part.total_len = mib;
    return part;
}

inline void put_root(disk_entry* entry, const char* dev_name, uint64_t mib)
{
    entry->in_use = 1;
    entry->disk.root = make_part(dev_name, mib);
    entry->disk.root.is_root_part = 1;
    entry->disk.root.ref_root = &entry->disk.root;
}

inline part_info* put_part(disk_obj* disk, int slot, const char* dev_name, uint64_t mib)
{
    disk->parts[slot].in_use = 1;
    disk->parts[slot].part = make_part(dev_name, mib);
    disk->parts[slot].part.ref_root = &disk->root;
    return &disk->parts[slot].part;
}

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
    for (size_t i = 0; i < sizeof(object); ++i) {
        if (bytes[i] != 0) {
            return false;
        }
    }
    return true;
}

}  // namespace support_disk
