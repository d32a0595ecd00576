#include "util/remove_tree.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "log/log.h"
#include "util/command.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/guard.h"
#include "util/text.h"

namespace {

// Without a pause: they help against what passes at once, like a file that came into a directory in
// between, and a lasting refusal is soon known.
constexpr int REMOVE_TRIES = 3;

bool removed_in_tries(const char* path, int (*remove_call)(const char*))
{
    for (int i = 0; i < REMOVE_TRIES; ++i) {
        if (remove_call(path) == 0) {
            return true;
        }
    }
    return false;
}

int remove_directory(const char* path)
{
    dir_stream dir(path);
    if (dir.stream == nullptr || chdir(path) != 0) {
        log_errno("ope dir err, path = %s\n", path);
        return 1;
    }
    while (const char* name = dir.next_name()) {
        // Hidden entries stay as well as "." and "..": what a user hid is not ours to delete.
        if (name[0] != '.') {
            path_remove_tree(name);
        }
    }
    if (chdir("../") != 0) {
        log_errno("ope dir err, path = %s\n", path);
        return 1;
    }
    dir_remove_retry(path);
    return 0;
}

}  // namespace

int path_rm_rf(const char* path)
{
    if (path == nullptr) {
        return 1;
    }
    const text_guard command(command_of_word("rm -rf \"%s\"", path));
    const bool done = command != nullptr && exec_cmd(command, 1) == 0;
    if (!done) {
        log_errno("rm err, fn = %s\n", path);
    }
    return done ? 0 : 1;
}

int file_remove_retry(const char* path)
{
    return removed_in_tries(path, remove) ? 0 : path_rm_rf(path);
}

int dir_remove_retry(const char* path)
{
    if (removed_in_tries(path, rmdir)) {
        return 0;
    }
    log_errno("rm err, fn = %s\n", path);
    return 1;
}

int link_remove_retry(const char* path)
{
    if (removed_in_tries(path, unlink)) {
        return 0;
    }
    log_errno("rm err, fn = %s\n", path);
    return 1;
}

path_type path_get_type(const char* path)
{
    if (path == nullptr) {
        log_err("err!\n");
        return PATH_TYPE_ERROR;
    }
    struct stat info {};
    if (lstat(path, &info) != 0) {
        log_errno("file not exist, file = %s\n", path);
        return PATH_TYPE_ERROR;
    }
    if (S_ISDIR(info.st_mode)) {
        return PATH_TYPE_DIRECTORY;
    }
    if (S_ISREG(info.st_mode)) {
        return PATH_TYPE_FILE;
    }
    return S_ISLNK(info.st_mode) ? PATH_TYPE_LINK : PATH_TYPE_OTHER;
}

int path_remove_tree(const char* path)
{
    switch (path_get_type(path)) {
        case PATH_TYPE_DIRECTORY:
            return remove_directory(path);
        case PATH_TYPE_FILE:
            file_remove_retry(path);
            return 0;
        case PATH_TYPE_LINK:
            link_remove_retry(path);
            return 0;
        default:
            return 1;
    }
}
