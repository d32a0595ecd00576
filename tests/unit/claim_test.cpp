#include "util/claim.h"

#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "disk/discovery.h"
#include "disk/mount_table.h"
#include "fs/fs_type.h"
#include "support/capture.h"
#include "support/files.h"
#include "support/stubs.h"
#include "support/text.h"
#include "util/block_dev.h"
#include "util/exec.h"
#include "util/file.h"
#include "util/paths.h"
#include "util/process.h"

using support::log_of;
using support::read_file;
using support::write_file;

namespace {

constexpr char PLACE[] = "/tmp/scratch";
constexpr char VICTIM[] = "/etc/victim";
constexpr uid_t STRANGER = 4711;

class Claim : public testing::Test {
protected:
    Claim()
    {
        clean();
        write_file(VICTIM, "precious");
    }
    ~Claim() override { clean(); }

    static void clean()
    {
        support::remove_all(PLACE);
        support::remove_all(VICTIM);
        for (const std::string& place : set_aside()) {
            support::remove_all(place);
        }
    }

    static std::vector<std::string> set_aside()
    {
        std::vector<std::string> places;
        for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
            if (entry.path().filename().string().rfind("foreign-", 0) == 0) {
                places.push_back(entry.path());
            }
        }
        return places;
    }

    static void expect_empty_private_file(const char* path)
    {
        struct stat info {};
        ASSERT_EQ(lstat(path, &info), 0);
        EXPECT_TRUE(S_ISREG(info.st_mode));
        EXPECT_EQ(info.st_mode & 0777U, 0600U);
        EXPECT_EQ(info.st_size, 0);
        EXPECT_EQ(info.st_uid, geteuid());
        EXPECT_EQ(info.st_nlink, 1U);
    }
};

}  // namespace

TEST_F(Claim, a_missing_file_is_made_empty_and_private)
{
    EXPECT_EQ(log_of([] { EXPECT_EQ(claim_file(PLACE), 0); }), "");
    expect_empty_private_file(PLACE);
}

TEST_F(Claim, a_file_that_was_there_is_replaced_and_not_emptied)
{
    write_file(PLACE, "old");
    std::filesystem::create_hard_link(PLACE, "/tmp/other_name");
    EXPECT_EQ(claim_file(PLACE), 0);
    expect_empty_private_file(PLACE);
    EXPECT_EQ(read_file("/tmp/other_name"), "old");
    support::remove_all("/tmp/other_name");
}

TEST_F(Claim, a_planted_link_is_removed_and_its_target_left_alone)
{
    for (const char* target : {VICTIM, "/etc/not_there"}) {
        std::filesystem::create_symlink(target, PLACE);
        EXPECT_EQ(claim_file(PLACE), 0);
        expect_empty_private_file(PLACE);
        support::remove_all(PLACE);
    }
    EXPECT_EQ(read_file(VICTIM), "precious");
    EXPECT_FALSE(std::filesystem::exists("/etc/not_there"));
}

TEST_F(Claim, a_planted_pipe_is_removed)
{
    ASSERT_EQ(mkfifo(PLACE, 0666), 0);
    EXPECT_EQ(claim_file(PLACE), 0);
    expect_empty_private_file(PLACE);
}

TEST_F(Claim, a_planted_directory_is_moved_into_one_that_only_the_daemon_enters)
{
    write_file(std::string(PLACE) + "/deep/file", "x");
    const std::string log = log_of([] { EXPECT_EQ(claim_file(PLACE), 0); });
    expect_empty_private_file(PLACE);
    EXPECT_TRUE(support::contains(log, "foreign path /tmp/scratch --> /tmp/foreign-")) << log;
    ASSERT_EQ(set_aside().size(), 1U);
    const std::string place = set_aside().front();
    EXPECT_EQ(read_file(place + "/entry/deep/file"), "x");
    struct stat info {};
    ASSERT_EQ(stat(place.c_str(), &info), 0);
    EXPECT_EQ(info.st_mode & 0777U, 0700U);
}

TEST_F(Claim, an_empty_planted_directory_is_removed)
{
    support::make_dir(PLACE);
    EXPECT_EQ(claim_file(PLACE), 0);
    expect_empty_private_file(PLACE);
    EXPECT_TRUE(set_aside().empty());
}

TEST_F(Claim, a_file_that_cannot_be_made_is_told)
{
    const std::string log =
        log_of([] { EXPECT_EQ(claim_file("/tmp/no_such_directory/scratch"), 1); });
    EXPECT_TRUE(support::contains(log, "claim err, path = /tmp/no_such_directory/scratch")) << log;
    EXPECT_EQ(claim_file(nullptr), 1);
}

TEST_F(Claim, what_is_missing_or_ours_stays)
{
    EXPECT_EQ(claim_path(PLACE), 0);
    support::make_dir(PLACE);
    EXPECT_EQ(claim_path(PLACE), 0);
    EXPECT_TRUE(std::filesystem::is_directory(PLACE));
    EXPECT_EQ(claim_path(nullptr), 0);
}

