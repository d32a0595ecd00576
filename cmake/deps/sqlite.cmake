# How SQLite is built for a small device. Only options that change no file format and that its makers support when they
# are given to the finished sqlite3.c are here: those that cut the grammar would save more, in combinations that
# nobody tests.

set(sqlite_options
    # One thread, no locks around every call.
    SQLITE_THREADSAFE=0
    # No dlopen: the program is static.
    SQLITE_OMIT_LOAD_EXTENSION
    # The statistics of the allocator cost time and room, and nobody reads them.
    SQLITE_DEFAULT_MEMSTATUS=0
    # The allocator is asked for the size of a block; SQLite would otherwise store it before each.
    HAVE_MALLOC_H=1
    HAVE_MALLOC_USABLE_SIZE=1
    # The table has a row for each partition ever seen: 64 KiB of cached pages hold all of it (the default is 2 MB).
    SQLITE_DEFAULT_CACHE_SIZE=-64
    # Pages are allocated one by one, not 20 in advance at every open of the database.
    SQLITE_DEFAULT_PCACHE_INITSZ=0
    # No pool of 48 kB at every open: a connection lives for a few statements.
    SQLITE_OMIT_LOOKASIDE
    # Tables are read, not mapped: a file that a failing flash cuts off would end the daemon by a signal.
    SQLITE_MAX_MMAP_SIZE=0
    # "/tmp" is memory on a router anyway.
    SQLITE_TEMP_STORE=3
    # Saves the writing of the file's times at each commit, which wears the flash.
    HAVE_FDATASYNC=1
    # The statements are the daemon's own: nothing to be checked for depth, and text in double quotes is a mistake.
    SQLITE_MAX_EXPR_DEPTH=0
    SQLITE_DQS=0
    SQLITE_LIKE_DOESNT_MATCH_BLOBS
    # Interfaces that the daemon does not call and that cost something in those that it calls.
    SQLITE_OMIT_AUTHORIZATION
    SQLITE_OMIT_DEPRECATED
    SQLITE_OMIT_PROGRESS_CALLBACK
    SQLITE_OMIT_SHARED_CACHE
    SQLITE_OMIT_TRACE
    SQLITE_OMIT_DECLTYPE
    SQLITE_OMIT_JSON
    SQLITE_UNTESTABLE)
