#include "report/DigestGathering.h"

#include <algorithm>
#include <cstdlib>
#include <fnmatch.h>
#include <limits>

#include "commands/GlitchWords.h"
#include "commands/MessageRows.h"
#include "commands/TableRows.h"
#include "reading/Glitches.h"
#include "report/SessionStatistics.h"
#include "report/SessionTimes.h"

namespace halyard::ctl {
namespace {

using linux_::StoreTable;
using reading::Glitch;
using reading::JsonFields;
using reading::Row;
using reading::Session;
using reading::StoreReader;

// Of kMessageColumns, behind the id.
enum Column : int { kCategory = 4, kType = 5 };

// A session's messages may be taken up before its row.
constexpr double kMargin = 2;
// A glitch's evidence is a handful of numbers. What is larger is not meant well.
constexpr std::size_t kMostGlitchBytes = 4096;
// Sessions and glitches are about as much work as the messages.
constexpr double kShareBeforeMessages = 0.4;

std::optional<std::string> shortName(const std::optional<std::string>& name) {
    return name ? std::optional(ctl::shortName(*name)) : std::nullopt;
}

std::string jsonOf(const Glitch& glitch) {
    char* text = nullptr;
    std::size_t size = 0;
    std::FILE* const stream = ::open_memstream(&text, &size);
    JsonStream json(stream);
    writeGlitch(json, glitch);
    (void)std::fclose(stream);
    std::string result(text, size);
    std::free(text);
    return result;
}

class Gathering {
public:
    Gathering(StoreReader& reader, Digest& digest, const Digest::Limits& limits,
              const ReportProgress& progress)
        : reader_(reader), digest_(digest), limits_(limits), progress_(progress),
          times_(digest, limits), statistics_(digest), directory_(reader) {}

    Outcome<void> run();

private:
    Outcome<void> readSessions();
    Outcome<void> readGlitches();
    Outcome<void> readMessages();
    Outcome<void> readTable(const char* name, StoreTable table);

    bool isWanted(const std::optional<std::string>& application) const;
    void takeSession(const Session& session);
    void takeGlitch(const Glitch& glitch);
    void takeMessage(const Row& row, RowChunks& rows);

