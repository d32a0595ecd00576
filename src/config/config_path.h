// Paths for the configuration library: made of their parts, copied, looked up, and judged before
// something is written. What uci2 stands on.
#pragma once

#include <uci.h>

#include <cstddef>

#include "util/guard.h"

constexpr size_t CONFIG_PATH_SIZE = 128;  // of paths that are made of parts

// One character more than such a path may have, so that one which is too long shows.
using config_path = char[CONFIG_PATH_SIZE + 1];

// "type[index].option" and "package.section.option"; a null option is left out. False, and logged,
// when a part is missing or the path is too long: cut it would name another option.
[[nodiscard]] bool config_path_by_index(config_path& out, const char* type, int index,
                                        const char* option);
[[nodiscard]] bool config_path_by_name(config_path& out, const char* package, const char* section,
                                       const char* option);

// A private copy of a path, with a value behind "=" or without: the library writes into the text
// that it parses, and its look-up result points into it. Null when an argument is.
struct path_copy {
    text_guard text;

    explicit path_copy(const char* path);
    path_copy(const char* path, const char* value);
};

// False when the library finds no place for the path; the second also when what it names is not
// there, which is the context's error then.
[[nodiscard]] bool config_look_up(uci_context* ctx, const path_copy& path, uci_ptr* ptr);
[[nodiscard]] bool config_look_up_complete(uci_context* ctx, const path_copy& path, uci_ptr* ptr);

// Logs why something is refused that the library would not survive, or could not read again once it
// is written. Always false.
bool config_refuse(const char* reason, const char* path);

// True when a section of that type can be read again.
[[nodiscard]] bool config_type_is_sound(const char* type);

using config_call = int (*)(uci_context*, uci_ptr*);

// May the call be made of what the path was found to name? The library itself asks less. False is
// logged.
[[nodiscard]] bool config_call_is_sound(config_call call, const uci_ptr& ptr, const char* path);
