#include "linux/store/StoreFacts.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>
#include <string>
#include <sys/random.h>

#include "linux/store/Schema.h"

namespace halyard::linux_ {
namespace {

constexpr std::size_t kMaxNotes = static_cast<std::size_t>(kMaxConsentNotes);

int execute(sqlite3* database, const std::string& sql) {
    return sqlite3_exec(database, sql.c_str(), nullptr, nullptr, nullptr);
}

// Random, so that it says nothing of the machine. None when the system has no
// randomness to give, which it always has once it is up.
std::optional<std::string> newIdentity() {
    std::array<unsigned char, 16> bytes{};
    if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
        return std::nullopt;
    }
    bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0F) | 0x40); // version 4
    bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3F) | 0x80); // of RFC 4122
    std::string text;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        const bool dash = i == 4 || i == 6 || i == 8 || i == 10;
        text += fmt::format("{}{:02x}", dash ? "-" : "", bytes[i]);
    }
    return text;
}

int makeIdentity(sqlite3* database) {
    const auto identity = newIdentity();
    return identity ? execute(database, fmt::format("INSERT INTO identity(device) SELECT '{}' "
                                                    "WHERE NOT EXISTS (SELECT 1 FROM identity)",
                                                    *identity))
                    : SQLITE_OK; // The next time that the file is opened.
}

int makeTables(sqlite3* database) {
    return execute(database, std::string(kStoreFactTables));
}

// Left alone where there is no note.
int newestNote(sqlite3* database, std::optional<bool>& given) {
    StoreStatement newest;
    int code = newest.prepare(database, "SELECT given FROM consent ORDER BY id DESC LIMIT 1");
    code = code == SQLITE_OK ? newest.step() : code;
    if (code == SQLITE_ROW) {
        given = newest.integer(0) != 0;
    }
    return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

int addNote(sqlite3* database, bool given, double time) {
    StoreStatement insert;
    const int code = insert.prepare(database, "INSERT INTO consent(given, time) VALUES(?, ?)");
    if (code != SQLITE_OK) {
        return code;
    }
    insert.bindFrom(1, std::int64_t{given}, time);
    return insert.run();
}

int forgetOldNotes(sqlite3* database) {
    return execute(database, fmt::format("DELETE FROM consent WHERE id <= "
                                         "(SELECT max(id) FROM consent) - {}",
                                         kMaxConsentNotes));
}

} // namespace

void StoreFacts::setConsent(bool given) {
    const MutexLock lock(mutex_);
    if (inForce_ && inForce_->given == given) {
        return;
    }
    // Under the lock: a group whose notes are being written has no row from later on.
    inForce_ = Note{given, platform::secondsSince1970(clock_.wallTime())};
    if (waiting_.size() >= kMaxNotes && waiting_.back().given) {
        waiting_.pop_back(); // Refused all the while: the less of the two.
    } else {
        waiting_.push_back(*inForce_);
    }
}

bool StoreFacts::isDue(std::uint64_t generation) const {
    const MutexLock lock(mutex_);
    return keptIn_ != generation || !waiting_.empty();
}

int StoreFacts::write(sqlite3* database) {
    const MutexLock lock(mutex_);
    int code = storeMakeFacts(database);
    std::vector<Note> notes = waiting_;
    if (notes.empty() && inForce_) {
        notes.push_back(*inForce_); // It may be another file than before.
    }
    std::optional<bool> noted;
    code = code == SQLITE_OK ? newestNote(database, noted) : code;
    for (const Note& note : notes) {
        if (code == SQLITE_OK && noted.value_or(false) != note.given) {
            code = addNote(database, note.given, note.time);
            noted = note.given;
        }
    }
    written_ = waiting_.size();
    code = code == SQLITE_OK ? forgetOldNotes(database) : code;
    // Tables of another shape than ours are as good as damaged.
    return code == SQLITE_ERROR ? SQLITE_CORRUPT : code;
}

void StoreFacts::noteCommitted(std::uint64_t generation) {
    const MutexLock lock(mutex_);
    waiting_.erase(waiting_.begin(), waiting_.begin() + static_cast<std::ptrdiff_t>(written_));
    written_ = 0;
    keptIn_ = generation;
}

int storeMakeFacts(sqlite3* database) {
    const int code = makeTables(database);
    return code == SQLITE_OK ? makeIdentity(database) : code;
}

int storeRenewFacts(sqlite3* database, double now) {
    std::optional<bool> noted;
    (void)newestNote(database, noted); // There may be no such table yet.
    int code = execute(database, "DROP TABLE IF EXISTS consent; DROP TABLE IF EXISTS identity");
    code = code == SQLITE_OK ? storeMakeFacts(database) : code;
    return code == SQLITE_OK && noted ? addNote(database, *noted, now) : code;
}

namespace {

struct KnownNote {
    double time;
    std::int64_t given;

    auto operator<=>(const KnownNote&) const = default;
};

void readNotes(sqlite3* database, std::vector<KnownNote>& into) {
    StoreStatement notes;
    if (notes.prepare(database, "SELECT time, given FROM consent WHERE typeof(time) = 'real' AND "
                                "given IN (0, 1) ORDER BY id") != SQLITE_OK) {
        return;
    }
    for (std::size_t i = 0; i < kMaxNotes && notes.step() == SQLITE_ROW; ++i) {
        into.push_back({notes.real(0), notes.integer(1)});
    }
}

std::string identityIn(sqlite3* database) {
    StoreStatement identity;
    const bool found = identity.prepare(database, "SELECT device FROM identity") == SQLITE_OK &&
                       identity.step() == SQLITE_ROW;
    const std::string text(found ? identity.text(0) : "");
    const bool plain =
        text.size() == 36 && std::all_of(text.begin(), text.end(), [](char each) {
            return each == '-' || (each >= '0' && each <= '9') || (each >= 'a' && each <= 'f');
        });
    return plain ? text : "";
}

} // namespace

int storeCarryFacts(sqlite3* from, sqlite3* to) {
    int code = makeTables(to);
    if (code != SQLITE_OK) {
        return code;
    }
    std::vector<KnownNote> notes;
    readNotes(from, notes);
    readNotes(to, notes);
    std::stable_sort(notes.begin(), notes.end(), [](const KnownNote& left, const KnownNote& right) {
        return left.time < right.time;
    });
    notes.erase(std::unique(notes.begin(), notes.end()), notes.end());
    code = execute(to, "DELETE FROM consent");
    for (const KnownNote& note : notes) {
        code = code == SQLITE_OK ? addNote(to, note.given != 0, note.time) : code;
    }
    code = code == SQLITE_OK ? forgetOldNotes(to) : code;
    const std::string identity = identityIn(from);
    if (code == SQLITE_OK && !identity.empty() && identityIn(to).empty()) {
        code = execute(
            to, fmt::format("DELETE FROM identity; INSERT INTO identity VALUES('{}')", identity));
    }
    return code;
}

} // namespace halyard::linux_
