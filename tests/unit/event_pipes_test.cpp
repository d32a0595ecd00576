#include "manager/event_pipes.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>

#include "support/capture.h"
#include "support/files.h"
#include "support/records.h"
#include "support/stubs.h"
#include "support/text.h"
#include "util/paths.h"

using support::capture_stdout;
using support::contains;

namespace {

// The name field with all its bytes.
std::string whole_name(const disk_event& event)
{
    return {event.dev_name, strnlen(event.dev_name, EVENT_NAME_SIZE)};
}

void send(const char* pipe_path, const std::string& bytes)
{
    int fd = open(pipe_path, O_WRONLY | O_NONBLOCK | O_CLOEXEC);
    ASSERT_GE(fd, 0) << pipe_path;
    EXPECT_EQ(write(fd, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    close(fd);
}

struct known_event {
    const char* keyword;
    const char* log_name;
    bool carries_name;
};

// By code, from 1.
constexpr known_event KNOWN_EVENTS[] = {
    {"add", "EVENT_DISK_ADD", true},
    {"remove_dev", "EVENT_DISK_REMOVE_DEV", true},
    {"remove_disk", "EVENT_DISK_REMOVE_DISK", true},
    {"safe_remove", "EVENT_DISK_SAFE_REMOVE", false},
    {"heart_beat", "EVENT_DISK_HEART_BEAT", false},
};

class EventPipes : public testing::Test {
protected:
    EventPipes()
    {
        support::remove_all("/tmp/tarn_nas");
        EXPECT_EQ(event_pipes_open(&pipes), 0);
    }
    ~EventPipes() override { event_pipes_close(&pipes); }

    event_pipes pipes{};
};

class EventParse : public testing::Test {
protected:
    event_pipes pipes{};
};

}  // namespace

TEST_F(EventPipes, opening_makes_three_private_fifos)
{
    for (const char* path :
         {"/tmp/tarn_nas/pipe_disk_add_remove", "/tmp/tarn_nas/pipe_disk_safe_remove",
          "/tmp/tarn_nas/pipe_disk_remove"}) {
        struct stat info {};
        ASSERT_EQ(stat(path, &info), 0) << path;
        EXPECT_TRUE(S_ISFIFO(info.st_mode)) << path;
        EXPECT_EQ(info.st_mode & 0777U, 0600U) << path;
    }
    EXPECT_GT(pipes.fd_add_remove, 0);
    EXPECT_GT(pipes.fd_safe_remove, 0);
    EXPECT_GT(pipes.fd_remove, 0);
    EXPECT_NE(fcntl(pipes.fd_remove, F_GETFL) & O_NONBLOCK, 0);
}

TEST_F(EventPipes, opening_again_forgets_messages_that_nobody_read)
{
    send(PIPE_REMOVE, "#heart_beat\n");
    event_pipes other{};
    ASSERT_EQ(event_pipes_open(&other), 0);
    char c = 0;
    EXPECT_EQ(read(other.fd_remove, &c, 1), -1);
    event_pipes_close(&other);
}

TEST_F(EventPipes, a_plain_file_in_the_place_of_a_pipe_is_replaced)
{
    event_pipes_close(&pipes);
    support::remove_all(PIPE_ADD_REMOVE);
    support::write_file(PIPE_ADD_REMOVE, "#add:sda\n");
    ASSERT_EQ(event_pipes_open(&pipes), 0);
    struct stat info {};
    ASSERT_EQ(stat(PIPE_ADD_REMOVE, &info), 0);
    EXPECT_TRUE(S_ISFIFO(info.st_mode));
}

TEST_F(EventPipes, opening_fails_when_a_pipe_cannot_be_made)
{
    event_pipes_close(&pipes);
    support::remove_all("/tmp/tarn_nas");
    support::write_file("/tmp/tarn_nas", "not a directory");
    EXPECT_EQ(event_pipes_open(&pipes), 1);
    support::remove_all("/tmp/tarn_nas");
}

TEST_F(EventPipes, without_its_directory_making_a_pipe_fails_with_the_systems_error)
{
    event_pipes_close(&pipes);
    support::remove_all("/tmp/tarn_nas");
    support::stub_programs stubs;
    stubs.add("mkdir");
    const std::string log = capture_stdout([&] { EXPECT_EQ(event_pipes_open(&pipes), 1); });
    EXPECT_EQ(stubs.calls().size(), 1U);
    EXPECT_TRUE(contains(log, "(No such file or directory)mknod err:")) << log;
}

TEST_F(EventPipes, pipes_in_a_directory_that_stays_somebody_elses_are_not_used)
{
    event_pipes_close(&pipes);
    support::remove_all("/tmp/tarn_nas");
    support::stub_programs stubs;
    stubs.add("mkdir", "/bin/mkdir -p /tmp/tarn_nas && chown 12345 /tmp/tarn_nas");
    const std::string log = capture_stdout([&] { EXPECT_EQ(event_pipes_open(&pipes), 1); });
    EXPECT_TRUE(contains(log, "]err, dir = /tmp/tarn_nas/\n")) << log;
    support::remove_all("/tmp/tarn_nas");
}

TEST_F(EventPipes, a_plain_file_that_comes_back_is_not_taken_for_a_pipe)
{
    event_pipes_close(&pipes);
    support::remove_all(PIPE_REMOVE);
    support::write_file(PIPE_REMOVE, "#add:sda\n");
    // What is mounted on cannot be deleted.
    ASSERT_EQ(mount(PIPE_REMOVE, PIPE_REMOVE, "none", MS_BIND, nullptr), 0) << strerror(errno);
    const std::string log = capture_stdout([&] { EXPECT_EQ(event_pipes_open(&pipes), 1); });
    EXPECT_EQ(umount2(PIPE_REMOVE, MNT_DETACH), 0);
    EXPECT_LT(pipes.fd_remove, 0);
    EXPECT_TRUE(contains(log, "]err, pipe = /tmp/tarn_nas/pipe_disk_remove\n")) << log;
}

TEST_F(EventPipes, closing_closes_the_descriptors_and_zeroes_the_record)
{
    const int fd = pipes.fd_safe_remove;
    pipes.event.type = EVENT_DISK_ADD;
    EXPECT_EQ(event_pipes_close(&pipes), 0);
    EXPECT_EQ(fcntl(fd, F_GETFD), -1);
    EXPECT_TRUE(support::is_all_zero(pipes));
    struct stat info {};
    EXPECT_EQ(stat(PIPE_SAFE_REMOVE, &info), 0) << "the pipe itself stays";
}

TEST_F(EventPipes, a_cycle_without_a_message_lasts_three_seconds)
{
    char buffer[EVENT_LINE_SIZE]{};
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(event_wait(&pipes, buffer, sizeof(buffer)), 0);
    const auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited, std::chrono::milliseconds(2900));
    EXPECT_LT(waited, std::chrono::seconds(6));
}

TEST_F(EventPipes, a_cycle_lasts_as_long_as_the_record_says)
{
    char buffer[EVENT_LINE_SIZE]{};
    for (const int32_t wait_ms : {100, 1100}) {
        pipes.wait_ms = wait_ms;
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(event_wait(&pipes, buffer, sizeof(buffer)), 0);
        const auto waited = std::chrono::steady_clock::now() - start;
        EXPECT_GE(waited, std::chrono::milliseconds(wait_ms - 10));
        EXPECT_LT(waited, std::chrono::milliseconds(wait_ms + 1500));
    }
}

TEST_F(EventPipes, each_of_the_four_terminators_ends_a_message)
{
    for (const char end : {'\n', '\r', ';', '\0'}) {
        send(PIPE_ADD_REMOVE, std::string("#add:sda") + end);
        char buffer[EVENT_LINE_SIZE]{};
        EXPECT_EQ(event_wait(&pipes, buffer, sizeof(buffer)), 9) << static_cast<int>(end);
        EXPECT_EQ(std::string(buffer, 9), std::string("#add:sda") + end);
        send(PIPE_ADD_REMOVE, std::string("#add:sda") + end);
        EXPECT_EQ(event_receive(&pipes), 1);
        EXPECT_EQ(pipes.event.type, 1);
        EXPECT_EQ(whole_name(pipes.event), "sda") << static_cast<int>(end);
    }
}

TEST_F(EventPipes, a_message_is_logged_as_it_was_read)
{
    send(PIPE_ADD_REMOVE, "#add:sda\n");
    const std::string log = capture_stdout([&] { event_receive(&pipes); });
    EXPECT_TRUE(contains(log, "get event = #add:sda\n\n")) << log;
}

TEST_F(EventPipes, junk_behind_a_semicolon_stays_in_the_pipe_and_is_dropped_as_the_next_message)
{
    send(PIPE_ADD_REMOVE, "#add:sda;junk\n#add:sdb\n");
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, 1);
    EXPECT_EQ(whole_name(pipes.event), "sda");

