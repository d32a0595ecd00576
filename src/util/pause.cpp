#include "util/pause.h"

#include <cerrno>
#include <ctime>

namespace {

constexpr int MS_PER_SECOND = 1000;
constexpr int NS_PER_MS = 1000000;

}  // namespace

void pause_seconds(int seconds)
{
    timespec left{};
    left.tv_sec = seconds;
    while (nanosleep(&left, &left) != 0 && errno == EINTR) {
    }
}

void pause_milliseconds(int milliseconds)
{
    timespec left{};
    left.tv_sec = milliseconds / MS_PER_SECOND;
    left.tv_nsec = static_cast<long>(milliseconds % MS_PER_SECOND) * NS_PER_MS;
    while (nanosleep(&left, &left) != 0 && errno == EINTR) {
    }
}
