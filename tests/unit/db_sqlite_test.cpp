#include "db_sqlite/db_sqlite.h"

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <string>

#include "support/capture.h"
#include "support/files.h"
#include "support/text.h"

using support::contains;
using support::log_of;

namespace {

const std::string FILE_NAME = "/run/test.db";
const std::string ERR = "ERROR[db_sqlite.cpp:N]";
const std::string INFO = "db_sqlite.cpp(N)";

class Database : public testing::Test {
protected:
    Database()
    {
        support::remove_all(FILE_NAME);
        db_handle_init(&handle);
    }

    ~Database() override
    {
        db_close(&handle);
        support::remove_all(FILE_NAME);
    }

    void open_with_table()
    {
        ASSERT_EQ(db_open(&handle, FILE_NAME.c_str()), 0);
        ASSERT_EQ(db_exec(&handle, "create table disk (id integer primary key, uuid text)"), 0);
    }

    void expect_cleared() const
    {
        EXPECT_EQ(handle.db, nullptr);
        EXPECT_EQ(handle.stmt, nullptr);
    }

    sqlite_handle handle{};
};

}  // namespace

TEST_F(Database, init_clears_the_handle)
{
    sqlite_handle dirty;
    memset(&dirty, 0x5A, sizeof(dirty));
    EXPECT_EQ(db_handle_init(&dirty), 0);
    EXPECT_EQ(dirty.db, nullptr);
    EXPECT_EQ(dirty.stmt, nullptr);
}

TEST_F(Database, a_null_handle_is_refused)
{
    EXPECT_EQ(db_handle_init(nullptr), 1);
    EXPECT_EQ(db_open(nullptr, FILE_NAME.c_str()), 1);
    EXPECT_EQ(db_close(nullptr), 1);
    EXPECT_EQ(db_finalize(nullptr), 1);
    log_of([] {
        EXPECT_EQ(db_exec(nullptr, "select 1"), 1);
        EXPECT_EQ(db_prepare(nullptr, "select 1"), 1);
        EXPECT_EQ(db_table_exists(nullptr, "disk"), -1);
    });
}

TEST_F(Database, open_creates_the_file)
{
    std::string log = log_of([&] { open_with_table(); });
    EXPECT_EQ(log, "");
    EXPECT_NE(handle.db, nullptr);
    EXPECT_GT(std::filesystem::file_size(FILE_NAME), 0U);
    EXPECT_EQ(db_close(&handle), 0);
    expect_cleared();
}

TEST_F(Database, content_outlasts_the_connection)
{
    open_with_table();
    EXPECT_EQ(db_close(&handle), 0);
    EXPECT_EQ(db_open(&handle, FILE_NAME.c_str()), 0);
    EXPECT_EQ(db_table_exists(&handle, "disk"), 0);
}

TEST_F(Database, a_failed_open_is_logged_and_leaves_the_handle_closed)
{
    std::string log = log_of([&] { EXPECT_EQ(db_open(&handle, "/run/missing/test.db"), 1); });
    expect_cleared();
    EXPECT_EQ(log, ERR + "open err, db = /run/missing/test.db\n" + INFO + "sqlite err code = 14\n" +
                       INFO + "sqlite err = unable to open database file\n");
}

TEST_F(Database, a_directory_cannot_be_opened)
{
    support::make_dir("/run/dir.db");
    std::string log = log_of([&] { EXPECT_EQ(db_open(&handle, "/run/dir.db"), 1); });
    expect_cleared();
    EXPECT_EQ(log, ERR + "open err, db = /run/dir.db\n" + INFO + "sqlite err code = 14\n" + INFO +
                       "sqlite err = unable to open database file\n");
}

TEST_F(Database, closing_a_handle_that_was_never_opened_succeeds)
{
    std::string log = log_of([&] { EXPECT_EQ(db_close(&handle), 0); });
    EXPECT_EQ(log, "");
}

TEST_F(Database, close_finalizes_the_statement)
{
    open_with_table();
    ASSERT_EQ(db_prepare(&handle, "select * from disk"), 0);
    std::string log = log_of([&] { EXPECT_EQ(db_close(&handle), 0); });
    EXPECT_EQ(log, "");
    expect_cleared();
}

