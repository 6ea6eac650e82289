#include "commands/MessageSheet.h"

#include <fmt/format.h>

#include "output/Sanitise.h"
#include "output/Words.h"

namespace halyard::ctl {
namespace {

std::uint64_t number(const Dictionary& in, std::string_view key) {
    const std::int64_t value = in[key].integerValue();
    return value > 0 ? static_cast<std::uint64_t>(value) : 0;
}

// A line for counts of which one is not 0: "  lost 3: disk_full 2, stuck 1".
void addReasons(std::vector<std::string>& lines, std::string_view what, const Value& counts) {
    if (!counts.isDictionary()) {
        return;
    }
    std::uint64_t sum = 0;
    std::string reasons;
    for (const Dictionary::Entry& entry : counts.dictionary()) {
        const std::uint64_t count = number(counts.dictionary(), entry.key.text());
        if (count > 0) {
            sum += count;
            reasons += fmt::format("{}{} {}", reasons.empty() ? "" : ", ",
                                   sanitised(entry.key.text()), count);
        }
    }
    if (sum > 0) {
        lines.push_back(fmt::format("  {} {}: {}", what, sum, reasons));
    }
}

Value messagesLost(const Dictionary& status) {
    const Value store = status["store"];
    const Value lost = store.isDictionary() ? store.dictionary()["lost"] : Value();
    return lost.isDictionary() ? lost.dictionary()["upload_message"] : Value();
}

std::uint64_t sumOf(const Value& counts) {
    std::uint64_t sum = 0;
    if (counts.isDictionary()) {
        for (const Dictionary::Entry& entry : counts.dictionary()) {
            sum += number(counts.dictionary(), entry.key.text());
        }
    }
    return sum;
}

// Whether sessions run whose messages go nowhere.
void addWithheld(std::vector<std::string>& lines, const Dictionary& status) {
    const std::uint64_t active = number(status, "active_session_count");
    const std::uint64_t limit = number(status, "upload_limit");
    const std::uint64_t withheld = number(status, "sessions_not_uploaded");
    if (active > limit || withheld > 0) {
        lines.push_back(
            fmt::format("Uploads are withheld: {} as active, and those started beyond {} are not "
                        "uploaded; {} now",
                        counted(active, "session counts", "sessions count"), limit, withheld));
    }
}

} // namespace

std::vector<std::string> messageSheet(const Dictionary& status) {
    if (!status["messages"].isDictionary()) {
        return {};
    }
    const Dictionary& sheet = status["messages"].dictionary();
    const Value lost = messagesLost(status);
    std::vector<std::string> lines{
        "Messages since the daemon started",
        fmt::format("  offered {} of {}, made by the daemon {}", number(sheet, "offered"),
                    counted(number(sheet, "requests"), "request", "requests"),
                    number(sheet, "own")),
        fmt::format("  stored {}, repeats {}, waiting {}", number(sheet, "delivered") - sumOf(lost),
                    number(sheet, "repeats"), number(sheet, "waiting"))};
    addReasons(lines, "not uploaded", sheet["not_uploaded"]);
    addReasons(lines, "lost", lost);
    for (const auto& [key, what] : {std::pair("unaddressed", "reached no session"),
                                    std::pair("bounded", "refused at a bound"),
                                    std::pair("refused", "refused, for reporting is off")}) {
        if (const std::uint64_t count = number(sheet, key); count > 0) {
            lines.push_back(fmt::format("  {} {}", counted(count, "request", "requests"), what));
        }
    }
    addReasons(lines, "lost in clients before they came here", sheet["lost_in_clients"]);
    addWithheld(lines, status);
    return lines;
}

} // namespace halyard::ctl
