#include "linux/store/StoreIntake.h"

namespace halyard::linux_ {

struct StoreIntake::Table : sqlite3_vtab {
    explicit Table(StoreIntake& owner) : sqlite3_vtab{}, intake(owner) {}
    StoreIntake& intake;
};

struct StoreIntake::Cursor : sqlite3_vtab_cursor {
    explicit Cursor(StoreIntake& owner) : sqlite3_vtab_cursor{}, intake(owner) {}
    StoreIntake& intake;
};

StoreIntake::StoreIntake(const StoreTableSchema& table)
    : table_(table), name_("rows_of_" + std::string(table.name)), cells_(1 + table.columns.size()) {
}

int StoreIntake::attach(sqlite3* database) {
    return sqlite3_create_module_v2(database, name_.c_str(), &module(), this, nullptr);
}

std::string StoreIntake::insertAll() const {
    const std::string columns = storeColumnNames(table_);
    return "INSERT INTO " + std::string(table_.name) + "(" + columns + ") SELECT " + columns +
           " FROM " + name_;
}

// Without xCreate() it is there by itself, and in no schema.
const sqlite3_module& StoreIntake::module() {
    static const sqlite3_module functions = [] {
        sqlite3_module made{};
        made.xConnect = connect;
        made.xBestIndex = findBest;
        made.xDisconnect = disconnect;
        made.xOpen = open;
        made.xClose = close;
        made.xFilter = filter;
        made.xNext = next;
        made.xEof = isAtEnd;
        made.xColumn = column;
        made.xRowid = rowID;
        return made;
    }();
    return functions;
}

int StoreIntake::connect(sqlite3* database, void* intake, int, const char* const*,
                         sqlite3_vtab** table, char**) {
    auto& self = *static_cast<StoreIntake*>(intake);
    const std::string sql = "CREATE TABLE x(" + storeColumnNames(self.table_) + ")";
    const int code = sqlite3_declare_vtab(database, sql.c_str());
    if (code == SQLITE_OK) {
        *table = new Table(self);
    }
    return code;
}

int StoreIntake::disconnect(sqlite3_vtab* table) {
    delete static_cast<Table*>(table);
    return SQLITE_OK;
}

int StoreIntake::findBest(sqlite3_vtab*, sqlite3_index_info* info) {
    info->estimatedCost = 1; // There is one way only.
    return SQLITE_OK;
}

int StoreIntake::open(sqlite3_vtab* table, sqlite3_vtab_cursor** cursor) {
    *cursor = new Cursor(static_cast<Table*>(table)->intake);
    return SQLITE_OK;
}

int StoreIntake::close(sqlite3_vtab_cursor* cursor) {
    delete static_cast<Cursor*>(cursor);
    return SQLITE_OK;
}

int StoreIntake::filter(sqlite3_vtab_cursor* cursor, int, const char*, int, sqlite3_value**) {
    return next(cursor);
}

int StoreIntake::next(sqlite3_vtab_cursor* cursor) {
    StoreIntake& self = static_cast<Cursor*>(cursor)->intake;
    self.atEnd_ = self.rows_ == nullptr || !self.rows_->next(self.cells_);
    return SQLITE_OK;
}

int StoreIntake::isAtEnd(sqlite3_vtab_cursor* cursor) {
    return static_cast<Cursor*>(cursor)->intake.atEnd_ ? 1 : 0;
}

int StoreIntake::column(sqlite3_vtab_cursor* cursor, sqlite3_context* context, int index) {
    const Cell& cell = static_cast<Cursor*>(cursor)->intake.cells_[static_cast<std::size_t>(index)];
    if (const auto* const integer = std::get_if<std::int64_t>(&cell)) {
        sqlite3_result_int64(context, *integer);
    } else if (const auto* const text = std::get_if<std::string_view>(&cell)) {
        sqlite3_result_text64(context, text->data(), text->size(), SQLITE_STATIC, SQLITE_UTF8);
    } else if (const auto* const real = std::get_if<double>(&cell)) {
        sqlite3_result_double(context, *real);
    } // Else NULL, which it is already.
    return SQLITE_OK;
}

int StoreIntake::rowID(sqlite3_vtab_cursor* cursor, sqlite3_int64* id) {
    *id = std::get<std::int64_t>(static_cast<Cursor*>(cursor)->intake.cells_.front());
    return SQLITE_OK;
}

} // namespace halyard::linux_