TEST_F(Database, a_failed_close_is_logged_and_clears_the_handle_all_the_same)
{
    open_with_table();
    sqlite3* connection = handle.db;
    sqlite3_stmt* forgotten = nullptr;
    ASSERT_EQ(sqlite3_prepare_v2(connection, "select 1", -1, &forgotten, nullptr), SQLITE_OK);
    std::string log = log_of([&] { EXPECT_EQ(db_close(&handle), 1); });
    expect_cleared();
    EXPECT_TRUE(contains(log, ERR + "err code = 5\n" + INFO + "sqlite err code = 5\n" + INFO +
                                  "sqlite err = unable to close due to "))
        << log;
    sqlite3_finalize(forgotten);
    EXPECT_EQ(sqlite3_close(connection), SQLITE_OK);
}

TEST_F(Database, finalize_without_a_statement_gives_one_silently)
{
    std::string log = log_of([&] {
        EXPECT_EQ(db_finalize(&handle), 1);
        open_with_table();
        EXPECT_EQ(db_finalize(&handle), 1);
    });
    EXPECT_EQ(log, "");
}

TEST_F(Database, finalize_ends_the_statement)
{
    open_with_table();
    ASSERT_EQ(db_prepare(&handle, "select 1"), 0);
    EXPECT_EQ(db_finalize(&handle), 0);
    EXPECT_EQ(handle.stmt, nullptr);
    EXPECT_EQ(db_finalize(&handle), 1);
}

TEST_F(Database, finalize_of_a_failed_statement_is_logged_and_clears_it)
{
    open_with_table();
    ASSERT_EQ(db_exec(&handle, "insert into disk values (1, 'a')"), 0);
    ASSERT_EQ(db_prepare(&handle, "insert into disk values (1, 'b')"), 0);
    EXPECT_NE(sqlite3_step(handle.stmt), SQLITE_DONE);
    std::string log = log_of([&] { EXPECT_EQ(db_finalize(&handle), 1); });
    EXPECT_EQ(handle.stmt, nullptr);
    EXPECT_TRUE(support::matches(
        log, "ERROR\\[db_sqlite\\.cpp:N\\]err code = [0-9]+\n"
             "db_sqlite\\.cpp\\(N\\)sqlite err code = [0-9]+\n"
             "db_sqlite\\.cpp\\(N\\)sqlite err = UNIQUE constraint failed: disk.id\n"))
        << log;
}

TEST_F(Database, exec_runs_every_statement_of_the_text)
{
    open_with_table();
    EXPECT_EQ(db_exec(&handle, "insert into disk values (1, 'a'); insert into disk values (2, 'b');"
                               "select * from disk"),
              0);
    ASSERT_EQ(db_prepare(&handle, "select count(*) from disk"), 0);
    ASSERT_EQ(sqlite3_step(handle.stmt), SQLITE_ROW);
    EXPECT_EQ(sqlite3_column_int(handle.stmt, 0), 2);
    EXPECT_EQ(db_finalize(&handle), 0);
    EXPECT_EQ(db_exec(&handle, ""), 0);
}

TEST_F(Database, exec_with_a_syntax_error_logs_the_librarys_message)
{
    open_with_table();
    std::string log = log_of([&] { EXPECT_EQ(db_exec(&handle, "selekt 1"), 1); });
    EXPECT_EQ(log, ERR + "err str = near \"selekt\": syntax error\n" + INFO +
                       "sqlite err code = 1\n" + INFO +
                       "sqlite err = near \"selekt\": syntax error\n");
}

TEST_F(Database, exec_and_prepare_without_connection_or_text_are_refused)
{
    std::string log = log_of([&] {
        EXPECT_EQ(db_exec(&handle, "select 1"), 1);
        EXPECT_EQ(db_prepare(&handle, "select 1"), 1);
        open_with_table();
        EXPECT_EQ(db_exec(&handle, nullptr), 1);
        EXPECT_EQ(db_prepare(&handle, nullptr), 1);
    });
    const std::string line = ERR + "err!\n";
    EXPECT_EQ(log, line + line + line + line);
}

TEST_F(Database, a_prepared_statement_is_driven_by_its_caller)
{
    open_with_table();
    ASSERT_EQ(db_exec(&handle, "insert into disk values (7, 'abc')"), 0);
    ASSERT_EQ(db_prepare(&handle, "select id, uuid from disk"), 0);
    ASSERT_EQ(sqlite3_step(handle.stmt), SQLITE_ROW);
    EXPECT_EQ(sqlite3_column_count(handle.stmt), 2);
    EXPECT_EQ(sqlite3_column_int(handle.stmt, 0), 7);
    EXPECT_STREQ(reinterpret_cast<const char*>(sqlite3_column_text(handle.stmt, 1)), "abc");
    EXPECT_EQ(sqlite3_step(handle.stmt), SQLITE_DONE);
    EXPECT_EQ(db_finalize(&handle), 0);
}

