// A closed session as spans: one for the session, with its glitches and changes as events,
// and a child for each glitch.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <vector>

#include "content/PayloadAttributes.h"
#include "content/SessionContents.h"
#include "otlp/RequestBody.h"

namespace halyard::exporting {

class SessionSpans {
public:
    // Borrows both.
    SessionSpans(const Identity& identity, const Omission& omission)
        : identity_(identity), omission_(omission), payload_(omission) {}

    // Requires a closed session.
    void add(otlp::RequestBody& body, const BookedSession& session,
             const SessionContents& contents);

private:
    void addEvents(otlp::Writer& span, const SessionContents& contents);
    void addGlitch(std::string& event, const GlitchFacts& glitch);
    void addFacts(std::string& bytes, const BookedSession& session);
    void addProcess(const BookedSession& session);
    void addPayload(std::string& bytes, otlp::Tag tag, std::uint64_t kind,
                    std::string_view payload);
    std::string glitchSpan(const BookedSession& session, const GlitchFacts& glitch);

    const Identity& identity_;
    const Omission& omission_;
    PayloadAttributes payload_;
    AttributeBytes attributes_;
};

} // namespace halyard::exporting
