#include "manager/manager.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <string>
#include <vector>

#include "disk/disk_db.h"
#include "main/signals.h"
#include "support/capture.h"
#include "support/child.h"
#include "support/clock.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/fs_code.h"
#include "util/paths.h"
#include "util/text.h"
#include "util/waits.h"

using support::capture_stdout;
using support::contains;
using support::expect_in_child;
using support::fake_clock;
using support::read_file;
using support::the_clock;
using support::write_file;

namespace {

constexpr time_t NOW = 1000000;
constexpr char EMPTY_JSON[] = "{\"disk_number\": 0, \"disk\": []}";
constexpr char TABLE_DETAILS[] = R"(PTUUID="12345678" PTTYPE="dos")";

const std::vector<std::string> STOP_CALLS = {
    "/etc/init.d/samba4 stop", "/etc/init.d/nas_samba3 stop", "/etc/init.d/tarn_nas_sys_dl stop",
    "/etc/init.d/tarn_nas_sys_up stop"};
const std::vector<std::string> START_CALLS = {
    "/etc/init.d/samba4 start", "/etc/init.d/nas_samba3 start", "/etc/init.d/tarn_nas_sys_dl start",
    "/etc/init.d/tarn_nas_sys_up start"};

std::vector<std::string> joined(const std::vector<std::vector<std::string>>& lists)
{
    std::vector<std::string> all;
    for (const auto& list : lists) {
        all.insert(all.end(), list.begin(), list.end());
    }
    return all;
}

class Manager : public support::disk_world {
protected:
    Manager() : manager(manager_get()) { EXPECT_EQ(manager_init(manager), 0); }
    ~Manager() override { manager_free(manager); }

    // Larger than what is free in the directories of this world, which are not really mounted.
    void plug_with_part(const std::string& disk, uint64_t mib)
    {
        plug_disk(disk, TABLE_DETAILS, mib + 1);
        plug_part(disk, disk + "1", "UUID=\"U-" + disk + R"(" TYPE="ext4")", mib);
    }

    int dispatch(int32_t type, const char* name)
    {
        manager->pipes.event = {};
        manager->pipes.event.type = static_cast<event_code>(type);
        text_copy(manager->pipes.event.dev_name, name);
        return manager_dispatch(manager);
    }

    static void send(const char* message)
    {
        const int fd = open(PIPE_ADD_REMOVE, O_WRONLY | O_NONBLOCK | O_CLOEXEC);
        ASSERT_GE(fd, 0);
        EXPECT_EQ(write(fd, message, strlen(message)), static_cast<ssize_t>(strlen(message)));
        close(fd);
    }

    // An active manager whose timers were all set just now.
    void make_calm()
    {
        manager->state = MANAGER_ACTIVE;
        manager->t_refresh = NOW;
        manager->t_update = NOW;
        manager->t_publish = NOW;
        manager->t_rescan = NOW;
        write_file(DISK_JSON_FILE, "old");
    }

    fake_clock clock{NOW};
    disk_manager* manager;
};

}  // namespace

TEST_F(Manager, initialising_zeroes_everything_and_opens_the_pipes)
{
    manager_free(manager);
    memset(&manager->disks, 'x', sizeof(manager->disks));
    manager->t_rescan = 5;
    manager->update_due = 1;
    ASSERT_EQ(manager_init(manager), 0);
    EXPECT_EQ(manager->state, 1);
    EXPECT_TRUE(support::is_all_zero(manager->disks));
    EXPECT_EQ(manager->t_rescan, 0);
    EXPECT_EQ(manager->update_due, 0);
    EXPECT_GT(manager->pipes.fd_add_remove, 0);
}

TEST_F(Manager, initialising_fails_when_the_pipes_cannot_be_made)
{
    manager_free(manager);
    support::remove_all("/tmp/tarn_nas");
    write_file("/tmp/tarn_nas", "");
    EXPECT_EQ(manager_init(manager), 1);
    EXPECT_EQ(manager->state, 0);
    support::remove_all("/tmp/tarn_nas");
}

