// What the fuzz programs share: the driver around one input, a stand-in for the shell, and checks.
// They write the daemon's fixed paths and only start in the private world of the unit tests.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>
#include <vector>

// Each program defines these three.

// Prepares what all inputs share, once.
void fuzz_begin();

// Runs one input and aborts when a promise is broken. Descriptors and memory must be as before.
void fuzz_one(const std::string& input);

// What a command that the daemon runs prints. "mkdir" is answered by the driver.
std::string fuzz_answer(const std::string& command);

// Ends the program with the text and the place when a promise is broken.
void require(bool kept, const char* promise, const char* file = __builtin_FILE(),
             int line = __builtin_LINE());

// The input's parts between separators (FIELD_SEPARATOR), at least count of them; those that are
// missing are empty.
extern const std::string FIELD_SEPARATOR;
std::vector<std::string> fields_of(const std::string& input, size_t count);

// A file's content, or nothing.
std::optional<std::string> content_of(const char* path);
void put_file(const char* path, const std::string& content);

// What C makes of bytes: the text before the first zero byte.
std::string c_text(const std::string& bytes);

// A text field of fixed size: always terminated, and filled with zero bytes behind the text.
template <size_t N>
bool is_clean_text(const char (&field)[N])
{
    size_t i = 0;
    while (i < N && field[i] != '\0') {
        ++i;
    }
    if (i == N) {
        return false;
    }
    while (i < N && field[i] == '\0') {
        ++i;
    }
    return i == N;
}

// Exactly size bytes on the heap, for code that must not write one more; the sanitizer sees it.
struct exact_buffer {
    std::vector<char> bytes;

    explicit exact_buffer(size_t size) : bytes(size, '\x7e') {}
    char* data() { return bytes.data(); }
    [[nodiscard]] size_t size() const { return bytes.size(); }
    [[nodiscard]] std::string all() const { return {bytes.data(), bytes.size()}; }
    [[nodiscard]] std::string text() const { return c_text(all()); }
};
