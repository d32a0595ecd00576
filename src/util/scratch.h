// What an outside program says: its command writes into a scratch file, the text is read from there
// and the file deleted. No two queries of one file may overlap.
//
// Deletions are told in the log when there is nothing to delete, and whoever reads it knows these
// lines: each query deletes when it always did. A command whose words are refused does not run,
// which is logged, nor does one whose file cannot be made.
#pragma once

#include <cstdio>
#include <initializer_list>
#include <span>

#include "util/guard.h"

enum scratch_end {
    SCRATCH_KEPT,               // until the next query
    SCRATCH_DELETED,            // once the command has run
    SCRATCH_DELETED_WHEN_READ,  // kept when it could not be read
};

struct scratch_query {
    const char* path;
    scratch_end end;
    bool starts_clear = false;  // what the last query left is deleted first
    bool wants_end = false;     // a program that was killed has said nothing
};

// The last of the words fills the place of the file in the command.
using scratch_words = std::initializer_list<const char*>;

// All that the program says; null when it could not be read. Released, and the file deleted, at the
// end of the scope.
struct scratch_text {
    const scratch_query& query;
    bool ran;
    text_guard text;

    scratch_text(const scratch_query& asked, const char* format, scratch_words words,
                 const char* file = __builtin_FILE(), int line = __builtin_LINE());
    ~scratch_text();
    scratch_text(const scratch_text&) = delete;
    scratch_text& operator=(const scratch_text&) = delete;
};

// The same line by line, as an open stream.
struct scratch_lines {
    const scratch_query& query;
    bool ran;
    stream_guard stream;

    scratch_lines(const scratch_query& asked, const char* format, scratch_words words,
                  const char* file = __builtin_FILE(), int line = __builtin_LINE());
    ~scratch_lines();
    scratch_lines(const scratch_lines&) = delete;
    scratch_lines& operator=(const scratch_lines&) = delete;
};

// The first characters of what the program says, cut to out and zero-filled. False, and an empty
// text, when it could not be read.
[[nodiscard]] bool scratch_read(const scratch_query& query, std::span<char> out, const char* format,
                                scratch_words words, const char* file = __builtin_FILE(),
                                int line = __builtin_LINE());
