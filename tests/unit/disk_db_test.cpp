#include "disk/disk_db.h"

#include <gtest/gtest.h>
#include <sys/mount.h>

#include <cstdint>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "support/capture.h"
#include "support/disk_world.h"
#include "support/files.h"
#include "support/records.h"
#include "support/text.h"
#include "util/paths.h"
#include "util/text.h"

using support::capture_stdout;
using support::contains;

namespace {

disk_db_record make_record(const char* uid, const char* dev_name, const char* disk_name,
                           int32_t mountd)
{
    disk_db_record record{};
    text_copy(record.uid, uid);
    text_copy(record.dev_name, dev_name);
    text_copy(record.disk_name, disk_name);
    if (disk_name[0] != '\0') {
        path_mount_dir(record.mount_path, disk_name);
    }
    record.mountd = mountd;
    return record;
}

class DiskDb : public support::disk_world {
protected:
    // All rows in order, "uid|dev_name|disk_name|mount_path|mountd", read past the code under test.
    static std::vector<std::string> rows()
    {
        std::vector<std::string> result;
        sqlite3* db = nullptr;
        EXPECT_EQ(sqlite3_open_v2(DISK_DB_FILE, &db, SQLITE_OPEN_READONLY, nullptr), SQLITE_OK);
        sqlite3_stmt* statement = nullptr;
        EXPECT_EQ(
            sqlite3_prepare_v2(db, "select * from disk order by rowid", -1, &statement, nullptr),
            SQLITE_OK);
        while (sqlite3_step(statement) == SQLITE_ROW) {
            std::string row;
            for (int i = 0; i < sqlite3_column_count(statement); ++i) {
                const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(statement, i));
                row += (i > 0 ? "|" : "") + std::string(text != nullptr ? text : "(null)");
            }
            result.push_back(row);
        }
        sqlite3_finalize(statement);
        sqlite3_close(db);
        return result;
    }

    static void run_sql(const char* sql)
    {
        sqlite3* db = nullptr;
        ASSERT_EQ(sqlite3_open(DISK_DB_FILE, &db), SQLITE_OK);
        EXPECT_EQ(sqlite3_exec(db, sql, nullptr, nullptr, nullptr), SQLITE_OK)
            << sqlite3_errmsg(db);
        sqlite3_close(db);
    }

    static void add_row(const char* uid, const char* dev, const char* name, int32_t mountd = 1)
    {
        const disk_db_record record = make_record(uid, dev, name, mountd);
        disk_db_add(&record);
    }
};

}  // namespace

TEST_F(DiskDb, the_first_partition_creates_directory_file_and_table_and_inserts_one_row)
{
    ASSERT_FALSE(std::filesystem::exists(CONFIG_DIR));
    const std::string log = capture_stdout([] { add_row("U-1", "sda1", "disk1_part1"); });
    EXPECT_EQ(rows(), std::vector<std::string>{"U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|yes"});
    EXPECT_TRUE(contains(log, "sql = \nCREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,"
                              "mount_path TEXT,mountd TEXT);\n"))
        << log;
    EXPECT_TRUE(contains(log, "sql = \ninsert into disk values('U-1','sda1','disk1_part1',"
                              "'/tmp/mountd/disk1_part1','yes')\n"))
        << log;
}

TEST_F(DiskDb, the_stored_table_has_the_five_text_columns)
{
    add_row("U-1", "sda1", "disk1_part1");
    sqlite3* db = nullptr;
    ASSERT_EQ(sqlite3_open(DISK_DB_FILE, &db), SQLITE_OK);
    sqlite3_stmt* statement = nullptr;
    ASSERT_EQ(sqlite3_prepare_v2(db, "select sql from sqlite_master where name='disk'", -1,
                                 &statement, nullptr),
              SQLITE_OK);
    ASSERT_EQ(sqlite3_step(statement), SQLITE_ROW);
    EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(statement, 0)),
                 "CREATE TABLE disk (uid TEXT,dev_name TEXT,disk_name TEXT,mount_path TEXT,mountd "
                 "TEXT)");
    sqlite3_finalize(statement);
    sqlite3_close(db);
}

