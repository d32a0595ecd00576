/* Lets the daemon's clock run faster: its waits, pauses and timers keep their proportions.
 *
 * Preloaded into the daemon by the tests, that a fault in every call can be tried in
 * minutes.  HASTE says how many times faster; HASTE_WAITS, where it is set, is how many
 * times shorter the waits for an event are, so that it does its idle work more often than
 * its timers want.  The daemon's commands inherit the preloading and keep the time of
 * everybody.
 */
#define _GNU_SOURCE
#include <dlfcn.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/select.h>
#include <time.h>
#include <unistd.h>

enum { MILLION = 1000000, BILLION = 1000000000 };

static int64_t haste = 1;
static int64_t haste_waits = 1;
static int64_t begun;

static int64_t now_nanoseconds(void)
{
    struct timespec now;
    clock_gettime(CLOCK_REALTIME, &now);
    return now.tv_sec * (int64_t)BILLION + now.tv_nsec;
}

/* Only the daemon itself; its name is in its path. */
__attribute__((constructor)) static void attach(void)
{
    char program[4096] = "";
    const char* wanted = getenv("HASTE");
    begun = now_nanoseconds();
    if (wanted != NULL && readlink("/proc/self/exe", program, sizeof(program) - 1) >= 0 &&
        strstr(program, "/tarn_nas_diskmanager") != NULL) {
        const char* waits = getenv("HASTE_WAITS");
        haste = atoi(wanted);
        haste_waits = waits != NULL ? atoi(waits) : haste;
    }
}

time_t time(time_t* out)
{
    time_t now = (time_t)((begun + (now_nanoseconds() - begun) * haste) / BILLION);
    if (out != NULL) {
        *out = now;
    }
    return now;
}

int select(int count, fd_set* reads, fd_set* writes, fd_set* excepts, struct timeval* timeout)
{
    int (*real)(int, fd_set*, fd_set*, fd_set*, struct timeval*) = dlsym(RTLD_NEXT, "select");
    if (timeout != NULL) {
        int64_t wanted = (timeout->tv_sec * (int64_t)MILLION + timeout->tv_usec) / haste_waits;
        timeout->tv_sec = wanted / MILLION;
        timeout->tv_usec = wanted % MILLION;
    }
    return real(count, reads, writes, excepts, timeout);
}

int nanosleep(const struct timespec* wanted, struct timespec* left)
{
    int64_t all = (wanted->tv_sec * (int64_t)BILLION + wanted->tv_nsec) / haste;
    struct timespec request = {all / BILLION, all % BILLION};
    struct timespec rest = request;
    int (*real)(const struct timespec*, struct timespec*) = dlsym(RTLD_NEXT, "nanosleep");
    int code = real(&request, &rest);
    if (left != NULL) {
        int64_t slow = (rest.tv_sec * (int64_t)BILLION + rest.tv_nsec) * haste;
        *left = (struct timespec){slow / BILLION, slow % BILLION};
    }
    return code;
}