    const std::string log = capture_stdout([&] { EXPECT_EQ(event_receive(&pipes), 0); });
    EXPECT_TRUE(contains(log, "get event = junk\n"));
    EXPECT_FALSE(contains(log, "err event"));

    EXPECT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(whole_name(pipes.event), "sdb");
}

TEST_F(EventPipes, messages_on_several_pipes_are_taken_one_a_cycle_add_remove_first)
{
    send(PIPE_REMOVE, "#remove_dev:sdc\n");
    send(PIPE_SAFE_REMOVE, "#safe_remove\n");
    send(PIPE_ADD_REMOVE, "#add:sda\n");
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, EVENT_DISK_ADD);
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, EVENT_DISK_SAFE_REMOVE);
    EXPECT_EQ(whole_name(pipes.event), "") << "nothing is left of the event before";
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, EVENT_DISK_REMOVE_DEV);
    EXPECT_EQ(whole_name(pipes.event), "sdc");
}

TEST_F(EventPipes, two_messages_on_one_pipe_are_taken_in_two_cycles)
{
    send(PIPE_SAFE_REMOVE, "#add:sda1\n#remove_disk:disk1_part2\n");
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(whole_name(pipes.event), "sda1");
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, EVENT_DISK_REMOVE_DISK);
    EXPECT_EQ(whole_name(pipes.event), "disk1_part2");
}

