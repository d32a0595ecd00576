// The command line.
#pragma once

#include <cstdint>

// 1 when -e asked for the block-input run. It lasts as long as the process.
extern int32_t block_input_mode;

// Reads the options. 0 to go on, 1 after -v. Does not return after a wrong option.
int parse_options(int argc, char* argv[]);
