// Which processes had the processors lately, by name.
//
// The names of programs that run are nobody's business but their user's: only for
// who asks for them. Not thread-safe.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>

#include "Contents.h"
#include "Cycle.h"

namespace halyard::pipewire {

class BusyProcesses final {
public:
    static constexpr std::size_t kMaxProcesses = 4096;
    static constexpr std::size_t kMost = 3;
    static constexpr Nanoseconds kBetween = 1'000'000'000;
    // Less of a processor is not worth a name.
    static constexpr double kLeastShare = 0.05;

    explicit BusyProcesses(std::filesystem::path processes = "/proc")
        : processes_(std::move(processes)) {}

    // Looks at all processes, unless that was done less than kBetween ago.
    void look(Nanoseconds now);
    // Up to kMost of {"name", "share" of a processor} over the last one or two looks,
    // the busiest first.
    [[nodiscard]] Dictionaries busiest(Nanoseconds now) const;

private:
    struct Process {
        std::string name;
        std::uint64_t ticks = 0; // on processors since it began
    };
    struct Look {
        Nanoseconds at = 0;
        std::map<std::int64_t, Process> processes;
    };
    static std::optional<Process> readProcess(const std::filesystem::path& path);
    [[nodiscard]] Look lookNow(Nanoseconds now) const;

    const std::filesystem::path processes_;
    std::array<Look, 2> looks_; // the older first
};

} // namespace halyard::pipewire
