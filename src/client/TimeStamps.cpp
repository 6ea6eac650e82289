#include "client/TimeStamps.h"

#include <fcntl.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cstdlib>
#include <cstring>

namespace halyard::client {
namespace {

constexpr std::string_view kKeys[] = {"hyreporting_timestamp", "systemuptime_sec",
                                      "processuptime_ms"};
constexpr StampSet kTimestamp = 1;
constexpr StampSet kSystemUptime = 2;
constexpr StampSet kProcessUptime = 4;
constexpr std::int64_t kNanosecondsPerSecond = 1'000'000'000;

// MessagePack's formats for a short string and for 64-bit numbers.
constexpr unsigned kFixString = 0xA0;
constexpr unsigned char kFloat64 = 0xCB;
constexpr unsigned char kUInt64 = 0xCF;

std::int64_t nanosecondsOf(clockid_t clock) noexcept {
    timespec time{};
    ::clock_gettime(clock, &time);
    return time.tv_sec * kNanosecondsPerSecond + time.tv_nsec;
}

// Field 22 of /proc/self/stat: the start in clock ticks since boot. Fields are
// counted behind the command name, which may itself hold blanks and brackets.
std::int64_t readProcessStart() noexcept {
    char text[1024] = {};
    const int file = ::open("/proc/self/stat", O_RDONLY | O_CLOEXEC);
    if (file < 0) {
        return nanosecondsOf(CLOCK_BOOTTIME);
    }
    const ssize_t length = ::read(file, text, sizeof(text) - 1);
    ::close(file);
    const char* field = length > 0 ? std::strrchr(text, ')') : nullptr;
    for (int number = 2; field != nullptr && number < 22; ++number) {
        field = std::strchr(field + 1, ' ');
    }
    if (field == nullptr) {
        return nanosecondsOf(CLOCK_BOOTTIME);
    }
    return std::strtoll(field, nullptr, 10) * (kNanosecondsPerSecond / ::sysconf(_SC_CLK_TCK));
}

class SystemClock final : public Clock {
public:
    std::int64_t realNanoseconds() const noexcept override { return nanosecondsOf(CLOCK_REALTIME); }
    std::int64_t bootNanoseconds() const noexcept override { return nanosecondsOf(CLOCK_BOOTTIME); }
    std::int64_t processStartNanoseconds() const noexcept override { return start_; }

private:
    const std::int64_t start_ = readProcessStart();
};

char* writeEntry(char* out, std::string_view key, unsigned char format,
                 std::uint64_t bits) noexcept {
    *out++ = static_cast<char>(kFixString | key.size());
    out = std::copy(key.begin(), key.end(), out);
    *out++ = static_cast<char>(format);
    for (int shift = 56; shift >= 0; shift -= 8) {
        *out++ = static_cast<char>(bits >> shift);
    }
    return out;
}

} // namespace

const Clock& systemClock() {
    static const SystemClock clock;
    return clock;
}

StampSet stampNamed(std::string_view key) noexcept {
    for (unsigned i = 0; i < std::size(kKeys); ++i) {
        if (key == kKeys[i]) {
            return static_cast<StampSet>(1U << i);
        }
    }
    return kNoStamps;
}

Stamps writeMissingStamps(char* out, StampSet present, const Clock& clock) noexcept {
    const char* const start = out;
    const std::int64_t boot = clock.bootNanoseconds();
    Stamps stamps;
    if ((present & kTimestamp) == 0) {
        // In two parts: as nanoseconds, today's dates have more digits than a double.
        const std::int64_t real = clock.realNanoseconds();
        const double seconds =
            static_cast<double>(real / kNanosecondsPerSecond) +
            static_cast<double>(real % kNanosecondsPerSecond) / double{kNanosecondsPerSecond};
        out = writeEntry(out, kKeys[0], kFloat64, std::bit_cast<std::uint64_t>(seconds));
        ++stamps.entries;
    }
    if ((present & kSystemUptime) == 0) {
        const std::int64_t seconds = (boot + kNanosecondsPerSecond / 2) / kNanosecondsPerSecond;
        out = writeEntry(out, kKeys[1], kUInt64, static_cast<std::uint64_t>(seconds));
        ++stamps.entries;
    }
    if ((present & kProcessUptime) == 0) {
        const std::int64_t age = std::max<std::int64_t>(boot - clock.processStartNanoseconds(), 0);
        out = writeEntry(out, kKeys[2], kUInt64, static_cast<std::uint64_t>(age / 1'000'000));
        ++stamps.entries;
    }
    stamps.bytes = static_cast<std::size_t>(out - start);
    return stamps;
}

} // namespace halyard::client
