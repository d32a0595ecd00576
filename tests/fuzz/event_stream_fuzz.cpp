// Bytes written into the three event pipes. Which messages they are, what each means and in which
// order they come is worked out here a second time. Accepted events are then carried out on an
// inventory, as the manager does it, so that a name reaches every command that it can reach.
//
// Fields: what is written into each pipe. The input's size chooses whether event_receive takes the
// messages or event_wait, and with which buffer.

#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>

#include "disk/discovery.h"
#include "disk/disk_sets.h"
#include "disk/removal.h"
#include "fuzz.h"
#include "manager/event_pipes.h"
#include "util/text.h"

namespace {

constexpr size_t PIPES = 3;
constexpr size_t FIELD_MAX = 2048;  // well below what a pipe holds
constexpr int CARRIED_OUT_MAX = 2;  // so many events an input: each may run a dozen commands

event_pipes pipes;
disk_sets disks;

struct pending_bytes {
    std::array<std::string, PIPES> of_pipe;

    [[nodiscard]] bool any() const
    {
        return std::any_of(of_pipe.begin(), of_pipe.end(),
                           [](const std::string& bytes) { return !bytes.empty(); });
    }

    // What one cycle gives to a reader that keeps limit bytes; empty when there is no message.
    std::string next(size_t limit)
    {
        const std::string terminators("\n\r;\0", 4);
        for (std::string& bytes : of_pipe) {
            const size_t end = bytes.find_first_of(terminators);
            if (end == std::string::npos) {
                bytes.clear();
                continue;
            }
            std::string message = bytes.substr(0, std::min(end + 1, limit));
            bytes.erase(0, end + 1);
            return message;
        }
        return "";
    }
};

struct expected_event {
    int32_t type = EVENT_NONE;
    std::string name;
};

struct known_event {
    const char* keyword;
    bool carries_name;
};

// By code, from 1.
constexpr std::array<known_event, 5> KNOWN_EVENTS = {{
    {"add", true},
    {"remove_dev", true},
    {"remove_disk", true},
    {"safe_remove", false},
    {"heart_beat", false},
}};

static_assert(KNOWN_EVENTS.size() == EVENT_CODE_END - 1, "every event is expected here");

expected_event meaning_of(const std::string& message)
{
    const std::string text = c_text(message);
    for (size_t i = 0; i < KNOWN_EVENTS.size(); ++i) {
        const known_event& event = KNOWN_EVENTS[i];
        if (text.empty() || text.compare(1, strlen(event.keyword), event.keyword) != 0) {
            continue;
        }
        const auto type = static_cast<int32_t>(i + 1);
        if (!event.carries_name) {
            return {type, ""};
        }
        const size_t colon = text.find(':');
        if (colon == std::string::npos || text.size() - colon - 1 > EVENT_NAME_SIZE) {
            return {};
        }
        const std::string name = text.substr(colon + 1);
        return {type, name.substr(0, name.find_first_of("\n\r;"))};
    }
    return {};
}

void require_event(const expected_event& expected)
{
    require(pipes.event.type == expected.type, "the event is the one that its keyword says");
    char name[EVENT_NAME_SIZE]{};
    memcpy(name, expected.name.data(), expected.name.size());
    require(expected.type == EVENT_NONE || memcmp(name, pipes.event.dev_name, sizeof(name)) == 0,
            "the name is the text behind the colon, zero-filled");
}

void carry_out()
{
    char name[EVENT_NAME_SIZE + 1];
    text_copy_n(name, pipes.event.dev_name, EVENT_NAME_SIZE);
    switch (pipes.event.type) {
        case EVENT_DISK_ADD:
            disk_sets_add_dev(&disks, name);
            break;
        case EVENT_DISK_REMOVE_DEV:
            remove_dev(&disks, name);
            break;
        case EVENT_DISK_REMOVE_DISK:
            remove_disk(&disks, name);
            break;
        case EVENT_DISK_SAFE_REMOVE:
            safe_remove_all(&disks);
            break;
        case EVENT_DISK_HEART_BEAT:
        case EVENT_NONE:
        case EVENT_CODE_END:
            break;
    }
    require(disk_sets_count(&disks) <= 2, "only what the kernel lists is ever added");
}

pending_bytes write_all(const std::vector<std::string>& fields)
{
    pending_bytes pending;
    const int fds[PIPES] = {pipes.fd_add_remove, pipes.fd_safe_remove, pipes.fd_remove};
    for (size_t i = 0; i < PIPES; ++i) {
        pending.of_pipe[i] = fields[i].substr(0, FIELD_MAX);
        const auto size = static_cast<ssize_t>(pending.of_pipe[i].size());
        require(write(fds[i], pending.of_pipe[i].data(), pending.of_pipe[i].size()) == size,
                "the pipes were empty");
    }
    return pending;
}

void receive_all(pending_bytes pending)
{
    int carried_out = 0;
    while (pending.any()) {
        const std::string message = pending.next(EVENT_LINE_SIZE - 1);
        const bool called = !message.empty() && message[0] == '#';
        const expected_event expected = called ? meaning_of(message) : expected_event{};
        pipes.event = {};
        const int received = event_receive(&pipes);
        require(received == (expected.type != EVENT_NONE ? 1 : 0), "only valid events count");
        require_event(expected);
        if (received == 1 && carried_out++ < CARRIED_OUT_MAX) {
            carry_out();
        }
    }
}

void wait_for_all(pending_bytes pending, size_t size)
{
    while (pending.any()) {
        const std::string message = pending.next(size - 1);
        exact_buffer buffer(size);
        memset(buffer.data(), 0, size);
        const int stored = event_wait(&pipes, buffer.data(), static_cast<uint32_t>(size));
        require(stored == static_cast<int>(message.size()), "a message is counted");
        std::string expected = message;
        expected.resize(size);
        require(buffer.all() == expected,
                "a message is cut at the buffer, a broken one leaves none");

        const expected_event meaning = meaning_of(message);
        const int parsed = event_parse(&pipes, buffer.data());
        require(parsed == (meaning.type != EVENT_NONE ? 0 : 1), "the parser judges alike");
        require_event(meaning);
    }
}

void require_empty()
{
    for (const int fd : {pipes.fd_add_remove, pipes.fd_safe_remove, pipes.fd_remove}) {
        int left = 0;
        require(ioctl(fd, FIONREAD, &left) == 0 && left == 0, "nothing is left in a pipe");
    }
}

}  // namespace

