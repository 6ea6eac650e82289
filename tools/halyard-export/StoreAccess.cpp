#include "StoreAccess.h"

#include <vector>

#include "linux/store/StoreSqlite.h"

namespace halyard::exporting {
namespace {

using linux_::StoreStatement;
using reading::Outcome;
using reading::StoreReader;

bool isLogLeft(const std::filesystem::path& path) {
    std::error_code none;
    const auto size = std::filesystem::file_size(path.native() + "-wal", none);
    return !none && size > 0;
}

} // namespace

Outcome<std::optional<StoreReader>> openStore(const std::filesystem::path& path) {
    using Store = std::optional<StoreReader>;
    if (!reading::storeHolder(path) && isLogLeft(path)) {
        return Store();
    }
    auto reader = StoreReader::open(path);
    if (!reader.ok()) {
        return reader.failure().exit == reading::Exit::NothingThere ? Outcome<Store>(Store())
                                                                    : reader.failure();
    }
    // Without its log it would show what was there before.
    return reader.value().isLogMissing() ? Store() : Store(std::move(reader.value()));
}

Outcome<StoreFacts> factsOf(StoreReader& reader) {
    StoreFacts facts;
    StoreStatement identity;
    if (reader.hasColumn("identity", "device")) {
        int code = identity.prepare(reader.handle(), "SELECT device FROM identity");
        code = code == SQLITE_OK ? identity.step() : code;
        if (code == SQLITE_ROW) {
            facts.device = identity.text(0);
        } else if (code != SQLITE_OK && code != SQLITE_DONE) {
            return reader.troubleOf(code);
        }
    }
    if (reader.hasColumn("consent", "given")) {
        std::vector<ConsentHistory::Note> notes;
        const auto read = reader.forEach({"consent", "given, time"}, [&](const reading::Row& row) {
            notes.push_back({row.integer(1) != 0, row.real(2)});
            return true;
        });
        if (!read.ok()) {
            return read.failure();
        }
        facts.consent = ConsentHistory(std::move(notes));
    }
    return facts;
}

} // namespace halyard::exporting
