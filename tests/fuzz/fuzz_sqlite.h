// SQLite as the fuzz programs want it: quick, since an input opens the database several times.
#pragma once

// Takes the locks out of SQLite, and its memory from the C library instead of from the sanitizer,
// which would check the memory of a library that it cannot see into. Before the first connection.
void fuzz_quicken_sqlite();

// Databases live in memory from here on, one for each absolute path. One of them is there as long
// as a connection is open.
void fuzz_keep_databases_in_memory();
