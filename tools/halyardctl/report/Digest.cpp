#include "report/Digest.h"

namespace halyard::ctl {

Digest::Digest(const Limits& limits)
    : sessions(limits.sessions), glitches(limits.glitches), stretches(limits.stretches),
      routes(limits.routes), histograms(limits.histograms), residencies(limits.residencies),
      counters(limits.counters) {}

std::string shortName(std::string_view name) {
    if (name.size() <= Digest::kNameBytes) {
        return std::string(name);
    }
    std::size_t end = Digest::kNameBytes;
    // Not between the bytes of a letter.
    while (end > 0 && (static_cast<unsigned char>(name[end]) & 0xC0) == 0x80) {
        --end;
    }
    return std::string(name.substr(0, end)) + "…";
}

} // namespace halyard::ctl
