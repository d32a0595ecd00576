// Small files, directories and pipes: whole-file readers and writers, deletion, creation.
// Results are 0 for success and 1 for failure unless a line says otherwise; every failure is
// logged where it happens.
#pragma once

#include <cstdint>
#include <cstdio>
#include <span>

#include "util/answer.h"
#include "util/guard.h"

// Largest file that file_read_all takes: a runaway scratch file must not exhaust a router's memory.
constexpr int64_t FILE_READ_ALL_MAX = 0x7FFFFF;

// An open directory that closes itself; stream is null when it could not be opened.
struct dir_stream {
    dir_guard stream;

    explicit dir_stream(const char* path);

    // Reading broke off, which is logged: what came so far is not the whole directory.
    bool failed = false;

    // The next entry's name, valid until the next call; null after the last, or when reading
    // failed.
    const char* next_name();
};

// How often a directory is walked when reading breaks off, for want of memory say. An entry that
// was only not reached must not count as one that is not there.
constexpr int DIR_WALKS = 3;

// True when something exists at path.
[[nodiscard]] bool path_exists(const char* path);

// True when nothing is there. What cannot be looked at for a moment, for want of memory say, is not
// gone.
[[nodiscard]] bool path_is_gone(const char* path);

// MATCHES when the directory holds an entry of exactly that name.
int dir_has_entry(const char* path, const char* name);

// Creates or truncates the file and writes length bytes. That a full disk took none of them is not
// told: what must be whole is published (util/publish.h).
int file_write(const char* path, const void* bytes, int32_t length);

// The whole content with a terminating zero, to be released with free(); null on failure.
char* file_read_all(const char* path);

// The first characters of a file, cut to out and zero-filled; an empty text on failure.
int file_read_text(const char* path, std::span<char> out);

int file_delete(const char* path);

// mkdir -p; anything that exists at path counts as success. No single quote may stand in path.
int dir_make(const char* path);

// dir_make of a directory in /tmp that must be ours: somebody else's is moved aside first. 0 only
// when what is there then is ours.
int dir_make_own(const char* path);

// Makes the FIFO (mode 0600) when path is missing and opens it for reading and writing without
// blocking, so that it never reports end-of-file. The caller owns the descriptor; -1 on failure.
int fifo_create_open(const char* path);

// What the operations above are made of.

// Size in bytes, 0 on failure; exists (may be null) becomes 1 on success and 0 on failure.
int64_t file_get_size(const char* path, uint8_t* exists);

// Writes length bytes. A stream that takes no more bytes ends the loop as a success.
int stream_write_all(FILE* stream, const void* bytes, int32_t length);

// 0 when exactly length bytes were read, 1 when the data ended early.
int fd_read_full(int fd, void* buffer, int32_t length);

// Kept for a maker's own code; nobody in the daemon calls them.

// Appends length bytes, creating the file when it is missing.
int file_append(const char* path, const void* bytes, int32_t length);

// Reads length bytes at offset. A missing file is created empty (mode 0600) and fails the read.
int file_read_at(const char* path, int32_t offset, void* buffer, int32_t length);

// Zero-fills buffer and reads up to size bytes. A file of at least size bytes leaves no terminating
// zero.
int file_read_buf(const char* path, void* buffer, int32_t size);
