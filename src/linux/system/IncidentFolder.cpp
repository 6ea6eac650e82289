#include "linux/system/IncidentFolder.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <fstream>
#include <map>
#include <sys/stat.h>
#include <system_error>
#include <utility>

#include "common/Description.h"
#include "common/Json.h"
#include "linux/system/CollectedFiles.h"
#include "linux/system/PrivateFiles.h"
#include "linux/system/ProcessFacts.h"
#include "platform/Log.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

Date dateOf(platform::WallTime time) {
    const auto seconds = std::chrono::floor<std::chrono::seconds>(time);
    return {seconds.time_since_epoch().count(),
            static_cast<std::uint32_t>((time - seconds).count())};
}

std::string safePart(std::string_view text) {
    constexpr std::size_t kLongestPart = 40;
    std::string safe(text.substr(0, kLongestPart));
    std::replace_if(
        safe.begin(), safe.end(),
        [](char c) {
            const bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                               (c >= '0' && c <= '9') || c == '_';
            return !plain;
        },
        '_');
    return safe;
}

Result<void> makeFolder(const fs::path& folder) {
    return makePrivateDirectory(folder);
}

Result<void> writeFile(const fs::path& path, std::string_view text) {
    std::ofstream file(path, std::ios::binary);
    file.write(text.data(), static_cast<std::streamsize>(text.size()));
    file.close();
    if (!file) {
        return Failure::ofErrno(path.string());
    }
    return {};
}

// Our finished folders by number; whatever else lies there is left alone.
std::map<std::uint64_t, fs::path> finishedFolders(const fs::path& directory) {
    std::map<std::uint64_t, fs::path> folders;
    for (const fs::directory_entry& entry : fs::directory_iterator(directory)) {
        const std::string name = entry.path().filename().string();
        std::uint64_t number = 0;
        const char* const end = name.data() + name.size();
        const auto result = std::from_chars(name.data(), end, number);
        if (result.ec == std::errc{} && result.ptr != end && *result.ptr == '-' &&
            number < UINT64_MAX && entry.symlink_status().type() == fs::file_type::directory) {
            folders.emplace(number, entry.path());
        }
    }
    return folders;
}

std::uintmax_t bytesOf(const fs::path& folder) {
    std::uintmax_t bytes = 0;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(folder)) {
        bytes += entry.symlink_status().type() == fs::file_type::regular ? entry.file_size() : 0;
    }
    return bytes;
}

// The newest stays, however large it is.
void removeOldest(const fs::path& directory) {
    const auto folders = finishedFolders(directory);
    std::size_t count = 0;
    std::uintmax_t bytes = 0;
    for (auto folder = folders.rbegin(); folder != folders.rend(); ++folder) {
        bytes += bytesOf(folder->second);
        if (++count > IncidentFolder::kKept || (count > 1 && bytes > IncidentFolder::kKeptBytes)) {
            fs::remove_all(folder->second);
        }
    }
}

// The newest lines that fit.
std::string joinLines(const std::vector<std::string>& lines, std::size_t most) {
    std::size_t size = 0;
    auto first = lines.end();
    while (first != lines.begin() && size + std::prev(first)->size() + 1 <= most) {
        --first;
        size += first->size() + 1;
    }
    std::string text;
    text.reserve(size);
    for (; first != lines.end(); ++first) {
        text += *first;
        if (!first->ends_with('\n')) {
            text += '\n';
        }
    }
    return text;
}

Result<void> writeFacts(const fs::path& folder, const ProcessFacts& process) {
    Result<void> result = makeFolder(folder);
    for (const ProcessFacts::Fact& fact : process.facts) {
        result = result.ok() ? writeFile(folder / fact.name, fact.text) : result;
    }
    return result;
}

// The process numbers.
Result<List> writeProcesses(const fs::path& folder, const NamedProcesses& named) {
    List pids;
    for (const ProcessFacts& process : named.processes) {
        const fs::path own = folder / fmt::format("process-{}", process.pid);
        if (const auto written = writeFacts(own, process); !written.ok()) {
            return written.failure();
        }
        pids.append(process.pid);
    }
    return pids;
}

} // namespace

