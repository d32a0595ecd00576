// Looking up other processes by name.
#pragma once

#include "util/answer.h"

// The first pid that pidof reports for name, 0 when there is none.
int proc_pid_of(const char* name);

// YES when a process of that name runs, else NO.
int proc_exists(const char* name);
