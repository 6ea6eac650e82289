#include "client/IssueEntries.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace halyard::client {
namespace {

// The daemon's metric counts them in 32 bits.
constexpr double kMaxSeconds = INT32_MAX;

// MessagePack's formats for a short string, a longer one and a real.
constexpr unsigned kFixString = 0xA0;
constexpr char kString16 = '\xDA';
constexpr char kFloat64 = '\xCB';

bool isComplete(const halyard_issue& issue) noexcept {
    const bool known =
        issue.category == HALYARD_CATEGORY_PLAYBACK || issue.category == HALYARD_CATEGORY_RECORD;
    const bool named = issue.issue_type != nullptr && issue.issue_type[0] != '\0';
    const double seconds = issue.any_channel_silence_seconds;
    return known && named && seconds >= 0 && seconds <= kMaxSeconds; // No NaN either.
}

} // namespace

halyard_result IssueEntries::fill(const halyard_issue& issue) noexcept {
    if (!isComplete(issue)) {
        return HALYARD_INVALID;
    }
    for (const halyard_result result :
         {addText("issue_type", issue.issue_type), addText("rtaid_client", issue.rtaid_client),
          addText("node", issue.node)}) {
        if (result != HALYARD_OK) {
            return result;
        }
    }
    addReal("any_channel_silence_seconds", issue.any_channel_silence_seconds);
    return HALYARD_OK;
}

halyard_result IssueEntries::addText(std::string_view key, const char* text) noexcept {
    if (text == nullptr) {
        return HALYARD_OK;
    }
    const std::size_t length = ::strnlen(text, kMaxText + 1);
    if (length > kMaxText) {
        return HALYARD_TOO_LARGE;
    }
    addKey(key);
    append({&kString16, 1});
    appendNumber(length, 2);
    append({text, length});
    return HALYARD_OK;
}

void IssueEntries::addReal(std::string_view key, double value) noexcept {
    addKey(key);
    append({&kFloat64, 1});
    appendNumber(std::bit_cast<std::uint64_t>(value), 8);
}

// Requires a key of up to 31 bytes.
void IssueEntries::addKey(std::string_view key) noexcept {
    const char head = static_cast<char>(kFixString | key.size());
    append({&head, 1});
    append(key);
    ++count_;
}

void IssueEntries::append(std::string_view bytes) noexcept {
    std::copy(bytes.begin(), bytes.end(), buffer_.data() + size_);
    size_ += bytes.size();
}

void IssueEntries::appendNumber(std::uint64_t bits, int bytes) noexcept {
    for (int shift = 8 * (bytes - 1); shift >= 0; shift -= 8) {
        const char byte = static_cast<char>(bits >> shift);
        append({&byte, 1});
    }
}

} // namespace halyard::client
