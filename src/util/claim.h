// Fixed names in /tmp, where anybody may have put something before us: a link to a file of the
// system, a directory of their own. What somebody else put there is never followed or used.
#pragma once

#include <sys/types.h>

// Puts an empty file of that mode, less the umask, in place of whatever lies at path, and opens it
// for writing. The caller owns the descriptor; -1 when it cannot be made, which is logged.
[[nodiscard]] int claim_open(const char* path, mode_t mode);

// The same, readable and writable by us alone and closed again. Where /tmp is sticky, nobody else
// can take it away. 0, or 1 when it cannot be made.
[[nodiscard]] int claim_file(const char* path);

enum path_owner {
    PATH_OF_NOBODY,  // nothing is there, or it cannot be told
    PATH_OURS,
    PATH_FOREIGN,
};

// Whose the thing at path is; of a link itself, not of its target.
path_owner path_get_owner(const char* path);

// Moves a foreign thing at path aside. 0 when nothing foreign is left there, else 1.
int claim_path(const char* path);