std::string incidentFolderName(std::uint64_t number, platform::WallTime time,
                               const Dictionary& signature) {
    std::string moment = rfc3339({dateOf(time).seconds, 0});
    std::erase_if(moment, [](char c) { return c == '-' || c == ':'; });
    std::string name = fmt::format("{:06}-{}", number, moment);
    for (const std::string_view key :
         {platform::kIncidentSignatureDomain, platform::kIncidentSignatureType,
          platform::kIncidentSignatureSubType, platform::kIncidentSignatureDetectedProcess}) {
        if (const Value* part = signature.find(key)) {
            name.append("-").append(safePart(describe(*part)));
        }
    }
    return name;
}

struct IncidentFolder::Snapshot {
    Dictionary signature;
    double duration;
    Value event;
    Value payload;
    Reply reply;
    platform::WallTime time;
};

IncidentFolder::IncidentFolder(const platform::Clock& clock, Options options)
    : clock_(clock), options_(std::move(options)) {}

IncidentFolder::~IncidentFolder() {
    worker_.stop();
}

void IncidentFolder::snapshotWithSignature(const Dictionary& signature, double duration,
                                           const Value& event, const Value& payload, Reply reply) {
    if (waiting_.fetch_add(1) >= kMostWaiting) {
        waiting_.fetch_sub(1);
        refused_.fetch_add(1);
        reply({{"success", false}, {"error", "too many snapshots are waiting"}});
        return;
    }
    worker_.post([this, snapshot = Snapshot{signature, duration, event, payload, std::move(reply),
                                            clock_.wallTime()}] {
        take(snapshot);
        waiting_.fetch_sub(1);
    });
}

void IncidentFolder::take(const Snapshot& snapshot) {
    const Result<fs::path> written = write(snapshot);
    if (!written.ok()) {
        const std::string why = written.failure().message();
        reportFailure(why);
        snapshot.reply({{"success", false}, {"error", why}});
        return;
    }
    const std::string path = written.value().string();
    failing_ = false;
    if (options_.record) {
        options_.record(snapshot.signature, path, snapshot.time);
    }
    snapshot.reply({{"success", true}, {"path", path}});
}

// What the standard library throws ends here.
Result<fs::path> IncidentFolder::write(const Snapshot& snapshot) const try {
    const fs::path& directory = options_.directory;
    fs::create_directories(directory.parent_path());
    if (const auto made = makePrivateDirectory(directory); !made.ok()) {
        return made.failure();
    }
    const fs::path unfinished = directory / kUnfinishedIncident;
    fs::remove_all(unfinished); // Of a daemon that was killed meanwhile.
    Result<void> filled = makeFolder(unfinished);
    filled = filled.ok() ? fillFolder(unfinished, snapshot) : filled;
    if (!filled.ok()) {
        return filled.failure();
    }

    const auto folders = finishedFolders(directory);
    const std::uint64_t number = folders.empty() ? 1 : folders.rbegin()->first + 1;
    const fs::path finished =
        directory / incidentFolderName(number, snapshot.time, snapshot.signature);
    if (const auto kept = keepTreePrivate(unfinished); !kept.ok()) {
        return kept.failure();
    }
    fs::rename(unfinished, finished);
    removeOldest(directory);
    return finished;
} catch (const std::exception& error) {
    return Failure{{}, error.what()};
}

Result<void> IncidentFolder::fillFolder(const fs::path& folder, const Snapshot& snapshot) const {
    NamedProcesses named;
    if (const Value* name = snapshot.signature.find(platform::kIncidentSignatureDetectedProcess)) {
        named = processesNamed(describe(*name), options_.procRoot);
    }
    const auto processes = writeProcesses(folder, named);
    if (!processes.ok()) {
        return processes.failure();
    }
    const Dictionary incident{{"signature", snapshot.signature},  {"time", dateOf(snapshot.time)},
                              {"duration", snapshot.duration},    {"event", snapshot.event},
                              {"payload", snapshot.payload},      {"processes", processes.value()},
                              {"processesLeftOut", named.leftOut}};
    Result<void> result = writeFile(folder / "incident.json", toPrettyJson(incident) + '\n');
    if (result.ok() && options_.recentLines) {
        result = writeFile(folder / "log.txt", joinLines(options_.recentLines(), kMostLogBytes));
    }
    return result;
}

void IncidentFolder::reportFailure(std::string_view what) {
    failed_.fetch_add(1);
    if (!std::exchange(failing_, true)) {
        HY_LOG_ERROR(HYReportingPlatformCategory, "no incident snapshot could be kept: {}", what);
    }
}

} // namespace halyard::linux_
