#include "main/options.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "support/capture.h"
#include "support/child.h"
#include "support/text.h"

using support::contains;

namespace {

int parse_words(std::vector<std::string> arguments)
{
    std::vector<char*> argv;
    argv.reserve(arguments.size() + 1);
    for (std::string& argument : arguments) {
        argv.push_back(argument.data());
    }
    const int argc = static_cast<int>(argv.size());
    argv.push_back(nullptr);
    // Zero makes the C library forget the word that the case before stopped in.
    optind = 0;
    block_input_mode = 0;
    return parse_options(argc, argv.data());
}

struct parsed {
    int result;
    int block_input;
    std::string out;
    std::string err;
};

parsed parse(const std::vector<std::string>& arguments)
{
    parsed seen{};
    seen.err = support::capture_stderr(
        [&] { seen.out = support::capture_stdout([&] { seen.result = parse_words(arguments); }); });
    seen.block_input = block_input_mode;
    block_input_mode = 0;
    return seen;
}

}  // namespace

TEST(Options, v_logs_its_option_prints_the_two_version_lines_and_stops_with_1)
{
    const auto result = parse({"daemon", "-v"});
    EXPECT_EQ(result.result, 1);
    EXPECT_TRUE(contains(result.out, "opt = v\n"));
    EXPECT_TRUE(contains(result.out, "\nversion:1.05\ndate:Feb 16 2022 20:29:10\n")) << result.out;
    EXPECT_EQ(support::lines_of(result.out).size(), 3U);
    EXPECT_EQ(result.err, "");
}

TEST(Options, v_ends_the_parsing_before_a_wrong_option)
{
    const auto result = parse({"daemon", "-v", "-x"});
    EXPECT_EQ(result.result, 1);
    EXPECT_EQ(result.err, "");
}

TEST(Options, an_unknown_option_prints_the_usage_on_standard_error_and_exits_with_1)
{
    const auto result = support::run_in_child([] {
        return 50 + parse_words({"./the_daemon", "-x"});
    });
    EXPECT_EQ(result.exit_code, 1);
    EXPECT_TRUE(contains(result.err, "Usage: ./the_daemon [option]\n"
                                     "          -d             # debug\n"
                                     "          -v             # version\n"))
        << result.err;
    EXPECT_FALSE(contains(result.err, "-e"));
    EXPECT_FALSE(contains(result.out, "Usage"));
    EXPECT_TRUE(contains(result.out, "opt = ?\n"));
}

TEST(Options, d_alone_goes_on_and_shows_nothing_but_its_option_line)
{
    const auto result = parse({"daemon", "-d"});
    EXPECT_EQ(result.result, 0);
    EXPECT_EQ(result.block_input, 0);
    EXPECT_TRUE(contains(result.out, "opt = d\n"));
    EXPECT_EQ(support::lines_of(result.out).size(), 1U);
    EXPECT_EQ(result.err, "");
}

TEST(Options, e_asks_for_the_block_input_run)
{
    for (const char* word : {"-e", "-de", "-ed"}) {
        const auto result = parse({"daemon", word});
        EXPECT_EQ(result.result, 0) << word;
        EXPECT_EQ(result.block_input, 1) << word;
    }
}

TEST(Options, no_option_goes_on_silently)
{
    const auto result = parse({"daemon"});
    EXPECT_EQ(result.result, 0);
    EXPECT_EQ(result.block_input, 0);
    EXPECT_EQ(result.out, "");
}

TEST(Options, words_that_are_no_options_are_ignored)
{
    EXPECT_EQ(parse({"daemon", "word", "-"}).result, 0);
}
