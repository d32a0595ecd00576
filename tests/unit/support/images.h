// Files that stand in for a block device's node.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

namespace support {

// A file of that many bytes without content; it goes away with the object.
class image {
public:
    explicit image(off_t size, std::string file_path = "/run/image");
    ~image();

    image(const image&) = delete;
    image& operator=(const image&) = delete;

    [[nodiscard]] const char* path() const { return file.c_str(); }

    void write_at(off_t offset, std::string_view bytes) const;

    // Runs for example "mkfs.ext4 -q -F" on the image; the test fails when the command does.
    void make_fs(const std::string& command) const;

private:
    std::string file;
};

}  // namespace support
