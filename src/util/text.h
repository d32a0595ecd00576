// Bounded text: every copy and every formatted buffer of the daemon goes through these.
#pragma once

#include <cstddef>
#include <span>

#include "util/answer.h"

// Copies text into out and zero-fills the rest; cut at one character less than out, always
// terminated. Null counts as empty. An out of no bytes is left alone.
void text_copy(std::span<char> out, const char* text);

// Copies at most count characters of text the same way.
void text_copy_n(std::span<char> out, const char* text, size_t count);

// snprintf into a zero-filled buffer; cutting is wanted, not an error.
void text_format(std::span<char> out, const char* fmt, ...) __attribute__((format(printf, 2, 3)));

// Zero-fills.
void text_clear(std::span<char> out);

// The three texts in one, to be released with free(); null when there is no memory.
[[nodiscard]] char* text_join(const char* a, const char* b, const char* c);

[[nodiscard]] bool text_has_prefix(const char* text, const char* prefix);

// MATCHES when both have the same length and the same bytes.
int str_equal(const char* a, const char* b);

// NO_MATCH when either is null, else as str_equal.
int str_equal_nullsafe(const char* a, const char* b);

// YES when text holds at least count "-" characters, also for a null text.
int str_count_char_at_least(const char* text, int count);