TEST_F(Database, a_failed_prepare_logs_the_statement)
{
    open_with_table();
    std::string log = log_of([&] { EXPECT_EQ(db_prepare(&handle, "select * from nowhere"), 1); });
    EXPECT_EQ(log, ERR + "err code = 1\n" + ERR + "sq = select * from nowhere\n" + INFO +
                       "sqlite err code = 1\n" + INFO + "sqlite err = no such table: nowhere\n");
    EXPECT_EQ(handle.stmt, nullptr);
}

TEST_F(Database, a_table_exists_or_not)
{
    open_with_table();
    std::string log = log_of([&] {
        EXPECT_EQ(db_table_exists(&handle, "disk"), 0);
        EXPECT_EQ(db_table_exists(&handle, "dis"), 1);
        EXPECT_EQ(db_table_exists(&handle, "disks"), 1);
        EXPECT_EQ(db_table_exists(&handle, ""), 1);
    });
    EXPECT_EQ(log, "");
    EXPECT_EQ(handle.stmt, nullptr);
}

TEST_F(Database, an_index_or_view_is_no_table)
{
    open_with_table();
    ASSERT_EQ(db_exec(&handle, "create view v as select 1; create index i on disk (uuid)"), 0);
    EXPECT_EQ(db_table_exists(&handle, "v"), 1);
    EXPECT_EQ(db_table_exists(&handle, "i"), 1);
}

TEST_F(Database, on_a_closed_handle_the_table_query_fails)
{
    std::string log = log_of([&] { EXPECT_EQ(db_table_exists(&handle, "disk"), -1); });
    EXPECT_EQ(log, ERR + "err!\n");
}

TEST_F(Database, without_a_name_the_table_query_fails)
{
    open_with_table();
    std::string log = log_of([&] { EXPECT_EQ(db_table_exists(&handle, nullptr), -1); });
    EXPECT_EQ(log, ERR + "err!\n");
}

TEST_F(Database, a_table_name_that_breaks_the_query_fails)
{
    open_with_table();
    std::string log = log_of([&] { EXPECT_EQ(db_table_exists(&handle, "a'b"), -1); });
    EXPECT_TRUE(contains(log, "sq = select count(*) from sqlite_master where type='table' and "
                              "name='a'b'\n"))
        << log;
    EXPECT_EQ(support::lines_of(log).back(), ERR + "err!");
}

TEST_F(Database, a_file_that_is_no_database_fails_at_the_first_query)
{
    support::write_file(FILE_NAME, std::string(4096, 'x'));
    ASSERT_EQ(db_open(&handle, FILE_NAME.c_str()), 0);
    std::string log = log_of([&] { EXPECT_EQ(db_table_exists(&handle, "disk"), -1); });
    EXPECT_TRUE(contains(log, ERR + "err code = 26\n")) << log;
    EXPECT_TRUE(contains(log, INFO + "sqlite err code = 26\n" + INFO +
                                  "sqlite err = file is not a database\n"))
        << log;
    log = log_of([&] { EXPECT_EQ(db_exec(&handle, "create table disk (id)"), 1); });
    EXPECT_TRUE(contains(log, ERR + "err str = file is not a database\n")) << log;
    EXPECT_EQ(db_close(&handle), 0);
    EXPECT_EQ(support::read_file(FILE_NAME), std::string(4096, 'x'));
}

TEST_F(Database, a_cut_database_fails_without_harm)
{
    open_with_table();
    for (int i = 0; i < 50; i++) {
        ASSERT_EQ(db_exec(&handle, "insert into disk (uuid) values (hex(randomblob(500)))"), 0);
    }
    ASSERT_EQ(db_close(&handle), 0);
    std::filesystem::resize_file(FILE_NAME, 4096);
    ASSERT_EQ(db_open(&handle, FILE_NAME.c_str()), 0);
    log_of([&] { EXPECT_EQ(db_exec(&handle, "select * from disk"), 1); });
    EXPECT_EQ(db_close(&handle), 0);
}

TEST_F(Database, the_last_error_is_logged_with_code_and_message)
{
    open_with_table();
    std::string log = log_of([&] { db_log_error(&handle); });
    EXPECT_EQ(log, INFO + "sqlite err code = 0\n" + INFO + "sqlite err = not an error\n");
}

