// Removing what lies at a path, whatever it is. Results are 0 for success and 1 for failure unless
// a line says otherwise; every failure is logged where it happens.
#pragma once

// rm -rf of a path.
int path_rm_rf(const char* path);

// Up to 3 tries each without a pause; the first falls back to path_rm_rf.
int file_remove_retry(const char* path);
int dir_remove_retry(const char* path);
int link_remove_retry(const char* path);

// What lies at a path, links not followed: -1 error, 0 other, 1 directory, 2 file, 3 link.
int path_get_type(const char* path);

// Removes a file, link or directory tree. Entries that begin with a dot are left alone, and so is
// the directory that holds one. Leaves the working directory in the parent of path.
int path_remove_tree(const char* path);
