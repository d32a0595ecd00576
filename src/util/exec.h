// The one way a shell command is run.
#pragma once

// Runs command through the shell, waits for it and prints it on standard output first. attempts is
// taken from 1 to 9, any other value means 5. 0 once the command ran to its end, whatever its exit
// code; 1 when every attempt was killed by a signal or could not be started.
int exec_cmd(const char* command, int attempts, const char* file = __builtin_FILE(),
             int line = __builtin_LINE());

// exec_cmd, once, of a command that redirects its output into the scratch file at path. An empty
// file of ours takes the place of whatever lies there first, so that the shell follows no planted
// link. -1, and the command does not run, when that cannot be done: what then lies at path is not
// to be read.
int exec_cmd_into(const char* command, const char* path, const char* file = __builtin_FILE(),
                  int line = __builtin_LINE());

// system() with the default SIGCHLD handling for its duration; the raw wait status.
int run_system(const char* command);
