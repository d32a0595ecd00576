#include "support/images.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <utility>

#include "support/files.h"

namespace support {

image::image(off_t size, std::string file_path) : file(std::move(file_path))
{
    const int fd = open(file.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    EXPECT_NE(fd, -1) << file;
    EXPECT_EQ(ftruncate(fd, size), 0);
    close(fd);
}

image::~image()
{
    remove_all(file);
}

void image::write_at(off_t offset, std::string_view bytes) const
{
    const int fd = open(file.c_str(), O_WRONLY | O_CLOEXEC);
    EXPECT_EQ(pwrite(fd, bytes.data(), bytes.size(), offset), static_cast<ssize_t>(bytes.size()));
    close(fd);
}

void image::make_fs(const std::string& command) const
{
    const std::string line = command + " " + file + " >/run/mkfs.log 2>&1";
    EXPECT_EQ(system(line.c_str()), 0) << line << "\n" << read_file("/run/mkfs.log");
}

}  // namespace support
