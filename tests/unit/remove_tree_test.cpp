#include "util/remove_tree.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <string>

#include "support/capture.h"
#include "support/child.h"
#include "support/files.h"
#include "support/stubs.h"
#include "support/text.h"

using support::exists;
using support::log_of;
using support::make_dir;
using support::make_link;
using support::make_socket;
using support::write_file;

namespace {

const std::string ROOT = "/run/trees";

class Trees : public testing::Test {
protected:
    Trees()
    {
        support::remove_all(ROOT);
        make_dir(ROOT);
    }
    ~Trees() override { support::remove_all(ROOT); }

    support::kept_working_dir working_dir;
    const std::string file = ROOT + "/file";
    const std::string missing = ROOT + "/missing";
};

using Remove = Trees;
using PathGetType = Trees;
using PathRemoveTree = Trees;

// Runs action in a child that owns the trees and is no superuser, for whom every directory is open;
// it begins above them. Returns the log.
std::string expect_as_nobody(const std::function<void()>& action)
{
    constexpr uid_t NOBODY = 65534;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(ROOT)) {
        EXPECT_EQ(lchown(entry.path().c_str(), NOBODY, NOBODY), 0);
    }
    EXPECT_EQ(lchown(ROOT.c_str(), NOBODY, NOBODY), 0);
    return support::without_line_numbers(support::expect_in_child([&] {
        ASSERT_EQ(chdir(ROOT.c_str()), 0);
        ASSERT_EQ(setuid(NOBODY), 0);
        action();
    }));
}

}  // namespace

TEST_F(Remove, rm_rf_takes_a_whole_tree_in_double_quotes)
{
    std::string path = ROOT + "/with space";
    write_file(path + "/deep/file", "x");
    write_file(path + "/.hidden", "x");
    write_file(ROOT + "/with", "stays");
    std::string log = log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 0); });
    EXPECT_EQ(support::count_of(log, "exec cmd = rm -rf \"/run/trees/with space\"\n"), 1) << log;
    EXPECT_FALSE(exists(path));
    EXPECT_TRUE(exists(ROOT + "/with"));
}

TEST_F(Remove, rm_rf_refuses_what_a_shell_reads_in_quotes)
{
    for (const char* name : {"$(touch harm)", "`touch harm`", "a\"; touch harm; \"", "a\\"}) {
        const std::string path = ROOT + "/" + name;
        write_file(path, "");
        const std::string log = log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 1); });
        EXPECT_EQ(support::count_of(log, "exec cmd"), 0) << log;
        EXPECT_TRUE(support::contains(log, "rm err, fn = " + path)) << log;
        EXPECT_TRUE(exists(path));
    }
}

TEST_F(Remove, rm_rf_takes_a_path_of_any_length)
{
    std::string path = ROOT + "/" + std::string(250, 'a') + "/" + std::string(250, 'b');
    make_dir(path);
    log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 0); });
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, rm_rf_whose_command_is_killed_gives_one)
{
    // The shell is killed, also one that gives its process to its only command.
    support::stub_programs stubs;
    stubs.add("rm", R"x([ "$(cat /proc/$PPID/comm)" = sh ] && kill -KILL $PPID || kill -KILL $$)x");
    std::string path = ROOT + "/x";
    support::capture_stderr([&] {
        std::string log = log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 1); });
        EXPECT_EQ(stubs.calls().size(), 1U);
        std::string last = support::lines_of(log).back();
        EXPECT_EQ(last.substr(0, 24), "ERROR[remove_tree.cpp:N]") << log;
        EXPECT_TRUE(support::contains(last, ")rm err, fn = " + path)) << log;
    });
}

TEST_F(Remove, a_file_goes_without_a_command)
{
    write_file(file, "x");
    std::string log = log_of([&] { EXPECT_EQ(file_remove_retry(file.c_str()), 0); });
    EXPECT_EQ(log, "");
    EXPECT_FALSE(exists(file));
}