TEST_F(Manager, a_null_manager_is_answered_with_1)
{
    EXPECT_NE(manager_get(), nullptr);
    EXPECT_EQ(manager_init(nullptr), 1);
    EXPECT_EQ(manager_free(nullptr), 1);
    EXPECT_EQ(manager_scan(nullptr, 0), 1);
    EXPECT_EQ(manager_run(nullptr), 1);
    EXPECT_EQ(manager_event_loop(nullptr), 1);
    EXPECT_EQ(manager_dispatch(nullptr), 1);
    EXPECT_EQ(manager_idle(nullptr), 1);
}

TEST_F(Manager, a_start_without_disks_writes_the_empty_document_and_leaves_the_count_alone)
{
    write_file(DISK_NUM_FILE, "old");
    for (const char* name : {"loop0", "mtdblock3", "sr0", "ram0"}) {
        plug_disk(name, TABLE_DETAILS, 5000);
    }
    const std::string log = capture_stdout([&] { EXPECT_EQ(manager_scan(manager, 0), 0); });
    EXPECT_EQ(read_file("/tmp/tarn_nas//disk.json"), EMPTY_JSON);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "old");
    EXPECT_EQ(manager->state, 1);
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
    EXPECT_TRUE(contains(log, "scan path = /sys/block\n"));
    EXPECT_TRUE(contains(log, "d_name = loop0\n"));
    EXPECT_TRUE(contains(log, "have disk = 0\n"));
}

TEST_F(Manager, after_a_start_without_disks_no_rescan_runs_until_an_add_event)
{
    manager_scan(manager, 0);
    plug_with_part("sda", 400000);
    for (int i = 0; i < 5; ++i) {
        the_clock.now += 100;
        EXPECT_EQ(manager_idle(manager), 0);
    }
    EXPECT_TRUE(stubs.calls().empty());
    EXPECT_EQ(read_file(DISK_JSON_FILE), EMPTY_JSON);

    dispatch(EVENT_DISK_ADD, "sda");
    EXPECT_EQ(manager->state, 3);
    manager_idle(manager);
    EXPECT_TRUE(contains(read_file(DISK_JSON_FILE), "disk1_part1"));
}

TEST_F(Manager, a_start_with_disks_mounts_and_publishes_them)
{
    plug_with_part("sda", 400000);
    plug_with_part("sdb", 800000);
    const std::string log = capture_stdout([&] { EXPECT_EQ(manager_scan(manager, 0), 0); });
    EXPECT_EQ(manager->state, 3);
    EXPECT_EQ(actions(), (std::vector<std::string>{
                             "mount -t ext4 -o rw,defaults /dev/sdb1 /tmp/mountd/disk1_part1",
                             "mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk2_part1"}))
        << "disk 1 is the largest";
    EXPECT_EQ(read_file(DISK_NUM_FILE), "2");
    EXPECT_TRUE(contains(log, "have disk = 1\n"));
    EXPECT_FALSE(contains(log, "check disk is alread mountd"));
}

TEST_F(Manager, a_scan_that_cannot_read_the_kernels_list_answers_1)
{
    const std::string log = expect_in_child([&] {
        support::allow_no_open_files();
        EXPECT_EQ(manager_scan(manager, 0), 1);
        EXPECT_EQ(manager->state, 1);
    });
    EXPECT_TRUE(contains(log, "]open dir err, dir = /sys/block\n"));
}

TEST_F(Manager, an_add_event_activates_adds_and_makes_the_mount_pass_due)
{
    plug_with_part("sda", 400000);
    const std::string log = capture_stdout([&] { EXPECT_EQ(dispatch(EVENT_DISK_ADD, "sda1"), 0); });
    EXPECT_EQ(manager->state, 3);
    EXPECT_EQ(manager->changed, 1);
    EXPECT_EQ(manager->update_due, 1);
    EXPECT_EQ(manager->t_refresh, NOW);
    EXPECT_EQ(manager->t_update, NOW);
    EXPECT_NE(disk_sets_find_part(&manager->disks, "sda1"), nullptr);
    EXPECT_TRUE(contains(log, "===> get event = EVENT_DISK_ADD\n"));
    EXPECT_TRUE(actions().empty()) << "no service is stopped, nothing is mounted yet";
}

