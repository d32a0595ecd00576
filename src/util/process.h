// Looking up other processes by name.
#pragma once

// The first pid that pidof reports for name, 0 when there is none.
int proc_pid_of(const char* name);

// 1 when a process of that name runs, else 0.
int proc_exists(const char* name);
