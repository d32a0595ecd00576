// The one logging call of the daemon and its outputs: standard output always, syslog on request.
#pragma once

#include <cstdint>

// Levels. Any other value is printed like LOG_LVL_INFO.
constexpr int32_t LOG_LVL_INFO = 1;   // trace
constexpr int32_t LOG_LVL_WARN = 2;   // noticed, the daemon goes on
constexpr int32_t LOG_LVL_ERR = 3;    // an operation failed
constexpr int32_t LOG_LVL_ERRNO = 4;  // an operation failed, with the system's error text

// Prints one message with the base name of file and the line in front. Callers end fmt with a
// newline themselves. Header and format together are cut at 255 characters, the message at 511.
// Keeps errno. Not for signal handlers.
void log_printf(int32_t level, const char* file, int32_t line, const char* fmt, ...)
    __attribute__((format(printf, 4, 5)));

#define log_info(...) log_printf(LOG_LVL_INFO, __FILE__, __LINE__, __VA_ARGS__)
#define log_warn(...) log_printf(LOG_LVL_WARN, __FILE__, __LINE__, __VA_ARGS__)
#define log_err(...) log_printf(LOG_LVL_ERR, __FILE__, __LINE__, __VA_ARGS__)
#define log_errno(...) log_printf(LOG_LVL_ERRNO, __FILE__, __LINE__, __VA_ARGS__)

// printf to standard output without header or level, for lines with a form of their own.
void log_print_stdout(const char* fmt, ...) __attribute__((format(printf, 1, 2)));

// Switches the log on. It starts switched on and nothing switches it off.
void log_set_debug();

// Copies every later message to syslog as well. Safe to call from a signal handler.
void log_enable_syslog();

// Opens the dated log file of this start. 0 on success, 1 on failure.
int log_file_open();

// Closes the log file when one is open, for the last time: no log file call may follow. Always 0.
int log_file_close();

// Kept for a maker's own code; nobody in the daemon calls it, and its log file stays empty.
// Appends text to the log file, opening it when needed. 0 when written; 1 when the file cannot be
// opened or 1501 writes were made already, so that a chatty caller cannot fill a RAM disk.
int log_file_write(const char* text);

// Puts the log back to its beginning: no syslog, no log file, no line counted. For tests. A log
// file that is open must be closed before.
void log_reset();