TEST_F(Manager, a_name_of_32_characters_is_never_read_beyond_its_field)
{
    const std::string name = "sd0123456789012345678901234567AB";
    ASSERT_EQ(name.size(), 32U);
    memset(&manager->disks.sorted_once, 0, sizeof(manager->disks.sorted_once));
    // The inventory stands right behind the event; its first bytes would be read as part of it.
    text_copy(manager->disks.entries[0].disk.root.uid, "BEHIND");
    for (const event_code type : {EVENT_DISK_ADD, EVENT_DISK_REMOVE_DEV, EVENT_DISK_REMOVE_DISK}) {
        manager->pipes.event.type = type;
        memcpy(manager->pipes.event.dev_name, name.data(), EVENT_NAME_SIZE);
        const std::string log = capture_stdout([&] { manager_dispatch(manager); });
        EXPECT_TRUE(contains(log, "name = " + name + "\n")) << log;
        EXPECT_FALSE(contains(log, "BEHIND")) << log;
    }
    EXPECT_EQ(times_called("blkid /dev/" + name), 1);
}

TEST_F(Manager, a_removal_event_stops_and_starts_the_four_services_even_for_an_unknown_device)
{
    for (const int32_t type : {EVENT_DISK_REMOVE_DEV, EVENT_DISK_REMOVE_DISK}) {
        stubs.forget_calls();
        manager->changed = 0;
        EXPECT_EQ(dispatch(type, "sdq1"), 0);
        EXPECT_EQ(stubs.calls(), joined({STOP_CALLS, START_CALLS})) << type;
        EXPECT_EQ(manager->changed, 1);
    }
}

TEST_F(Manager, remove_dev_unmounts_between_stopping_and_starting_the_services)
{
    plug_with_part("sda", 400000);
    manager_scan(manager, 0);
    stubs.forget_calls();
    dispatch(EVENT_DISK_REMOVE_DEV, "sda1");
    EXPECT_EQ(
        actions(),
        joined({STOP_CALLS, {"umount /dev/sda1", "umount /tmp/mountd/disk1_part1"}, START_CALLS}));
    EXPECT_EQ(disk_sets_find_part(&manager->disks, "sda1"), nullptr);
}

TEST_F(Manager, remove_disk_takes_a_directory_name)
{
    plug_with_part("sda", 400000);
    manager_scan(manager, 0);
    stubs.forget_calls();
    dispatch(EVENT_DISK_REMOVE_DISK, "disk1_part1");
    EXPECT_EQ(
        actions(),
        joined({STOP_CALLS, {"umount /dev/sda1", "umount /tmp/mountd/disk1_part1"}, START_CALLS}));
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
}

TEST_F(Manager, a_safe_removal_unmounts_all_publishes_and_parks_until_the_next_add)
{
    plug_with_part("sda", 400000);
    manager_scan(manager, 0);
    stubs.forget_calls();
    const std::string log =
        capture_stdout([&] { EXPECT_EQ(dispatch(EVENT_DISK_SAFE_REMOVE, ""), 0); });
    EXPECT_TRUE(contains(log, "===> safe remove disk\n"));
    EXPECT_EQ(actions(),
              joined({STOP_CALLS,
                      {"umount /dev/sda1", "umount /tmp/mountd/disk1_part1", "umount /dev/sda"},
                      START_CALLS}));
    EXPECT_EQ(manager->state, 4);
    EXPECT_EQ(read_file(DISK_NUM_FILE), "0");

    stubs.forget_calls();
    the_clock.slept_ms = 0;
    the_clock.now += 1000;
    const std::string parked = capture_stdout([&] { EXPECT_EQ(manager_idle(manager), 0); });
    EXPECT_TRUE(contains(parked, "]disk safe remove ...\n"));
    EXPECT_EQ(the_clock.slept_ms, 1000);
    EXPECT_TRUE(stubs.calls().empty());

    dispatch(EVENT_DISK_ADD, "sda");
    EXPECT_EQ(manager->state, 3);
    EXPECT_EQ(disk_sets_count(&manager->disks), 1);
}

