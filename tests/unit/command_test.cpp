#include "util/command.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "util/guard.h"

namespace {

constexpr size_t ROOM = 64;

// The command, or "refused"; what is refused leaves an empty text.
std::string made(const char* format, std::initializer_list<const char*> words, size_t size = ROOM)
{
    char out[ROOM + 1];
    memset(out, '#', sizeof(out));
    const bool taken = command_format({out, size}, format, words);
    EXPECT_EQ(out[size], '#') << format;
    EXPECT_EQ(std::string(out, size).find_last_not_of('\0') + 1, strlen(out)) << "not zero-filled";
    EXPECT_TRUE(taken || out[0] == '\0');
    return taken ? out : "refused";
}

// The command of any length, or "refused".
std::string made_of_word(const char* format, const char* word)
{
    const text_guard command(command_of_word(format, word));
    return command != nullptr ? command.held : "refused";
}

}  // namespace

TEST(CommandFormat, a_null_word_is_refused)
{
    EXPECT_EQ(made("umount %s", {nullptr}), "refused");
    EXPECT_EQ(made("mkdir -p '%s'", {nullptr}), "refused");
    EXPECT_EQ(made_of_word("mkdir -p '%s'", nullptr), "refused");
}

TEST(CommandFormat, fills_the_places_in_their_order)
{
    EXPECT_EQ(made("mount > x", {}), "mount > x");
    EXPECT_EQ(made("umount %s", {"/dev/sda1"}), "umount /dev/sda1");
    EXPECT_EQ(made("%s %s > %s", {"a", "b", "c"}), "a b > c");
    EXPECT_EQ(made("%s%s", {"a", "b"}), "ab");
    EXPECT_EQ(made("a %d 100%", {}), "a %d 100%");
    EXPECT_EQ(made("", {}), "");
}

TEST(CommandFormat, does_not_fill_what_a_word_brings)
{
    EXPECT_EQ(made("a %s %s", {"%s", "b"}), "a %s b");
}

TEST(CommandFormat, refuses_when_a_word_is_missing)
{
    EXPECT_EQ(made("%s %s", {"a"}), "refused");
    EXPECT_EQ(made("%s", {}), "refused");
}

TEST(CommandFormat, is_cut_at_one_less_than_its_buffer)
{
    for (size_t length : {1U, 2U, 3U, 9U}) {
        const std::string word(length, 'w');
        EXPECT_EQ(made("rm %s x", {word.c_str()}, 8), ("rm " + word + " x").substr(0, 7)) << length;
    }
    EXPECT_EQ(made("abcdefgh", {}, 8), "abcdefg");
    EXPECT_EQ(made("abc", {}, 1), "");
}

TEST(CommandFormat, a_word_behind_the_cut_is_refused_too)
{
    EXPECT_EQ(made("umount %s", {";reboot"}, 8), "refused");
    EXPECT_EQ(made("umount %s %s", {"aaaaaaaa", ";reboot"}, 8), "refused");
}

TEST(CommandFormat, takes_plain_words)
{
    for (const char* word :
         {"/dev/sda1", "/tmp/mountd/disk1_part1", "/", "", "/tmp/a+b,c:d@e%f=g", "/tmp/b\xc3\xbcro",
          "/tmp/..x", "/tmp/x..", "/tmp/.../y", "sda", "sda15", "cciss!c0d0", "dm-0"}) {
        EXPECT_EQ(made("umount %s", {word}), std::string("umount ") + word);
    }
}

TEST(CommandFormat, refuses_what_a_shell_would_read_and_what_climbs)
{
    for (const char* word : {"/dev/sda1;x",   "/tmp/a b",
                             "/tmp/$x",       "/tmp/a\\040b",
                             "/tmp/a\n",      "/tmp/a\tb",
                             "/tmp/~x",       "/tmp/a*",
                             "$(reboot)",     "`reboot`",
                             "sda1&",         "sda|cat",
                             "sda>x",         "sda<x",
                             "sda'",          "sda\"",
                             "sda?",          "[sda]",
                             "sda{1}",        "#sda",
                             "sda(1)",        "/tmp/mountd/../../overlay",
                             "/tmp/mountd/.."}) {
        EXPECT_EQ(made("umount %s", {word}), "refused") << word;
    }
}

TEST(CommandFormat, in_quotes_refuses_only_what_they_do_not_hold)
{
    EXPECT_EQ(made("mkdir -p '%s'", {"a b;$(c)\"`\\"}), "mkdir -p 'a b;$(c)\"`\\'");
    EXPECT_EQ(made("mkdir -p '%s'", {"a'b"}), "refused");
    EXPECT_EQ(made("rm -rf \"%s\"", {"a b;'c"}), "rm -rf \"a b;'c\"");
    for (const char* word : {"a\"b", "a$b", "a`b", "a\\b"}) {
        EXPECT_EQ(made("rm -rf \"%s\"", {word}), "refused") << word;
    }
}

TEST(CommandFormat, quotes_hold_up_to_their_own_end)
{
    EXPECT_EQ(made("a 'b' %s", {"c d"}), "refused");
    EXPECT_EQ(made("a \"b\" %s", {"c d"}), "refused");
    EXPECT_EQ(made("a \"'%s\"", {"c$d"}), "refused");
    EXPECT_EQ(made("a '\"%s'", {"c$d"}), "a '\"c$d'");
}

TEST(CommandOfWord, is_as_long_as_it_takes)
{
    const std::string word(1000, 'w');
    EXPECT_EQ(made_of_word("mkdir -p '%s'", word.c_str()), "mkdir -p '" + word + "'");
    EXPECT_EQ(made_of_word("mkdir -p '%s'", ""), "mkdir -p ''");
}

TEST(CommandOfWord, refuses_the_same_words)
{
    EXPECT_EQ(made_of_word("mkdir -p '%s'", "a'b"), "refused");
    EXPECT_EQ(made_of_word("rm -rf \"%s\"", "$a"), "refused");
    EXPECT_EQ(made_of_word("umount %s", "a b"), "refused");
}
