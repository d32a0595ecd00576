// What a piece of a test and its child processes write.
#pragma once

#include <cstdio>
#include <functional>
#include <string>

namespace support {

// Everything that goes to the descriptor of stream while action runs.
std::string capture(FILE* stream, const std::function<void()>& action);

std::string capture_stdout(const std::function<void()>& action);
std::string capture_stderr(const std::function<void()>& action);

// What action writes through the log and its commands, without the line numbers.
std::string log_of(const std::function<void()>& action);

// The whole content of a memory file, which it closes.
std::string read_memfd(int fd);

}  // namespace support
