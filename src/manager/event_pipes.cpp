#include "manager/event_pipes.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <initializer_list>

#include "log/log.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/text.h"

namespace {

// What a pipe holds. A writer that never ends its line must not keep the loop for ever.
constexpr uint32_t PIPE_CAPACITY = 65536;

constexpr int FIFO_TRIES = 3;

struct event_kind {
    event_code code;
    const char* keyword;
    const char* name;
    bool has_dev_name;
};

// A keyword matches as a prefix, so the order decides where two could match.
constexpr event_kind EVENT_KINDS[] = {
    {EVENT_DISK_ADD, "add", "EVENT_DISK_ADD", true},
    {EVENT_DISK_REMOVE_DEV, "remove_dev", "EVENT_DISK_REMOVE_DEV", true},
    {EVENT_DISK_REMOVE_DISK, "remove_disk", "EVENT_DISK_REMOVE_DISK", true},
    {EVENT_DISK_SAFE_REMOVE, "safe_remove", "EVENT_DISK_SAFE_REMOVE", false},
    {EVENT_DISK_HEART_BEAT, "heart_beat", "EVENT_DISK_HEART_BEAT", false},
};

bool is_terminator(char c)
{
    return c == '\n' || c == '\r' || c == ';' || c == '\0';
}

int32_t largest(int32_t a, int32_t b)
{
    return a > b ? a : b;
}

void prepare_sets(event_pipes* pipes)
{
    FD_ZERO(&pipes->read_set);
    FD_ZERO(&pipes->except_set);
    pipes->max_fd = 0;
    for (const int32_t fd : {pipes->fd_add_remove, pipes->fd_safe_remove, pipes->fd_remove}) {
        FD_SET(fd, &pipes->read_set);
        FD_SET(fd, &pipes->except_set);
        pipes->max_fd = largest(pipes->max_fd, fd);
    }
    pipes->timeout = {EVENT_WAIT_SECONDS, 0};
}

// Reads one message byte by byte. A line without its terminator is lost: its writer broke off.
int read_message(int fd, char* buffer, uint32_t size)
{
    uint32_t stored = 0;
    char c = 0;
    for (uint32_t taken = 0; taken < PIPE_CAPACITY && read(fd, &c, 1) == 1; ++taken) {
        if (stored < size - 1) {
            buffer[stored++] = c;
        }
        if (is_terminator(c)) {
            log_info("get event = %s\n", buffer);
            return static_cast<int>(stored);
        }
    }
    // Nothing of it may stand behind the message of the next pipe.
    memset(buffer, 0, size);
    return 0;
}

int read_pipe(const event_pipes* pipes, int fd, char* buffer, uint32_t size)
{
    if (FD_ISSET(fd, &pipes->read_set)) {
        return read_message(fd, buffer, size);
    }
    if (FD_ISSET(fd, &pipes->except_set)) {
        log_errno("pipe err, fd = %d\n", fd);
        return -1;
    }
    return 0;
}

bool is_fifo(int fd)
{
    struct stat info {};
    return fstat(fd, &info) == 0 && S_ISFIFO(info.st_mode);
}

// A writer that redirects to the name while the pipe is made anew creates a plain file, which would
// be ready to read for ever.
int open_fifo(const char* path)
{
    for (int i = 0; i < FIFO_TRIES; ++i) {
        const int fd = fifo_create_open(path);
        if (fd < 0 || is_fifo(fd)) {
            return fd;
        }
        close(fd);
        file_delete(path);
    }
    log_err("err, pipe = %s\n", path);
    return -1;
}

void close_pipe(int32_t fd)
{
    if (fd > 0) {
        close(fd);
    }
}

const event_kind* kind_of_message(const char* message)
{
    for (const event_kind& kind : EVENT_KINDS) {
        if (text_has_prefix(message + 1, kind.keyword)) {
            return &kind;
        }
    }
    return nullptr;
}

}  // namespace

