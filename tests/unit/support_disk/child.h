// Runs a piece of a test in a process of its own: for state that lives as long as the process, for
// signals, and for calls that end it.
#pragma once

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <unistd.h>

#include <functional>
#include <string>

#include "support/support.h"

namespace support_disk {

struct child_result {
    int exit_code;
    std::string out;
    std::string err;
};

inline std::string read_memfd(int fd)
{
    std::string text(static_cast<size_t>(lseek(fd, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(fd, text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
    close(fd);
    return text;
}

// in_child with what the child wrote kept apart. The exit code is what in_child returns.
inline child_result run_in_child(const std::function<int()>& action)
{
    int out = memfd_create("out", MFD_CLOEXEC);
    int err = memfd_create("err", MFD_CLOEXEC);
    const int exit_code = support::in_child([&] {
        dup2(out, STDOUT_FILENO);
        dup2(err, STDERR_FILENO);
        return action();
    });
    child_result result{exit_code, read_memfd(out), read_memfd(err)};
    EXPECT_NE(exit_code, support::expectation_failed) << result.out;
    return result;
}

// For actions that hold expectations only: fails when one of them failed or the child died.
inline std::string expect_in_child(const std::function<void()>& action)
{
    child_result result = run_in_child([&] {
        action();
        return 0;
    });
    EXPECT_EQ(result.exit_code, 0) << result.out << result.err;
    return result.out;
}

// Lets no file or directory be opened from now on; for use in a child only.
inline void allow_no_open_files()
{
    const rlimit none{0, 0};
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
}

}  // namespace support_disk
