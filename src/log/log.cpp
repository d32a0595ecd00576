#include "log/log.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <ctime>

namespace {

constexpr size_t HEADER_SIZE = 256;
constexpr size_t MESSAGE_SIZE = 512;
constexpr size_t LOG_PATH_SIZE = 128;
constexpr int32_t LOG_LINES_MAX = 1500;
constexpr mode_t LOG_FILE_MODE = 0644;

struct log_state {
    uint8_t log_debug = 1;
    std::atomic<uint8_t> log_syslog{0};  // set by a signal handler
    FILE* log_fp = nullptr;
    int32_t log_lines = 0;  // written to the file in the life of the process
};

static_assert(std::atomic<uint8_t>::is_always_lock_free, "a signal handler writes log_syslog");

constinit log_state state;

const char* base_name(const char* file)
{
    const char* slash = strrchr(file, '/');
    return slash != nullptr ? slash + 1 : file;
}

void put_syslog(const char* text)
{
    openlog("tarndisk", 0, LOG_DAEMON);
    syslog(LOG_INFO, "%s", text);
    closelog();
}

// The header ends in the caller's format and so is a format itself.
void build_header(char (&header)[HEADER_SIZE], int32_t level, const char* module, int32_t line,
                  const char* fmt)
{
    switch (level) {
        case LOG_LVL_WARN:
            snprintf(header, HEADER_SIZE, "Warning[%s:%d]%s", module, line, fmt);
            return;
        case LOG_LVL_ERR:
            snprintf(header, HEADER_SIZE, "ERROR[%s:%d]%s", module, line, fmt);
            return;
        case LOG_LVL_ERRNO:
            snprintf(header, HEADER_SIZE, "ERROR[%s:%d](%s)%s", module, line, strerror(errno), fmt);
            return;
        default:
            snprintf(header, HEADER_SIZE, "%s(%d)%s", module, line, fmt);
            return;
    }
}

// As fopen with "at+", but a link that somebody planted under the name, which the clock foretells,
// is not followed, and the services that this daemon starts do not keep the file open.
FILE* open_log(const char* path)
{
    const int fd = open(path, O_RDWR | O_CREAT | O_APPEND | O_NOFOLLOW | O_CLOEXEC, LOG_FILE_MODE);
    if (fd < 0) {
        return nullptr;
    }
    FILE* stream = fdopen(fd, "a+");
    if (stream == nullptr) {
        close(fd);
    }
    return stream;
}

}  // namespace

void log_printf(int32_t level, const char* file, int32_t line, const char* fmt, ...)
{
    char header[HEADER_SIZE]{};
    char message[MESSAGE_SIZE]{};
    if (state.log_debug == 0) {
        return;
    }

    const int saved_errno = errno;
    build_header(header, level, base_name(file), line, fmt);

    va_list args;
    va_start(args, fmt);
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat-nonliteral"
    vsnprintf(message, sizeof(message), header, args);
#pragma GCC diagnostic pop
    va_end(args);

    log_print_stdout("%s", message);
    if (state.log_syslog != 0) {
        put_syslog(message);
    }
    errno = saved_errno;
}

void log_print_stdout(const char* fmt, ...)
{
    va_list args;
    va_start(args, fmt);
    vprintf(fmt, args);
    va_end(args);
    // A reader may come back: one failed line must not silence the following ones.
    clearerr(stdout);
}

void log_set_debug()
{
    state.log_debug = 1;
}

void log_enable_syslog()
{
    state.log_syslog = 1;
}

int log_file_open()
{
    const time_t now = time(nullptr);
    tm date{};
    localtime_r(&now, &date);

    char path[LOG_PATH_SIZE]{};
    snprintf(path, sizeof(path), "/tmp/log/disk_log-%d-%d-%d-%d-%d-%d.txt", date.tm_year + 1900,
             date.tm_mon + 1, date.tm_mday, date.tm_hour, date.tm_min, date.tm_sec);
    state.log_fp = open_log(path);
    if (state.log_fp == nullptr) {
        log_print_stdout("err, file = %s\n", path);
        return 1;
    }
    return 0;
}

int log_file_close()
{
    if (state.log_fp != nullptr) {
        fclose(state.log_fp);
    }
    return 0;
}

int log_file_write(const char* text)
{
    if (state.log_fp == nullptr && log_file_open() != 0) {
        return 1;
    }
    if (state.log_lines > LOG_LINES_MAX) {
        return 1;
    }
    ++state.log_lines;
    fwrite(text, 1, strlen(text), state.log_fp);
    fflush(state.log_fp);
    return 0;
}

void log_reset()
{
    state.log_debug = 1;
    state.log_syslog = 0;
    state.log_fp = nullptr;
    state.log_lines = 0;
}
