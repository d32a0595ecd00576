// Guards: each owns one thing and gives it back at the end of its scope, however that ends. Nobody
// closes or frees by hand beside these; the log alone, which lies below this folder, does.
#pragma once

#include <dirent.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

// A guard stands for its thing wherever that is passed or compared; "held" names it where a format
// wants it. NOTHING is what it holds when there is nothing to give back.
template <typename T, T NOTHING, auto GIVE_BACK>
struct guard {
    T held;

    explicit guard(T thing) : held(thing) {}
    ~guard() { reset(NOTHING); }
    guard(const guard&) = delete;
    guard& operator=(const guard&) = delete;

    operator T() const { return held; }
    // Descriptor 0 is something and -1 is nothing: compare instead.
    explicit operator bool() const = delete;

    // Gives back what is held and takes another thing.
    void reset(T thing)
    {
        if (held != NOTHING) {
            GIVE_BACK(held);
        }
        held = thing;
    }

    // The caller owns the thing from now on.
    [[nodiscard]] T release()
    {
        const T thing = held;
        held = NOTHING;
        return thing;
    }
};

using fd_guard = guard<int, -1, close>;
using stream_guard = guard<FILE*, nullptr, fclose>;
using dir_guard = guard<DIR*, nullptr, closedir>;
using text_guard = guard<char*, nullptr, free>;  // text from malloc
