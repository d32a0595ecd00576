// The three named pipes through which other programs tell of disks, and the parser of their
// one-line messages: "#keyword" or "#keyword:name", ended by newline, carriage return, ";" or a
// zero byte. Any event may arrive on any pipe.
#pragma once

#include <sys/select.h>
#include <sys/time.h>

#include <cstdint>

// To add an event: its code here, its row in event_pipes.cpp, its case in manager_dispatch. Without
// one of them nothing compiles.
enum event_code : int32_t {
    EVENT_NONE = 0,
    EVENT_DISK_ADD = 1,
    EVENT_DISK_REMOVE_DEV = 2,
    EVENT_DISK_REMOVE_DISK = 3,
    EVENT_DISK_SAFE_REMOVE = 4,
    EVENT_DISK_HEART_BEAT = 5,
    EVENT_CODE_END,  // stays last and is no event: one more than the last code
};

constexpr int32_t EVENT_NAME_SIZE = 32;
constexpr uint32_t EVENT_LINE_SIZE = 256;

struct disk_event {
    event_code type;                 // EVENT_NONE when there is none
    char dev_name[EVENT_NAME_SIZE];  // zero-filled; 32 characters leave no terminating zero
};

struct event_pipes {
    int32_t fd_add_remove;
    int32_t fd_safe_remove;
    int32_t fd_remove;
    timeval timeout;    // of one cycle, set anew before every wait
    fd_set read_set;    // the three descriptors
    fd_set except_set;  // the same three
    int32_t max_fd;
    disk_event event;  // the last parsed event
    int32_t event_fd;  // the pipe that its message came from
    int32_t wait_ms;   // how long the next cycle waits; 0 for the idle wait
};

// What event_receive answers when there is an event.
constexpr int EVENT_RECEIVED = 1;

// Makes the pipes afresh, so that no message of an earlier run is left, and opens them. 0 or 1.
int event_pipes_open(event_pipes* pipes);

// Closes and clears. The pipes stay in the file system. Always 0, 1 for a null argument.
int event_pipes_close(event_pipes* pipes);

// One cycle: waits as long as the record says and reads at most one message into buffer (size
// bytes, zeroed by the caller), which stays terminated; a longer line is cut and its rest dropped.
// The number of bytes stored, 0 when there was no message, -1 on a pipe error.
int event_wait(event_pipes* pipes, char* buffer, uint32_t size);

// EVENT_RECEIVED when a valid event is now in the record's event, else 0.
int event_receive(event_pipes* pipes);

// Turns a message into the record's event. Keywords match by prefix. 0, 1 on a bad message.
int event_parse(event_pipes* pipes, const char* message);

// Copies the text behind the first ":" up to a terminator into out (max bytes, zero-filled). 0, or
// 1 without a ":" or when more than max characters follow it.
int event_parse_dev_name(const char* message, char* out, int32_t max);

// The name that log lines print for a type code; "err event" for a number that is none.
const char* event_name(int32_t type);
