#include "support/text.h"

#include <regex>
#include <sstream>

namespace support {

std::vector<std::string> lines_of(const std::string& text)
{
    std::istringstream in(text);
    std::vector<std::string> lines;
    std::string line;
    while (std::getline(in, line)) {
        lines.push_back(line);
    }
    return lines;
}

bool contains(const std::string& text, const std::string& part)
{
    return text.find(part) != std::string::npos;
}

int count_of(const std::string& text, const std::string& part)
{
    int count = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) {
        count++;
    }
    return count;
}

bool matches(const std::string& text, const std::string& pattern)
{
    return std::regex_match(text, std::regex(pattern));
}

std::string without_line_numbers(const std::string& text)
{
    static const std::regex plain(R"((\.(?:cpp|h))\(\d+\))");
    static const std::regex bracketed(R"((\.(?:cpp|h)):\d+\])");
    const std::string changed = std::regex_replace(text, plain, "$1(N)");
    return std::regex_replace(changed, bracketed, "$1:N]");
}

}  // namespace support
