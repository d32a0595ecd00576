#include "util/process.h"

#include <cstdlib>

#include "log/log.h"
#include "util/paths.h"
#include "util/scratch.h"

namespace {

constexpr scratch_query PIDOF_QUERY{
    .path = SCRATCH_PIDOF, .end = SCRATCH_KEPT, .starts_clear = true};

}  // namespace

int proc_pid_of(const char* name)
{
    const scratch_text pids(PIDOF_QUERY, "pidof %s > %s", {name, SCRATCH_PIDOF});
    if (pids.text == nullptr || *pids.text == '\0') {
        return 0;
    }
    log_info("get app = %s, pid = %s\n", name, pids.text.held);
    return atoi(pids.text);
}

int proc_exists(const char* name)
{
    if (proc_pid_of(name) != 0) {
        return YES;
    }
    log_warn("===> proc not exist, name = %s\n", name);
    return NO;
}
