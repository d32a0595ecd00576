#include "main/options.h"

#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "log/log.h"

int32_t block_input_mode = 0;

namespace {

// Also in CMakeLists.txt and in the package's Makefile.
constexpr char VERSION[] = "1.05";

// Fixed, so that one source always gives the same binary.
constexpr char BUILD_DATE[] = "Feb 16 2022";
constexpr char BUILD_TIME[] = "20:29:10";

void print_version()
{
    printf("version:%s\n", VERSION);
    printf("date:%s %s\n", BUILD_DATE, BUILD_TIME);
}

// -e is left out: it is for the block hook, not for people.
[[noreturn]] void exit_with_usage(const char* program)
{
    fprintf(stderr,
            "Usage: %s [option]\n"
            "          -d             # debug\n"
            "          -v             # version\n",
            program);
    exit(1);
}

}  // namespace

int parse_options(int argc, char* argv[])
{
    for (int option = getopt(argc, argv, "edv"); option != -1; option = getopt(argc, argv, "edv")) {
        log_info("opt = %c\n", option);
        switch (option) {
            case 'e':
                block_input_mode = 1;
                break;
            case 'd':
                log_set_debug();
                break;
            case 'v':
                print_version();
                return 1;
            default:
                exit_with_usage(argv[0]);
        }
    }
    return 0;
}
