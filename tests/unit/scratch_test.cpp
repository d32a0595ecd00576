#include "util/scratch.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "support/capture.h"
#include "support/files.h"
#include "support/text.h"

using support::contains;
using support::log_of;

namespace {

constexpr char PLACE[] = "/tmp/scratch_place";
constexpr char NOWHERE[] = "/tmp/none/scratch";
constexpr char NOTHING_TO_DELETE[] = "del err! not exist file = /tmp/scratch_place\n";
constexpr char KILLED[] = "echo half > %s ; kill -KILL $$";

constexpr scratch_query LOST{NOWHERE, SCRATCH_DELETED};
constexpr scratch_query KEPT{PLACE, SCRATCH_KEPT};
constexpr scratch_query DELETED{PLACE, SCRATCH_DELETED};
constexpr scratch_query DELETED_WHEN_READ{PLACE, SCRATCH_DELETED_WHEN_READ};
constexpr scratch_query STARTS_CLEAR{.path = PLACE, .end = SCRATCH_KEPT, .starts_clear = true};
constexpr scratch_query WANTS_END{.path = PLACE, .end = SCRATCH_KEPT, .wants_end = true};

std::string first_of(const scratch_query& query, const char* format, size_t size = 16)
{
    char out[33];
    memset(out, '#', sizeof(out));
    const bool was_read = scratch_read(query, {out, size}, format, {PLACE});
    EXPECT_EQ(out[size], '#');
    EXPECT_TRUE(was_read || out[0] == '\0');
    return was_read ? out : "nothing";
}

std::string text_of(const scratch_query& query, const char* format)
{
    const scratch_text answer(query, format, {PLACE});
    return answer.text != nullptr ? answer.text.held : "nothing";
}

std::string lines_of(const scratch_query& query, const char* format)
{
    const scratch_lines answer(query, format, {PLACE});
    if (answer.stream == nullptr) {
        return "nothing";
    }
    char line[16];
    std::string text;
    while (fgets(line, sizeof(line), answer.stream) != nullptr) {
        text += std::string(line) + "|";
    }
    return text;
}

class Scratch : public testing::Test {
protected:
    Scratch() { support::remove_all(PLACE); }
    ~Scratch() override { support::remove_all(PLACE); }
};

}  // namespace

TEST_F(Scratch, each_reader_gives_what_the_program_says)
{
    log_of([] {
        EXPECT_EQ(text_of(DELETED, "echo 'one two' > %s"), "one two\n");
        EXPECT_EQ(first_of(DELETED, "echo 'one two' > %s"), "one two\n");
        EXPECT_EQ(lines_of(DELETED, "printf 'a\\nb\\n' > %s"), "a\n|b\n|");
        EXPECT_EQ(text_of(DELETED, "true > %s"), "");
    });
}

TEST_F(Scratch, the_first_characters_are_cut_to_the_buffer)
{
    log_of([] {
        EXPECT_EQ(first_of(DELETED, "printf 1234567 > %s", 8), "1234567");
        EXPECT_EQ(first_of(DELETED, "printf 12345678 > %s", 8), "1234567");
    });
}

TEST_F(Scratch, the_command_is_logged_at_the_place_that_asks)
{
    const char* const expected = "scratch_test.cpp(N)exec cmd = true > /tmp/scratch_place\n";
    EXPECT_TRUE(contains(log_of([] { text_of(DELETED, "true > %s"); }), expected));
    EXPECT_TRUE(contains(log_of([] { first_of(DELETED, "true > %s"); }), expected));
    EXPECT_TRUE(contains(log_of([] { lines_of(DELETED, "true > %s"); }), expected));
}

TEST_F(Scratch, the_file_is_kept_or_deleted_as_the_query_says)
{
    log_of([] {
        for (auto* reader : {text_of, lines_of}) {
            reader(KEPT, "echo a > %s");
            EXPECT_TRUE(support::exists(PLACE));
            reader(DELETED, "echo a > %s");
            EXPECT_FALSE(support::exists(PLACE));
            reader(DELETED_WHEN_READ, "echo a > %s");
            EXPECT_FALSE(support::exists(PLACE));
        }
        first_of(KEPT, "echo a > %s");
        EXPECT_TRUE(support::exists(PLACE));
        first_of(DELETED_WHEN_READ, "echo a > %s");
        EXPECT_FALSE(support::exists(PLACE));
    });
}

TEST_F(Scratch, what_cannot_be_read_is_deleted_only_in_the_first_of_these_cases)
{
    const char* const vanishes = "rm -f %s";
    for (auto* reader : {text_of, lines_of}) {
        EXPECT_TRUE(contains(log_of([&] { EXPECT_EQ(reader(DELETED, vanishes), "nothing"); }),
                             NOTHING_TO_DELETE));
        EXPECT_FALSE(
            contains(log_of([&] { EXPECT_EQ(reader(DELETED_WHEN_READ, vanishes), "nothing"); }),
                     NOTHING_TO_DELETE));
    }
    EXPECT_TRUE(contains(log_of([&] { EXPECT_EQ(first_of(DELETED, vanishes), "nothing"); }),
                         NOTHING_TO_DELETE));
}

TEST_F(Scratch, an_earlier_answer_is_deleted_first_when_the_query_says_so)
{
    EXPECT_TRUE(contains(log_of([] { text_of(STARTS_CLEAR, "true > %s"); }), NOTHING_TO_DELETE));
    EXPECT_FALSE(contains(log_of([] { text_of(STARTS_CLEAR, "true > %s"); }), NOTHING_TO_DELETE));
    support::remove_all(PLACE);
    EXPECT_FALSE(contains(log_of([] { text_of(KEPT, "true > %s"); }), NOTHING_TO_DELETE));
}

TEST_F(Scratch, an_earlier_answer_is_never_taken_for_a_new_one)
{
    support::write_file(PLACE, "old");
    log_of([] { EXPECT_EQ(text_of(KEPT, "true %s"), ""); });
}

TEST_F(Scratch, what_a_killed_program_said_counts_unless_the_query_wants_its_end)
{
    support::capture_stderr([] {
        log_of([] {
            EXPECT_EQ(text_of(KEPT, KILLED), "half\n");
            EXPECT_EQ(text_of(WANTS_END, KILLED), "nothing");
            EXPECT_EQ(first_of(WANTS_END, KILLED), "nothing");
        });
    });
}

TEST_F(Scratch, where_no_file_can_be_made_nothing_runs_and_nothing_is_deleted)
{
    std::string log = log_of([] {
        const scratch_text answer(LOST, "touch /run/ran %s", {NOWHERE});
        EXPECT_EQ(answer.text, nullptr);
        const scratch_lines lines(LOST, "touch /run/ran %s", {NOWHERE});
        EXPECT_EQ(lines.stream, nullptr);
    });
    EXPECT_FALSE(support::exists("/run/ran"));
    EXPECT_FALSE(contains(log, "exec cmd")) << log;
    EXPECT_FALSE(contains(log, "del err!")) << log;
}

TEST_F(Scratch, a_refused_word_runs_nothing_and_is_logged)
{
    std::string log = log_of([] {
        const scratch_text answer(STARTS_CLEAR, "pidof %s > %s", {"a;touch /run/ran", PLACE});
        EXPECT_EQ(answer.text, nullptr);
    });
    EXPECT_EQ(log, "Warning[scratch.cpp:N]command err, cmd = pidof %s > %s\n");
    EXPECT_FALSE(support::exists("/run/ran"));
}