TEST_F(Remove, a_file_that_stays_is_removed_by_rm_rf)
{
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    std::string log = log_of([&] { EXPECT_EQ(file_remove_retry(path.c_str()), 0); });
    EXPECT_EQ(support::count_of(log, "exec cmd = rm -rf \"/run/trees/dir\"\n"), 1) << log;
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, an_empty_directory_goes)
{
    std::string path = ROOT + "/dir";
    make_dir(path);
    EXPECT_EQ(dir_remove_retry(path.c_str()), 0);
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, a_directory_that_is_not_empty_stays)
{
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    std::string log = log_of([&] { EXPECT_EQ(dir_remove_retry(path.c_str()), 1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](Directory not empty)rm err, fn = /run/trees/dir\n");
    EXPECT_TRUE(exists(ROOT + "/dir/entry"));
}

TEST_F(Remove, a_link_goes_and_its_target_stays)
{
    write_file(file, "x");
    std::string link = ROOT + "/link";
    make_link(file, link);
    EXPECT_EQ(link_remove_retry(link.c_str()), 0);
    EXPECT_FALSE(exists(link));
    EXPECT_TRUE(exists(file));
}

TEST_F(Remove, a_missing_link_gives_the_systems_error)
{
    std::string log = log_of([&] { EXPECT_EQ(link_remove_retry(missing.c_str()), 1); });
    EXPECT_EQ(
        log,
        "ERROR[remove_tree.cpp:N](No such file or directory)rm err, fn = /run/trees/missing\n");
}

TEST_F(PathGetType, tells_directories_files_links_and_the_rest)
{
    write_file(file, "");
    ASSERT_EQ(mkfifo((ROOT + "/fifo").c_str(), 0600), 0);
    make_socket(ROOT + "/socket");
    make_link(ROOT, ROOT + "/dir_link");
    make_link(missing, ROOT + "/dead_link");
    struct {
        std::string path;
        int expected;
    } cases[] = {
        {ROOT, 1},
        {file, 2},
        {ROOT + "/dir_link", 3},
        {ROOT + "/dead_link", 3},
        {ROOT + "/fifo", 0},
        {ROOT + "/socket", 0},
        {"/dev/null", 0},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(path_get_type(c.path.c_str()), c.expected) << c.path;
    }
}

TEST_F(PathGetType, a_missing_path_is_an_error_with_the_systems_text)
{
    std::string log = log_of([&] { EXPECT_EQ(path_get_type(missing.c_str()), -1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](No such file or directory)file not exist, file = "
                   "/run/trees/missing\n");
}

TEST_F(PathGetType, a_null_path_is_an_error)
{
    std::string log = log_of([] { EXPECT_EQ(path_get_type(nullptr), -1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N]err!\n");
}

TEST_F(PathRemoveTree, takes_a_file_a_link_and_a_tree)
{
    write_file(ROOT + "/tree/file", "x");
    write_file(ROOT + "/tree/deep/deeper/file", "x");
    make_link(missing, ROOT + "/tree/dead_link");
    write_file(file, "x");
    make_link(file, ROOT + "/link");
    EXPECT_EQ(path_remove_tree((ROOT + "/link").c_str()), 0);
    EXPECT_EQ(path_remove_tree(file.c_str()), 0);
    EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
    EXPECT_TRUE(std::filesystem::is_empty(ROOT));
}

TEST_F(PathRemoveTree, leaves_what_is_hidden_and_its_directory_and_still_gives_zero)
{
    for (const char* hidden : {"/tree/.hidden", "/tree/..dir/file"}) {
        write_file(ROOT + hidden, "x");
        write_file(ROOT + "/tree/seen", "x");
        std::string log = log_of([] { EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0); });
        EXPECT_EQ(log,
                  "ERROR[remove_tree.cpp:N](Directory not empty)rm err, fn = /run/trees/tree\n");
        EXPECT_TRUE(exists(ROOT + hidden));
        EXPECT_FALSE(exists(ROOT + "/tree/seen"));
        support::remove_all(ROOT + "/tree");
    }
}

TEST_F(PathRemoveTree, a_link_to_a_directory_is_unlinked_and_its_target_stays)
{
    write_file(ROOT + "/target/file", "x");
    std::string link = ROOT + "/link";
    make_link(ROOT + "/target", link);
    EXPECT_EQ(path_remove_tree(link.c_str()), 0);
    EXPECT_FALSE(exists(link));
    EXPECT_TRUE(exists(ROOT + "/target/file"));
}

TEST_F(PathRemoveTree, a_link_inside_a_tree_is_not_followed)
{
    write_file(ROOT + "/target/file", "x");
    make_dir(ROOT + "/tree");
    make_link(ROOT + "/target", ROOT + "/tree/link");
    EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
    EXPECT_FALSE(exists(ROOT + "/tree"));
    EXPECT_TRUE(exists(ROOT + "/target/file"));
}

TEST_F(PathRemoveTree, leaves_the_working_directory_in_the_parent)
{
    write_file(ROOT + "/tree/deep/file", "x");
    EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
    EXPECT_EQ(std::filesystem::current_path(), ROOT);
}

TEST_F(PathRemoveTree, a_relative_path_of_two_names_leaves_its_empty_directory)
{
    // The directory is removed by the path as it was given, from inside its parent.
    write_file(ROOT + "/tree/deep/file", "x");
    ASSERT_EQ(chdir(ROOT.c_str()), 0);
    log_of([] { EXPECT_EQ(path_remove_tree("tree/deep"), 0); });
    EXPECT_EQ(std::filesystem::current_path(), ROOT + "/tree");
    EXPECT_TRUE(std::filesystem::is_empty(ROOT + "/tree/deep"));
}

TEST_F(PathRemoveTree, a_directory_that_cannot_be_listed_or_entered_stays_and_gives_one)
{
    for (const mode_t mode : {0333, 0444}) {
        write_file(ROOT + "/tree/file", "x");
        ASSERT_EQ(chmod((ROOT + "/tree").c_str(), mode), 0);
        const std::string log = expect_as_nobody([] {
            EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 1);
            EXPECT_EQ(std::filesystem::current_path(), ROOT) << "the working directory stays";
        });
        EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](Permission denied)ope dir err, path = "
                       "/run/trees/tree\n")
            << mode;
        EXPECT_TRUE(exists(ROOT + "/tree/file")) << mode;
    }
}

TEST_F(PathRemoveTree, a_directory_inside_that_cannot_be_entered_stays_with_those_above_it_alone)
{
    write_file(ROOT + "/tree/one", "x");
    write_file(ROOT + "/tree/closed/file", "x");
    write_file(ROOT + "/tree/deep/two", "x");
    ASSERT_EQ(chmod((ROOT + "/tree/closed").c_str(), 0444), 0);
    const std::string log = expect_as_nobody([] {
        EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
        EXPECT_EQ(std::filesystem::current_path(), ROOT) << "the parent of what was to be removed";
    });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](Permission denied)ope dir err, path = closed\n"
                   "ERROR[remove_tree.cpp:N](Directory not empty)rm err, fn = /run/trees/tree\n");
    EXPECT_TRUE(exists(ROOT + "/tree/closed/file"));
    EXPECT_FALSE(exists(ROOT + "/tree/one"));
    EXPECT_FALSE(exists(ROOT + "/tree/deep"));
}

TEST_F(PathRemoveTree, what_is_neither_file_link_nor_directory_is_refused)
{
    ASSERT_EQ(mkfifo((ROOT + "/fifo").c_str(), 0600), 0);
    EXPECT_EQ(path_remove_tree((ROOT + "/fifo").c_str()), 1);
    EXPECT_TRUE(exists(ROOT + "/fifo"));
    log_of([&] {
        EXPECT_EQ(path_remove_tree(missing.c_str()), 1);
        EXPECT_EQ(path_remove_tree(nullptr), 1);
    });
}