TEST_F(Manager, heart_beats_do_nothing_and_unknown_types_answer_1)
{
    EXPECT_EQ(dispatch(EVENT_DISK_HEART_BEAT, ""), 0);
    EXPECT_EQ(manager->state, 1);
    EXPECT_EQ(manager->changed, 0);
    for (const int32_t type : {0, -1, 1000, INT32_MAX, INT32_MIN}) {
        const std::string log = capture_stdout([&] { EXPECT_EQ(dispatch(type, ""), 1); });
        EXPECT_TRUE(contains(log, "===> get event = err event\n")) << log;
        EXPECT_TRUE(contains(log, "]err event type = " + std::to_string(type) + "\n")) << log;
    }
}

TEST_F(Manager, every_event_that_can_be_parsed_is_acted_on)
{
    for (int32_t type = EVENT_NONE + 1; type < EVENT_CODE_END; ++type) {
        const std::string log = capture_stdout([&] { dispatch(type, ""); });
        EXPECT_FALSE(contains(log, "err event type")) << log;
    }
}

TEST_F(Manager, the_state_of_the_process_survives_the_manager_and_ends_with_its_reset)
{
    EXPECT_EQ(running, 1);
    EXPECT_EQ(restart_requested, 0);
    dispatch(EVENT_DISK_SAFE_REMOVE, "");
    restart_requested = 1;
    loop_run_stop();
    EXPECT_EQ(running, 0);
    manager_free(manager);
    ASSERT_EQ(manager_init(manager), 0);
    EXPECT_EQ(running, 0);
    EXPECT_EQ(restart_requested, 1);

    manager_life_reset();
    EXPECT_EQ(running, 1);
    EXPECT_EQ(restart_requested, 0);
    the_clock.step = 61;
    const std::string log = capture_stdout([&] { manager_event_loop(manager); });
    EXPECT_TRUE(contains(log, "]sys timeout, 61 > 60\n")) << "the limit is the first one again";
}

TEST_F(Manager, the_first_idle_cycle_refreshes_updates_publishes_and_rescans_at_once)
{
    plug_with_part("sda", 400000);
    manager->state = MANAGER_ACTIVE;
    const std::string log = capture_stdout([&] { manager_idle(manager); });
    EXPECT_TRUE(contains(log, "=== === ===> update = 1\n")) << "disk.json is missing";
    EXPECT_EQ(manager->t_refresh, NOW);
    EXPECT_EQ(manager->t_update, NOW);
    EXPECT_EQ(manager->t_publish, NOW);
    EXPECT_EQ(manager->t_rescan, NOW);
    EXPECT_EQ(manager->changed, 1) << "the rescan found a disk after the publication";
    EXPECT_EQ(disk_sets_count(&manager->disks), 1);
}

TEST_F(Manager, a_calm_cycle_does_nothing)
{
    make_calm();
    const std::string log = capture_stdout([&] { manager_idle(manager); });
    EXPECT_TRUE(contains(log, "=== === ===> update = 0\n"));
    EXPECT_TRUE(stubs.calls().empty());
    EXPECT_EQ(read_file(DISK_JSON_FILE), "old");
}

