#include "util/text.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

void text_copy(std::span<char> out, const char* text)
{
    text_copy_n(out, text != nullptr ? text : "", out.size());
}

void text_copy_n(std::span<char> out, const char* text, size_t count)
{
    if (out.empty()) {
        return;
    }
    const size_t room = out.size() - 1;
    const size_t length = strnlen(text, count < room ? count : room);
    memmove(out.data(), text, length);
    memset(out.data() + length, 0, out.size() - length);
}

void text_format(std::span<char> out, const char* fmt, ...)
{
    char* text = out.data();
    const size_t size = out.size();
    memset(text, 0, size);
    va_list args;
    va_start(args, fmt);
    vsnprintf(text, size, fmt, args);
    va_end(args);
}

void text_clear(std::span<char> out)
{
    memset(out.data(), 0, out.size());
}

char* text_join(const char* a, const char* b, const char* c)
{
    const size_t size = strlen(a) + strlen(b) + strlen(c) + 1;
    auto* joined = static_cast<char*>(malloc(size));
    if (joined != nullptr) {
        text_format({joined, size}, "%s%s%s", a, b, c);
    }
    return joined;
}

bool text_has_prefix(const char* text, const char* prefix)
{
    return strncmp(text, prefix, strlen(prefix)) == 0;
}

int str_equal(const char* a, const char* b)
{
    return strcmp(a, b) == 0 ? MATCHES : NO_MATCH;
}

int str_equal_nullsafe(const char* a, const char* b)
{
    if (a == nullptr || b == nullptr) {
        return NO_MATCH;
    }
    return str_equal(a, b);
}

int str_count_char_at_least(const char* text, int count)
{
    if (text == nullptr) {
        return YES;
    }
    int dashes = 0;
    for (const char* c = text; *c != '\0'; ++c) {
        if (*c == '-') {
            ++dashes;
        }
    }
    return dashes >= count ? YES : NO;
}
