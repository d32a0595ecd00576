/* Allocations that fail on demand, told apart by the library that asks for them.
 *
 * Preloaded into the daemon by the tests.  A file shared with the test says what is to
 * fail and takes down what happened.  The daemon's commands inherit the preloading;
 * they pass everything through.
 *
 * An operation is what one sqlite3_open or one JSON document needs.  In a sweep each
 * further operation of the watched library lets one later allocation fail.
 */
#define _GNU_SOURCE
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <link.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/mman.h>
#include <unistd.h>

enum { SQLITE, CJSON, OWN, KINDS };
enum { MAX_OPERATIONS = 20000, MAX_LIVE = 4096 };

struct operation {
    int32_t nth;    /* which allocation was to fail */
    int32_t seen;   /* allocations made */
    int32_t failed; /* of these, failed on purpose */
    int32_t left;   /* of these, not given back by the end of the operation */
};

/* The layout is known to the test. */
struct control {
    int32_t armed;   /* 0 nothing fails, else 1 + kind */
    int32_t from_on; /* not only the nth fails, but all from it on */
    int32_t next;    /* which fails in the next operation; 0 none */
    int32_t step;    /* added to next after every `repeat` operations */
    int32_t repeat;
    int32_t every; /* kind OWN has no operations: every so many-th allocation fails */
    int32_t own_seen;
    int32_t own_failed;
    int32_t own_left; /* blocks of the program itself that are not given back */
    int32_t count;    /* operations finished */
    struct operation done[MAX_OPERATIONS];
};

struct range {
    uintptr_t begin, end;
};

extern void* __libc_malloc(size_t size);
extern void* __libc_calloc(size_t count, size_t size);
extern void* __libc_realloc(void* old, size_t size);
extern void __libc_free(void* block);

static struct control* control;
static struct range ranges[KINDS][2];
static struct operation current; /* of the watched library */
static void* live[MAX_LIVE];     /* its blocks that were not given back so far */
static int live_count;
static int repeated;
static int opening; /* SQLite closes by itself what it could not open */
static void* document;

static int add_range(struct dl_phdr_info* info, size_t size, void* data)
{
    (void)size;
    (void)data;
    int kind = strstr(info->dlpi_name, "/libsqlite3.")                             ? SQLITE
               : strstr(info->dlpi_name, "/libcjson.")                             ? CJSON
               : info->dlpi_name[0] == '\0' || strstr(info->dlpi_name, "/libc.so") ? OWN
                                                                                   : KINDS;
    if (kind == KINDS) {
        return 0;
    }
    struct range* range = &ranges[kind][ranges[kind][0].end != 0];
    for (int i = 0; i < info->dlpi_phnum; ++i) {
        const ElfW(Phdr)* header = &info->dlpi_phdr[i];
        if (header->p_type == PT_LOAD && (header->p_flags & PF_X)) {
            range->begin = info->dlpi_addr + header->p_vaddr;
            range->end = range->begin + header->p_memsz;
        }
    }
    return 0;
}

