#include "reading/Rows.h"

#include <cmath>

namespace halyard::reading {
namespace {

// What a batch keeps of its bytes for the next one.
constexpr std::size_t kKeptBytes = 4 * 1024 * 1024;
// Beyond these a real has no integer of 64 bits.
constexpr double kIntegers = 9.2e18;

} // namespace

bool Row::isNull(int column) const {
    return batch_.cells_[first_ + static_cast<std::size_t>(column)].kind == SQLITE_NULL;
}

std::optional<std::int64_t> Row::maybeInteger(int column) const {
    const auto& cell = batch_.cells_[first_ + static_cast<std::size_t>(column)];
    if (cell.kind == SQLITE_INTEGER) {
        return cell.integer;
    }
    if (cell.kind == SQLITE_FLOAT && std::abs(cell.real) < kIntegers) {
        return static_cast<std::int64_t>(cell.real);
    }
    return std::nullopt;
}

std::optional<double> Row::maybeReal(int column) const {
    const auto& cell = batch_.cells_[first_ + static_cast<std::size_t>(column)];
    if (cell.kind == SQLITE_INTEGER) {
        return static_cast<double>(cell.integer);
    }
    return cell.kind == SQLITE_FLOAT ? std::optional(cell.real) : std::nullopt;
}

std::string_view Row::text(int column) const {
    const auto& cell = batch_.cells_[first_ + static_cast<std::size_t>(column)];
    return std::string_view(batch_.bytes_).substr(cell.from, cell.length);
}

void RowBatch::clear() {
    cells_.clear();
    bytes_.clear();
    if (bytes_.capacity() > kKeptBytes) {
        bytes_.shrink_to_fit();
    }
}

void RowBatch::add(sqlite3_stmt* statement) {
    columns_ = static_cast<std::size_t>(sqlite3_column_count(statement));
    for (int i = 0; i < static_cast<int>(columns_); ++i) {
        Cell cell;
        cell.kind = sqlite3_column_type(statement, i);
        switch (cell.kind) {
        case SQLITE_INTEGER:
            cell.integer = sqlite3_column_int64(statement, i);
            break;
        case SQLITE_FLOAT:
            cell.real = sqlite3_column_double(statement, i);
            break;
        case SQLITE_NULL:
            break;
        default:
            cell.from = bytes_.size();
            cell.length = static_cast<std::size_t>(sqlite3_column_bytes(statement, i));
            if (cell.length > 0) {
                bytes_.append(static_cast<const char*>(sqlite3_column_blob(statement, i)),
                              cell.length);
            }
            break;
        }
        cells_.push_back(cell);
    }
}

} // namespace halyard::reading
