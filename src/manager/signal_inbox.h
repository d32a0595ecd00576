// Signals between their arrival and the loop. A handler may interrupt anything, so it only counts
// here; the loop tells of what was counted when nothing is under way.
#pragma once

// Counts an arrived signal; of a number that is never handled nothing is kept. For handlers: no
// lock, no memory, errno untouched.
void signal_inbox_note(int sig);

// Logs every signal counted since the previous call, a line each. Not for handlers.
void signal_inbox_report();
