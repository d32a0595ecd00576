// Files that other programs read while we write them anew.
#pragma once

// Makes text the whole content of the file at path. A reader finds the old content or the new one,
// never less: the new file is written at "beside", in the same directory, and renamed. It gets the
// mode and owner of the file that it replaces, or those of any new file; of a link the name is
// replaced, not what it points to. False when it could not be done, which is logged: the old file
// stays, and nothing stays beside it.
[[nodiscard]] bool file_publish(const char* path, const char* beside, const char* text);