TEST_F(Manager, sizes_are_refreshed_after_more_than_4_seconds)
{
    make_calm();
    support::put_root(&manager->disks.entries[0], "sda", 0);
    plug_disk("sda", "", 5000);
    manager->t_update = NOW + 10;
    manager->t_rescan = NOW + 10;
    manager->t_refresh = NOW - 4;
    manager_idle(manager);
    EXPECT_EQ(manager->t_refresh, NOW - 4);
    EXPECT_EQ(manager->disks.entries[0].disk.root.total_len, 0U);
    manager->t_refresh = NOW - 5;
    manager_idle(manager);
    EXPECT_EQ(manager->t_refresh, NOW);
    EXPECT_EQ(manager->disks.entries[0].disk.root.total_len, 5000U);
}

TEST_F(Manager, the_mount_pass_runs_every_3_seconds_or_when_it_is_due)
{
    make_calm();
    manager->t_update = NOW - 2;
    manager_idle(manager);
    EXPECT_EQ(manager->t_update, NOW - 2);
    EXPECT_EQ(manager->disks.sorted_once, 0);
    manager->t_update = NOW - 3;
    manager_idle(manager);
    EXPECT_EQ(manager->t_update, NOW);
    EXPECT_EQ(manager->disks.sorted_once, 1);

    manager->disks.sorted_once = 0;
    manager->update_due = 1;
    manager_idle(manager);
    EXPECT_EQ(manager->disks.sorted_once, 1);
    EXPECT_EQ(manager->update_due, 0);
}

TEST_F(Manager, a_change_is_published_once_and_a_missing_document_counts_as_one)
{
    make_calm();
    manager->t_publish = NOW - 20;
    manager->changed = 1;
    manager_idle(manager);
    EXPECT_EQ(manager->changed, 0);
    EXPECT_EQ(manager->t_publish, NOW);
    EXPECT_NE(read_file(DISK_JSON_FILE), "old");

    write_file(DISK_JSON_FILE, "old");
    manager_idle(manager);
    EXPECT_EQ(read_file(DISK_JSON_FILE), "old");

    support::remove_all(DISK_JSON_FILE);
    manager->t_publish = NOW - 20;
    manager_idle(manager);
    EXPECT_TRUE(std::filesystem::exists(DISK_JSON_FILE));
    EXPECT_EQ(manager->t_publish, NOW);
}

TEST_F(Manager, thirty_seconds_after_the_last_change_every_idle_cycle_publishes)
{
    make_calm();
    manager->t_publish = NOW - 29;
    manager_idle(manager);
    EXPECT_EQ(read_file(DISK_JSON_FILE), "old");
    manager->t_publish = NOW - 30;
    for (int i = 0; i < 3; ++i) {
        write_file(DISK_JSON_FILE, "old");
        manager_idle(manager);
        EXPECT_NE(read_file(DISK_JSON_FILE), "old") << i;
        EXPECT_EQ(manager->t_publish, NOW - 30) << i;
    }
}

TEST_F(Manager, the_rescan_and_the_consistency_check_run_every_8_seconds)
{
    make_calm();
    plug_with_part("sda", 400000);
    manager->t_rescan = NOW - 7;
    manager_idle(manager);
    EXPECT_EQ(manager->t_rescan, NOW - 7);
    EXPECT_TRUE(stubs.calls().empty());
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_EQ(manager->t_rescan, NOW);
    EXPECT_EQ(manager->changed, 1);
    EXPECT_EQ(disk_sets_count(&manager->disks), 1);
    EXPECT_EQ(times_called("mount"), 2) << "one look for each of the two checks";
    EXPECT_EQ(running, 1);
    EXPECT_EQ(restart_requested, 0);
}

TEST_F(Manager, a_mounted_device_that_vanished_deletes_the_database_and_asks_for_a_restart)
{
    make_calm();
    write_file(DISK_DB_FILE, "database");
    add_mount("/dev/sdq1", "/tmp/mountd/disk1_part1");
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_FALSE(std::filesystem::exists(DISK_DB_FILE));
    EXPECT_EQ(running, 0);
    EXPECT_EQ(restart_requested, 1);
}

