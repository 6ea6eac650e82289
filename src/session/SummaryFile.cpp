#include "session/SummaryFile.h"

#include <fmt/format.h>
#include <utility>

#include "common/Utf8.h"

namespace halyard {
namespace {

constexpr std::size_t kLongestComponent = 80;

bool isUnsafe(char c) {
    return static_cast<unsigned char>(c) < 0x20 || c == 0x7F || c == '/' || c == '\\' || c == ':';
}

} // namespace

std::string safePathComponent(std::string_view text) {
    std::string safe = replaceInvalidUtf8(text);
    for (char& c : safe) {
        if (isUnsafe(c)) {
            c = '_';
        }
    }
    if (safe.empty() || safe.front() == '.') {
        safe.insert(0, 1, '_');
    }
    if (safe.size() > kLongestComponent) {
        std::size_t cut = kLongestComponent;
        while (cut > 0 && (static_cast<unsigned char>(safe[cut]) & 0xC0U) == 0x80U) {
            --cut; // Not inside a character.
        }
        safe.resize(cut);
    }
    return safe;
}

std::string summaryFileName(platform::WallTime time, std::chrono::seconds utcOffset,
                            std::string_view application, std::string_view service) {
    const auto local = std::chrono::floor<std::chrono::seconds>(time) + utcOffset;
    const auto day = std::chrono::floor<std::chrono::days>(local);
    const std::chrono::year_month_day date{day};
    const std::chrono::hh_mm_ss clock{local - day};
    const auto minutes = std::chrono::duration_cast<std::chrono::minutes>(utcOffset).count();
    return fmt::format("{:04}{:02}{:02}-{:02}{:02}{:02}{}{:02}{:02}-{}-{}-{}.json",
                       static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                       static_cast<unsigned>(date.day()), clock.hours().count(),
                       clock.minutes().count(), clock.seconds().count(), minutes < 0 ? '-' : '+',
                       std::abs(minutes) / 60, std::abs(minutes) % 60, HYReportingPerfProjectName,
                       safePathComponent(application), safePathComponent(service));
}

Value summaryFileContents(const std::vector<MessageBatch::Entry>& batch) {
    std::vector<Value> elements;
    elements.reserve(batch.size());
    for (const MessageBatch::Entry& entry : batch) {
        elements.emplace_back(Dictionary{{Value(entry.identifier()), Value(entry.message)}});
    }
    return List(std::move(elements));
}

} // namespace halyard
