// Rows of the store, copied out of SQLite so that they outlive the transaction
// that they were read in.
//
// One arena of bytes for the texts of many rows: a batch costs a handful of
// allocations, and the next batch none. Not thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <sqlite3.h>

namespace halyard::reading {

class RowBatch;

// One row of a batch; valid until the batch is cleared.
class Row {
public:
    Row(const RowBatch& batch, std::size_t first) : batch_(batch), first_(first) {}

    bool isNull(int column) const;
    // 0 for what is no number. A text that a hand put where a number belongs is none.
    std::int64_t integer(int column) const { return maybeInteger(column).value_or(0); }
    double real(int column) const { return maybeReal(column).value_or(0); }
    std::optional<std::int64_t> maybeInteger(int column) const;
    std::optional<double> maybeReal(int column) const;
    // The bytes of a text or a blob, empty for the rest.
    std::string_view text(int column) const;

private:
    const RowBatch& batch_;
    const std::size_t first_;
};

class RowBatch {
public:
    void clear();
    // Takes the row that `statement` stands at.
    void add(sqlite3_stmt* statement);
    std::size_t rows() const { return columns_ == 0 ? 0 : cells_.size() / columns_; }
    std::size_t bytes() const { return bytes_.size(); }
    Row row(std::size_t index) const { return {*this, index * columns_}; }

private:
    friend class Row;
    struct Cell {
        int kind = SQLITE_NULL;
        std::int64_t integer = 0;
        double real = 0;
        std::size_t from = 0;
        std::size_t length = 0;
    };

    std::size_t columns_ = 0;
    std::vector<Cell> cells_;
    std::string bytes_;
};

} // namespace halyard::reading
