// Removing what lies at a path, whatever it is. Results are 0 for success and 1 for failure unless
// a line says otherwise; every failure is logged where it happens.
#pragma once

// rm -rf of a path; 1 also for one that a shell would not take as it stands in quotes.
int path_rm_rf(const char* path);

// Up to 3 tries each without a pause; the first falls back to path_rm_rf.
int file_remove_retry(const char* path);
int dir_remove_retry(const char* path);
int link_remove_retry(const char* path);

enum path_type {
    PATH_TYPE_ERROR = -1,
    PATH_TYPE_OTHER = 0,
    PATH_TYPE_DIRECTORY = 1,
    PATH_TYPE_FILE = 2,
    PATH_TYPE_LINK = 3,
};

// What lies at a path; a link is not followed.
path_type path_get_type(const char* path);

// Removes a file, link or directory tree. Entries that begin with a dot are left alone, and so is
// the directory that holds one. Leaves the working directory in the parent of path.
int path_remove_tree(const char* path);
