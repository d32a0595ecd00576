// Runs a piece of a test in a process of its own: for state that lives as long as the process, for
// signals, and for calls that end it.
#pragma once

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <functional>
#include <string>

namespace support_disk {

struct child_result {
    int exit_code;  // -1 when a signal ended it
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

// The action's result is the exit code, unless an expectation in it failed: that gives 111.
inline child_result run_in_child(const std::function<int()>& action)
{
    constexpr int expectation_failed = 111;
    int out = memfd_create("out", MFD_CLOEXEC);
    int err = memfd_create("err", MFD_CLOEXEC);
    fflush(stdout);
    fflush(stderr);
    pid_t pid = fork();
    if (pid == 0) {
        dup2(out, STDOUT_FILENO);
        dup2(err, STDERR_FILENO);
        int code = action();
        fflush(stdout);
        fflush(stderr);
        _exit(testing::Test::HasFailure() ? expectation_failed : code);
    }
    int status = 0;
    EXPECT_EQ(waitpid(pid, &status, 0), pid);
    child_result result{WIFEXITED(status) ? WEXITSTATUS(status) : -1, read_memfd(out),
                        read_memfd(err)};
    EXPECT_NE(result.exit_code, expectation_failed) << result.out;
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
