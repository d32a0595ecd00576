// Fixed names in /tmp, where anybody may have put something before us: a link to a file of the
// system, a directory of their own. What somebody else put there is never followed or used.
#pragma once

// Puts an empty file, readable and writable by us alone, in place of whatever lies at path. Where
// /tmp is sticky, nobody else can take it away again. 0, or 1 when it cannot be made.
int claim_file(const char* path);

// True when what lies at path, a link itself and not its target, belongs to another user.
bool path_is_foreign(const char* path);

// Moves a foreign thing at path aside. 0 when nothing foreign is left there, else 1.
int claim_path(const char* path);