void fuzz_begin()
{
    for (const char* dir : {"/tmp/tarn_nas", "/sys/block/sda", "/sys/block/sda/sda1",
                            "/sys/block/mmcblk0", "/sys/block/mmcblk0/mmcblk0p1"}) {
        mkdir(dir, 0755);
    }
    for (const char* node : {"/dev/sda", "/dev/sda1", "/dev/mmcblk0", "/dev/mmcblk0p1"}) {
        put_file(node, std::string(4096, '\0'));
    }
    require(event_pipes_open(&pipes) == 0, "the pipes can be opened");
}

// Every device is there and carries a filesystem. Nothing is mounted.
std::string fuzz_answer(const std::string& command)
{
    const std::string blkid = "blkid ";
    if (command.rfind(blkid, 0) == 0) {
        return command.substr(blkid.size()) + ": LABEL=\"a\" UUID=\"1-2\" TYPE=\"ext4\"\n";
    }
    return "";
}

void fuzz_one(const std::string& input)
{
    const std::vector<std::string> fields = fields_of(input, PIPES);
    disk_sets_init(&disks);
    if (input.size() % 3 != 0) {
        receive_all(write_all(fields));
    } else {
        wait_for_all(write_all(fields), 2 + input.size() % EVENT_LINE_SIZE);
    }
    require_empty();
}
