// The status files that tell other programs of the disks and partitions, mounted or not. A reader
// finds each file whole at any time; one that cannot be written anew stays as it was, which is
// logged.
#pragma once

#include "disk/disk_sets.h"

// Clears empty disks, then writes both files. Beware: a disk that waits for its first mount pass
// counts as empty.
void disk_sets_publish(disk_sets* sets);

// Writes the document of a router without any disk and leaves the count alone. 0 or 1.
int disk_status_write_empty_json();

// What disk_sets_publish is made of.

// Writes "disk.json". A partition without a label gets its device name as label. 0, also when the
// document could not be printed or written; 1 when it could not be begun.
int disk_status_write_json(disk_sets* sets);

// Writes the number of disks. 0 or 1.
int disk_status_write_count(const disk_sets* sets);
