#include "util/command.h"

#include <cstdlib>
#include <cstring>

#include "util/guard.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr char PLACE[] = "%s";
constexpr size_t PLACE_LENGTH = sizeof(PLACE) - 1;
constexpr char PATH_PUNCTUATION[] = "/+,:@%=";
constexpr char IN_DOUBLE_QUOTES_READ[] = "\"$`\\";

bool is_plain(char c)
{
    const bool ascii = static_cast<unsigned char>(c) < 0x80;
    return !ascii || strchr(NAME_CHARACTERS, c) != nullptr ||
           strchr(PATH_PUNCTUATION, c) != nullptr;
}

bool climbs(const char* path)
{
    const size_t length = strlen(path);
    const bool ends_up = length >= 3 && strcmp(path + length - 3, "/..") == 0;
    return ends_up || strstr(path, "/../") != nullptr;
}

bool is_plain_word(const char* word)
{
    for (const char* c = word; *c != '\0'; ++c) {
        if (!is_plain(*c)) {
            return false;
        }
    }
    return !climbs(word);
}

bool is_taken(const char* word, char quote)
{
    switch (quote) {
        case '\'':
            return strchr(word, '\'') == nullptr;
        case '"':
            return strpbrk(word, IN_DOUBLE_QUOTES_READ) == nullptr;
        default:
            return is_plain_word(word);
    }
}

// The quote that is open behind the format's next character.
char quote_behind(char quote, char c)
{
    if (quote == '\0') {
        return c == '\'' || c == '"' ? c : '\0';
    }
    return c == quote ? '\0' : quote;
}

// A text that takes what fits and drops the rest.
struct bounded_text {
    std::span<char> out;
    size_t used = 0;

    void append(const char* text, size_t length)
    {
        const size_t room = out.size() - 1 - used;
        const size_t taken = length < room ? length : room;
        memcpy(out.data() + used, text, taken);
        used += taken;
    }
};

}  // namespace

bool command_format(std::span<char> out, const char* format,
                    std::initializer_list<const char*> words)
{
    text_clear(out);
    bounded_text command{out};
    const auto* word = words.begin();
    char quote = '\0';
    for (const char* c = format; *c != '\0'; ++c) {
        if (!text_has_prefix(c, PLACE)) {
            quote = quote_behind(quote, *c);
            command.append(c, 1);
            continue;
        }
        if (word == words.end() || *word == nullptr || !is_taken(*word, quote)) {
            text_clear(out);
            return false;
        }
        command.append(*word, strlen(*word));
        ++word;
        c += PLACE_LENGTH - 1;
    }
    return true;
}

char* command_of_word(const char* format, const char* word)
{
    if (word == nullptr) {
        return nullptr;
    }
    const size_t size = strlen(format) + strlen(word) + 1;
    text_guard command(static_cast<char*>(malloc(size)));
    const bool done = command != nullptr && command_format({command.held, size}, format, {word});
    return done ? command.release() : nullptr;
}
