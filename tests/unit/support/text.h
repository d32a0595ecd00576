// Looking at texts: outputs, logs, files.
#pragma once

#include <string>
#include <vector>

namespace support {

// The lines of a text without their newlines.
std::vector<std::string> lines_of(const std::string& text);

bool contains(const std::string& text, const std::string& part);

// How often part stands in text.
int count_of(const std::string& text, const std::string& part);

// Whether an extended regular expression describes the whole text.
bool matches(const std::string& text, const std::string& pattern);

// A log text with "N" in place of the line numbers: "file.cpp(12)" and "[file.cpp:12]" change with
// every edit of the daemon.
std::string without_line_numbers(std::string text);

}  // namespace support
