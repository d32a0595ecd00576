// Runs a piece of a test in a process of its own: for what a process cannot take back, and for
// calls that end it.
#pragma once

#include <functional>
#include <string>

namespace support {

// What in_child returns when an expectation failed in the child.
inline constexpr int expectation_failed = 111;

// Runs action in a child and returns its result (0 to 110). 255 when it was killed, also because it
// took longer than half a minute. An expectation that fails in it fails the test.
int in_child(const std::function<int()>& action);

struct child_result {
    int exit_code;
    std::string out;
    std::string err;
};

// in_child with what the child wrote kept apart. The exit code is what in_child returns.
child_result run_in_child(const std::function<int()>& action);

// For actions that hold expectations only: fails when one of them failed or the child died. Returns
// what it wrote to standard output.
std::string expect_in_child(const std::function<void()>& action);

// Lets no file or directory be opened from now on; for use in a child only.
void allow_no_open_files();

}  // namespace support
