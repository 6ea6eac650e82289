#include "MachineReader.h"

#include <charconv>
#include <ctime>
#include <fcntl.h>
#include <string_view>
#include <unistd.h>
#include <utility>

namespace halyard::pipewire {

namespace {

Nanoseconds clock(clockid_t which) {
    timespec now{};
    ::clock_gettime(which, &now);
    return Nanoseconds{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

std::optional<Nanoseconds> numberAfter(const Descriptor& file, std::string_view before) {
    std::array<char, 512> buffer{};
    const ssize_t size = file ? ::pread(file.get(), buffer.data(), buffer.size(), 0) : -1;
    const std::string_view text(buffer.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
    const std::size_t at = text.find(before);
    Nanoseconds value = 0;
    if (text.empty() || at == std::string_view::npos) {
        return std::nullopt;
    }
    const char* const from = text.data() + at + before.size();
    return std::from_chars(from, text.data() + text.size(), value).ec == std::errc()
               ? std::optional(value)
               : std::nullopt;
}

// "some avg10=0.00 avg60=0.00 avg300=0.00 total=MICROSECONDS"
std::optional<Nanoseconds> pressure(const Descriptor& file) {
    const auto total = numberAfter(file, "total=");
    return total ? std::optional(*total * 1000) : std::nullopt;
}

} // namespace

Nanoseconds timeAsleep() {
    return clock(CLOCK_BOOTTIME) - clock(CLOCK_MONOTONIC);
}

MachineReader::MachineReader(const std::filesystem::path& processes,
                             std::function<Nanoseconds()> asleep)
    : asleep_(std::move(asleep)),
      ownTimes_(::open((processes / "thread-self/schedstat").c_str(), O_RDONLY | O_CLOEXEC)) {
    const char* const names[] = {"cpu", "memory", "io"};
    for (std::size_t i = 0; i < pressure_.size(); ++i) {
        const auto path = processes / "pressure" / names[i];
        pressure_[i] = Descriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    }
}

MachineSample MachineReader::sample(Nanoseconds now) const {
    return {.at = now,
            .cpuPressure = pressure(pressure_[0]),
            .memoryPressure = pressure(pressure_[1]),
            .ioPressure = pressure(pressure_[2]),
            .asleep = asleep_(),
            .ownDelay = numberAfter(ownTimes_, " ")};
}

Nanoseconds monotonicNow() {
    return clock(CLOCK_MONOTONIC);
}

Nanoseconds realTimeOffset() {
    return clock(CLOCK_REALTIME) - clock(CLOCK_MONOTONIC);
}

} // namespace halyard::pipewire
