#include "util/process.h"

#include <cstdlib>

#include "log/log.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

int proc_pid_of(const char* name)
{
    file_delete(SCRATCH_PIDOF);
    char command[COMMAND_SIZE];
    text_format(command, sizeof(command), "pidof %s > %s", name, SCRATCH_PIDOF);
    if (exec_cmd_into(command, SCRATCH_PIDOF) < 0) {
        return 0;
    }
    char* text = file_read_all(SCRATCH_PIDOF);
    if (text == nullptr) {
        return 0;
    }
    int pid = 0;
    if (text[0] != '\0') {
        log_info("get app = %s, pid = %s\n", name, text);
        pid = atoi(text);
    }
    free(text);
    return pid;
}

int proc_exists(const char* name)
{
    if (proc_pid_of(name) != 0) {
        return 1;
    }
    log_warn("===> proc not exist, name = %s\n", name);
    return 0;
}
