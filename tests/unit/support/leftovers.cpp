// Takes away what a case leaves in its world, so that no other can lean on it, and fails the case
// that leaves its process otherwise than it found it.

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <map>
#include <optional>
#include <set>
#include <string>

#include "support/files.h"
#include "support/process_state.h"

namespace {

namespace fs = std::filesystem;
using names = std::set<std::string>;

// run_private makes this one.
constexpr char PRIVATE_DIR[] = "/run/private";

// The private directories that cases fill, and files of theirs elsewhere.
constexpr const char* FILLED[] = {
    "/tmp",        "/run",           "/dev",       "/etc/config",
    "/etc/init.d", "/etc/hotplug.d", "/sys/block", "/sys/class/block"};
constexpr const char* PLACED[] = {"/etc/tarn_utils", "/usr/bin/disk_get_label.sh"};

names entries_of(const std::string& dir)
{
    names found;
    for (const auto& entry : fs::directory_iterator(dir)) {
        found.insert(entry.path());
    }
    return found;
}

// What is the process's own: the tests' and the daemon's code shall put it back.
struct process_view {
    names descriptors;
    std::string directory;
    std::string path;
    mode_t mask;

    bool operator==(const process_view&) const = default;
};

process_view look_at_process()
{
    process_view view;
    for (const std::string& link : entries_of("/proc/self/fd")) {
        std::error_code gone;
        const std::string target = fs::read_symlink(link, gone);
        // The look's own descriptor is closed by now.
        if (!gone) {
            view.descriptors.insert(std::string(link).append(" -> ").append(target));
        }
    }
    view.directory = fs::current_path();
    const char* path = getenv("PATH");
    view.path = path != nullptr ? path : "";
    view.mask = umask(0);
    umask(view.mask);
    return view;
}

class leftovers : public testing::EmptyTestEventListener {
    void OnTestProgramStart(const testing::UnitTest&) override
    {
        if (!fs::exists(PRIVATE_DIR)) {
            fprintf(stderr, "start the unit tests through run_private\n");
            exit(1);
        }
        for (const char* dir : FILLED) {
            kept[dir] = entries_of(dir);
        }
    }

    void OnTestStart(const testing::TestInfo&) override
    {
        state.emplace();
        before = look_at_process();
    }

    void OnTestEnd(const testing::TestInfo&) override
    {
        state.reset();
        for (const auto& [dir, own] : kept) {
            for (const std::string& entry : entries_of(dir)) {
                if (!own.contains(entry)) {
                    support::remove_all(entry);
                }
            }
        }
        for (const char* path : PLACED) {
            support::remove_all(path);
        }
        const process_view after = look_at_process();
        EXPECT_EQ(after.descriptors, before.descriptors);
        EXPECT_EQ(after.directory, before.directory);
        EXPECT_EQ(after.path, before.path);
        EXPECT_EQ(after.mask, before.mask);
    }

    std::map<std::string, names> kept;  // what was there before the first case
    std::optional<support::fresh_process> state;
    process_view before;
};

// GoogleTest owns it.
[[maybe_unused]] const bool listens = [] {
    testing::UnitTest::GetInstance()->listeners().Append(new leftovers);
    return true;
}();

}  // namespace
