// The -e run: one start-up scan that takes over what is mounted already, and one loop.
#pragma once

// 1 when another instance runs, otherwise 0 after the loop's end.
int run_block_input_mode(int argc, char* argv[]);
