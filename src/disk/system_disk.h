// The disk that the router itself runs from: an SD card, an eMMC chip or a stick like a user's, and
// nobody's to mount a second time or to remove.
#pragma once

// True when the whole disk or one of its partitions holds a file system that the router lives on
// (SYSTEM_DIRS), whatever they are called: device numbers are compared, not names.
bool is_system_disk(const char* root_dev);
