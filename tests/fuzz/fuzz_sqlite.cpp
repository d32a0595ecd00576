#include "fuzz_sqlite.h"

#include <malloc.h>
#include <sqlite3.h>

#include <cstddef>

#include "fuzz.h"

// The C library's own allocator, behind the sanitizer's malloc.
extern "C" void* __libc_malloc(size_t size);
extern "C" void* __libc_realloc(void* memory, size_t size);
extern "C" void __libc_free(void* memory);

namespace {

// The size stands in front of each piece.
constexpr size_t HEAD = 16;

struct head {
    int size;
};

head* head_of(void* memory)
{
    return reinterpret_cast<head*>(static_cast<char*>(memory) - HEAD);
}

void* behind(void* piece, int size)
{
    if (piece == nullptr) {
        return nullptr;
    }
    static_cast<head*>(piece)->size = size;
    return static_cast<char*>(piece) + HEAD;
}

void* allocate(int size)
{
    return behind(__libc_malloc(HEAD + static_cast<size_t>(size)), size);
}

void* reallocate(void* memory, int size)
{
    return behind(__libc_realloc(head_of(memory), HEAD + static_cast<size_t>(size)), size);
}

void release(void* memory)
{
    __libc_free(head_of(memory));
}

int size_of(void* memory)
{
    return memory != nullptr ? head_of(memory)->size : 0;
}

int round_up(int size)
{
    return (size + 7) / 8 * 8;
}

int begin(void* context)
{
    static_cast<void>(context);
    return SQLITE_OK;
}

void end(void* context)
{
    static_cast<void>(context);
}

}  // namespace

void fuzz_quicken_sqlite()
{
    const sqlite3_mem_methods methods = {allocate, release, reallocate, size_of,
                                         round_up, begin,   end,        nullptr};
    require(sqlite3_config(SQLITE_CONFIG_SINGLETHREAD) == SQLITE_OK &&
                sqlite3_config(SQLITE_CONFIG_MALLOC, &methods) == SQLITE_OK &&
                sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 1) == SQLITE_OK,
            "SQLite can be configured");
}

void fuzz_keep_databases_in_memory()
{
    sqlite3_vfs* memory = sqlite3_vfs_find("memdb");
    require(memory != nullptr && sqlite3_vfs_register(memory, 1) == SQLITE_OK,
            "this SQLite can keep databases in memory");
}
