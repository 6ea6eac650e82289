#include "BusyProcesses.h"

#include <algorithm>
#include <charconv>
#include <fstream>
#include <sstream>
#include <unistd.h>
#include <utility>
#include <vector>

namespace halyard::pipewire {

namespace {

namespace fs = std::filesystem;

constexpr std::size_t kUserTicks = 11; // fields behind the program's name
constexpr std::size_t kSystemTicks = 12;

} // namespace

// Nothing when it has ended.
std::optional<BusyProcesses::Process> BusyProcesses::readProcess(const fs::path& path) {
    std::ifstream file(path);
    std::string line;
    std::getline(file, line, '\0');
    const std::size_t open = line.find('(');
    const std::size_t close = line.rfind(')');
    if (open == std::string::npos || close == std::string::npos || close < open) {
        return std::nullopt;
    }
    std::istringstream rest(line.substr(close + 1));
    std::string word;
    Process process{.name = line.substr(open + 1, close - open - 1)};
    for (std::size_t field = 0; field <= kSystemTicks && rest >> word; ++field) {
        if (field == kUserTicks || field == kSystemTicks) {
            std::uint64_t ticks = 0;
            std::from_chars(word.data(), word.data() + word.size(), ticks);
            process.ticks += ticks;
        }
    }
    return process;
}

BusyProcesses::Look BusyProcesses::lookNow(Nanoseconds now) const {
    Look look{.at = now, .processes = {}};
    std::error_code ignored;
    for (fs::directory_iterator entry(processes_, ignored);
         entry != fs::directory_iterator() && look.processes.size() < kMaxProcesses;
         entry.increment(ignored)) {
        const std::string folder = entry->path().filename();
        std::int64_t id = 0;
        const char* const end = folder.data() + folder.size();
        if (std::from_chars(folder.data(), end, id).ptr != end) {
            continue;
        }
        if (auto process = readProcess(entry->path() / "stat")) {
            look.processes.emplace(id, std::move(*process));
        }
    }
    return look;
}

void BusyProcesses::look(Nanoseconds now) {
    if (looks_[1].at != 0 && now - looks_[1].at < kBetween) {
        return;
    }
    looks_[0] = std::move(looks_[1]);
    looks_[1] = lookNow(now);
}

Dictionaries BusyProcesses::busiest(Nanoseconds now) const {
    const Look& before = looks_[0].at != 0 ? looks_[0] : looks_[1];
    const double length = static_cast<double>(now - before.at) / 1e9;
    if (before.at == 0 || length <= 0) {
        return {};
    }
    std::vector<std::pair<double, std::string>> shares;
    for (const auto& [id, process] : lookNow(now).processes) {
        const auto known = before.processes.find(id);
        const std::uint64_t from = known != before.processes.end() ? known->second.ticks : 0;
        const double ticks = process.ticks > from ? static_cast<double>(process.ticks - from) : 0;
        const double share = ticks / static_cast<double>(::sysconf(_SC_CLK_TCK)) / length;
        if (share >= kLeastShare) {
            shares.emplace_back(share, process.name);
        }
    }
    std::sort(shares.rbegin(), shares.rend());
    shares.resize(std::min(shares.size(), kMost));
    Dictionaries result;
    for (const auto& [share, name] : shares) {
        result.push_back({{"name", name}, {"share", share}});
    }
    return result;
}

} // namespace halyard::pipewire
