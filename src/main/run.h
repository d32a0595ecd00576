// One run of the daemon: the guard against a second instance, the preparation, the manager's work,
// the tear-down and, when the manager asked for it, the restart.
#pragma once

// 0 when this process may run, 1 when another instance holds the pid file. A stale pid file is
// deleted.
int check_single_instance();

// Writes this process's id into the pid file. A failure is logged and stops nothing.
void write_pid_file();

// Opens the log file, writes the pid file, makes the directories, unmounts what an earlier run left
// and removes the system's own mounting hook. Failures are logged and stop nothing. Always 0.
int init_environment();

// The shorter preparation of block-input mode: pid file and mount base. Always 0.
int init_block_input_environment();

// The ordinary run: scan and loop. The status with which the process ends: 1 when another instance
// runs, otherwise 0 after the loop's end.
[[nodiscard]] int run_daemon();

// The -e run: one start-up scan that takes over what is mounted already, and one loop. The
// arguments are not looked at. Results as above.
int run_block_input_mode(int argc, char* argv[]);

// Has the init script start the daemon again, without waiting for it. Always 0.
int restart_self();
