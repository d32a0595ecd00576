#include "manager/event_pipes.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <iterator>
#include <span>
#include <string_view>

#include "log/log.h"
#include "util/file.h"
#include "util/guard.h"
#include "util/paths.h"
#include "util/pause.h"
#include "util/text.h"
#include "util/waits.h"

namespace {

// What a pipe holds. A writer that never ends its line must not keep the loop for ever.
constexpr uint32_t PIPE_CAPACITY = 65536;

constexpr int FIFO_TRIES = 3;

constexpr int MS_PER_SECOND = 1000;
constexpr suseconds_t US_PER_MS = 1000;

struct pipe_place {
    const char* path;
    int32_t event_pipes::*fd;
};

// In the order in which they are made and read.
constexpr pipe_place PIPES[] = {
    {PIPE_ADD_REMOVE, &event_pipes::fd_add_remove},
    {PIPE_SAFE_REMOVE, &event_pipes::fd_safe_remove},
    {PIPE_REMOVE, &event_pipes::fd_remove},
};

struct event_kind {
    event_code code;
    const char* keyword;
    const char* name;   // in log lines
    bool has_dev_name;  // ":" and a name follow the keyword
};

constexpr event_kind EVENT_KINDS[] = {
    {EVENT_DISK_ADD, "add", "EVENT_DISK_ADD", true},
    {EVENT_DISK_REMOVE_DEV, "remove_dev", "EVENT_DISK_REMOVE_DEV", true},
    {EVENT_DISK_REMOVE_DISK, "remove_disk", "EVENT_DISK_REMOVE_DISK", true},
    {EVENT_DISK_SAFE_REMOVE, "safe_remove", "EVENT_DISK_SAFE_REMOVE", false},
    {EVENT_DISK_HEART_BEAT, "heart_beat", "EVENT_DISK_HEART_BEAT", false},
};

consteval bool each_row_stands_at_its_code()
{
    int32_t code = EVENT_NONE;
    for (const event_kind& kind : EVENT_KINDS) {
        if (kind.code != ++code) {
            return false;
        }
    }
    return true;
}

// Keywords match as prefixes and the first match wins.
consteval bool no_keyword_hides_a_later_one()
{
    for (size_t i = 0; i < std::size(EVENT_KINDS); ++i) {
        for (size_t later = i + 1; later < std::size(EVENT_KINDS); ++later) {
            if (std::string_view(EVENT_KINDS[later].keyword).starts_with(EVENT_KINDS[i].keyword)) {
                return false;
            }
        }
    }
    return true;
}

static_assert(std::size(EVENT_KINDS) == EVENT_CODE_END - 1, "every event code has a row");
static_assert(each_row_stands_at_its_code(), "rows stand in the order of their codes");
static_assert(no_keyword_hides_a_later_one(), "every keyword can be reached");

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
    for (const pipe_place& place : PIPES) {
        const int32_t fd = pipes->*place.fd;
        FD_SET(fd, &pipes->read_set);
        FD_SET(fd, &pipes->except_set);
        pipes->max_fd = largest(pipes->max_fd, fd);
    }
    const int32_t wait_ms = pipes->wait_ms > 0 ? pipes->wait_ms : WAITS.idle;
    pipes->timeout = {wait_ms / MS_PER_SECOND,
                      static_cast<suseconds_t>(wait_ms % MS_PER_SECOND) * US_PER_MS};
}

// Reads one message byte by byte. A line without its terminator is lost: its writer broke off.
int read_message(int fd, std::span<char> buffer)
{
    size_t stored = 0;
    char c = 0;
    for (uint32_t taken = 0; taken < PIPE_CAPACITY && read(fd, &c, 1) == 1; ++taken) {
        if (stored < buffer.size() - 1) {
            buffer[stored++] = c;
        }
        if (is_terminator(c)) {
            log_info("get event = %s\n", buffer.data());
            return static_cast<int>(stored);
        }
    }
    // Nothing of it may stand behind the message of the next pipe.
    memset(buffer.data(), 0, buffer.size());
    return 0;
}

// As event_wait, of one pipe that select has looked at.
int read_pipe(const event_pipes* pipes, int fd, std::span<char> buffer)
{
    if (FD_ISSET(fd, &pipes->read_set)) {
        return read_message(fd, buffer);
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
        fd_guard fd(fifo_create_open(path));
        if (fd < 0 || is_fifo(fd)) {
            return fd.release();
        }
        file_delete(path);
    }
    log_err("err, pipe = %s\n", path);
    return -1;
}

// 0 is what a cleared record holds.
void close_pipe(int32_t fd)
{
    if (fd > 0) {
        const fd_guard closed_here(fd);
    }
}

// Null when no keyword matches. Whatever stands in place of the "#" is passed over.
const event_kind* kind_of_message(const char* message)
{
    if (message[0] == '\0') {
        return nullptr;
    }
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

    for (const pipe_place& place : PIPES) {
        file_delete(place.path);
    }
    for (const pipe_place& place : PIPES) {
        pipes->*place.fd = open_fifo(place.path);
        if (pipes->*place.fd < 0) {
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
    for (const pipe_place& place : PIPES) {
        close_pipe(pipes->*place.fd);
    }
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
    for (const pipe_place& place : PIPES) {
        const int ret = read_pipe(pipes, pipes->*place.fd, std::span(buffer, size));
        if (ret != 0) {
            pipes->event_fd = pipes->*place.fd;
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
    // Without a word: the rest of a line that held a ";" arrives like this.
    if (message[0] != '#') {
        return 0;
    }
    return event_parse(pipes, message) == 0 ? EVENT_RECEIVED : 0;
}

int event_parse(event_pipes* pipes, const char* message)
{
    if (pipes == nullptr || message == nullptr) {
        return 1;
    }
    pipes->event = {};
    const event_kind* kind = kind_of_message(message);
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
    if (max < 0 || length > static_cast<size_t>(max)) {
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