TEST_F(Manager, a_disk_pulled_between_the_rescan_and_the_check_is_only_pulled)
{
    make_calm();
    plug_with_part("sda", 400000);
    dispatch(EVENT_DISK_ADD, "sda");
    manager_idle(manager);
    ASSERT_EQ(times_called("mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk1_part1"), 1);
    write_file(DISK_DB_FILE, "database");
    // The first thing that the check asks for is the mount table; by then the disk is gone.
    stubs.add("mount", "rm -rf /sys/block/sda /dev/sda /dev/sda1; cat /run/mounts 2>/dev/null");
    manager->t_rescan = NOW - 8;
    const std::string log = capture_stdout([&] { manager_idle(manager); });
    EXPECT_TRUE(contains(log, "]dev not find, dev = /dev/sda1\n")) << log;
    EXPECT_TRUE(contains(log, "]disk was pulled, dev = sda\n")) << log;
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
    EXPECT_EQ(manager->changed, 1);
    EXPECT_TRUE(std::filesystem::exists(DISK_DB_FILE));
    EXPECT_EQ(running, 1);
    EXPECT_EQ(restart_requested, 0);
}

TEST_F(Manager, a_pulled_disk_that_stays_busy_deletes_the_database_and_asks_for_a_restart)
{
    make_calm();
    plug_with_part("sda", 400000);
    dispatch(EVENT_DISK_ADD, "sda");
    manager_idle(manager);
    write_file(DISK_DB_FILE, "database");
    write_file(support::UMOUNT_BUSY, std::string(100, 'x'));
    unplug("sda1");
    unplug("sda");
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_FALSE(std::filesystem::exists(DISK_DB_FILE));
    EXPECT_EQ(restart_requested, 1);
}

TEST_F(Manager, a_node_gone_while_the_kernel_lists_the_disk_asks_for_a_restart)
{
    make_calm();
    plug_with_part("sda", 400000);
    dispatch(EVENT_DISK_ADD, "sda");
    manager_idle(manager);
    write_file(DISK_DB_FILE, "database");
    support::remove_all("/dev/sda1");
    manager->t_rescan = NOW - 8;
    const std::string log = capture_stdout([&] { manager_idle(manager); });
    EXPECT_EQ(restart_requested, 1);
    EXPECT_EQ(support::count_of(log, "]dev not find, dev = /dev/sda1\n"), 1);
    EXPECT_FALSE(contains(log, "umount"));
}

TEST_F(Manager, an_add_for_another_disk_under_a_known_name_takes_it_in)
{
    make_calm();
    plug_with_part("sda", 400000);
    dispatch(EVENT_DISK_ADD, "sda");
    manager_idle(manager);
    unplug("sda1");
    unplug("sda");
    write_file("/dev/keeps_a_number", "");
    plug_with_part("sda", 300000);
    const std::string log = capture_stdout([&] { dispatch(EVENT_DISK_ADD, "sda1"); });
    EXPECT_TRUE(contains(log, "]disk was replaced, dev = sda\n"));
    EXPECT_EQ(manager->disks.entries[0].disk.parts[0].part.total_len, 300000U);
    // The messages of the pull come only now, and cost the new one a moment.
    dispatch(EVENT_DISK_REMOVE_DEV, "sda1");
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_EQ(manager->disks.entries[0].disk.parts[0].part.total_len, 300000U);
    // Through the other pipes somebody asks for it.
    manager->pipes.event_fd = manager->pipes.fd_remove;
    dispatch(EVENT_DISK_REMOVE_DEV, "sda1");
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
}

TEST_F(Manager, a_disk_that_a_rescan_took_in_is_mounted_before_anything_is_published)
{
    make_calm();
    plug_with_part("sda", 400000);
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    // Junk in a pipe ends the wait, and the next idle cycle begins in the same second.
    manager_idle(manager);
    EXPECT_EQ(disk_sets_count(&manager->disks), 1);
    EXPECT_EQ(times_called("mount -t ext4 -o rw,defaults /dev/sda1 /tmp/mountd/disk1_part1"), 1);
}

