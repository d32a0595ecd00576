// The test program's own readdir(): real unless a test says otherwise.
#pragma once

#include <sys/stat.h>

#include <string>

namespace support {

// Reading the directory breaks off with EIO at one of its entries, so many times, until the end of
// the scope. One object at a time.
class broken_listing {
public:
    broken_listing(const std::string& dir, std::string entry_name, int breaks);
    ~broken_listing();

    broken_listing(const broken_listing&) = delete;
    broken_listing& operator=(const broken_listing&) = delete;

    // How often reading has still to break off.
    [[nodiscard]] int left() const { return times; }

    // Asked for each entry that is read; true when reading breaks off at it.
    bool breaks_at(int dir_fd, const char* name);

private:
    struct stat where {};
    std::string entry;
    int times;
};

// The entry that comes last when the directory is read.
std::string last_listed(const std::string& dir);

}  // namespace support
