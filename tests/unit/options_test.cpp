#include "main/options.h"

#include <unistd.h>

#include <string>
#include <vector>

#include "support/support.h"
#include "support_disk/child.h"

using support::contains;

namespace {

// Parses in a child, since a wrong option ends the process. 50 + block_input_mode when it goes on.
support_disk::child_result parse(std::vector<std::string> arguments)
{
    return support_disk::run_in_child([&] {
        std::vector<char*> argv;
        argv.reserve(arguments.size() + 1);
        for (std::string& argument : arguments) {
            argv.push_back(argument.data());
        }
        const int argc = static_cast<int>(argv.size());
        argv.push_back(nullptr);
        optind = 1;
        const int ret = parse_options(argc, argv.data());
        return ret == 0 ? 50 + block_input_mode : ret;
    });
}

}  // namespace

TEST(Options, v_logs_its_option_prints_the_two_version_lines_and_stops_with_1)
{
    const auto result = parse({"daemon", "-v"});
    EXPECT_EQ(result.exit_code, 1);
    EXPECT_TRUE(contains(result.out, "opt = v\n"));
    EXPECT_TRUE(contains(result.out, "\nversion:1.05\ndate:Feb 16 2022 20:29:10\n")) << result.out;
    EXPECT_EQ(support::lines_of(result.out).size(), 3U);
    EXPECT_EQ(result.err, "");
}

TEST(Options, v_ends_the_parsing_before_a_wrong_option)
{
    EXPECT_EQ(parse({"daemon", "-v", "-x"}).exit_code, 1);
    EXPECT_FALSE(contains(parse({"daemon", "-v", "-x"}).err, "Usage"));
}

TEST(Options, an_unknown_option_prints_the_usage_on_standard_error_and_exits_with_1)
{
    const auto result = parse({"./the_daemon", "-x"});
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
    EXPECT_EQ(result.exit_code, 50);
    EXPECT_TRUE(contains(result.out, "opt = d\n"));
    EXPECT_EQ(support::lines_of(result.out).size(), 1U);
    EXPECT_EQ(result.err, "");
}

TEST(Options, e_asks_for_the_block_input_run)
{
    EXPECT_EQ(parse({"daemon", "-e"}).exit_code, 51);
    EXPECT_EQ(parse({"daemon", "-de"}).exit_code, 51);
}

TEST(Options, no_option_goes_on_silently)
{
    const auto result = parse({"daemon"});
    EXPECT_EQ(result.exit_code, 50);
    EXPECT_EQ(result.out, "");
}

TEST(Options, words_that_are_no_options_are_ignored)
{
    EXPECT_EQ(parse({"daemon", "word", "-"}).exit_code, 50);
}
