// How far the exporter has got, and what it left behind: export.db.
//
// Nothing that was collected is in it. The place is moved after a receiver has accepted,
// in one transaction with what was counted: a kill costs nothing, and sends at most what
// was in flight once more. Not thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "linux/store/StoreSqlite.h"
#include "reading/Trouble.h"

namespace halyard::exporting {

enum class Signal : std::uint8_t { Logs, Metrics, Traces };
inline constexpr std::array<std::string_view, 3> kSignalNames = {"logs", "metrics", "traces"};
inline constexpr std::size_t kSignals = kSignalNames.size();
inline std::string_view nameOf(Signal signal) {
    return kSignalNames[static_cast<std::size_t>(signal)];
}

// Up to which row of a table a signal has got, and when that row was made.
struct Position {
    std::int64_t id = 0;
    double time = 0;

    bool operator==(const Position&) const = default;
};

// Rows that may come yet between others that were passed: the daemon leaves room for what it
// may still save from a damaged file. Those up to `after` have come.
struct LateRows {
    Position after;
    std::int64_t before = 0;
};

// Why something did not arrive.
enum class Loss : std::uint8_t {
    Removed,  // retention was faster
    TooLarge, // for any request
    Rejected, // by the receiver, within what it accepted
    Refused,  // the whole request
};
inline constexpr std::array<std::string_view, 4> kLossNames = {"removed", "too_large", "rejected",
                                                               "refused"};
// What retention removed is lost; what was given up is dropped.
inline bool isLost(Loss loss) {
    return loss == Loss::Removed;
}

// What changes together.
struct PlaceChange {
    std::map<std::string, Position> positions;
    std::map<std::pair<std::string, std::int64_t>, Position> late; // by table and LateRows::before
    std::vector<std::int64_t> opened; // sessions that are not closed yet
    std::vector<std::int64_t> done;   // of those that were open
    std::map<Loss, std::uint64_t> losses;
    std::uint64_t bytesSent = 0;
    std::uint64_t records = 0;

    bool isNothing() const {
        return positions.empty() && late.empty() && opened.empty() && done.empty() &&
               losses.empty() && bytesSent == 0;
    }
};

struct ExportCounts {
    std::map<std::pair<std::string, Loss>, std::uint64_t> losses; // by signal
    std::map<std::string, std::uint64_t> sent;                    // records, by signal
    double since = 0;
    std::string day; // of bytesToday, in UTC
    std::uint64_t bytesToday = 0;
    std::optional<double> lastSuccess;
    std::optional<double> lastFailure;
    std::string lastError;
};

class ExportPlace {
public:
    static constexpr const char* kFileName = "export.db";

    // Makes the file where there is none; one that is damaged is set aside. `now` in
    // seconds since 1970.
    static reading::Outcome<ExportPlace> open(const std::filesystem::path& path, double now);
    // A copy in memory, changed without anybody's noticing; empty where there is no file.
    static reading::Outcome<ExportPlace> inMemory(const std::filesystem::path& path, double now);

    // Another device's store, or one that was purged, is begun anew. What was counted stays.
    reading::Outcome<void> follow(const std::string& device);

    Position positionOf(Signal signal, const std::string& table) const;
    // Those of a table, by rising rows.
    std::vector<LateRows> lateRows(Signal signal, const std::string& table) const;
    // Open sessions that were passed, by rising rows.
    std::vector<std::int64_t> openSessions(Signal signal, std::int64_t after,
                                           std::size_t most) const;

    // The day of `now` is what bytesSent counts for.
    reading::Outcome<void> commit(Signal signal, const PlaceChange& change, double now);
    reading::Outcome<void> noteFailure(const std::string& error, double now);
    ExportCounts counts(double now) const;
    std::uint64_t bytesToday(double now) const;

private:
    struct Closer {
        void operator()(sqlite3* database) const;
    };
    using Database = std::unique_ptr<sqlite3, Closer>;

    class Use;

    explicit ExportPlace(Database database) : database_(std::move(database)) {}
    static reading::Outcome<ExportPlace> opened(const std::string& name, int flags, double now);
    reading::Outcome<void> prepare(double now);
    reading::Outcome<void> execute(const std::string& sql);
    reading::Outcome<void> run(std::string_view sql);
    reading::Outcome<void> write(Signal signal, const PlaceChange& change, double now);
    std::optional<std::string> fact(std::string_view name) const;
    std::optional<double> realFact(std::string_view name) const;
    bool setFact(std::string_view name, std::string_view value);
    reading::Trouble trouble() const;

    Database database_;
    // Each request asks for the same: to prepare that anew took longer than to answer it. By
    // their text, which is a literal.
    mutable std::map<std::string_view, linux_::StoreStatement> statements_;
};

// "2026-11-22".
std::string dayOf(double now);

} // namespace halyard::exporting
