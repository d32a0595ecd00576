// Every path of the daemon but the log's, and every name derived from another, is made here.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

constexpr size_t PATH_SIZE = 128;       // buffers for paths below the fixed directories
constexpr size_t DEV_PATH_SIZE = 64;    // buffers for "/dev/%s" of a record's device name
constexpr size_t MOUNT_NAME_SIZE = 32;  // buffers for directory names below the mount base

// What other programs see. The doubled slashes belong to the names.
inline constexpr char RUNTIME_DIR[] = "/tmp/tarn_nas/";
inline constexpr char PID_FILE[] = "/tmp/tarn_nas//disk_manager_pid";
inline constexpr char DISK_JSON_FILE[] = "/tmp/tarn_nas//disk.json";
inline constexpr char DISK_NUM_FILE[] = "/tmp/tarn_nas//disk_num.txt";
// Where both of them are written before they take their names.
inline constexpr char STATUS_NEW_FILE[] = "/tmp/tarn_nas/status.new";
inline constexpr char PIPE_ADD_REMOVE[] = "/tmp/tarn_nas/pipe_disk_add_remove";
inline constexpr char PIPE_SAFE_REMOVE[] = "/tmp/tarn_nas/pipe_disk_safe_remove";
inline constexpr char PIPE_REMOVE[] = "/tmp/tarn_nas/pipe_disk_remove";
inline constexpr char CONFIG_DIR[] = "/etc/config/tarn_nas";
inline constexpr char DISK_DB_FILE[] = "/etc/config/tarn_nas/disk.db";
inline constexpr char MOUNT_BASE[] = "/tmp/mountd";
inline constexpr char HOTPLUG_MOUNT_HOOK[] = "/etc/hotplug.d/block/10-mount";

// The kernel's.
inline constexpr char SYS_BLOCK[] = "/sys/block";

// Other mounts are not looked at: "Names beginning with" in docs/limits.md.
inline constexpr char SD_NODE_PREFIX[] = "/dev/sd";
inline constexpr char CARD_NODE_PREFIX[] = "/dev/mmcblk0";

// What the router itself runs from is mounted at these, where it has them.
inline constexpr const char* SYSTEM_DIRS[] = {"/", "/rom", "/overlay", "/boot"};

// Output of outside programs on its way back to us.
inline constexpr char SCRATCH_PGREP[] = "/tmp/disk_pid_tmp";
inline constexpr char SCRATCH_PIDOF[] = "/tmp/pid";
inline constexpr char SCRATCH_MOUNT[] = "/tmp/mount.txt";
inline constexpr char SCRATCH_DEV_CHECK[] = "/tmp/tmp_blkid";
inline constexpr char SCRATCH_BLKID_TYPE[] = "/tmp/out.txt";
inline constexpr char SCRATCH_BLKID_VALUE[] = "/tmp/disk_uid.txt";
inline constexpr char SCRATCH_LABEL[] = "/tmp/disk_label";

// Where things go that others left under our names; mkdtemp fills in the end.
inline constexpr char SET_ASIDE_TEMPLATE[] = "/tmp/foreign-XXXXXX";

// An optional program of the router: prints the label of the device named by its argument.
inline constexpr char LABEL_SCRIPT[] = "/usr/bin/disk_get_label.sh";

// Other processes of the router, and the commands of its init scripts: each stands whole, as the
// log shows it.
inline constexpr char COMPANION_PROCESS[] = "tarn_nas_sys";
inline constexpr char RESTART_DAEMON[] = "/etc/init.d/tarn_nas_diskmanager restart &";
inline constexpr char RELOAD_FIREWALL[] = "/etc/init.d/firewall reload 2>/dev/null";
inline constexpr char RESTART_SAMBA[] = "/etc/init.d/samba restart";

// Each service that holds files open on disks: to stop it, to start it. Both go from top to bottom.
inline constexpr const char* FILE_SERVICES[][2] = {
    {"/etc/init.d/samba4 stop", "/etc/init.d/samba4 start"},
    {"/etc/init.d/nas_samba3 stop", "/etc/init.d/nas_samba3 start"},
    {"/etc/init.d/tarn_nas_sys_dl stop", "/etc/init.d/tarn_nas_sys_dl start"},
    {"/etc/init.d/tarn_nas_sys_up stop", "/etc/init.d/tarn_nas_sys_up start"},
};

// What the names of kernel devices are made of, and those of our own directories. Events and
// entries with another name are not for us.
inline constexpr char NAME_CHARACTERS[] = "abcdefghijklmnopqrstuvwxyz"
                                          "ABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                          "0123456789._-!";

// "/dev/%s" of a device name.
void path_dev_node(std::span<char> out, const char* dev_name);

// The directory of a disk under /sys/block.
void path_sys_disk(std::span<char> out, const char* disk_name);

// The size file of any block device by its own name, and of a partition below its disk.
void path_sys_size(std::span<char> out, const char* dev_name);
void path_sys_part_size(std::span<char> out, const char* disk_name, const char* dev_name);

// The file with a disk's hardware sector size.
void path_sys_sector_size(std::span<char> out, const char* disk_name);

// "disk%d_part%d": the directory name of a partition below the mount base.
void path_mount_name(std::span<char> out, int32_t disk_number, int32_t part_number);

// The mount base joined with such a name.
void path_mount_dir(std::span<char> out, const char* mount_name);

// The directory name out of a mount path: drops as many characters as the mount base has, without
// comparing them, and one slash behind. 0, or 1 for a null argument or a path shorter than that.
int mount_path_to_name(const char* mount_path, char* out, size_t size);

// True when path is a directory directly below the mount base whose name fits MOUNT_NAME_SIZE and
// is plain: what the daemon itself once chose, and not what a damaged database says.
[[nodiscard]] bool mount_path_is_usable(const char* path);

// True when name holds nothing but NAME_CHARACTERS.
[[nodiscard]] bool name_is_plain(const char* name);
