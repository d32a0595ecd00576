// What surrounds a run: preparation before it and the restart after it.
#pragma once

// Opens the log file, writes the pid file, makes the directories, unmounts what an earlier run left
// and removes the system's own mounting hook. Failures are logged and stop nothing. Always 0.
int init_environment();

// The shorter preparation of block-input mode: pid file and mount base.
void init_block_input_environment();

// Has the init script start the daemon again, without waiting for it. Always 0.
int restart_self();
