#include "util/publish.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "log/log.h"
#include "util/claim.h"
#include "util/guard.h"

namespace {

// As fopen makes a file, less the umask.
constexpr mode_t NEW_FILE_MODE = 0666;
constexpr mode_t PERMISSIONS = 07777;

bool write_whole(int fd, const char* text)
{
    size_t left = strlen(text);
    while (left > 0) {
        const ssize_t written = write(fd, text, left);
        if (written < 0) {
            log_info("file write err, len = %d, ret = %d\n", static_cast<int>(left),
                     static_cast<int>(written));
            return false;
        }
        text += written;
        left -= static_cast<size_t>(written);
    }
    return true;
}

// An administrator may have given the file to others; a new one is theirs as well.
bool keep_access(int fd, const char* path)
{
    struct stat old {};
    if (lstat(path, &old) != 0) {
        return errno == ENOENT;
    }
    struct stat fresh {};
    if (!S_ISREG(old.st_mode)) {
        return true;
    }
    if (fstat(fd, &fresh) != 0) {
        return false;
    }
    const bool has_owner = fresh.st_uid == old.st_uid && fresh.st_gid == old.st_gid;
    if (!has_owner && fchown(fd, old.st_uid, old.st_gid) != 0) {
        return false;
    }
    return fresh.st_mode == old.st_mode || fchmod(fd, old.st_mode & PERMISSIONS) == 0;
}

}  // namespace

bool file_publish(const char* path, const char* beside, const char* text)
{
    if (path == nullptr || beside == nullptr || text == nullptr) {
        return false;
    }
    // Also what an earlier run left half written there is out of the way now.
    const fd_guard file(claim_open(beside, NEW_FILE_MODE));
    if (file < 0) {
        log_info("file not exist, fn = %s\n", path);
        return false;
    }
    // Not synchronised: /tmp lies in memory, and what a power cut takes, it takes whole.
    if (write_whole(file, text) && keep_access(file, path) && rename(beside, path) == 0) {
        return true;
    }
    log_errno("publish err, fn = %s\n", path);
    // What cannot be deleted now the next publication deletes.
    unlink(beside);
    return false;
}
