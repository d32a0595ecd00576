#include "util/text.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>

namespace {

// A buffer full of rubbish with a guard behind the part that a call may use.
struct dirty_buffer {
    char bytes[32];

    dirty_buffer() { memset(bytes, '#', sizeof(bytes)); }

    [[nodiscard]] bool untouched_from(size_t start) const
    {
        return std::all_of(bytes + start, bytes + sizeof(bytes), [](char c) { return c == '#'; });
    }

    [[nodiscard]] bool zero_between(size_t start, size_t end) const
    {
        return std::all_of(bytes + start, bytes + end, [](char c) { return c == '\0'; });
    }
};

}  // namespace

TEST(TextCopy, cuts_at_one_less_than_the_size)
{
    struct {
        const char* text;
        const char* expected;
    } cases[] = {
        {"", ""},
        {"1234567", "1234567"},
        {"12345678", "1234567"},
        {"123456789", "1234567"},
    };
    for (const auto& c : cases) {
        dirty_buffer out;
        text_copy({out.bytes, 8}, c.text);
        EXPECT_STREQ(out.bytes, c.expected);
        EXPECT_TRUE(out.untouched_from(8)) << c.text;
    }
}

TEST(TextCopy, takes_null_for_an_empty_text)
{
    dirty_buffer out;
    text_copy({out.bytes, 16}, nullptr);
    EXPECT_TRUE(out.zero_between(0, 16));
    EXPECT_TRUE(out.untouched_from(16));
}

TEST(TextCopy, zero_fills_the_rest)
{
    dirty_buffer out;
    text_copy({out.bytes, 16}, "abc");
    EXPECT_TRUE(out.zero_between(3, 16));
    EXPECT_TRUE(out.untouched_from(16));
}

TEST(TextCopy, a_buffer_of_one_byte_holds_the_empty_text)
{
    dirty_buffer out;
    text_copy({out.bytes, 1}, "abc");
    EXPECT_EQ(out.bytes[0], '\0');
    EXPECT_TRUE(out.untouched_from(1));
}

TEST(TextCopy, a_buffer_of_no_bytes_is_left_alone)
{
    dirty_buffer out;
    text_copy({out.bytes, 0}, "abc");
    EXPECT_TRUE(out.untouched_from(0));
}

TEST(TextCopy, takes_the_size_of_an_array_by_itself)
{
    char out[4];
    text_copy(out, "abcdef");
    EXPECT_STREQ(out, "abc");
    text_clear(out);
    EXPECT_EQ(std::string(out, 4), std::string(4, '\0'));
}

TEST(TextCopyN, takes_at_most_that_many_characters)
{
    dirty_buffer out;
    text_copy_n({out.bytes, 8}, "abcdef", 3);
    EXPECT_STREQ(out.bytes, "abc");
    EXPECT_TRUE(out.zero_between(3, 8));
    text_copy_n({out.bytes, 8}, "abcdef", 0);
    EXPECT_STREQ(out.bytes, "");
    text_copy_n({out.bytes, 8}, "ab", 5);
    EXPECT_STREQ(out.bytes, "ab");
    text_copy_n({out.bytes, 4}, "abcdef", 6);
    EXPECT_STREQ(out.bytes, "abc");
    EXPECT_TRUE(out.untouched_from(8));
}

TEST(TextFormat, cuts_and_zero_fills)
{
    dirty_buffer out;
    text_format({out.bytes, 8}, "%s-%d", "ab", 7);
    EXPECT_STREQ(out.bytes, "ab-7");
    EXPECT_TRUE(out.zero_between(4, 8));
    text_format({out.bytes, 8}, "%s", "123456789");
    EXPECT_STREQ(out.bytes, "1234567");
    EXPECT_TRUE(out.untouched_from(8));
}

TEST(TextHasPrefix, compares_from_the_start)
{
    EXPECT_TRUE(text_has_prefix("remove_dev", "remove"));
    EXPECT_TRUE(text_has_prefix("remove", "remove"));
    EXPECT_TRUE(text_has_prefix("anything", ""));
    EXPECT_FALSE(text_has_prefix("remov", "remove"));
    EXPECT_FALSE(text_has_prefix("a remove", "remove"));
}

TEST(StrEqual, wants_the_same_length_and_the_same_bytes)
{
    EXPECT_EQ(str_equal("sda", "sda"), 0);
    EXPECT_EQ(str_equal("", ""), 0);
    EXPECT_EQ(str_equal("sda", "sda1"), 1);
    EXPECT_EQ(str_equal("sda1", "sda"), 1);
    EXPECT_EQ(str_equal("sda", "sdb"), 1);
    EXPECT_EQ(str_equal("sda", "SDA"), 1);
    EXPECT_EQ(str_equal("", "a"), 1);
}

TEST(StrEqual, with_a_null_is_never_equal)
{
    EXPECT_EQ(str_equal_nullsafe(nullptr, "a"), 1);
    EXPECT_EQ(str_equal_nullsafe("a", nullptr), 1);
    EXPECT_EQ(str_equal_nullsafe(nullptr, nullptr), 1);
    EXPECT_EQ(str_equal_nullsafe("a", "a"), 0);
    EXPECT_EQ(str_equal_nullsafe("a", "ab"), 1);
}

TEST(StrCountChar, counts_dashes)
{
    struct {
        const char* text;
        int count;
        int expected;
    } cases[] = {
        {"a-b-c-d", 2, 1}, {"a-b-c-d", 3, 1}, {"a-b-c-d", 4, 0}, {"---", 3, 1}, {"plain", 1, 0},
        {"plain", 0, 1},   {"a_b_c_d", 3, 0}, {"", 1, 0},        {"", 0, 1},    {"", -1, 1},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(str_count_char_at_least(c.text, c.count), c.expected) << c.text << c.count;
    }
}

TEST(StrCountChar, a_null_text_has_enough)
{
    EXPECT_EQ(str_count_char_at_least(nullptr, 3), 1);
}
