// A pid file and the output of pgrep: does another instance run?
//
// Fields: the pid file, and what pgrep prints. A pid file that begins with a "-" is none.

#include <sys/stat.h>
#include <unistd.h>

#include "fuzz.h"
#include "main/run.h"
#include "util/paths.h"

namespace {

constexpr size_t PID_TEXT_MAX = 32;
constexpr size_t LIST_TEXT_MAX = 128;

std::string pid_list;

bool is_another_running(const std::string& pid_file)
{
    const std::string pid = c_text(pid_file.substr(0, PID_TEXT_MAX));
    const std::string list = c_text(pid_list.substr(0, LIST_TEXT_MAX));
    return !pid.empty() && list.find(pid) != std::string::npos;
}

}  // namespace

void fuzz_begin()
{
    mkdir(RUNTIME_DIR, 0755);
}

std::string fuzz_answer(const std::string& command)
{
    require(command == "pgrep -f tarn_nas_diskmanager", "only pgrep is asked");
    return pid_list;
}

void fuzz_one(const std::string& input)
{
    const std::vector<std::string> fields = fields_of(input, 2);
    pid_list = fields[1];
    const bool have_file = fields[0].empty() || fields[0][0] != '-';
    if (have_file) {
        put_file(PID_FILE, fields[0]);
    }
    const bool another = have_file && is_another_running(fields[0]);
    require(check_single_instance() == (another ? 1 : 0), "another runs when its pid is listed");
    require((access(PID_FILE, F_OK) == 0) == another, "only a stale pid file goes");
    require(access(SCRATCH_PGREP, F_OK) != 0, "the scratch file goes");

    write_pid_file();
    require(content_of(PID_FILE) == std::to_string(getpid()), "the pid file holds the pid alone");
    unlink(PID_FILE);
}
