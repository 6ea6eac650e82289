#include "content/Omission.h"

#include <algorithm>
#include <array>

namespace halyard::exporting {
namespace {

// Where an application's name, or that of its program, is known to stand.
constexpr std::array<std::string_view, 10> kPlacesOfApplication = {
    "ApplicationName",
    "detectedProcess",
    "HostApplicationDisplayID",
    "VQSessionVolumeOperationProcess",
    "application_binary",
    "application_name",
    "busiest",
    "kRelayReportingSessionInfoClientBundleID",
    "processName",
    "rtaid_client",
};

bool isPartOfName(char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
           c == '-' || c == '.' || static_cast<unsigned char>(c) >= 0x80;
}

} // namespace

Omission::Omission(std::vector<std::string> keys) : keys_(std::move(keys)) {
    omitsApplication_ = std::find(keys_.begin(), keys_.end(), kApplication) != keys_.end();
    if (omitsApplication_) {
        keys_.insert(keys_.end(), kPlacesOfApplication.begin(), kPlacesOfApplication.end());
    }
    std::sort(keys_.begin(), keys_.end());
}

bool Omission::omits(std::string_view key) const {
    return std::binary_search(keys_.begin(), keys_.end(), key);
}

bool Omission::isToldIn(std::string_view summaryText) const {
    return std::any_of(keys_.begin(), keys_.end(), [summaryText](const std::string& key) {
        std::size_t at = summaryText.find(key);
        while (at != std::string_view::npos) {
            const std::string_view after = summaryText.substr(at + key.size());
            if (after.starts_with(" = ") || after.starts_with("\" = ")) {
                return true;
            }
            at = summaryText.find(key, at + 1);
        }
        return false;
    });
}

bool mentions(std::string_view text, std::string_view name) {
    if (name.empty()) {
        return false;
    }
    for (std::size_t at = text.find(name); at != std::string_view::npos;
         at = text.find(name, at + 1)) {
        const std::size_t end = at + name.size();
        if ((at == 0 || !isPartOfName(text[at - 1])) &&
            (end == text.size() || !isPartOfName(text[end]))) {
            return true;
        }
    }
    return false;
}

} // namespace halyard::exporting
