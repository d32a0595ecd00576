// Arbitrary bytes as the database file, and as the journal that a power cut leaves beside it,
// through every operation on the table.
//
// Fields: the database, its journal. The input's size chooses the operation. SQLite itself is not
// instrumented: which of its complaints an input draws counts as coverage instead.

#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>

#include "disk/disk_db.h"
#include "fuzz.h"
#include "fuzz_sqlite.h"
#include "util/paths.h"
#include "util/text.h"

namespace {

constexpr char JOURNAL_FILE[] = "/etc/config/tarn_nas/disk.db-journal";
constexpr char STORED_UID[] = "1234-ABCD";
constexpr size_t COUNTERS = 4096;
constexpr size_t COMPLAINT_LENGTH = 16;

// libFuzzer looks here for coverage of the program's own.
__attribute__((section("__libfuzzer_extra_counters"))) uint8_t complaints[COUNTERS];

// Where SQLite found the file damaged, it names its own line; other messages are told apart by how
// they begin, since they quote the file.
void note_complaint(void* context, int code, const char* message)
{
    static_cast<void>(context);
    const char* line = strstr(message, "at line ");
    const char* text = line != nullptr ? line : message;
    auto hash = static_cast<uint32_t>(code);
    for (size_t i = 0; i < COMPLAINT_LENGTH && text[i] != '\0'; ++i) {
        hash = hash * 31 + static_cast<uint8_t>(text[i]);
    }
    complaints[hash % COUNTERS] = 1;
}

disk_db_record make_record(const char* uid)
{
    disk_db_record record{};
    text_copy(record.uid, uid);
    text_copy(record.dev_name, "sdb2");
    text_copy(record.disk_name, "disk3_part2");
    text_copy(record.mount_path, "/tmp/mountd/disk3_part2");
    record.mountd = 1;
    return record;
}

// 0 only with a record to show, which is terminated whatever the file says.
int check_get(const char* uid)
{
    disk_db_record record;
    memset(&record, 0x7e, sizeof(record));
    const disk_db_record untouched = record;
    const int ret = disk_db_get(uid, &record);
    require(ret == 0 || ret == 1 || ret == -1, "0, 1 or -1");
    if (ret != 0) {
        require(memcmp(&record, &untouched, sizeof(record)) == 0, "no row leaves no half record");
        return ret;
    }
    require(is_clean_text(record.uid) && is_clean_text(record.dev_name) &&
                is_clean_text(record.disk_name) && is_clean_text(record.mount_path),
            "texts are terminated");
    require(record.mountd == 0 || record.mountd == 1, "mounted or not");
    return 0;
}

int count_of_uid(const char* uid)
{
    sqlite_handle handle;
    db_handle_init(&handle);
    int found = -1;
    if (db_open(&handle, DISK_DB_FILE) == 0) {
        found = disk_table_uid_exists(uid, &handle);
        require(found >= -1 && found <= 1, "-1, 0 or 1");
    }
    require(handle.stmt == nullptr, "no statement is left");
    require(db_close(&handle) == 0, "closing succeeds");
    return found;
}

void check_update(int (*update)(const disk_db_record*), const char* uid)
{
    const disk_db_record record = make_record(uid);
    const int ret = update(&record);
    require(ret == 0 || ret == 1, "0 or 1");
}

void check_add(const char* uid)
{
    const int before = count_of_uid(uid);
    const disk_db_record record = make_record(uid);
    disk_db_add(&record);
    if (before == 1) {
        require(count_of_uid(uid) == 1, "a stored UUID is not stored again");
    }
}

}  // namespace

void fuzz_begin()
{
    mkdir(CONFIG_DIR, 0755);
    fuzz_quicken_sqlite();
    sqlite3_config(SQLITE_CONFIG_LOG, note_complaint, nullptr);
    // A page that claims to be huge is refused, as on a router.
    sqlite3_hard_heap_limit64(INT64_C(64) << 20);
}

std::string fuzz_answer(const std::string& command)
{
    require(command.empty(), "no command is run");
    return "";
}

void fuzz_one(const std::string& input)
{
    constexpr int (*updates[])(const disk_db_record*) = {disk_db_set_mountd, disk_db_update_paths,
                                                         disk_db_update_all};
    const std::vector<std::string> fields = fields_of(input, 2);
    unlink(JOURNAL_FILE);
    put_file(DISK_DB_FILE, fields[0]);
    if (!fields[1].empty()) {
        put_file(JOURNAL_FILE, fields[1]);
    }
    switch (input.size() % 6) {
        case 0:
            check_get("new");
            check_add("new");
            break;
        case 1:
        case 2:
            check_add(STORED_UID);
            break;
        default:
            check_get(STORED_UID);
            check_update(updates[input.size() % 3], STORED_UID);
    }
    require(sqlite3_memory_used() == 0, "SQLite gets everything back");
}