TEST_F(EventPipes, any_event_may_arrive_on_any_pipe)
{
    for (const char* path : {PIPE_ADD_REMOVE, PIPE_SAFE_REMOVE, PIPE_REMOVE}) {
        for (const char* message : {"#add:sda\n", "#remove_dev:sda\n", "#remove_disk:disk1_part1\n",
                                    "#safe_remove\n", "#heart_beat\n"}) {
            send(path, message);
            EXPECT_EQ(event_receive(&pipes), 1) << path << " " << message;
        }
    }
}

TEST_F(EventPipes, a_half_line_on_one_pipe_leaves_no_bytes_behind_the_next_pipes_message)
{
    send(PIPE_ADD_REMOVE, "#remove_dev:sdzzzzzzzzzzzz");
    send(PIPE_SAFE_REMOVE, "#add:sdb\n");
    char buffer[EVENT_LINE_SIZE]{};
    ASSERT_EQ(event_wait(&pipes, buffer, sizeof(buffer)), 9);
    EXPECT_STREQ(buffer, "#add:sdb\n");
    for (size_t i = 9; i < sizeof(buffer); ++i) {
        ASSERT_EQ(buffer[i], '\0') << i;
    }

    send(PIPE_ADD_REMOVE, "#remove_dev:sdzzzzzzzzzzzz");
    send(PIPE_REMOVE, std::string("#add:sdb\0", 9));
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(pipes.event.type, EVENT_DISK_ADD);
    EXPECT_EQ(whole_name(pipes.event), "sdb");
}

