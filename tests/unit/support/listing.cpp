#include "support/listing.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <utility>

namespace support {

namespace {

broken_listing* the_broken_listing = nullptr;

}  // namespace

broken_listing::broken_listing(const std::string& dir, std::string entry_name, int breaks)
    : entry(std::move(entry_name)), times(breaks)
{
    EXPECT_EQ(stat(dir.c_str(), &where), 0);
    the_broken_listing = this;
}

broken_listing::~broken_listing()
{
    the_broken_listing = nullptr;
}

bool broken_listing::breaks_at(int dir_fd, const char* name)
{
    struct stat info {};
    const bool meant = times > 0 && entry == name && fstat(dir_fd, &info) == 0 &&
                       info.st_dev == where.st_dev && info.st_ino == where.st_ino;
    times -= meant ? 1 : 0;
    return meant;
}

std::string last_listed(const std::string& dir)
{
    std::string last;
    for (const auto& entry : std::filesystem::directory_iterator(dir)) {
        last = entry.path().filename();
    }
    return last;
}

}  // namespace support

namespace {

// What the kernel has told of a directory and is not handed out yet.
struct told_entries {
    alignas(dirent) char bytes[8192];
    size_t length;
    size_t next;
};

std::map<int, told_entries> open_listings;

}  // namespace

// Stands in front of the C library's, which a statically linked program then no longer has: the
// entries come from the kernel, in the layout that the library hands out as well.
static_assert(offsetof(dirent, d_reclen) == 16 && offsetof(dirent, d_name) == 19);

extern "C" dirent* readdir(DIR* dirp)
{
    const int fd = dirfd(dirp);
    told_entries& told = open_listings[fd];
    const bool is_new = lseek(fd, 0, SEEK_CUR) == 0;
    if (is_new || told.next == told.length) {
        const int saved_errno = errno;
        const long length = syscall(SYS_getdents64, fd, told.bytes, sizeof(told.bytes));
        if (length < 0 && errno == ENOENT) {
            // A directory that was removed meanwhile is at its end.
            errno = saved_errno;
        }
        told.next = 0;
        told.length = length > 0 ? static_cast<size_t>(length) : 0;
        if (length <= 0) {
            return nullptr;
        }
    }
    auto* entry = reinterpret_cast<dirent*>(told.bytes + told.next);
    told.next += entry->d_reclen;
    support::broken_listing* broken = support::the_broken_listing;
    if (broken != nullptr && broken->breaks_at(fd, entry->d_name)) {
        errno = EIO;
        return nullptr;
    }
    return entry;
}