TEST_F(Database, text_is_bound_and_taken_as_it_stands)
{
    open_with_table();
    const char* const hostile[] = {"it's; drop table disk"};
    EXPECT_EQ(db_exec_bound(&handle, "insert into disk (id, uuid) values (1, ?)", hostile), 0);
    EXPECT_EQ(handle.stmt, nullptr);
    const char* const sql = "select count(*) from disk where uuid = ?";
    ASSERT_EQ(db_prepare_bound(&handle, sql, sql, hostile), 0);
    EXPECT_EQ(db_step_is_one(&handle), 1);
}

TEST_F(Database, a_parameter_that_does_not_exist_cannot_be_bound)
{
    open_with_table();
    const char* const values[] = {"x"};
    std::string log =
        log_of([&] { EXPECT_EQ(db_prepare_bound(&handle, "select 1", "select x", values), 1); });
    EXPECT_TRUE(contains(log, ERR + "err code = 25\n")) << log;
    EXPECT_EQ(handle.stmt, nullptr);

    log = log_of([&] { EXPECT_EQ(db_exec_bound(&handle, "delete from disk", values), 1); });
    EXPECT_TRUE(contains(log, ERR + "err str = ")) << log;
    EXPECT_EQ(handle.stmt, nullptr);
}

TEST_F(Database, a_bound_statement_that_cannot_be_prepared_is_told_like_any_that_is_executed)
{
    open_with_table();
    const char* const values[] = {"x"};
    const char* statement = "update disk set absent = ?";
    std::string log = log_of([&] { EXPECT_EQ(db_exec_bound(&handle, statement, values), 1); });
    EXPECT_EQ(log, ERR + "err str = no such column: absent\n" + INFO + "sqlite err code = 1\n" +
                       INFO + "sqlite err = no such column: absent\n");
    EXPECT_EQ(handle.stmt, nullptr);
}

TEST_F(Database, a_failed_preparation_is_told_in_the_readable_form)
{
    open_with_table();
    const char* const values[] = {"x"};
    std::string log = log_of([&] {
        EXPECT_EQ(db_prepare_bound(&handle, "select absent from disk where uuid = ?",
                                   "select absent from disk where uuid = 'x'", values),
                  1);
    });
    EXPECT_TRUE(contains(log, ERR + "sq = select absent from disk where uuid = 'x'\n")) << log;
    EXPECT_EQ(handle.stmt, nullptr);
    log = log_of([&] { EXPECT_EQ(db_prepare_bound(&handle, "select 1", nullptr, {}), 1); });
    EXPECT_EQ(log, ERR + "err!\n");
}

TEST_F(Database, the_error_of_no_handle_is_not_asked)
{
    EXPECT_EQ(log_of([] { db_log_error(nullptr); }), "");
    const std::string log = log_of([&] { db_log_error(&handle); });
    EXPECT_TRUE(contains(log, "sqlite err code = ")) << log;
}

TEST_F(Database, only_the_last_value_of_the_last_row_is_compared_with_one)
{
    struct {
        const char* query;
        int expected;
    } cases[] = {
        {"select 1", 1},
        {"select 0", 0},
        {"select 2", 0},
        {"select -1", 0},
        {"select 0, 1", 1},
        {"select 1, 0", 0},
        {"select 0 union all select 1", 1},
        {"select 1 union all select 0", 0},
        {"select id from disk", 0},
    };
    open_with_table();
    for (const auto& c : cases) {
        ASSERT_EQ(db_prepare(&handle, c.query), 0);
        EXPECT_EQ(db_step_is_one(&handle), c.expected) << c.query;
        EXPECT_EQ(handle.stmt, nullptr);
    }
}

TEST_F(Database, a_step_that_fails_is_logged_and_finalizes)
{
    open_with_table();
    ASSERT_EQ(db_exec(&handle, "insert into disk values (1, 'a')"), 0);
    std::string log = log_of(
        [&] { EXPECT_EQ(db_exec_bound(&handle, "insert into disk values (1, 'b')", {}), 1); });
    EXPECT_EQ(log, ERR + "err str = UNIQUE constraint failed: disk.id\n" + INFO +
                       "sqlite err code = 19\n" + INFO +
                       "sqlite err = UNIQUE constraint failed: disk.id\n");
    EXPECT_EQ(handle.stmt, nullptr);

    ASSERT_EQ(db_prepare(&handle, "insert into disk values (1, 'b')"), 0);
    log = log_of([&] { EXPECT_EQ(db_step_is_one(&handle), -1); });
    EXPECT_TRUE(contains(log, ERR + "err code = ")) << log;
    EXPECT_EQ(handle.stmt, nullptr);
}
