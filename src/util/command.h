// Shell commands are made here: only words that a shell takes as they stand get into one.
#pragma once

#include <cstddef>
#include <initializer_list>
#include <span>

constexpr size_t COMMAND_SIZE = 128;       // the buffer of most commands; longer ones are cut
constexpr size_t LONG_COMMAND_SIZE = 256;  // of those that take a whole path of a user's

// What each "%s" of a format takes. Outside quotes: one plain word, that is letters, digits, UTF-8
// and the characters . _ - ! / + , : @ % = alone, and no ".." that climbs. Between single quotes:
// anything but these. Between double quotes: anything but these and $ ` \.

// Fills the places of format with the words in their order, cut to out and zero-filled. False, and
// an empty text, when a word is refused or missing.
[[nodiscard]] bool command_format(std::span<char> out, const char* format,
                                  std::initializer_list<const char*> words);

// The same in a text as long as it takes, to be released with free(); null when the word is refused
// or there is no memory.
[[nodiscard]] char* command_of_word(const char* format, const char* word);