int event_pipes_open(event_pipes* pipes)
{
    if (pipes == nullptr) {
        return 1;
    }
    memset(pipes, 0, sizeof(*pipes));
    const bool have_own_dir = dir_make_own(RUNTIME_DIR) == 0;

    struct pipe_place {
        const char* path;
        int32_t* fd;
    };
    const pipe_place places[] = {
        {PIPE_ADD_REMOVE, &pipes->fd_add_remove},
        {PIPE_SAFE_REMOVE, &pipes->fd_safe_remove},
        {PIPE_REMOVE, &pipes->fd_remove},
    };
    for (const pipe_place& place : places) {
        file_delete(place.path);
    }
    for (const pipe_place& place : places) {
        *place.fd = open_fifo(place.path);
        if (*place.fd < 0) {
            return 1;
        }
    }
    log_info("fd disk_add_remove = %d\n", pipes->fd_add_remove);
    log_info("fd disk_safe_remove = %d\n", pipes->fd_safe_remove);
    log_info("fd disk_remove = %d\n", pipes->fd_remove);
    // A directory that appeared only now is somebody else's, and so may its pipes be.
    return have_own_dir ? 0 : 1;
}

int event_pipes_close(event_pipes* pipes)
{
    if (pipes == nullptr) {
        return 1;
    }
    close_pipe(pipes->fd_add_remove);
    close_pipe(pipes->fd_safe_remove);
    close_pipe(pipes->fd_remove);
    memset(pipes, 0, sizeof(*pipes));
    return 0;
}

int event_wait(event_pipes* pipes, char* buffer, uint32_t size)
{
    if (pipes == nullptr || buffer == nullptr || size == 0) {
        return -1;
    }
    prepare_sets(pipes);
    const int ready =
        select(pipes->max_fd + 1, &pipes->read_set, nullptr, &pipes->except_set, &pipes->timeout);
    if (ready < 0 && errno != EINTR) {
        // For want of memory, say: asking again at once would only make it scarcer.
        log_errno("select err\n");
        pause_seconds(1);
    }
    if (ready < 1) {
        return ready;
    }
    for (const int32_t fd : {pipes->fd_add_remove, pipes->fd_safe_remove, pipes->fd_remove}) {
        const int ret = read_pipe(pipes, fd, buffer, size);
        if (ret != 0) {
            return ret;
        }
    }
    return 0;
}

int event_receive(event_pipes* pipes)
{
    char message[EVENT_LINE_SIZE]{};
    if (event_wait(pipes, message, sizeof(message)) <= 0) {
        return 0;
    }
    if (message[0] != '#') {
        return 0;
    }
    return event_parse(pipes, message) == 0 ? 1 : 0;
}

int event_parse(event_pipes* pipes, const char* message)
{
    if (pipes == nullptr || message == nullptr) {
        return 1;
    }
    pipes->event = {};
    const event_kind* kind = message[0] != '\0' ? kind_of_message(message) : nullptr;
    if (kind == nullptr) {
        log_err("err event = %s\n", message);
        return 1;
    }
    if (kind->has_dev_name &&
        event_parse_dev_name(message, pipes->event.dev_name, EVENT_NAME_SIZE) != 0) {
        return 1;
    }
    pipes->event.type = kind->code;
    return 0;
}

int event_parse_dev_name(const char* message, char* out, int32_t max)
{
    if (message == nullptr || out == nullptr) {
        return 1;
    }
    const char* colon = strchr(message, ':');
    if (colon == nullptr) {
        log_err("err event = %s\n", message);
        return 1;
    }
    const char* name = colon + 1;
    const size_t length = strlen(name);
    if (length > static_cast<size_t>(max)) {
        log_err("err event(%s), disk name long\n", message);
        return 1;
    }
    memset(out, 0, static_cast<size_t>(max));
    for (size_t i = 0; i < length && !is_terminator(name[i]); ++i) {
        out[i] = name[i];
    }
    return 0;
}

const char* event_name(int32_t type)
{
    for (const event_kind& kind : EVENT_KINDS) {
        if (kind.code == type) {
            return kind.name;
        }
    }
    return "err event";
}
