#include "fuzz.h"

#include <fcntl.h>
#include <sanitizer/asan_interface.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include "util/exec.h"
#include "util/pause.h"

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv);
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace {

constexpr long TMPFS = 0x01021994;
constexpr char PLAIN_CHARACTERS[] = "abcdefghijklmnopqrstuvwxyz"
                                    "ABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                    "0123456789/._-!,:=+@% ";

bool is_tmpfs(const char* path)
{
    struct statfs info {};
    return statfs(path, &info) == 0 && info.f_type == TMPFS;
}

// The lowest descriptor that is free: it stays the same unless one is left open.
int free_descriptor()
{
    const int fd = dup(STDERR_FILENO);
    close(fd);
    return fd;
}

// Bytes beyond ASCII mean nothing to a shell.
bool is_plain(char c)
{
    return (c & 0x80) != 0 || (c != '\0' && strchr(PLAIN_CHARACTERS, c) != nullptr);
}

// Only words, and one pair of quotes around a directory to make: nothing that a disk, an event, a
// row or a listing says may mean anything to the shell.
void require_plain(const std::string& command)
{
    const std::string quoted = "mkdir -p '";
    std::string words = command;
    if (words.rfind(quoted, 0) == 0 && words.back() == '\'') {
        words = words.substr(quoted.size(), words.size() - quoted.size() - 1);
    }
    const bool plain = std::all_of(words.begin(), words.end(), is_plain);
    if (!plain) {
        fprintf(stderr, "command: %s\n", command.c_str());
    }
    require(plain, "nothing from outside carries shell syntax");
}

std::string run_stand_in(const std::string& command)
{
    require_plain(command);
    return command.rfind("mkdir ", 0) == 0 ? "" : fuzz_answer(command);
}

}  // namespace

// These take the place of the daemon's own.

int run_system(const char* command)
{
    run_stand_in(command);
    return 0;
}

int exec_cmd(const char* command, int attempts, const char* file, int line)
{
    static_cast<void>(attempts);
    static_cast<void>(file);
    static_cast<void>(line);
    run_stand_in(command);
    return 0;
}

int exec_cmd_into(const char* command, const char* path, const char* file, int line)
{
    static_cast<void>(file);
    static_cast<void>(line);
    const std::string text = command;
    const std::string redirection = std::string(" > ") + path;
    const size_t arrow = text.find(redirection);
    require(arrow != std::string::npos && arrow + redirection.size() == text.size(),
            "the output goes to the scratch file");
    put_file(path, run_stand_in(text.substr(0, arrow)));
    return 0;
}

void pause_seconds(int seconds)
{
    static_cast<void>(seconds);
}

void pause_milliseconds(int milliseconds)
{
    static_cast<void>(milliseconds);
}

const std::string FIELD_SEPARATOR = "\xff\x1f";

void require(bool kept, const char* promise, const char* file, int line)
{
    if (!kept) {
        fprintf(stderr, "%s:%d: broken promise: %s\n", file, line, promise);
        abort();
    }
}

std::vector<std::string> fields_of(const std::string& input, size_t count)
{
    std::vector<std::string> fields;
    size_t begin = 0;
    for (size_t end = 0; end != std::string::npos; begin = end + FIELD_SEPARATOR.size()) {
        end = input.find(FIELD_SEPARATOR, begin);
        fields.push_back(input.substr(begin, end - begin));
    }
    if (fields.size() < count) {
        fields.resize(count);
    }
    return fields;
}

std::optional<std::string> content_of(const char* path)
{
    const int fd = open(path, O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
        return std::nullopt;
    }
    std::string content;
    char part[16384];
    for (ssize_t got = read(fd, part, sizeof(part)); got > 0; got = read(fd, part, sizeof(part))) {
        content.append(part, static_cast<size_t>(got));
    }
    close(fd);
    return content;
}

void put_file(const char* path, const std::string& content)
{
    const int fd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    require(fd >= 0 &&
                write(fd, content.data(), content.size()) == static_cast<ssize_t>(content.size()),
            "the fuzz program can write its files");
    close(fd);
}

std::string c_text(const std::string& bytes)
{
    return bytes.substr(0, bytes.find('\0'));
}

// For speed. Inputs are short-lived: a small store of freed memory finds their mistakes as well.
const char* __asan_default_options()
{
    return "quarantine_size_mb=16:malloc_context_size=8";
}

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv)
{
    static_cast<void>(argc);
    static_cast<void>(argv);
    for (const char* path : {"/tmp", "/etc/config", "/sys/block"}) {
        if (!is_tmpfs(path)) {
            fprintf(stderr, "%s is not private: start this by tests/unit/run_private\n", path);
            exit(1);
        }
    }
    // The readers log all that they meet; libFuzzer itself writes to standard error.
    if (freopen("/dev/null", "w", stdout) == nullptr) {
        return 1;
    }
    fuzz_begin();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const int before = free_descriptor();
    fuzz_one(std::string(reinterpret_cast<const char*>(data), size));
    require(free_descriptor() == before, "every descriptor is closed");
    return 0;
}
