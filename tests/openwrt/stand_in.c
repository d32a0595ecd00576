/* A process with the disk manager's signals, pid file and pipe, for the scripts to deal with.
 *
 * Notes in /tmp/notes what happens to it. The words in /tmp/mode make it difficult:
 *   busy   works in commands of 3 s each, during which SIGINT is ignored
 *   hang   never looks at the stop flag
 *   slow   takes 3 s to end after it has removed its pid file
 *   deaf   does not read the pipe
 * When /tmp/restart appears it ends and restarts itself through the init script. */

#include <fcntl.h>
#include <signal.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

static const char PID_FILE[] = "/tmp/tarn_nas//disk_manager_pid";
static const char PIPE[] = "/tmp/tarn_nas/pipe_disk_add_remove";

static volatile sig_atomic_t sigint_count;

static void note(const char* format, ...)
{
    FILE* notes = fopen("/tmp/notes", "a");
    va_list args;
    va_start(args, format);
    vfprintf(notes, format, args);
    va_end(args);
    fclose(notes);
}

static int has_mode(const char* word)
{
    char text[64] = "";
    FILE* mode = fopen("/tmp/mode", "r");
    if (mode) {
        if (!fgets(text, sizeof text, mode))
            text[0] = 0;
        fclose(mode);
    }
    return strstr(text, word) != NULL;
}

static void on_sigint(int number)
{
    (void)number;
    sigint_count++;
}

static int another_runs(void)
{
    char mine[32] = "", all[128] = "";
    FILE* file = fopen(PID_FILE, "r");
    if (!file)
        return 0;
    size_t used = fread(mine, 1, sizeof mine - 1, file);
    fclose(file);
    if (system("pgrep -f tarn_nas_diskmanager > /tmp/disk_pid_tmp") != 0 || used == 0)
        return 0;
    file = fopen("/tmp/disk_pid_tmp", "r");
    used = fread(all, 1, sizeof all - 1, file);
    fclose(file);
    return strstr(all, mine) != NULL;
}

static void read_pipe(int fd)
{
    char byte;
    while (read(fd, &byte, 1) == 1)
        note("%c", byte);
}

static void cycle(int fd)
{
    int waits = 1;

    if (has_mode("busy")) {
        system("sleep 3");
        /* Longer than the second between two signals, so that one of them meets it at rest. */
        waits = 15;
    }
    if (!has_mode("deaf"))
        read_pipe(fd);
    while (waits-- > 0)
        usleep(100000);
}

int main(void)
{
    int restart = 0;

    if (another_runs()) {
        note("gave way\n");
        return 1;
    }
    signal(SIGTERM, SIG_IGN);
    signal(SIGINT, on_sigint);
    mkdir("/tmp/tarn_nas", 0755);
    FILE* file = fopen(PID_FILE, "w");
    fprintf(file, "%d", getpid());
    fclose(file);
    unlink(PIPE);
    mkfifo(PIPE, 0600);
    int fd = open(PIPE, O_RDWR | O_NONBLOCK);
    note("start\n");

    while (sigint_count < 2 || has_mode("hang")) {
        cycle(fd);
        if (access("/tmp/restart", F_OK) == 0) {
            unlink("/tmp/restart");
            restart = 1;
            break;
        }
    }

    close(fd);
    unlink(PID_FILE);
    if (restart)
        system("/etc/init.d/tarn_nas_diskmanager restart &");
    if (has_mode("slow"))
        for (int i = 0; i < 30; i++)
            usleep(100000);
    note("end\n");
    return 0;
}