TEST_F(DiskDb, an_existing_table_is_kept_and_its_warning_is_logged_on_every_operation)
{
    add_row("U-1", "sda1", "disk1_part1");
    disk_db_record record{};
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_get("U-1", &record), 0); });
    EXPECT_TRUE(contains(log, "]db table already exist, table = disk\n"));
    EXPECT_FALSE(contains(log, "CREATE TABLE"));
}

TEST_F(DiskDb, a_row_that_is_read_fills_the_record_and_is_dumped)
{
    add_row("U-1", "sda1", "disk1_part1");
    disk_db_record record{};
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_get("U-1", &record), 0); });
    EXPECT_STREQ(record.uid, "U-1");
    EXPECT_STREQ(record.dev_name, "sda1");
    EXPECT_STREQ(record.disk_name, "disk1_part1");
    EXPECT_STREQ(record.mount_path, "/tmp/mountd/disk1_part1");
    EXPECT_EQ(record.mountd, 1);
    for (const char* line :
         {"disk info:\n", "uid = U-1\n", "dev name = sda1\n", "disk name = disk1_part1\n",
          "mount path = /tmp/mountd/disk1_part1\n", "mountd = 1\n"}) {
        EXPECT_TRUE(contains(log, line)) << line;
    }
}

TEST_F(DiskDb, no_record_is_dumped_as_nothing)
{
    EXPECT_EQ(support::log_of([] { disk_db_record_dump(nullptr); }), "");
}

TEST_F(DiskDb, a_question_that_cannot_be_asked_is_logged_with_its_uid)
{
    sqlite_handle handle{};
    ASSERT_EQ(db_open(&handle, ":memory:"), 0);
    disk_db_record record{};
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_table_uid_exists("U-'1", &handle), STORED_UNKNOWN);
        EXPECT_EQ(disk_table_select("U-'1", &record, &handle), -1);
    });
    EXPECT_TRUE(contains(log, "sq = select count(*) from disk where uid='U-'1'\n")) << log;
    EXPECT_TRUE(contains(log, "sq = select * from disk where uid='U-'1'\n")) << log;
    db_close(&handle);
}

TEST_F(DiskDb, an_unmount_keeps_the_row_and_writes_no)
{
    add_row("U-1", "sda1", "disk1_part1");
    const disk_db_record record = make_record("U-1", "", "", 0);
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_set_mountd(&record), 0); });
    EXPECT_EQ(rows(), std::vector<std::string>{"U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|no"});
    EXPECT_TRUE(contains(log, "sql = \nupdate disk set mountd='no'where uid='U-1'\n")) << log;
}

TEST_F(DiskDb, a_uid_that_is_stored_is_not_inserted_again)
{
    add_row("U-1", "sda1", "disk1_part1");
    add_row("U-1", "sdb1", "disk2_part1");
    add_row("U-2", "sdb1", "disk2_part1", 0);
    EXPECT_EQ(rows(),
              (std::vector<std::string>{"U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|yes",
                                        "U-2|sdb1|disk2_part1|/tmp/mountd/disk2_part1|no"}));
}

TEST_F(DiskDb, a_record_with_any_empty_text_is_never_stored)
{
    for (int missing = 0; missing < 4; ++missing) {
        disk_db_record record = make_record("U-1", "sda1", "disk1_part1", 1);
        char* const fields[] = {record.uid, record.dev_name, record.disk_name, record.mount_path};
        fields[missing][0] = '\0';
        const std::string log = capture_stdout([&] { disk_db_add(&record); });
        EXPECT_TRUE(contains(log, "err!\n")) << missing;
    }
    disk_db_add(nullptr);
    EXPECT_FALSE(std::filesystem::exists(DISK_DB_FILE));
}

TEST_F(DiskDb, a_partition_without_a_uuid_finds_no_row)
{
    add_row("U-1", "sda1", "disk1_part1");
    disk_db_record record{};
    EXPECT_EQ(disk_db_get("", &record), 1);
    EXPECT_TRUE(support::is_all_zero(record));
}

