#include "main/single_instance.h"

#include <unistd.h>

#include <cstdint>
#include <cstring>

#include "log/log.h"
#include "util/claim.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr int32_t PID_FILE_TEXT_SIZE = 32;
constexpr int32_t PID_LIST_SIZE = 128;
constexpr size_t PID_TEXT_SIZE = 16;

// The pids of all processes whose command line names the daemon, this one included.
void list_daemon_pids(char (&list)[PID_LIST_SIZE + 1])
{
    file_delete(SCRATCH_PGREP);
    char command[COMMAND_SIZE];
    text_format(command, sizeof(command), "pgrep -f tarn_nas_diskmanager > %s", SCRATCH_PGREP);
    if (exec_cmd_into(command, SCRATCH_PGREP) < 0) {
        return;
    }
    file_read_buf(SCRATCH_PGREP, list, PID_LIST_SIZE);
    file_delete(SCRATCH_PGREP);
}

// A plain substring search. An empty pid file, left by a full /tmp, names no process.
bool is_listed(const char* pid_text, const char* list)
{
    return pid_text[0] != '\0' && strstr(list, pid_text) != nullptr;
}

}  // namespace

int check_single_instance()
{
    // A pid file in somebody else's directory says nothing of ours.
    claim_path(RUNTIME_DIR);
    if (!path_exists(PID_FILE)) {
        log_info("===> pid Not exist, file = %s\n", PID_FILE);
        return 0;
    }
    char pid_text[PID_FILE_TEXT_SIZE + 1]{};
    file_read_buf(PID_FILE, pid_text, PID_FILE_TEXT_SIZE);
    char list[PID_LIST_SIZE + 1]{};
    list_daemon_pids(list);
    log_info("pid sets = %s\n", list);
    log_info("cur pid = %s\n", pid_text);

    if (is_listed(pid_text, list)) {
        log_info("===> pid exist, file = %s\n", PID_FILE);
        return 1;
    }
    file_delete(PID_FILE);
    log_info("===> pid Not exist, file = %s\n", PID_FILE);
    return 0;
}

void write_pid_file()
{
    if (dir_make_own(RUNTIME_DIR) != 0) {
        return;
    }
    char text[PID_TEXT_SIZE];
    text_format(text, sizeof(text), "%d", static_cast<int>(getpid()));
    file_write(PID_FILE, text, static_cast<int32_t>(strlen(text)));
}
