#include "send/TlsTrouble.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>

namespace halyard::exporting {
namespace {

constexpr std::string_view kKeys = "client_certificate and client_key in [export]";

template <std::size_t N>
bool saysAnyOf(std::string_view why, const std::array<std::string_view, N>& words) {
    return std::any_of(words.begin(), words.end(), [why](std::string_view each) {
        return why.find(each) != std::string_view::npos;
    });
}

} // namespace

std::string troubleWithoutCertificate(std::string_view why, bool broke) {
    // The alert that means just this came with TLS 1.3. Before, a receiver could only say that
    // it does not like the handshake.
    constexpr std::array<std::string_view, 1> kCertain = {"alert certificate required"};
    constexpr std::array<std::string_view, 2> kLikely = {"alert handshake failure",
                                                         "alert bad certificate"};
    if (saysAnyOf(why, kCertain)) {
        return fmt::format("the receiver asks for a certificate of the client's: set {}", kKeys);
    }
    if (broke || saysAnyOf(why, kLikely)) {
        return fmt::format("the receiver broke off ({}), as one does that asks for a certificate "
                           "of the client's: {}",
                           why, kKeys);
    }
    return std::string(why);
}

} // namespace halyard::exporting