TEST_F(EventPipes, a_half_written_line_is_lost_and_its_rest_is_no_message)
{
    send(PIPE_ADD_REMOVE, "#add:s");
    EXPECT_EQ(event_receive(&pipes), 0);
    send(PIPE_ADD_REMOVE, "da\n");
    EXPECT_EQ(event_receive(&pipes), 0);
    EXPECT_EQ(pipes.event.type, EVENT_NONE);
}

TEST_F(EventPipes, lines_around_and_above_the_buffer_size_never_leave_the_buffer)
{
    struct guarded {
        char buffer[EVENT_LINE_SIZE];
        char fence[64];
    };
    for (const size_t length : {254U, 255U, 256U, 257U, 300U, 3000U}) {
        const std::string line = "#heart_beat" + std::string(length - 12, 'x') + "\n";
        ASSERT_EQ(line.size(), length);
        send(PIPE_ADD_REMOVE, line + "#add:sdb\n");

        guarded space{};
        memset(space.fence, 'F', sizeof(space.fence));
        const int stored = event_wait(&pipes, space.buffer, sizeof(space.buffer));
        EXPECT_EQ(stored, static_cast<int>(std::min<size_t>(length, 255))) << length;
        EXPECT_EQ(space.buffer[255], '\0') << length;
        for (const char c : space.fence) {
            ASSERT_EQ(c, 'F') << length;
        }
        ASSERT_EQ(event_receive(&pipes), 1) << "the message behind is whole, length " << length;
        EXPECT_EQ(whole_name(pipes.event), "sdb") << length;
    }
}

TEST_F(EventPipes, an_over_long_add_line_is_rejected_and_nothing_of_it_becomes_a_name)
{
    for (const size_t length : {255U, 256U, 257U, 1000U}) {
        send(PIPE_ADD_REMOVE, "#add:" + std::string(length - 6, 'a') + "\n");
        const std::string log = capture_stdout([&] { EXPECT_EQ(event_receive(&pipes), 0); });
        EXPECT_TRUE(contains(log, ", disk name long\n")) << length;
        EXPECT_TRUE(support::is_all_zero(pipes.event)) << length;
    }
    send(PIPE_ADD_REMOVE, "#heart_beat\n");
    EXPECT_EQ(event_receive(&pipes), 1);
}

TEST_F(EventPipes, a_writer_that_never_ends_its_line_does_not_hold_the_reader)
{
    const pid_t writer = fork();
    if (writer == 0) {
        const int fd = open(PIPE_ADD_REMOVE, O_WRONLY | O_CLOEXEC);
        const std::string text(4096, 'x');
        // Killed below; ends by itself if the test does not live to do so.
        alarm(30);
        while (write(fd, text.data(), text.size()) > 0) {
        }
        _exit(0);
    }
    ASSERT_GT(writer, 0);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(event_receive(&pipes), 0);
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
    kill(writer, SIGKILL);
    EXPECT_EQ(waitpid(writer, nullptr, 0), writer);
}

TEST_F(EventPipes, binary_bytes_are_dropped_or_kept_as_a_name_but_never_lose_the_next_message)
{
    std::string binary;
    for (int c = 1; c < 256; ++c) {
        if (c != '\n' && c != '\r' && c != ';' && c != '#') {
            binary += static_cast<char>(c);
        }
    }
    send(PIPE_ADD_REMOVE, binary + "\n#add:\xff\x01%n\n#add:sda\n");
    EXPECT_EQ(event_receive(&pipes), 0);
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(whole_name(pipes.event), "\xff\x01%n");
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(whole_name(pipes.event), "sda");
}

