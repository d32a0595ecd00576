#include "strict_json.h"

#include <cctype>
#include <cstring>

namespace {

struct reader {
    const std::string& text;
    json_tokens* tokens;
    size_t at = 0;

    [[nodiscard]] char next() const { return at < text.size() ? text[at] : '\0'; }
    [[nodiscard]] bool next_is_digit() const
    {
        return std::isdigit(static_cast<unsigned char>(next())) != 0;
    }

    void skip_blanks()
    {
        while (at < text.size() && strchr(" \t\n\r", text[at]) != nullptr && text[at] != '\0') {
            ++at;
        }
    }

    bool take(char c)
    {
        if (at >= text.size() || text[at] != c) {
            return false;
        }
        ++at;
        return true;
    }

    bool take_digits()
    {
        const size_t begin = at;
        while (next_is_digit()) {
            ++at;
        }
        return at > begin;
    }

    bool number()
    {
        const size_t begin = at;
        take('-');
        if (!take('0') && !take_digits()) {
            return false;
        }
        if (take('.') && !take_digits()) {
            return false;
        }
        if (take('e') || take('E')) {
            if (!take('+')) {
                take('-');
            }
            if (!take_digits()) {
                return false;
            }
        }
        tokens->add('n', std::string_view(text).substr(begin, at - begin));
        return !next_is_digit();
    }

    bool escape()
    {
        const char* const names = "\"\\/bfnrt";
        const char* const meanings = "\"\\/\b\f\n\r\t";
        if (take('u')) {
            return code_point();
        }
        const char* name = next() != '\0' ? strchr(names, next()) : nullptr;
        if (name == nullptr) {
            return false;
        }
        ++at;
        tokens->texts.push_back(meanings[name - names]);
        return true;
    }

    bool code_point()
    {
        int value = 0;
        for (int i = 0; i < 4; ++i, ++at) {
            if (std::isxdigit(static_cast<unsigned char>(next())) == 0) {
                return false;
            }
            const int letter = std::tolower(next());
            value = value * 16 + (letter <= '9' ? letter - '0' : letter - 'a' + 10);
        }
        tokens->texts.push_back(static_cast<char>(value));
        return value < 0x80;
    }

    bool string()
    {
        if (!take('"')) {
            return false;
        }
        while (at < text.size() && text[at] != '"') {
            if (static_cast<unsigned char>(text[at]) < 0x20) {
                return false;
            }
            if (text[at] != '\\') {
                tokens->texts.push_back(text[at++]);
            } else if (++at; !escape()) {
                return false;
            }
        }
        tokens->add('s');
        return take('"');
    }

    bool key()
    {
        skip_blanks();
        if (!string()) {
            return false;
        }
        skip_blanks();
        return take(':');
    }

    // The members between two brackets; an object's have keys.
    bool members(char open, char close)
    {
        take(open);
        tokens->add(open);
        skip_blanks();
        bool ok = true;
        if (next() != close) {
            do {
                ok = (open == '[' || key()) && value();
                skip_blanks();
            } while (ok && take(','));
        }
        tokens->add(close);
        return ok && take(close);
    }

    bool value()
    {
        skip_blanks();
        switch (next()) {
            case '{':
                return members('{', '}');
            case '[':
                return members('[', ']');
            case '"':
                return string();
            default:
                return number();
        }
    }
};

}  // namespace

void json_tokens::clear()
{
    kinds.clear();
    texts.clear();
    ends.clear();
}

void json_tokens::add(char kind, std::string_view text)
{
    kinds.push_back(kind);
    texts.append(text);
    ends.push_back(texts.size());
}

std::string_view json_tokens::text(size_t index) const
{
    const size_t begin = index > 0 ? ends[index - 1] : 0;
    return std::string_view(texts).substr(begin, ends[index] - begin);
}

bool strict_json(const std::string& text, json_tokens* tokens)
{
    tokens->clear();
    reader json{text, tokens};
    const bool ok = json.value();
    json.skip_blanks();
    return ok && json.at == text.size();
}
