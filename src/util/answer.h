// What the operations answer that ask something and return an int. Both customs are older than this
// header and kept, since makers' own code calls the operations; our own return bool.
#pragma once

// Those that look something up or compare: str_equal, dir_has_entry, dev_name_is_disk ...
constexpr int MATCHES = 0;
constexpr int NO_MATCH = 1;

// Those that ask for a state: proc_exists, is_dev_mounted ...
constexpr int YES = 1;
constexpr int NO = 0;
