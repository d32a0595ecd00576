#include "util/remove_tree.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "support/files.h"
#include "support/support.h"

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

}  // namespace

TEST_F(Remove, RmRfTakesAWholeTreeInDoubleQuotes)
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

TEST_F(Remove, RmRfRefusesWhatAShellReadsInQuotes)
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

TEST_F(Remove, RmRfTakesAPathOfAnyLength)
{
    std::string path = ROOT + "/" + std::string(250, 'a') + "/" + std::string(250, 'b');
    make_dir(path);
    log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 0); });
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, RmRfWhoseCommandIsKilledGivesOne)
{
    // The shell itself is killed: the path ends the quotes.
    std::string path = ROOT + "/x\"; kill -KILL $$; \"";
    support::capture_stderr([&] {
        std::string log = log_of([&] { EXPECT_EQ(path_rm_rf(path.c_str()), 1); });
        std::string last = support::lines_of(log).back();
        EXPECT_EQ(last.substr(0, 24), "ERROR[remove_tree.cpp:N]") << log;
        EXPECT_TRUE(support::contains(last, ")rm err, fn = " + path)) << log;
    });
}

TEST_F(Remove, AFileGoesWithoutACommand)
{
    write_file(file, "x");
    std::string log = log_of([&] { EXPECT_EQ(file_remove_retry(file.c_str()), 0); });
    EXPECT_EQ(log, "");
    EXPECT_FALSE(exists(file));
}

TEST_F(Remove, AFileThatStaysIsRemovedByRmRf)
{
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    std::string log = log_of([&] { EXPECT_EQ(file_remove_retry(path.c_str()), 0); });
    EXPECT_EQ(support::count_of(log, "exec cmd = rm -rf \"/run/trees/dir\"\n"), 1) << log;
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, AnEmptyDirectoryGoes)
{
    std::string path = ROOT + "/dir";
    make_dir(path);
    EXPECT_EQ(dir_remove_retry(path.c_str()), 0);
    EXPECT_FALSE(exists(path));
}

TEST_F(Remove, ADirectoryThatIsNotEmptyStays)
{
    write_file(ROOT + "/dir/entry", "");
    std::string path = ROOT + "/dir";
    std::string log = log_of([&] { EXPECT_EQ(dir_remove_retry(path.c_str()), 1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](Directory not empty)rm err, fn = /run/trees/dir\n");
    EXPECT_TRUE(exists(ROOT + "/dir/entry"));
}

TEST_F(Remove, ALinkGoesAndItsTargetStays)
{
    write_file(file, "x");
    std::string link = ROOT + "/link";
    make_link(file, link);
    EXPECT_EQ(link_remove_retry(link.c_str()), 0);
    EXPECT_FALSE(exists(link));
    EXPECT_TRUE(exists(file));
}

TEST_F(Remove, AMissingLinkGivesTheSystemsError)
{
    std::string log = log_of([&] { EXPECT_EQ(link_remove_retry(missing.c_str()), 1); });
    EXPECT_EQ(
        log,
        "ERROR[remove_tree.cpp:N](No such file or directory)rm err, fn = /run/trees/missing\n");
}

TEST_F(PathGetType, TellsDirectoriesFilesLinksAndTheRest)
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

TEST_F(PathGetType, AMissingPathIsAnErrorWithTheSystemsText)
{
    std::string log = log_of([&] { EXPECT_EQ(path_get_type(missing.c_str()), -1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N](No such file or directory)file not exist, file = "
                   "/run/trees/missing\n");
}

TEST_F(PathGetType, ANullPathIsAnError)
{
    std::string log = log_of([] { EXPECT_EQ(path_get_type(nullptr), -1); });
    EXPECT_EQ(log, "ERROR[remove_tree.cpp:N]err!\n");
}

TEST_F(PathRemoveTree, TakesAFileALinkAndATree)
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

TEST_F(PathRemoveTree, LeavesWhatIsHiddenAndItsDirectoryAndStillGivesZero)
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

TEST_F(PathRemoveTree, ALinkToADirectoryIsUnlinkedAndItsTargetStays)
{
    write_file(ROOT + "/target/file", "x");
    std::string link = ROOT + "/link";
    make_link(ROOT + "/target", link);
    EXPECT_EQ(path_remove_tree(link.c_str()), 0);
    EXPECT_FALSE(exists(link));
    EXPECT_TRUE(exists(ROOT + "/target/file"));
}

TEST_F(PathRemoveTree, ALinkInsideATreeIsNotFollowed)
{
    write_file(ROOT + "/target/file", "x");
    make_dir(ROOT + "/tree");
    make_link(ROOT + "/target", ROOT + "/tree/link");
    EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
    EXPECT_FALSE(exists(ROOT + "/tree"));
    EXPECT_TRUE(exists(ROOT + "/target/file"));
}

TEST_F(PathRemoveTree, LeavesTheWorkingDirectoryInTheParent)
{
    write_file(ROOT + "/tree/deep/file", "x");
    EXPECT_EQ(path_remove_tree((ROOT + "/tree").c_str()), 0);
    EXPECT_EQ(std::filesystem::current_path(), ROOT);
}

TEST_F(PathRemoveTree, ARelativePathOfTwoNamesLeavesItsEmptyDirectory)
{
    // The directory is removed by the path as it was given, from inside its parent.
    write_file(ROOT + "/tree/deep/file", "x");
    ASSERT_EQ(chdir(ROOT.c_str()), 0);
    log_of([] { EXPECT_EQ(path_remove_tree("tree/deep"), 0); });
    EXPECT_EQ(std::filesystem::current_path(), ROOT + "/tree");
    EXPECT_TRUE(std::filesystem::is_empty(ROOT + "/tree/deep"));
}

TEST_F(PathRemoveTree, WhatIsNeitherFileLinkNorDirectoryIsRefused)
{
    ASSERT_EQ(mkfifo((ROOT + "/fifo").c_str(), 0600), 0);
    EXPECT_EQ(path_remove_tree((ROOT + "/fifo").c_str()), 1);
    EXPECT_TRUE(exists(ROOT + "/fifo"));
    log_of([&] {
        EXPECT_EQ(path_remove_tree(missing.c_str()), 1);
        EXPECT_EQ(path_remove_tree(nullptr), 1);
    });
}
