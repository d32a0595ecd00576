// A reader of JSON that takes nothing that the standard (RFC 8259) does not allow.
#pragma once

#include <string>
#include <string_view>
#include <vector>

// A document as tokens in their order, keys as strings. The texts stand in one piece of memory.
struct json_tokens {
    std::string kinds;         // of each: { } [ ], s for a string, n for a number
    std::string texts;         // the strings' bytes with escapes resolved, the numbers as written
    std::vector<size_t> ends;  // of each one's text

    void clear();
    void add(char kind, std::string_view text = "");
    [[nodiscard]] std::string_view text(size_t index) const;
};

// Reads a whole document. False when the text is no JSON, or when it holds a word (true, false,
// null) or an escape of a character beyond ASCII: the daemon publishes none. Bytes beyond ASCII are
// taken as they are, whatever their encoding.
bool strict_json(const std::string& text, json_tokens* tokens);
