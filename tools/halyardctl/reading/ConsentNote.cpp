#include "reading/ConsentNote.h"

namespace halyard::reading {

Outcome<std::optional<ConsentNote>> newestConsentNote(StoreReader& reader) {
    if (!reader.hasColumn("consent", "given")) {
        return std::optional<ConsentNote>();
    }
    linux_::StoreStatement newest;
    int code =
        newest.prepare(reader.handle(), "SELECT given, time FROM consent ORDER BY id DESC LIMIT 1");
    code = code == SQLITE_OK ? newest.step() : code;
    if (code == SQLITE_ROW) {
        return std::optional(ConsentNote{newest.integer(0) != 0, newest.real(1)});
    }
    return code == SQLITE_DONE ? Outcome<std::optional<ConsentNote>>(std::nullopt)
                               : reader.troubleOf(code);
}

} // namespace halyard::reading
