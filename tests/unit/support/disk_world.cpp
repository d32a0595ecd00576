#include "support/disk_world.h"

#include <algorithm>

#include "support/files.h"

namespace support {

namespace {

void plug(const std::string& name, const std::string& dir, const std::string& details, uint64_t mib)
{
    constexpr uint64_t sectors_of_a_mib = 2048;
    const std::string size = std::to_string(mib * sectors_of_a_mib) + "\n";
    write_file(dir + "/size", size);
    write_file("/sys/class/block/" + name + "/size", size);
    write_file("/dev/" + name, "");
    if (!details.empty()) {
        write_file(std::string(BLKID_DIR) + "/" + name, "/dev/" + name + ": " + details + "\n");
    }
}

}  // namespace

disk_world::disk_world()
{
    make_dir("/tmp/tarn_nas");
    add_stubs();
}

void disk_world::plug_disk(const std::string& name, const std::string& details, uint64_t mib)
{
    write_file("/sys/block/" + name + "/queue/hw_sector_size", "512\n");
    plug(name, "/sys/block/" + name, details, mib);
}

void disk_world::plug_part(const std::string& disk, const std::string& name,
                           const std::string& details, uint64_t mib)
{
    plug(name, "/sys/block/" + disk + "/" + name, details, mib);
}

void disk_world::unplug(const std::string& name)
{
    remove_all("/sys/block/" + name);
    remove_all("/sys/class/block/" + name);
    remove_all("/dev/" + name);
    remove_all(std::string(BLKID_DIR) + "/" + name);
}

void disk_world::add_mount(const std::string& dev, const std::string& path)
{
    write_file(MOUNTS_FILE, read_file(MOUNTS_FILE) + dev + " on " + path + " type ext4 (rw)\n");
}

std::vector<std::string> disk_world::actions() const
{
    std::vector<std::string> calls = stubs.calls();
    std::erase_if(calls, [](const std::string& call) {
        return call == "mount" || call.starts_with("blkid");
    });
    return calls;
}

int disk_world::times_called(const std::string& call) const
{
    const std::vector<std::string> calls = stubs.calls();
    return static_cast<int>(std::count(calls.begin(), calls.end(), call));
}

void disk_world::add_stubs()
{
    stubs.add("blkid", "for node; do :; done; cat /run/blkid/${node#/dev/} 2>/dev/null; exit 0");
    const std::string mounting =
        "for word; do node=$place; place=$word; done\n"
        "[ -e /run/mount_refuses ] || echo \"$node on $place type x (rw)\" >>/run/mounts";
    stubs.add("mount", "[ $# -gt 0 ] || { cat /run/mounts 2>/dev/null; exit 0; }\n" + mounting);
    stubs.add("mount.ntfs-3g", mounting);
    stubs.add("umount",
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

}  // namespace support
