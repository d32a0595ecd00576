#include "util/waits.h"

#include <gtest/gtest.h>

#include <numeric>
#include <span>
#include <vector>

#include "disk/mount.h"
#include "disk/removal.h"

namespace {

struct waits_case {
    const char* name;
    const wait_table& table;
};

const waits_case BOTH[] = {{"steady", waits::steady}, {"prompt", waits::prompt}};

int sum(std::span<const int> pauses)
{
    return std::accumulate(pauses.begin(), pauses.end(), 0);
}

}  // namespace

TEST(Waits, a_mount_gets_18_seconds_in_both_tables)
{
    for (const auto& [name, table] : BOTH) {
        EXPECT_EQ(sum(table.mount), 18000) << name;
    }
}

TEST(Waits, an_umount_gets_10_seconds_in_both_tables)
{
    for (const auto& [name, table] : BOTH) {
        EXPECT_EQ(sum(table.umount) * UMOUNT_TRIES, 10000) << name;
    }
}

TEST(Waits, a_cycle_without_work_lasts_3_seconds_in_both_tables)
{
    for (const auto& [name, table] : BOTH) {
        EXPECT_EQ(table.idle, 3000) << name;
        EXPECT_LE(table.work_due, table.idle) << name;
        EXPECT_GT(table.work_due, 0) << name << ": a wait of 0 would never let a burst arrive";
    }
}

TEST(Waits, the_steady_table_waits_the_same_each_time)
{
    EXPECT_EQ(std::vector<int>(waits::steady.mount.begin(), waits::steady.mount.end()),
              std::vector<int>(MOUNT_WAIT_TRIES, 2000));
    EXPECT_EQ(std::vector<int>(waits::steady.umount.begin(), waits::steady.umount.end()),
              std::vector<int>{1000});
    EXPECT_EQ(waits::steady.work_due, 3000);
}

TEST(Waits, the_prompt_table_looks_at_once_and_then_in_doubling_steps)
{
    for (const auto& looks : {waits::prompt.mount, waits::prompt.umount}) {
        ASSERT_GE(looks.size(), 3U);
        EXPECT_EQ(looks[0], 0);
        EXPECT_EQ(looks[1], 50);
        for (size_t i = 2; i + 1 < looks.size(); ++i) {
            EXPECT_EQ(looks[i], 2 * looks[i - 1]) << i;
        }
        EXPECT_LT(looks.back(), 2 * looks[looks.size() - 2]) << "the rest of the same time";
        EXPECT_GT(looks.back(), 0);
    }
    EXPECT_EQ(waits::prompt.work_due, 100);
}

TEST(Waits, this_build_has_one_of_the_two_tables)
{
    EXPECT_TRUE(&WAITS == &waits::steady || &WAITS == &waits::prompt);
}
