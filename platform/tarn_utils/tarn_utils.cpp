// Stand-in for the maker's library, for routers and development machines that lack it.

#include "tarn_utils.h"

#include <cstdio>
#include <cstring>

namespace {

// Where the router's start-up scripts leave the model.
constexpr const char* MODEL_PATH = "/tmp/sysinfo/model";

// The administrator's answer on a router with an SD-card slot.
constexpr const char* SDCARD_POINT_PATH = "/etc/tarn_utils/sdcard_point";

// The SD-card text with its terminating zero; callers have room for no more.
constexpr int SDCARD_POINT_SIZE = 16;

char model[256];

// Reads the first line of `path`, without its line end and cut to `size` - 1 characters, into
// `line`. Returns whether it holds anything.
bool read_first_line(const char* path, char* line, int size)
{
    FILE* file = fopen(path, "re");
    if (file == nullptr) {
        return false;
    }

    const bool read = fgets(line, size, file) != nullptr;
    fclose(file);
    if (!read) {
        return false;
    }

    line[strcspn(line, "\r\n")] = '\0';
    return line[0] != '\0';
}

}  // namespace

const char* tarn_get_model(void)
{
    return read_first_line(MODEL_PATH, model, sizeof model) ? model : nullptr;
}

void get_device_microsd(char* buf)
{
    char line[SDCARD_POINT_SIZE];

    if (read_first_line(SDCARD_POINT_PATH, line, sizeof line)) {
        memcpy(buf, line, strlen(line) + 1);
    }
}