TEST_F(EventPipes, empty_lines_are_no_events)
{
    send(PIPE_ADD_REMOVE, std::string("\n\r;\0#\n", 6));
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(event_receive(&pipes), 0) << i;
    }
}

TEST_F(EventPipes, a_name_of_32_characters_ended_by_a_zero_byte_fills_the_field)
{
    const std::string name = "disk1_part2_0123456789_012345678";
    ASSERT_EQ(name.size(), 32U);
    send(PIPE_ADD_REMOVE, "#add:" + name + std::string(1, '\0'));
    ASSERT_EQ(event_receive(&pipes), 1);
    EXPECT_EQ(std::string(pipes.event.dev_name, EVENT_NAME_SIZE), name);
}

TEST_F(EventPipes, a_descriptor_that_went_away_is_an_error_and_no_event)
{
    close(pipes.fd_remove);
    char buffer[EVENT_LINE_SIZE]{};
    EXPECT_EQ(event_wait(&pipes, buffer, sizeof(buffer)), -1);
    EXPECT_EQ(event_receive(&pipes), 0);
    pipes.fd_remove = 0;
}

TEST_F(EventParse, add_with_a_newline_yields_code_1_and_the_bare_name)
{
    EXPECT_EQ(event_parse(&pipes, "#add:sda\n"), 0);
    EXPECT_EQ(pipes.event.type, 1);
    EXPECT_EQ(whole_name(pipes.event), "sda");
}

TEST_F(EventParse, each_keyword_gives_its_code_its_log_name_and_a_name_where_it_carries_one)
{
    int code = 0;
    for (const known_event& event : KNOWN_EVENTS) {
        ++code;
        const std::string message = std::string("#") + event.keyword + ":sda1\n";
        EXPECT_EQ(event_parse(&pipes, message.c_str()), 0) << message;
        EXPECT_EQ(pipes.event.type, code) << message;
        EXPECT_EQ(whole_name(pipes.event), event.carries_name ? "sda1" : "") << message;
        EXPECT_STREQ(event_name(code), event.log_name);

        const std::string bare = std::string("#") + event.keyword + "\n";
        const std::string log = capture_stdout(
            [&] { EXPECT_EQ(event_parse(&pipes, bare.c_str()), event.carries_name ? 1 : 0); });
        EXPECT_EQ(contains(log, "err event"), event.carries_name) << bare;
    }
    EXPECT_EQ(code, EVENT_CODE_END - 1) << "event " << code + 1 << " has no row in this test";
}

TEST_F(EventParse, each_event_stands_in_the_documents_of_its_interface)
{
    const std::string document = support::read_file(CHECKOUT "/docs/interfaces.md");
    const std::string grammar =
        document.substr(document.find("message    = "), document.find("terminator = "));
    for (const known_event& event : KNOWN_EVENTS) {
        const std::string keyword = event.keyword;
        const std::string quoted = '"' + keyword + '"';
        EXPECT_TRUE(contains(grammar, quoted))
            << quoted << " is what the grammar of docs/interfaces.md lacks";
        // Without a name nothing follows the keyword.
        const std::string row = "| `#" + keyword + (event.carries_name ? ":" : "` |");
        EXPECT_TRUE(contains(document, row))
            << "no line of docs/interfaces.md's table of messages begins with " << row;
    }
}

TEST_F(EventParse, the_type_of_an_event_takes_the_four_bytes_of_its_number)
{
    EXPECT_EQ(sizeof(pipes.event.type), sizeof(int32_t));
    EXPECT_EQ(sizeof(disk_event), sizeof(int32_t) + EVENT_NAME_SIZE);
    EXPECT_EQ(offsetof(disk_event, dev_name), sizeof(int32_t));
}

