// What the daemon does on signals: SIGTERM is ignored on purpose, the second SIGINT ends the loop,
// SIGUSR2 copies the log to syslog, others are only logged.
#pragma once

#include <cstdint>

// Number of SIGINTs seen. The handler counts and sets flags; messages come from the loop.
extern volatile int32_t sigint_count;

// Always 0.
int setup_signals();