TEST_F(Manager, a_safe_removal_forgets_pulled_disks_too)
{
    make_calm();
    plug_with_part("sda", 400000);
    dispatch(EVENT_DISK_ADD, "sda");
    manager_idle(manager);
    unplug("sda1");
    unplug("sda");
    dispatch(EVENT_DISK_SAFE_REMOVE, "");
    EXPECT_EQ(disk_sets_count(&manager->disks), 0);
    EXPECT_EQ(read_file(support::MOUNTS_FILE), "");
}

TEST_F(Manager, two_devices_on_one_path_delete_the_database_and_ask_for_a_restart)
{
    make_calm();
    write_file(DISK_DB_FILE, "database");
    for (const char* name : {"sda", "sdb"}) {
        plug_disk(name, "", 5000);
        add_mount(std::string("/dev/") + name, "/tmp/mountd/disk1_part1");
    }
    manager->t_rescan = NOW - 8;
    manager_idle(manager);
    EXPECT_FALSE(std::filesystem::exists(DISK_DB_FILE));
    EXPECT_EQ(running, 0);
    EXPECT_EQ(restart_requested, 1);
    EXPECT_EQ(times_called("mount"), 2) << "both checks run, whatever the first one found";
}

TEST_F(Manager, 61_seconds_of_silence_with_the_companion_running_warn_and_go_on)
{
    const std::string log = capture_stdout([&] {
        write_file(support::PIDS_FILE, "321 322\n");
        the_clock.step = 61;
        the_clock.on_look = [&](int look) {
            if (look == 2) {
                send("#heart_beat\n");
            } else if (look == 3) {
                support::remove_all(support::PIDS_FILE);
            }
        };
        EXPECT_EQ(manager_event_loop(manager), 0);
        EXPECT_EQ(running, 0);
        EXPECT_EQ(times_called("pidof tarn_nas_sys"), 2);
        EXPECT_EQ(restart_requested, 0);
    });
    EXPECT_EQ(support::count_of(log, "]sys timeout, 61 > 60\n"), 2) << log;
    EXPECT_TRUE(contains(log, "get app = tarn_nas_sys, pid = 321 322\n"));
    EXPECT_TRUE(contains(log, "EVENT_DISK_HEART_BEAT"));
    EXPECT_TRUE(contains(log, "]===> proc not exist, name = tarn_nas_sys\n"));
}

TEST_F(Manager, 60_seconds_of_silence_are_none_and_every_valid_event_resets_them)
{
    the_clock.step = 60;
    the_clock.on_look = [&](int look) {
        send("#heart_beat\n");
        running = look < 6 ? 1 : 0;
    };
    EXPECT_EQ(manager_event_loop(manager), 0);
    EXPECT_EQ(times_called("pidof tarn_nas_sys"), 0);
}

TEST_F(Manager, a_cycle_without_an_event_does_not_reset_the_silence)
{
    const std::string log = capture_stdout([&] {
        the_clock.step = 40;
        the_clock.on_look = [&](int look) {
            if (look == 2) {
                send("no event\n");
            }
        };
        EXPECT_EQ(manager_event_loop(manager), 0);
        EXPECT_EQ(the_clock.looks, 3);
        EXPECT_EQ(running, 0);
    });
    EXPECT_TRUE(contains(log, "]no event ...\n"));
    EXPECT_TRUE(contains(log, "]sys timeout, 80 > 60\n"));
}

TEST_F(Manager, two_safe_removals_raise_the_silence_limit_to_1500_seconds)
{
    const std::string log = capture_stdout([&] {
        dispatch(EVENT_DISK_SAFE_REMOVE, "");
        dispatch(EVENT_DISK_SAFE_REMOVE, "");
        the_clock.looks = 0;
        the_clock.step = 1500;
        the_clock.on_look = [&](int look) {
            if (look == 2) {
                send("#heart_beat\n");
            } else if (look == 3) {
                the_clock.now += 1;
            }
        };
        EXPECT_EQ(manager_event_loop(manager), 0);
        EXPECT_EQ(the_clock.looks, 3);
    });
    EXPECT_EQ(support::count_of(log, "]sys timeout, "), 1);
    EXPECT_TRUE(contains(log, "]sys timeout, 1501 > 1500\n"));
}