TEST_F(EventParse, keywords_match_as_prefixes)
{
    EXPECT_EQ(event_parse(&pipes, "#addition:sda\n"), 0);
    EXPECT_EQ(pipes.event.type, 1);
    EXPECT_EQ(whole_name(pipes.event), "sda");
    EXPECT_EQ(event_parse(&pipes, "#remove_device:x\n"), 0);
    EXPECT_EQ(pipes.event.type, 2);
    EXPECT_EQ(whole_name(pipes.event), "x");
}

TEST_F(EventParse, unknown_and_shortened_keywords_are_bad_messages)
{
    for (const char* message :
         {"#ad:sda\n", "#Add:sda\n", "# add:sda\n", "#remove:sda\n", "#heart\n", "#\n", ""}) {
        pipes.event.type = EVENT_DISK_ADD;
        const std::string log =
            capture_stdout([&] { EXPECT_EQ(event_parse(&pipes, message), 1) << message; });
        EXPECT_TRUE(contains(log, std::string("err event = ") + message + "\n")) << log;
        EXPECT_TRUE(support::is_all_zero(pipes.event)) << message;
    }
}

TEST_F(EventParse, add_without_a_colon_is_rejected_as_an_err_event)
{
    const std::string log = capture_stdout([&] { EXPECT_EQ(event_parse(&pipes, "#add\n"), 1); });
    EXPECT_TRUE(contains(log, "err event = #add\n\n")) << log;
    EXPECT_EQ(pipes.event.type, EVENT_NONE);
}

TEST_F(EventParse, a_name_of_32_characters_and_a_newline_is_too_long_and_31_are_accepted)
{
    const std::string name32(32, 'n');
    const std::string log = capture_stdout(
        [&] { EXPECT_EQ(event_parse(&pipes, ("#add:" + name32 + "\n").c_str()), 1); });
    EXPECT_TRUE(contains(log, "err event(#add:" + name32 + "\n), disk name long\n")) << log;
    EXPECT_TRUE(support::is_all_zero(pipes.event));

    const std::string name31(31, 'n');
    EXPECT_EQ(event_parse(&pipes, ("#add:" + name31 + "\n").c_str()), 0);
    EXPECT_EQ(whole_name(pipes.event), name31);
}

TEST_F(EventParse, a_name_of_32_characters_is_copied_whole_and_nothing_behind_it_is_touched)
{
    char out[EVENT_NAME_SIZE + 8];
    memset(out, 'F', sizeof(out));
    const std::string name(EVENT_NAME_SIZE, 'n');
    EXPECT_EQ(event_parse_dev_name(("#add:" + name).c_str(), out, EVENT_NAME_SIZE), 0);
    EXPECT_EQ(std::string(out, sizeof(out)), name + "FFFFFFFF");
}

TEST_F(EventParse, a_short_name_leaves_the_rest_of_the_field_zero)
{
    memset(&pipes.event, 'x', sizeof(pipes.event));
    EXPECT_EQ(event_parse(&pipes, "#add:sd\n"), 0);
    for (int i = 2; i < EVENT_NAME_SIZE; ++i) {
        ASSERT_EQ(pipes.event.dev_name[i], '\0') << i;
    }
}

TEST_F(EventParse, an_empty_name_is_accepted)
{
    EXPECT_EQ(event_parse(&pipes, "#add:\n"), 0);
    EXPECT_EQ(pipes.event.type, 1);
    EXPECT_EQ(whole_name(pipes.event), "");
}

TEST_F(EventParse, heart_beat_followed_by_anything_is_code_5)
{
    EXPECT_EQ(event_parse(&pipes, "#heart_beat:and-a-very-long-text-that-would-not-be-a-name\n"),
              0);
    EXPECT_EQ(pipes.event.type, 5);
    EXPECT_EQ(whole_name(pipes.event), "");
}

TEST_F(EventParse, numbers_that_are_no_code_have_the_log_name_err_event)
{
    for (const int other : {0, -1, 1000, INT32_MAX, INT32_MIN}) {
        EXPECT_STREQ(event_name(other), "err event") << other;
    }
}