TEST_F(DiskDb, a_uid_in_two_rows_counts_as_absent_is_inserted_a_third_time_and_reads_the_first)
{
    add_row("U-1", "sda1", "disk1_part1");
    run_sql("insert into disk values('U-1','sdb1','disk2_part1','/tmp/mountd/disk2_part1','no')");

    sqlite_handle handle{};
    ASSERT_EQ(db_open(&handle, DISK_DB_FILE), 0);
    EXPECT_EQ(disk_table_uid_exists("U-1", &handle), 0);
    db_close(&handle);

    disk_db_record record = make_record("U-1", "sdc1", "disk3_part1", 0);
    for (const auto& update : {disk_db_set_mountd, disk_db_update_paths, disk_db_update_all}) {
        const std::string log = capture_stdout([&] { EXPECT_EQ(update(&record), 0); });
        EXPECT_TRUE(contains(log, "]uid not exist\n"));
    }
    EXPECT_EQ(rows()[0], "U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|yes");
    disk_db_add(&record);
    ASSERT_EQ(rows().size(), 3U);
    EXPECT_EQ(rows()[2], "U-1|sdc1|disk3_part1|/tmp/mountd/disk3_part1|no");

    EXPECT_EQ(disk_db_get("U-1", &record), 0);
    EXPECT_STREQ(record.dev_name, "sda1");
}

TEST_F(DiskDb, a_quote_in_a_value_is_stored_and_found_as_data)
{
    const char* const uid = "U'1'; drop table disk; --";
    add_row(uid, "sd'a", "disk'1", 1);
    ASSERT_EQ(rows(),
              (std::vector<std::string>{std::string(uid) + "|sd'a|disk'1|/tmp/mountd/disk'1|yes"}));
    disk_db_record record{};
    ASSERT_EQ(disk_db_get(uid, &record), 0);
    EXPECT_STREQ(record.disk_name, "disk'1");
    record = make_record(uid, "sdb'", "disk\"2", 1);
    EXPECT_EQ(disk_db_update_all(&record), 0);
    record.mountd = 0;
    EXPECT_EQ(disk_db_set_mountd(&record), 0);
    EXPECT_EQ(rows(), (std::vector<std::string>{std::string(uid) +
                                                "|sdb'|disk\"2|/tmp/mountd/disk\"2|no"}));
    EXPECT_EQ(disk_db_get("U' or '1'='1", &record), 1) << "no value becomes a condition";
}

TEST_F(DiskDb, only_a_text_that_begins_with_yes_reads_as_mounted)
{
    add_row("U-1", "sda1", "disk1_part1");
    struct expectation {
        const char* text;
        int32_t mountd;
    };
    for (const expectation& expected :
         {expectation{"yes", 1}, expectation{"yes indeed", 1}, expectation{"no", 0},
          expectation{"", 0}, expectation{"Yes", 0}, expectation{"1", 0}}) {
        run_sql((std::string("update disk set mountd='") + expected.text + "'").c_str());
        disk_db_record record{};
        EXPECT_EQ(disk_db_get("U-1", &record), 0) << expected.text;
        EXPECT_EQ(record.mountd, expected.mountd) << expected.text;
    }
}

TEST_F(DiskDb, updates_write_yes_for_exactly_1_and_inserts_for_any_value_but_0)
{
    add_row("U-1", "sda1", "disk1_part1", 5);
    EXPECT_EQ(rows()[0], "U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|yes");
    const disk_db_record record = make_record("U-1", "sda1", "disk1_part1", 5);
    EXPECT_EQ(disk_db_set_mountd(&record), 0);
    EXPECT_EQ(rows()[0], "U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|no");
}

TEST_F(DiskDb, each_update_writes_the_columns_of_its_name_into_its_own_row)
{
    add_row("U-1", "sda1", "disk1_part1");
    add_row("U-2", "sdb1", "disk2_part1");
    const disk_db_record record = make_record("U-1", "sdc9", "disk9_part9", 0);
    std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_update_paths(&record), 0); });
    EXPECT_EQ(rows()[0], "U-1|sdc9|disk9_part9|/tmp/mountd/disk9_part9|yes");
    EXPECT_TRUE(contains(log, "update disk set dev_name='sdc9',disk_name='disk9_part9',"
                              "mount_path='/tmp/mountd/disk9_part9' where uid='U-1'\n"));
    log = capture_stdout([&] { EXPECT_EQ(disk_db_update_all(&record), 0); });
    EXPECT_EQ(rows()[0], "U-1|sdc9|disk9_part9|/tmp/mountd/disk9_part9|no");
    EXPECT_TRUE(contains(log,
                         "update disk set dev_name='sdc9',disk_name='disk9_part9',"
                         "mount_path='/tmp/mountd/disk9_part9',mountd='no' where uid='U-1'\n"));
    EXPECT_EQ(rows()[1], "U-2|sdb1|disk2_part1|/tmp/mountd/disk2_part1|yes");
}

