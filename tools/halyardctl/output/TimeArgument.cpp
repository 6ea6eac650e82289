#include "output/TimeArgument.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <ctime>

namespace halyard::ctl {
namespace {

// Reads a text from its front; once something does not fit, nothing fits.
class Scanner {
public:
    explicit Scanner(std::string_view text) : rest_(text) {}

    bool done() const { return good_ && rest_.empty(); }
    // Exactly `digits` of them, from `least` to `most`.
    int number(std::size_t digits, int least, int most) {
        int value = 0;
        const char* const end = rest_.data() + std::min(digits, rest_.size());
        const auto result = std::from_chars(rest_.data(), end, value);
        good_ = good_ && rest_.size() >= digits && result.ptr == end && rest_[0] != '-' &&
                value >= least && value <= most;
        rest_.remove_prefix(good_ ? digits : 0);
        return value;
    }
    char oneOf(std::string_view choice) {
        good_ = good_ && !rest_.empty() && choice.find(rest_[0]) != std::string_view::npos;
        const char found = good_ ? rest_[0] : '\0';
        rest_.remove_prefix(good_ ? 1 : 0);
        return found;
    }
    double fraction() {
        if (!good_ || rest_.empty() || rest_[0] != '.') {
            return 0;
        }
        rest_.remove_prefix(1);
        double value = 0;
        double place = 0.1;
        std::size_t digits = 0;
        for (; !rest_.empty() && rest_[0] >= '0' && rest_[0] <= '9'; rest_.remove_prefix(1)) {
            value += place * (rest_[0] - '0');
            place /= 10;
            ++digits;
        }
        good_ = digits > 0;
        return value;
    }

private:
    std::string_view rest_;
    bool good_ = true;
};

std::optional<double> rfc3339(std::string_view text) {
    Scanner scan(text);
    std::tm parts{};
    parts.tm_year = scan.number(4, 0, 9999) - 1900;
    scan.oneOf("-");
    parts.tm_mon = scan.number(2, 1, 12) - 1;
    scan.oneOf("-");
    parts.tm_mday = scan.number(2, 1, 31);
    scan.oneOf("Tt ");
    parts.tm_hour = scan.number(2, 0, 23);
    scan.oneOf(":");
    parts.tm_min = scan.number(2, 0, 59);
    scan.oneOf(":");
    parts.tm_sec = scan.number(2, 0, 60); // A leap second there may be.
    const double fraction = scan.fraction();
    const char zone = scan.oneOf("Zz+-");
    int offset = 0;
    if (zone == '+' || zone == '-') {
        offset = scan.number(2, 0, 23) * 3600;
        scan.oneOf(":");
        offset += scan.number(2, 0, 59) * 60;
    }
    if (!scan.done()) {
        return std::nullopt;
    }
    std::tm day{};
    day.tm_year = parts.tm_year;
    day.tm_mon = parts.tm_mon;
    day.tm_mday = parts.tm_mday;
    (void)::timegm(&day);
    if (day.tm_mon != parts.tm_mon) {
        return std::nullopt; // A 31st of a month that has none moved on.
    }
    const auto seconds = static_cast<double>(::timegm(&parts));
    return seconds + fraction - (zone == '-' ? -offset : offset);
}

std::optional<double> duration(std::string_view text) {
    std::uint64_t count = 0;
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, count);
    if (result.ec != std::errc() || result.ptr + 1 != end) {
        return std::nullopt;
    }
    const auto number = static_cast<double>(count);
    switch (*result.ptr) {
    case 's':
        return number;
    case 'm':
        return number * 60;
    case 'h':
        return number * 3600;
    case 'd':
        return number * 86400;
    default:
        return std::nullopt;
    }
}

// 0:00 of the day that `now` is in, or of one some days before it.
double startOfDay(double now, int daysBefore) {
    const auto seconds = static_cast<std::time_t>(std::floor(now));
    std::tm local{};
    ::localtime_r(&seconds, &local);
    local.tm_hour = local.tm_min = local.tm_sec = 0;
    local.tm_mday -= daysBefore;
    local.tm_isdst = -1;
    return static_cast<double>(::mktime(&local));
}

} // namespace

std::optional<double> timeArgument(std::string_view text, double now) {
    if (text == "today" || text == "yesterday") {
        return startOfDay(now, text == "today" ? 0 : 1);
    }
    if (const auto before = duration(text)) {
        return now - *before;
    }
    return rfc3339(text);
}

} // namespace halyard::ctl
