// What the unit tests share. Every test runs in the private world of run_private: it may fill the
// daemon's fixed paths at will, and "/run" belongs to these helpers.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <regex>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace support {

// Standard output is line-buffered, as the daemon's is: its lines and those of its commands stand
// in their order also in a file.
inline const bool line_buffered = setvbuf(stdout, nullptr, _IOLBF, 0) == 0;

// The file's content; empty when there is none.
inline std::string read_file(const std::string& path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Creates or replaces the file, and the directories above it.
inline void write_file(const std::string& path, std::string_view content)
{
    std::filesystem::path parent = std::filesystem::path(path).parent_path();
    if (!parent.empty()) {
        std::filesystem::create_directories(parent);
    }
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(content.data(), static_cast<std::streamsize>(content.size()));
    out.close();
    ASSERT_TRUE(out.good()) << "cannot write " << path;
}

// Creates the directory and those above it.
inline void make_dir(const std::string& path)
{
    std::filesystem::create_directories(path);
}

// Takes away a file, link or whole directory; nothing there is fine.
inline void remove_all(const std::string& path)
{
    std::filesystem::remove_all(path);
}

// A file that outside programs can run, and the directories above it.
inline void write_script(const std::string& path, const std::string& body)
{
    write_file(path, "#!/bin/sh\n" + body + "\n");
    ASSERT_EQ(chmod(path.c_str(), 0755), 0) << path;
}

// The lines of a text without their newlines.
inline std::vector<std::string> lines_of(const std::string& text)
{
    std::istringstream in(text);
    std::vector<std::string> lines;
    std::string line;
    while (std::getline(in, line)) {
        lines.push_back(line);
    }
    return lines;
}

inline bool contains(const std::string& text, const std::string& part)
{
    return text.find(part) != std::string::npos;
}

// How often part stands in text.
inline int count_of(const std::string& text, const std::string& part)
{
    int count = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) {
        count++;
    }
    return count;
}

// A log text with "N" in place of the line numbers: "file.cpp(12)" and "[file.cpp:12]" change with
// every edit of the daemon.
inline std::string without_line_numbers(const std::string& text)
{
    static const std::regex plain(R"((\.(?:cpp|h))\(\d+\))");
    static const std::regex bracketed(R"((\.(?:cpp|h)):\d+\])");
    std::string changed = std::regex_replace(text, plain, "$1(N)");
    return std::regex_replace(changed, bracketed, "$1:N]");
}

// Everything that action and its child processes write to the descriptor of stream.
inline std::string capture(FILE* stream, const std::function<void()>& action)
{
    int target = fileno(stream);
    fflush(stream);
    int kept = dup(target);
    int sink = memfd_create("captured", MFD_CLOEXEC);
    EXPECT_NE(sink, -1);
    dup2(sink, target);

    action();

    fflush(stream);
    dup2(kept, target);
    close(kept);
    std::string text(static_cast<size_t>(lseek(sink, 0, SEEK_END)), '\0');
    EXPECT_EQ(pread(sink, text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
    close(sink);
    return text;
}

inline std::string capture_stdout(const std::function<void()>& action)
{
    return capture(stdout, action);
}

inline std::string capture_stderr(const std::function<void()>& action)
{
    return capture(stderr, action);
}

// What action writes through the log and its commands, without the line numbers.
inline std::string log_of(const std::function<void()>& action)
{
    return without_line_numbers(capture_stdout(action));
}

// What in_child returns when an expectation failed in the child.
inline constexpr int expectation_failed = 111;

// Runs action in a process of its own, for what a process cannot take back, and returns its result
// (0 to 110). 255 when it was killed, also because it took longer than half a minute. An
// expectation that fails in it fails the test.
inline int in_child(const std::function<int()>& action)
{
    fflush(nullptr);
    pid_t child = fork();
    if (child == 0) {
        alarm(30);
        int result = action();
        fflush(nullptr);
        _exit(testing::Test::HasFailure() ? expectation_failed : result);
    }
    int status = 0;
    EXPECT_EQ(waitpid(child, &status, 0), child);
    const int result = WIFEXITED(status) ? WEXITSTATUS(status) : 255;
    EXPECT_NE(result, expectation_failed);
    return result;
}

// Programs in front of PATH that stand in for the system's and write down how they are called.
// One object at a time; all its programs go away with it.
class stub_programs {
public:
    stub_programs()
    {
        remove_all(dir);
        make_dir(dir);
        const char* path = getenv("PATH");
        old_path = path != nullptr ? path : "";
        setenv("PATH", (std::string(dir) + ":" + old_path).c_str(), 1);
    }

    ~stub_programs()
    {
        for (const std::string& path : placed) {
            remove_all(path);
        }
        setenv("PATH", old_path.c_str(), 1);
        remove_all(dir);
        remove_all(call_log);
    }

    stub_programs(const stub_programs&) = delete;
    stub_programs& operator=(const stub_programs&) = delete;

    // A program found by name. body is shell text that runs after the call was written down.
    void add(const std::string& name, const std::string& body = "exit 0")
    {
        write_script(std::string(dir) + "/" + name, record_line(name) + body);
    }

    // The same at a fixed path, for example "/etc/init.d/firewall".
    void add_at(const std::string& path, const std::string& body = "exit 0")
    {
        write_script(path, record_line(path) + body);
        placed.push_back(path);
    }

    // Every call so far in order, as "name argument argument"; arguments stand in it unquoted.
    [[nodiscard]] std::vector<std::string> calls() const { return lines_of(read_file(call_log)); }

    void forget_calls() { remove_all(call_log); }

private:
    static constexpr const char* dir = "/run/stubs";
    static constexpr const char* call_log = "/run/stub_calls";

    static std::string record_line(const std::string& name)
    {
        return "printf '%s\\n' \"" + name + "${*:+ }$*\" >>" + call_log + "\n";
    }

    std::string old_path;
    std::vector<std::string> placed;
};

// A file of that many bytes without content, as a stand-in for a block device's node.
class image {
public:
    explicit image(off_t size, std::string file_path = "/run/image") : file(std::move(file_path))
    {
        int fd = open(file.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
        EXPECT_NE(fd, -1) << file;
        EXPECT_EQ(ftruncate(fd, size), 0);
        close(fd);
    }

    ~image() { remove_all(file); }

    image(const image&) = delete;
    image& operator=(const image&) = delete;

    [[nodiscard]] const char* path() const { return file.c_str(); }

    void write_at(off_t offset, std::string_view bytes) const
    {
        int fd = open(file.c_str(), O_WRONLY | O_CLOEXEC);
        EXPECT_EQ(pwrite(fd, bytes.data(), bytes.size(), offset),
                  static_cast<ssize_t>(bytes.size()));
        close(fd);
    }

    // Runs for example "mkfs.ext4 -q -F" on the image; the test fails when the command does.
    void make_fs(const std::string& command) const
    {
        std::string line = command + " " + file + " >/run/mkfs.log 2>&1";
        EXPECT_EQ(system(line.c_str()), 0) << line << "\n" << read_file("/run/mkfs.log");
    }

private:
    std::string file;
};

// Puts the working directory back: some of the daemon's calls leave it elsewhere.
class kept_working_dir {
public:
    kept_working_dir() : fd(open(".", O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {}

    ~kept_working_dir()
    {
        EXPECT_EQ(fchdir(fd), 0);
        close(fd);
    }

    kept_working_dir(const kept_working_dir&) = delete;
    kept_working_dir& operator=(const kept_working_dir&) = delete;

private:
    int fd;
};

}  // namespace support
