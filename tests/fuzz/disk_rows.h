// The rows of the "disk" table as the fuzz program writes and reads them, on a connection of its
// own.
#pragma once

#include <sqlite3.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

constexpr size_t ROW_COLUMNS = 5;

// What a column holds. USE_UID is the text of the UUID that the input is about.
enum cell_use : uint8_t { USE_TEXT, USE_BLOB, USE_NULL, USE_UID, USE_COUNT };

struct cell {
    uint8_t use;
    std::string bytes;

    [[nodiscard]] bool is_text() const { return use == USE_TEXT || use == USE_UID; }
};

using row = std::vector<cell>;

// Makes the database with an empty table, in memory. The connection stays open.
sqlite3* rows_open();

// Replaces all rows.
void rows_put(const std::vector<row>& rows);

// All rows in their order; texts are USE_TEXT.
std::vector<row> rows_get();

bool row_has_uid(const row& values, const std::string& uid);
bool rows_are_same(const row& a, const row& b);
