#include "support/text.h"

#include <regex.h>

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
    regex_t compiled;
    if (regcomp(&compiled, ("^(" + pattern + ")$").c_str(), REG_EXTENDED | REG_NOSUB) != 0) {
        return false;
    }
    const bool found = regexec(&compiled, text.c_str(), 0, nullptr, 0) == 0;
    regfree(&compiled);
    return found;
}

std::string without_line_numbers(std::string text)
{
    struct place {
        std::string before;
        char behind;
    };
    for (const place& number :
         {place{".cpp(", ')'}, place{".cpp:", ']'}, place{".h(", ')'}, place{".h:", ']'}}) {
        for (size_t at = text.find(number.before); at != std::string::npos;
             at = text.find(number.before, at + 1)) {
            const size_t start = at + number.before.size();
            const size_t end = text.find_first_not_of("0123456789", start);
            if (end != std::string::npos && end > start && text[end] == number.behind) {
                text.replace(start, end - start, "N");
            }
        }
    }
    return text;
}

}  // namespace support
