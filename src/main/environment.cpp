#include "main/environment.h"

#include "disk/mount_point.h"
#include "log/log.h"
#include "main/single_instance.h"
#include "util/device.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"

int init_environment()
{
    log_file_open();
    write_pid_file();
    dir_make_own(MOUNT_BASE);
    dir_make(CONFIG_DIR);
    umount_all_force();
    file_delete(HOTPLUG_MOUNT_HOOK);
    init_hook();
    return 0;
}

void init_block_input_environment()
{
    write_pid_file();
    dir_make_own(MOUNT_BASE);
    init_hook();
}

int restart_self()
{
    exec_cmd("/etc/init.d/tarn_nas_diskmanager restart &", 1);
    return 0;
}
