#include "support/child.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>

#include "support/capture.h"

namespace support {

int in_child(const std::function<int()>& action)
{
    fflush(nullptr);
    const pid_t child = fork();
    if (child == 0) {
        alarm(30);
        const int result = action();
        fflush(nullptr);
        _exit(testing::Test::HasFailure() ? expectation_failed : result);
    }
    int status = 0;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    const int result = WIFEXITED(status) ? WEXITSTATUS(status) : 255;
    EXPECT_NE(result, expectation_failed);
    return result;
}

child_result run_in_child(const std::function<int()>& action)
{
    const int out = memfd_create("out", MFD_CLOEXEC);
    const int err = memfd_create("err", MFD_CLOEXEC);
    const int exit_code = in_child([&] {
        dup2(out, STDOUT_FILENO);
        dup2(err, STDERR_FILENO);
        return action();
    });
    child_result result{exit_code, read_memfd(out), read_memfd(err)};
    EXPECT_NE(exit_code, expectation_failed) << result.out;
    return result;
}

std::string expect_in_child(const std::function<void()>& action)
{
    child_result result = run_in_child([&] {
        action();
        return 0;
    });
    EXPECT_EQ(result.exit_code, 0) << result.out << result.err;
    return result.out;
}

void allow_no_open_files()
{
    const rlimit none{0, 0};
    EXPECT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
}

}  // namespace support