TEST_F(Manager, many_safe_removals_do_not_overflow_the_silence_limit)
{
    for (int i = 0; i < 20; ++i) {
        dispatch(EVENT_DISK_SAFE_REMOVE, "");
    }
    the_clock.step = 100000;
    the_clock.on_look = [&](int look) {
        send("#heart_beat\n");
        running = look < 4 ? 1 : 0;
    };
    manager_event_loop(manager);
    EXPECT_EQ(times_called("pidof tarn_nas_sys"), 0);
}

TEST_F(Manager, only_an_active_manager_with_something_to_do_shortens_its_wait)
{
    struct wait_case {
        int32_t state;
        int32_t changed;
        int32_t update_due;
        int expected;
    };
    for (const wait_case& one : {wait_case{MANAGER_ACTIVE, 0, 0, WAITS.idle},
                                 wait_case{MANAGER_ACTIVE, 1, 0, WAITS.work_due},
                                 wait_case{MANAGER_ACTIVE, 0, 1, WAITS.work_due},
                                 wait_case{MANAGER_ACTIVE, 1, 1, WAITS.work_due},
                                 wait_case{MANAGER_INITIALISED, 1, 1, WAITS.idle},
                                 wait_case{MANAGER_SAFE_REMOVED, 1, 1, WAITS.idle}}) {
        manager_life_reset();
        manager->state = one.state;
        manager->changed = one.changed;
        manager->update_due = one.update_due;
        send("#heart_beat\n");
        the_clock.looks = 0;
        the_clock.on_look = [&](int look) {
            if (look == 2) {
                running = 0;
            }
        };
        capture_stdout([&] { manager_event_loop(manager); });
        EXPECT_EQ(manager->pipes.wait_ms, one.expected)
            << one.state << one.changed << one.update_due;
    }
}

TEST_F(Manager, a_stopped_loop_ends_at_the_top_of_its_cycle)
{
    running = 0;
    send("#add:sda\n");
    EXPECT_EQ(manager_event_loop(manager), 0);
    EXPECT_TRUE(stubs.calls().empty());
}

TEST_F(Manager, a_run_scans_once_loops_and_rebuilds_the_manager_once_at_its_end)
{
    const std::string log = capture_stdout([&] {
        send("#heart_beat\n");
        the_clock.on_look = [](int look) { running = look < 2 ? 1 : 0; };
        EXPECT_EQ(manager_run(manager), 0);
        EXPECT_EQ(manager->state, 1);
        EXPECT_GT(manager->pipes.fd_add_remove, 0);
    });
    EXPECT_EQ(support::count_of(log, "manager work again!\n"), 1);
    EXPECT_EQ(support::count_of(log, "scan path = /sys/block\n"), 1);
    EXPECT_EQ(support::count_of(log, "EVENT_DISK_HEART_BEAT"), 1);
    EXPECT_EQ(read_file(DISK_JSON_FILE), EMPTY_JSON) << "the status file stays";
}

TEST_F(Manager, signals_of_the_last_event_are_told_before_the_manager_is_rebuilt)
{
    const std::string log = capture_stdout([&] {
        setup_signals();
        send("#add:sda\n");
        the_clock.on_look = [](int look) {
            // The third look is the event's.
            if (look == 3) {
                raise(SIGINT);
                raise(SIGINT);
            }
        };
        EXPECT_EQ(manager_run(manager), 0);
    });
    EXPECT_TRUE(contains(log, "EVENT_DISK_ADD")) << log;
    EXPECT_TRUE(contains(log, "get sig = SIGINT, c = 1\n")) << log;
    EXPECT_LT(log.find("get sig = SIGINT, c = 1\n"), log.find("fd disk_add_remove")) << log;
}