    StoreReader& reader_;
    Digest& digest_;
    const Digest::Limits& limits_;
    const ReportProgress& progress_;
    SessionTimes times_;
    SessionStatistics statistics_;
    reading::SessionDirectory directory_;
    JsonFields fields_;
    double firstOpened_ = std::numeric_limits<double>::infinity();
};

Outcome<void> Gathering::run() {
    digest_.isLive = reader_.isLive();
    for (const auto step :
         {&Gathering::readSessions, &Gathering::readGlitches, &Gathering::readMessages}) {
        if (auto read = (this->*step)(); !read.ok()) {
            return read;
        }
    }
    if (!digest_.scope.applicationPattern.empty()) {
        return {}; // What is in the other tables is of no application.
    }
    for (const auto& [name, table] :
         {std::pair("events", StoreTable::AnalyticsEvent),
          std::pair("energy", StoreTable::EnergyEvent),
          std::pair("incidents", StoreTable::Incident), std::pair("metrics", StoreTable::Metric)}) {
        if (auto read = readTable(name, table); !read.ok()) {
            return read;
        }
    }
    return {};
}

bool Gathering::isWanted(const std::optional<std::string>& application) const {
    const std::string& pattern = digest_.scope.applicationPattern;
    return pattern.empty() ||
           (application && ::fnmatch(pattern.c_str(), application->c_str(), 0) == 0);
}

Outcome<void> Gathering::readSessions() {
    return forEachSession(
        reader_, digest_.scope.range, digest_.scope.now,
        [this](const reading::SessionRow& row) { return isWanted(row.application); },
        [this](const Session& session) {
            takeSession(session);
            return true;
        });
}

void Gathering::takeSession(const Session& session) {
    Session kept = session;
    kept.application = shortName(session.application);
    kept.service = shortName(session.service);
    kept.ended = shortName(session.ended);
    kept.devices.resize(std::min(kept.devices.size(), Digest::kDevices));
    for (std::string& device : kept.devices) {
        device = ctl::shortName(device);
    }
    firstOpened_ = std::min(firstOpened_, session.opened.value_or(-firstOpened_));
    times_.addSession(kept);
    digest_.sessions.add(std::move(kept));
}

Outcome<void> Gathering::readGlitches() {
    return forEachGlitch(reader_, digest_.scope.range, [this](const Glitch& glitch) {
        if (isWanted(glitch.application)) {
            takeGlitch(glitch);
        }
        return true;
    });
}

void Gathering::takeGlitch(const Glitch& glitch) {
    Glitch kept = glitch;
    for (auto* name : {&kept.application, &kept.node, &kept.device, &kept.cause}) {
        *name = shortName(*name);
    }
    digest_.glitchSum.add(kept);
    digest_.byApplication.add(kept);
    digest_.byDevice.add(kept);
    digest_.byCause.add(kept);
    std::string json = jsonOf(kept);
    if (json.size() > kMostGlitchBytes) {
        kept.evidence = nullptr;
        json = jsonOf(kept);
    }
    digest_.glitches.add(std::move(json));
}

Outcome<void> Gathering::readMessages() {
    reading::TimeRange span = digest_.scope.range;
    span.since = std::min(span.since, firstOpened_ - kMargin);
    const auto ids = reader_.idsIn(span, "upload_message", "time");
    if (!ids.ok()) {
        return ids.failure();
    }
    const auto last = reader_.integer("SELECT max(id) FROM upload_message");
    const double end = static_cast<double>(last.ok() ? last.value().value_or(1) : 1);
    const double first = static_cast<double>(ids.value().after);
    RowChunks& rows = digest_.tables.emplace_back("messages", limits_.messages).rows;
    const auto read = reader_.forEach(
        {"upload_message", kMessageColumns, "", ids.value().after, ids.value().upTo},
        [&](const Row& row) {
            takeMessage(row, rows);
            progress_(kShareBeforeMessages + (1 - kShareBeforeMessages) *
                                                 (static_cast<double>(row.integer(0)) - first) /
                                                 std::max(1.0, end - first));
            return true;
        });
    times_.finish();
    rows.finish();
    return read;
}

Outcome<void> Gathering::readTable(const char* name, StoreTable table) {
    const linux_::StoreTableSchema& schema = storeSchema(table);
    const auto ids = reader_.idsIn(digest_.scope.range, schema.name, "time");
    if (!ids.ok()) {
        return ids.failure();
    }
    RowChunks& rows = digest_.tables.emplace_back(name, limits_.others).rows;
    const auto read = reader_.forEach(
        {std::string(schema.name), columnNames(schema), digest_.scope.range.condition("time"),
         ids.value().after, ids.value().upTo},
        [&](const Row& row) {
            rows.add([&](JsonStream& json) { writeRow(json, table, row); });
            return true;
        });
    rows.finish();
    return read;
}

void Gathering::takeMessage(const Row& row, RowChunks& rows) {
    const Message message = messageIn(row, directory_, fields_);
    const double time = message.time.value_or(0);
    if (message.session && times_.knows(*message.session) && fields_.parse(message.payload)) {
        times_.takeMessage(*message.session, row.integer(kCategory), row.integer(kType), time,
                           fields_);
        if (digest_.scope.range.contains(time)) {
            statistics_.take(*message.session, row.integer(kCategory), row.integer(kType),
                             message.payload);
        }
    }
    if (digest_.scope.range.contains(time) && isWanted(message.names.application)) {
        rows.add([&message](JsonStream& json) { writeMessage(json, message); });
    }
}

} // namespace

Outcome<void> gatherDigest(StoreReader& reader, Digest& digest, const Digest::Limits& limits,
                           const ReportProgress& progress) {
    return Gathering(reader, digest, limits, progress).run();
}

} // namespace halyard::ctl
