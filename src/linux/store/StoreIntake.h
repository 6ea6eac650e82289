// Rows that one statement takes from us: a table that lies in no file, whose rows are made
// while SQLite reads them.
//
// INSERT INTO t SELECT * FROM an intake costs half of an INSERT for each row, because
// SQLite stays where it is: at the end of the table.
//
// Not thread-safe, like the connection; must outlive that.
#pragma once

#include <cstdint>
#include <sqlite3.h>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "linux/store/Schema.h"

namespace halyard::linux_ {

class StoreIntake {
public:
    // Texts are borrowed until the next row is asked for.
    using Cell = std::variant<std::nullptr_t, std::int64_t, double, std::string_view>;
    using Cells = std::vector<Cell>; // the id, then each column

    class Rows {
    public:
        virtual ~Rows() = default;
        // Makes the next one; false at the end.
        virtual bool next(Cells& cells) = 0;
    };

    explicit StoreIntake(const StoreTableSchema& table);
    StoreIntake(const StoreIntake&) = delete;
    StoreIntake& operator=(const StoreIntake&) = delete;

    // Makes it known to a connection.
    [[nodiscard]] int attach(sqlite3* database);
    // The statement, for as long as the connection lasts.
    std::string insertAll() const;
    // What the statement takes when it is run. Borrowed; null: nothing.
    void offer(Rows* rows) { rows_ = rows; }

private:
    struct Table;
    struct Cursor;

    static int connect(sqlite3* database, void* intake, int count, const char* const* words,
                       sqlite3_vtab** table, char** error);
    static int disconnect(sqlite3_vtab* table);
    static int findBest(sqlite3_vtab* table, sqlite3_index_info* info);
    static int open(sqlite3_vtab* table, sqlite3_vtab_cursor** cursor);
    static int close(sqlite3_vtab_cursor* cursor);
    static int filter(sqlite3_vtab_cursor* cursor, int number, const char* text, int count,
                      sqlite3_value** values);
    static int next(sqlite3_vtab_cursor* cursor);
    static int isAtEnd(sqlite3_vtab_cursor* cursor);
    static int column(sqlite3_vtab_cursor* cursor, sqlite3_context* context, int index);
    static int rowID(sqlite3_vtab_cursor* cursor, sqlite3_int64* id);
    static const sqlite3_module& module();

    const StoreTableSchema& table_;
    const std::string name_;
    Rows* rows_ = nullptr;
    Cells cells_;
    bool atEnd_ = true;
};

} // namespace halyard::linux_
