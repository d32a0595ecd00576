// Files, directories and other things to meet at a path. "/run" belongs to these helpers.
#pragma once

#include <string>
#include <string_view>

namespace support {

// The file's content; empty when there is none.
std::string read_file(const std::string& path);

// Creates or replaces the file, and the directories above it.
void write_file(const std::string& path, std::string_view content);

// A file that outside programs can run, and the directories above it.
void write_script(const std::string& path, const std::string& body);

// Creates the directory and those above it.
void make_dir(const std::string& path);

void make_link(const std::string& target, const std::string& path);

// Something that exists and that open refuses, also to root.
void make_socket(const std::string& path);

// Links are not followed.
bool exists(const std::string& path);

// Takes away a file, link or whole directory; nothing there is fine.
void remove_all(const std::string& path);

// Puts the working directory back: some of the daemon's calls leave it elsewhere.
class kept_working_dir {
public:
    kept_working_dir();
    ~kept_working_dir();

    kept_working_dir(const kept_working_dir&) = delete;
    kept_working_dir& operator=(const kept_working_dir&) = delete;

private:
    int fd;
};

}  // namespace support
