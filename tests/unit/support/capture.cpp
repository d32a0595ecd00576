#include "support/capture.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include "support/text.h"

namespace support {

namespace {

// Standard output is line-buffered, as the daemon's is: its lines and those of its commands stand
// in their order also in a file.
[[maybe_unused]] const bool line_buffered = setvbuf(stdout, nullptr, _IOLBF, 0) == 0;

}  // namespace

std::string read_memfd(int fd)
{
    std::string text(static_cast<size_t>(lseek(fd, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(fd, text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
    close(fd);
    return text;
}

std::string capture(FILE* stream, const std::function<void()>& action)
{
    const int target = fileno(stream);
    fflush(stream);
    const int kept = dup(target);
    const int sink = memfd_create("captured", MFD_CLOEXEC);
    EXPECT_NE(sink, -1);
    dup2(sink, target);

    action();

    fflush(stream);
    dup2(kept, target);
    close(kept);
    return read_memfd(sink);
}

std::string capture_stdout(const std::function<void()>& action)
{
    return capture(stdout, action);
}

std::string capture_stderr(const std::function<void()>& action)
{
    return capture(stderr, action);
}

std::string log_of(const std::function<void()>& action)
{
    return without_line_numbers(capture_stdout(action));
}

}  // namespace support
