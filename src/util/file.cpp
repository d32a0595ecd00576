#include "util/file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "log/log.h"
#include "util/claim.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/guard.h"
#include "util/text.h"

namespace {

constexpr mode_t PRIVATE_MODE = 0600;

// The same race as in util/claim; but a try starts a shell, so that fewer can be won and fewer must
// do.
constexpr int DIR_MAKE_TRIES = 8;

int write_all(FILE* stream, const void* bytes, int32_t length)
{
    // What a full disk refuses shows when the stream is closed, and is no failure there either.
    const int ret = stream_write_all(stream, bytes, length);
    if (ret != 0) {
        log_info("file write err, len = %d, ret = %d\n", length, ret);
    }
    return ret == 0 ? 0 : 1;
}

}  // namespace

dir_stream::dir_stream(const char* path) : stream(path != nullptr ? opendir(path) : nullptr) {}

const char* dir_stream::next_name()
{
    errno = 0;
    const dirent* entry = readdir(stream);
    failed = entry == nullptr && errno != 0;
    if (failed) {
        log_errno("read dir err\n");
    }
    return entry != nullptr ? entry->d_name : nullptr;
}

bool path_exists(const char* path)
{
    return path != nullptr && access(path, F_OK) == 0;
}

bool path_is_gone(const char* path)
{
    return path != nullptr && access(path, F_OK) != 0 && (errno == ENOENT || errno == ENOTDIR);
}

int dir_has_entry(const char* path, const char* name)
{
    if (path == nullptr || name == nullptr) {
        return NO_MATCH;
    }
    for (int walk = 0; walk < DIR_WALKS; ++walk) {
        dir_stream dir(path);
        if (dir.stream == nullptr) {
            log_err("open dir err, dir = %s\n", path);
            return NO_MATCH;
        }
        while (const char* entry = dir.next_name()) {
            if (str_equal(entry, name) == MATCHES) {
                return MATCHES;
            }
        }
        if (!dir.failed) {
            break;
        }
    }
    return NO_MATCH;
}

int64_t file_get_size(const char* path, uint8_t* exists)
{
    struct stat info {};
    const bool found = stat(path, &info) == 0;
    if (!found) {
        log_errno("stat err, fn = %s\n", path);
    }
    if (exists != nullptr) {
        *exists = found ? 1 : 0;
    }
    return found ? info.st_size : 0;
}

int stream_write_all(FILE* stream, const void* bytes, int32_t length)
{
    const auto* next = static_cast<const char*>(bytes);
    int32_t left = length;
    while (left > 0) {
        const auto written =
            static_cast<int32_t>(fwrite(next, 1, static_cast<size_t>(left), stream));
        if (written < 0) {
            log_warn("write err!\n");
            return 1;
        }
        if (written == 0) {
            return 0;
        }
        next += written;
        left -= written;
    }
    return 0;
}

int file_write(const char* path, const void* bytes, int32_t length)
{
    if (path == nullptr || bytes == nullptr) {
        return 1;
    }
    const stream_guard stream(fopen(path, "w"));
    if (stream == nullptr) {
        log_info("file not exist, fn = %s\n", path);
        return 1;
    }
    return write_all(stream, bytes, length);
}

int file_append(const char* path, const void* bytes, int32_t length)
{
    if (path == nullptr || bytes == nullptr) {
        return 1;
    }
    const stream_guard stream(fopen(path, "at+"));
    if (stream == nullptr) {
        log_err("open err, file = %s\n", path);
        return 1;
    }
    return write_all(stream, bytes, length);
}

int fd_read_full(int fd, void* buffer, int32_t length)
{
    auto* next = static_cast<char*>(buffer);
    int32_t left = length;
    while (left > 0) {
        const ssize_t got = read(fd, next, static_cast<size_t>(left));
        if (got < 1) {
            return 1;
        }
        next += got;
        left -= static_cast<int32_t>(got);
    }
    return 0;
}