TEST_F(DiskDb, an_update_of_a_uid_without_a_row_writes_nothing)
{
    add_row("U-1", "sda1", "disk1_part1");
    const disk_db_record record = make_record("U-9", "sdc9", "disk9_part9", 0);
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_update_all(&record), 0); });
    EXPECT_TRUE(contains(log, "]uid not exist\n"));
    EXPECT_EQ(rows().size(), 1U);
}

TEST_F(DiskDb, a_row_with_a_missing_column_is_no_row)
{
    add_row("U-1", "sda1", "disk1_part1");
    run_sql("update disk set mount_path=NULL");
    disk_db_record record{};
    const std::string log = capture_stdout([&] { EXPECT_EQ(disk_db_get("U-1", &record), 1); });
    EXPECT_TRUE(contains(log, "err!\n"));
}

TEST_F(DiskDb, over_long_stored_texts_are_cut_to_the_fields)
{
    add_row("U-1", "sda1", "disk1_part1");
    run_sql(("update disk set dev_name='" + std::string(300, 'd') + "',disk_name='" +
             std::string(300, 'n') + "',mount_path='" + std::string(600, 'p') + "'")
                .c_str());
    disk_db_record record{};
    EXPECT_EQ(disk_db_get("U-1", &record), 0);
    EXPECT_EQ(std::string(record.dev_name), std::string(15, 'd'));
    EXPECT_EQ(std::string(record.disk_name), std::string(31, 'n'));
    EXPECT_EQ(std::string(record.mount_path), std::string(127, 'p'));
}

TEST_F(DiskDb, the_longest_record_is_stored_whole)
{
    disk_db_record record{};
    memset(record.uid, 'u', sizeof(record.uid) - 1);
    memset(record.dev_name, 'd', sizeof(record.dev_name) - 1);
    memset(record.disk_name, 'n', sizeof(record.disk_name) - 1);
    memset(record.mount_path, 'p', sizeof(record.mount_path) - 1);
    record.mountd = 1;
    disk_db_add(&record);
    disk_db_record read{};
    ASSERT_EQ(disk_db_get(record.uid, &read), 0);
    EXPECT_EQ(memcmp(&record, &read, sizeof(record)), 0);
    EXPECT_EQ(disk_db_update_all(&record), 0);
    EXPECT_EQ(rows().size(), 1U);
}

TEST_F(DiskDb, a_damaged_file_fails_every_operation_and_stops_nothing)
{
    support::write_file(DISK_DB_FILE, std::string(8192, 'x'));
    disk_db_record record = make_record("U-1", "sda1", "disk1_part1", 1);
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_db_get("U-1", &record), 1);
        EXPECT_EQ(disk_db_set_mountd(&record), 0);
        EXPECT_EQ(disk_db_update_paths(&record), 0);
        EXPECT_EQ(disk_db_update_all(&record), 0);
        disk_db_add(&record);
    });
    EXPECT_GE(support::count_of(log, "]err!\n"), 5);
    EXPECT_TRUE(contains(log, "sqlite err = file is not a database\n")) << log;
    EXPECT_EQ(support::read_file(DISK_DB_FILE), std::string(8192, 'x'));
}

TEST_F(DiskDb, a_database_cut_short_is_an_error_and_no_crash)
{
    for (int i = 0; i < 60; ++i) {
        add_row(("U-" + std::to_string(i)).c_str(), "sda1",
                ("disk" + std::to_string(i) + "_part1").c_str());
    }
    // The rows stand at the end of their page: the first ones go first.
    std::filesystem::resize_file(DISK_DB_FILE, 5000);
    disk_db_record record = make_record("U-0", "sda1", "disk1_part1", 0);
    EXPECT_NE(disk_db_get("U-0", &record), 0);
    EXPECT_EQ(disk_db_set_mountd(&record), 0);
    disk_db_add(&record);
}