TEST_F(Claim, somebody_elses_directory_is_moved_aside)
{
    write_file(std::string(PLACE) + "/disk.json", "forged");
    ASSERT_EQ(chown(PLACE, STRANGER, STRANGER), 0);
    EXPECT_EQ(path_get_owner("/tmp/scratch/"), PATH_FOREIGN);
    EXPECT_EQ(claim_path("/tmp/scratch/"), 0);
    EXPECT_FALSE(std::filesystem::exists(PLACE));
    EXPECT_EQ(set_aside().size(), 1U);
}

TEST_F(Claim, somebody_elses_link_is_moved_aside_and_roots_own_is_used)
{
    support::make_dir("/run/elsewhere");
    std::filesystem::create_symlink("/run/elsewhere", PLACE);
    EXPECT_EQ(claim_path("/tmp/scratch/"), 0);
    EXPECT_TRUE(std::filesystem::is_symlink(PLACE));

    ASSERT_EQ(lchown(PLACE, STRANGER, STRANGER), 0);
    EXPECT_EQ(path_get_owner("/tmp/scratch/"), PATH_FOREIGN);
    EXPECT_EQ(claim_path("/tmp/scratch/"), 0);
    EXPECT_FALSE(std::filesystem::is_symlink(PLACE));
    EXPECT_TRUE(std::filesystem::is_directory("/run/elsewhere"));
    support::remove_all("/run/elsewhere");
}

TEST_F(Claim, a_directory_of_ours_takes_the_place_of_somebody_elses)
{
    write_file(std::string(PLACE) + "/disk.json", "forged");
    ASSERT_EQ(chown(PLACE, STRANGER, STRANGER), 0);
    log_of([] { EXPECT_EQ(dir_make_own("/tmp/scratch/"), 0); });
    EXPECT_TRUE(std::filesystem::is_directory(PLACE));
    EXPECT_EQ(path_get_owner(PLACE), PATH_OURS);
    EXPECT_TRUE(std::filesystem::is_empty(PLACE));
}

TEST_F(Claim, a_commands_output_goes_into_a_file_of_ours_and_not_through_a_planted_link)
{
    std::filesystem::create_symlink(VICTIM, PLACE);
    const std::string log =
        log_of([] { EXPECT_EQ(exec_cmd_into("echo output > /tmp/scratch", PLACE), 0); });
    EXPECT_TRUE(support::contains(log, "exec cmd = echo output > /tmp/scratch\n")) << log;
    EXPECT_EQ(read_file(PLACE), "output\n");
    EXPECT_EQ(read_file(VICTIM), "precious");
    EXPECT_FALSE(std::filesystem::is_symlink(PLACE));
}

TEST_F(Claim, a_command_whose_output_has_no_place_does_not_run)
{
    const std::string log = log_of([] {
        EXPECT_EQ(exec_cmd_into("touch /tmp/ran > /tmp/none/scratch", "/tmp/none/scratch"), -1);
    });
    EXPECT_FALSE(support::contains(log, "exec cmd")) << log;
    EXPECT_FALSE(std::filesystem::exists("/tmp/ran"));
}

TEST_F(Claim, a_forged_answer_that_cannot_be_taken_away_is_not_read)
{
    // A mount on the name cannot be unlinked.
    write_file("/run/forged", "/dev/sda1 on /tmp/mountd/disk1_part1 type ext4\n4711\n");
    const char* const names[] = {SCRATCH_MOUNT, SCRATCH_PIDOF, SCRATCH_BLKID_TYPE,
                                 SCRATCH_BLKID_VALUE, SCRATCH_DEV_CHECK};
    for (const char* name : names) {
        write_file(name, "");
        ASSERT_EQ(mount("/run/forged", name, "none", MS_BIND, nullptr), 0) << strerror(errno);
    }
    support::stub_programs stubs;
    for (const char* program : {"mount", "pidof", "blkid"}) {
        stubs.add(program);
    }
    log_of([] {
        mount_table table;
        EXPECT_EQ(read_mount_table(&table), 1);
        EXPECT_EQ(table.num, 0);
        EXPECT_EQ(proc_pid_of("tarn_nas_sys"), 0);
        char text[64];
        EXPECT_EQ(fs_blkid_type("/dev/sda1", text, sizeof(text)), 1);
        blkid_get_value("sda1", "/dev", text, sizeof(text));
        EXPECT_STREQ(text, "");
        EXPECT_EQ(dev_check_blkid("sda1"), 1);
    });
    EXPECT_TRUE(stubs.calls().empty());
    for (const char* name : names) {
        EXPECT_EQ(umount2(name, MNT_DETACH), 0);
        support::remove_all(name);
    }
}

TEST_F(Claim, a_directory_that_cannot_be_made_ours_is_told)
{
    // mkdir has nothing to make it in.
    const std::string log = log_of([] { EXPECT_EQ(dir_make_own("/proc/none/x"), 1); });
    EXPECT_TRUE(support::contains(log, "err, dir = /proc/none/x")) << log;
}