/* Only the daemon itself; its name is in its path. */
__attribute__((constructor)) static void attach(void)
{
    char program[4096] = "";
    const char* path = getenv("ALLOC_CONTROL");
    if (path == NULL || readlink("/proc/self/exe", program, sizeof(program) - 1) < 0 ||
        strstr(program, "/tarn_nas_diskmanager") == NULL) {
        return;
    }
    dl_iterate_phdr(add_range, NULL);
    int fd = open(path, O_RDWR | O_CLOEXEC);
    void* shared = mmap(NULL, sizeof(*control), PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    close(fd);
    control = shared != MAP_FAILED ? shared : NULL;
}

static int kind_of(uintptr_t caller)
{
    for (int kind = 0; kind < KINDS; ++kind) {
        for (int i = 0; i < 2; ++i) {
            if (caller >= ranges[kind][i].begin && caller < ranges[kind][i].end) {
                return kind;
            }
        }
    }
    return KINDS;
}

static int watched(int kind)
{
    return control != NULL && control->armed == 1 + kind;
}

static int own_must_fail(void)
{
    int32_t seen = ++control->own_seen;
    if (seen < control->next) {
        return 0;
    }
    int fails = control->from_on || (seen - control->next) % control->every == 0;
    control->own_failed += fails;
    return fails;
}

static int must_fail(int kind)
{
    if (!watched(kind)) {
        return 0;
    }
    if (kind == OWN) {
        return own_must_fail();
    }
    ++current.seen;
    if (current.nth == 0 || current.seen < current.nth) {
        return 0;
    }
    int fails = control->from_on || current.seen == current.nth;
    current.failed += fails;
    return fails;
}

static void note_left(void)
{
    if (watched(OWN)) {
        control->own_left = live_count;
    }
}

static void forget(void* block)
{
    for (int i = 0; i < live_count; ++i) {
        if (live[i] == block) {
            live[i] = live[--live_count];
            note_left();
            return;
        }
    }
}

/* What the C library keeps for the program, as the buffer of an open file, is its own affair. */
static int is_counted(int kind, uintptr_t caller)
{
    struct range program = ranges[OWN][0];
    return watched(kind) && (kind != OWN || (caller >= program.begin && caller < program.end));
}

static void* remember(void* caller, void* block)
{
    if (block != NULL && live_count < MAX_LIVE &&
        is_counted(kind_of((uintptr_t)caller), (uintptr_t)caller)) {
        live[live_count++] = block;
        note_left();
    }
    return block;
}

static void* refuse(void)
{
    errno = ENOMEM;
    return NULL;
}

void* malloc(size_t size)
{
    void* caller = __builtin_return_address(0);
    return must_fail(kind_of((uintptr_t)caller)) ? refuse() : remember(caller, __libc_malloc(size));
}

void* calloc(size_t count, size_t size)
{
    void* caller = __builtin_return_address(0);
    return must_fail(kind_of((uintptr_t)caller)) ? refuse()
                                                 : remember(caller, __libc_calloc(count, size));
}

void* realloc(void* old, size_t size)
{
    void* caller = __builtin_return_address(0);
    if (must_fail(kind_of((uintptr_t)caller))) {
        return refuse();
    }
    forget(old);
    return remember(caller, __libc_realloc(old, size));
}

void free(void* block)
{
    forget(block);
    __libc_free(block);
}

static void begin(int kind)
{
    if (watched(kind)) {
        current = (struct operation){.nth = control->next};
        live_count = 0;
    }
}

/* One that began before the sweep was armed is none of it. */
static void end(int kind)
{
    if (!watched(kind) || current.nth == 0 || control->count >= MAX_OPERATIONS) {
        return;
    }
    current.left = live_count;
    control->done[control->count++] = current;
    current = (struct operation){0};
    if (++repeated >= control->repeat) {
        repeated = 0;
        control->next += control->step;
    }
}

int sqlite3_open(const char* name, void** db)
{
    int (*real)(const char*, void**) = dlsym(RTLD_NEXT, "sqlite3_open");
    begin(SQLITE);
    opening = 1;
    int code = real(name, db);
    opening = 0;
    if (*db == NULL) {
        end(SQLITE);
    }
    return code;
}

int sqlite3_close(void* db)
{
    int (*real)(void*) = dlsym(RTLD_NEXT, "sqlite3_close");
    int code = real(db);
    if (!opening) {
        end(SQLITE);
    }
    return code;
}

void* cJSON_CreateObject(void)
{
    void* (*real)(void) = dlsym(RTLD_NEXT, "cJSON_CreateObject");
    int is_root = document == NULL;
    if (is_root) {
        begin(CJSON);
    }
    void* object = real();
    if (is_root) {
        document = object;
        if (object == NULL) {
            end(CJSON);
        }
    }
    return object;
}

void cJSON_Delete(void* item)
{
    void (*real)(void*) = dlsym(RTLD_NEXT, "cJSON_Delete");
    real(item);
    if (item != NULL && item == document) {
        document = NULL;
        end(CJSON);
    }
}
