// Feeds arbitrary bytes to everything that reads what others wrote: event messages, lines of the
// mount listing, blkid's text, remembered paths and the first sectors of a disk. The first byte
// chooses the reader.

#include <sys/mman.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "disk/mount_table.h"
#include "fs/fs_probe.h"
#include "manager/event_pipes.h"
#include "util/paths.h"
#include "util/text.h"

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv);
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace {

void require(bool promise)
{
    if (!promise) {
        abort();
    }
}

void fuzz_event(const std::string& text)
{
    event_pipes pipes{};
    const int ret = event_parse(&pipes, text.c_str());
    require((ret == 0) == (pipes.event.type != EVENT_NONE));
    require(pipes.event.type >= EVENT_NONE && pipes.event.type <= EVENT_DISK_HEART_BEAT);
}

void fuzz_pipe(const std::string& bytes)
{
    int ends[2];
    if (pipe(ends) != 0) {
        return;
    }
    const ssize_t written = write(ends[1], bytes.data(), bytes.size());
    close(ends[1]);
    event_pipes pipes{};
    pipes.fd_add_remove = pipes.fd_safe_remove = pipes.fd_remove = ends[0];
    char line[EVENT_LINE_SIZE]{};
    const int stored = event_wait(&pipes, line, sizeof(line));
    close(ends[0]);
    require(stored >= 0 && stored < static_cast<int>(sizeof(line)) && stored <= written);
    require(line[sizeof(line) - 1] == '\0');
}

void fuzz_mount_lines(const std::string& text)
{
    mount_table table{};
    for (int i = 0; i <= MOUNT_TABLE_SIZE; ++i) {
        parse_mount_line(&table, text.c_str());
    }
    require(table.num == 0 || table.num == MOUNT_TABLE_SIZE);
    for (int i = 0; i < table.num; ++i) {
        require(strnlen(table.entries[i].dev, MOUNT_DEV_SIZE) < MOUNT_DEV_SIZE);
        require(strnlen(table.entries[i].path, MOUNT_PATH_SIZE) < MOUNT_PATH_SIZE);
    }
}

void fuzz_texts(const std::string& bytes)
{
    const std::string text(bytes.c_str());
    const char* value = text_quoted_value(text.c_str(), "UUID=");
    require(value == nullptr || value <= text.c_str() + text.size());

    char name[32];
    if (mount_path_to_name(text.c_str(), name, sizeof(name)) == 0) {
        require(strlen(name) < sizeof(name));
    }
    if (mount_path_is_usable(text.c_str())) {
        require(text.find_first_of(" ;|&$`'\"\\\n") == std::string::npos);
        require(text.rfind('/') == strlen(MOUNT_BASE));
    }
}

void fuzz_probes(const std::string& bytes)
{
    const int fd = memfd_create("device", MFD_CLOEXEC);
    if (fd < 0 || write(fd, bytes.data(), bytes.size()) < 0) {
        return;
    }
    const int32_t fs_type = fs_probe_all(fd);
    close(fd);
    require(fs_type >= FS_NONE && fs_type < FS_CODE_COUNT && fs_type != FS_ERR);
}

constexpr void (*READERS[])(const std::string&) = {
    fuzz_event, fuzz_pipe, fuzz_mount_lines, fuzz_texts, fuzz_probes,
};

}  // namespace

extern "C" int LLVMFuzzerInitialize(int* argc, char*** argv)
{
    static_cast<void>(argc);
    static_cast<void>(argv);
    // The readers log all that they meet; libFuzzer itself writes to standard error.
    return freopen("/dev/null", "w", stdout) != nullptr ? 0 : 1;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    if (size == 0) {
        return 0;
    }
    const std::string input(reinterpret_cast<const char*>(data + 1), size - 1);
    READERS[data[0] % (sizeof(READERS) / sizeof(READERS[0]))](input);
    return 0;
}
