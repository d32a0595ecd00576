#include "util/claim.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "log/log.h"
#include "util/guard.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

// Somebody may put a new thing there between our steps. A try is two system calls: nobody wins so
// many of these races in a row, and if they did, nothing would run or be read.
constexpr int CLAIM_TRIES = 100;
constexpr mode_t PRIVATE_MODE = 0600;

// A directory that others filled is not deleted: that walk could be led astray. It goes into a
// directory that only we can enter.
int move_aside(const char* path)
{
    char place[sizeof(SET_ASIDE_TEMPLATE)];
    text_copy(place, SET_ASIDE_TEMPLATE);
    if (mkdtemp(place) == nullptr) {
        log_errno("mkdtemp err, path = %s\n", path);
        return 1;
    }
    char target[PATH_SIZE];
    text_format(target, "%s/entry", place);
    if (rename(path, target) != 0) {
        // Its owner may have been faster; the name is free then.
        const bool is_free = errno == ENOENT;
        if (!is_free) {
            log_errno("rename err, path = %s\n", path);
        }
        rmdir(place);
        return is_free ? 0 : 1;
    }
    log_warn("foreign path %s --> %s\n", path, target);
    return 0;
}

// The name itself: behind a slash at its end a link would be followed.
void text_copy_without_slash(char (&out)[PATH_SIZE], const char* path)
{
    text_copy(out, path);
    const size_t length = strlen(out);
    if (length > 1 && out[length - 1] == '/') {
        out[length - 1] = '\0';
    }
}

// 1 when a directory stays. Any other entry that cannot be removed shows when the file is created.
int free_name(const char* path)
{
    if (unlink(path) == 0 || (errno != EISDIR && errno != EPERM)) {
        return 0;
    }
    return rmdir(path) == 0 ? 0 : move_aside(path);
}

}  // namespace

int claim_open(const char* path, mode_t mode)
{
    if (path == nullptr) {
        return -1;
    }
    for (int i = 0; i < CLAIM_TRIES; ++i) {
        if (free_name(path) != 0) {
            return -1;
        }
        const int fd = open(path, O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode);
        if (fd >= 0) {
            return fd;
        }
        if (errno != EEXIST) {
            break;
        }
    }
    log_errno("claim err, path = %s\n", path);
    return -1;
}

int claim_file(const char* path)
{
    const fd_guard file(claim_open(path, PRIVATE_MODE));
    return file >= 0 ? 0 : 1;
}

path_owner path_get_owner(const char* path)
{
    if (path == nullptr) {
        return PATH_OF_NOBODY;
    }
    char name[PATH_SIZE];
    text_copy_without_slash(name, path);
    struct stat info {};
    if (lstat(name, &info) != 0) {
        return PATH_OF_NOBODY;
    }
    return info.st_uid == geteuid() ? PATH_OURS : PATH_FOREIGN;
}

int claim_path(const char* path)
{
    if (path_get_owner(path) != PATH_FOREIGN) {
        return 0;
    }
    char name[PATH_SIZE];
    text_copy_without_slash(name, path);
    return move_aside(name);
}
