#include "util/pause.h"

#include <cerrno>
#include <ctime>

void pause_seconds(int seconds)
{
    timespec left{};
    left.tv_sec = seconds;
    while (nanosleep(&left, &left) != 0 && errno == EINTR) {
    }
}