TEST_F(DiskDb, a_read_only_database_is_read_and_its_failed_updates_are_only_logged)
{
    add_row("U-1", "sda1", "disk1_part1");
    ASSERT_EQ(mount(CONFIG_DIR, CONFIG_DIR, "none", MS_BIND, nullptr), 0);
    ASSERT_EQ(mount(nullptr, CONFIG_DIR, "none", MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr), 0);

    disk_db_record record{};
    EXPECT_EQ(disk_db_get("U-1", &record), 0);
    record.mountd = 0;
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_db_set_mountd(&record), 1);
        add_row("U-2", "sdb1", "disk2_part1");
    });
    EXPECT_TRUE(contains(log, "sqlite err = attempt to write a readonly database\n")) << log;
    EXPECT_EQ(umount(CONFIG_DIR), 0);
    EXPECT_EQ(rows(), std::vector<std::string>{"U-1|sda1|disk1_part1|/tmp/mountd/disk1_part1|yes"});
}

TEST_F(DiskDb, a_missing_directory_fails_reads_and_updates_and_only_adding_creates_it)
{
    disk_db_record record = make_record("U-1", "sda1", "disk1_part1", 1);
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_db_get("U-1", &record), 1);
        EXPECT_EQ(disk_db_set_mountd(&record), 0);
        EXPECT_EQ(disk_db_update_all(&record), 0);
    });
    EXPECT_TRUE(contains(log, "open err, db = /etc/config/tarn_nas/disk.db\n")) << log;
    EXPECT_FALSE(std::filesystem::exists(CONFIG_DIR));
    disk_db_add(&record);
    EXPECT_EQ(rows().size(), 1U);
}

TEST_F(DiskDb, a_locked_database_is_only_logged)
{
    add_row("U-1", "sda1", "disk1_part1");
    sqlite3* other = nullptr;
    ASSERT_EQ(sqlite3_open(DISK_DB_FILE, &other), SQLITE_OK);
    ASSERT_EQ(sqlite3_exec(other, "begin exclusive", nullptr, nullptr, nullptr), SQLITE_OK);
    disk_db_record record{};
    EXPECT_NE(disk_db_get("U-1", &record), 0);
    sqlite3_exec(other, "rollback", nullptr, nullptr, nullptr);
    sqlite3_close(other);
    EXPECT_EQ(disk_db_get("U-1", &record), 0);
}

TEST_F(DiskDb, null_arguments_are_answered_and_logged)
{
    disk_db_record record{};
    sqlite_handle handle{};
    const std::string log = capture_stdout([&] {
        EXPECT_EQ(disk_table_uid_exists(nullptr, &handle), -1);
        EXPECT_EQ(disk_table_uid_exists("U", nullptr), -1);
        EXPECT_EQ(disk_table_select(nullptr, &record, &handle), 1);
        EXPECT_EQ(disk_table_select("U", nullptr, &handle), 1);
        EXPECT_EQ(disk_table_select("U", &record, nullptr), 1);
        EXPECT_EQ(disk_table_set_mountd(nullptr, &handle), 1);
        EXPECT_EQ(disk_table_update_paths(&record, nullptr), 1);
        EXPECT_EQ(disk_table_update_all(nullptr, nullptr), 1);
        EXPECT_EQ(disk_db_get(nullptr, &record), 1);
        EXPECT_EQ(disk_db_get("U", nullptr), 1);
        EXPECT_EQ(disk_db_set_mountd(nullptr), 1);
        EXPECT_EQ(disk_db_update_paths(nullptr), 1);
        EXPECT_EQ(disk_db_update_all(nullptr), 1);
    });
    EXPECT_EQ(support::count_of(log, "]err!\n"), 13);
}

TEST_F(DiskDb, an_unprepared_table_answers_minus_1)
{
    support::make_dir(CONFIG_DIR);
    sqlite_handle handle{};
    ASSERT_EQ(db_open(&handle, DISK_DB_FILE), 0);
    disk_db_record record{};
    EXPECT_EQ(disk_table_uid_exists("U-1", &handle), -1) << "there is no table yet";
    EXPECT_EQ(disk_table_select("U-1", &record, &handle), -1);
    EXPECT_EQ(disk_table_create(&handle), 0);
    EXPECT_EQ(disk_table_create(&handle), 0);
    EXPECT_EQ(disk_table_uid_exists("U-1", &handle), 0);
    EXPECT_EQ(disk_table_select("U-1", &record, &handle), 1);
    db_close(&handle);
}