int file_read_at(const char* path, int32_t offset, void* buffer, int32_t length)
{
    if (path == nullptr || buffer == nullptr) {
        log_err("err!\n");
        return 1;
    }
    const fd_guard file(open(path, O_RDWR | O_CREAT | O_SYNC | O_CLOEXEC, PRIVATE_MODE));
    if (file < 0) {
        log_err("err!\n");
        return 1;
    }
    if (offset > 0 && lseek(file, offset, SEEK_SET) != offset) {
        log_err("seek err!\n");
        return 1;
    }
    const int ret = fd_read_full(file, buffer, length);
    if (ret != 0) {
        log_err("read err, ret=%d, len=%d\n", ret, length);
    }
    return ret;
}

char* file_read_all(const char* path)
{
    if (path == nullptr) {
        return nullptr;
    }
    if (!path_exists(path)) {
        log_info("file not exist, file = %s\n", path);
        return nullptr;
    }
    uint8_t exists = 0;
    const int64_t size = file_get_size(path, &exists);
    if (exists == 0) {
        log_info("err, fn = %s, size = %d\n", path, static_cast<int>(size));
        return nullptr;
    }
    if (size > FILE_READ_ALL_MAX) {
        log_info("===== file too large =====\n");
        return nullptr;
    }
    const fd_guard file(open(path, O_RDONLY | O_CLOEXEC));
    if (file < 0) {
        log_info("open file err, file = %s\n", path);
        return nullptr;
    }
    text_guard content(static_cast<char*>(calloc(1, static_cast<size_t>(size) + 1)));
    if (content == nullptr) {
        log_err("calloc err!\n");
        return nullptr;
    }
    const int ret = fd_read_full(file, content, static_cast<int32_t>(size));
    if (ret != 0) {
        log_err("err, fn = %s, ret = %d, file_size = %d\n", path, ret, static_cast<int>(size));
        return nullptr;
    }
    return content.release();
}

int file_read_buf(const char* path, void* buffer, int32_t size)
{
    if (path == nullptr || buffer == nullptr) {
        return 1;
    }
    if (!path_exists(path)) {
        log_info("file not exist, file = %s\n", path);
        return 1;
    }
    memset(buffer, 0, static_cast<size_t>(size));
    const fd_guard file(open(path, O_RDONLY | O_CLOEXEC));
    if (file < 0) {
        log_info("open file err, file = %s\n", path);
        return 1;
    }
    // A file shorter than the buffer is the ordinary case.
    fd_read_full(file, buffer, size);
    return 0;
}

int file_read_text(const char* path, std::span<char> out)
{
    text_clear(out);
    return file_read_buf(path, out.data(), static_cast<int32_t>(out.size() - 1));
}

int file_delete(const char* path)
{
    if (path == nullptr) {
        return 1;
    }
    if (!path_exists(path)) {
        log_warn("del err! not exist file = %s\n", path);
        return 1;
    }
    if (remove(path) != 0) {
        log_errno("remove file err, file = %s\n", path);
        return 1;
    }
    return 0;
}

int dir_make(const char* path)
{
    if (path == nullptr) {
        return 1;
    }
    if (path_exists(path)) {
        return 0;
    }
    const text_guard command(command_of_word("mkdir -p '%s'", path));
    if (command == nullptr) {
        log_err("err!\n");
        return 1;
    }
    return exec_cmd(command, 1);
}

int dir_make_own(const char* path)
{
    for (int i = 0; i < DIR_MAKE_TRIES; ++i) {
        if (claim_path(path) != 0) {
            return 1;
        }
        dir_make(path);
        // Making is content with what somebody else made a moment earlier.
        if (path_get_owner(path) == PATH_OURS) {
            return 0;
        }
        // Nobody is in the way: it cannot be made.
        if (!path_exists(path)) {
            break;
        }
    }
    log_err("err, dir = %s\n", path);
    return 1;
}

int fifo_create_open(const char* path)
{
    if (!path_exists(path) && mknod(path, S_IFIFO | PRIVATE_MODE, 0) != 0) {
        log_errno("mknod err:");
        return -1;
    }
    // Not handed down: a service started by us would keep a pipe of an earlier run open.
    const int fd = open(path, O_RDWR | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
        log_errno("fopen err:");
        return -1;
    }
    return fd;
}
