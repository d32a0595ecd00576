// What the daemon does on signals: SIGTERM is ignored on purpose, the second SIGINT ends the loop,
// SIGUSR2 copies the log to syslog, others are only logged. The handler counts and sets flags;
// messages come from the loop.
#pragma once

#include <atomic>
#include <cstdint>

// SIGINTs seen in the life of the process.
extern std::atomic<int32_t>& sigint_count;

// Installs the handler and has the manager's loop call signals_report. Always 0.
int setup_signals();

// Logs every signal that arrived since the previous call, a line each. Not for handlers.
void signals_report();

// Forgets every signal that arrived; the handler stays installed. For tests.
void signals_reset();
