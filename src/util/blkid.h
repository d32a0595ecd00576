// The line that blkid prints of a device that it knows:
//   /dev/sda1: LABEL="Disk" UUID="0123-4567" TYPE="vfat" PARTUUID="89abcdef-01"
#pragma once

#include <cstddef>

// A value in the line; text is null when the line has none.
struct blkid_value {
    const char* text;
    size_t length;
};

// What a value ends at: TYPE at its quote, the others also at a space, so that a label is cut there
// ("Labels are cut at a space" in docs/limits.md).
inline constexpr char BLKID_QUOTE[] = "\"";
inline constexpr char BLKID_WORD_ENDS[] = "\" ";

// The value behind the first occurrence of key (with its "=") and the quote that follows; empty
// when the text ends at the key. The key matches anywhere, so a longer one that ends the same and
// stands first wins: "Names of unlabelled GPT partitions" in docs/limits.md.
[[nodiscard]] blkid_value blkid_find(const char* line, const char* key, const char* ends);

// True when the line is that of the device: blkid prints nothing of one that it does not know.
[[nodiscard]] bool blkid_knows(const char* line, const char* dev_path);
