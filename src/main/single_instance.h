// The guard that keeps two daemons from mounting the same disks.
#pragma once

// 0 when this process may run, 1 when another instance holds the pid file. A stale pid file is
// deleted.
int check_single_instance();

// Writes this process's id into the pid file.
void write_pid_file();
