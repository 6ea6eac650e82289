#include "reading/Digest.h"

#include "reading/Sessions.h"

namespace halyard::reading {
namespace {

std::optional<Digest::Leader> worstOf(const GlitchTally& tally) {
    for (const GlitchTally::Entry& entry : tally.entries()) {
        if (entry.name) {
            return Digest::Leader{*entry.name, entry.sum};
        }
    }
    return std::nullopt;
}

bool isTied(const std::vector<GlitchTally::Entry>& entries) {
    return entries.size() > 1 && entries[0].sum.glitches == entries[1].sum.glitches;
}

} // namespace

Outcome<Digest> digestOf(StoreReader& reader, const TimeRange& range, double now) {
    Digest digest;
    const auto sessions =
        forEachSession(reader, range, now, nullptr, [&digest](const Session& session) {
            const bool captured = session.direction == Direction::Capture;
            (captured ? digest.capturedSeconds : digest.playedSeconds) += session.playedInRange;
            digest.openSessions += session.closed ? 0 : 1;
            ++digest.sessions;
            return true;
        });
    if (!sessions.ok()) {
        return sessions.failure();
    }
    GlitchTally applications(GlitchKey::Application);
    GlitchTally causes(GlitchKey::Cause);
    const auto glitches = forEachGlitch(reader, range, [&](const Glitch& glitch) {
        digest.glitches.add(glitch);
        applications.add(glitch);
        causes.add(glitch);
        return true;
    });
    if (!glitches.ok()) {
        return glitches.failure();
    }
    digest.worstApplication = worstOf(applications);
    if (!isTied(causes.entries())) {
        digest.leadingCause = worstOf(causes);
    }
    return digest;
}

} // namespace halyard::reading
