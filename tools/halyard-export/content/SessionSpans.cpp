#include "content/SessionSpans.h"

#include <algorithm>

#include "common/HYReportingUtility.h"
#include "linux/store/Schema.h"

namespace halyard::exporting {
namespace {

using namespace otlp;

// Of the upload framework itself, which the span's own attributes tell better.
constexpr std::string_view kFrameworkKeys = "kRelay";

void addID(Writer& span, Tag tag, std::string_view id) {
    span.add_bytes(tag, id.data(), id.size());
}

// A clock that was set back must not make a span end before it began.
void addTimes(Writer& span, double start, double end) {
    span.add_fixed64(span::kStart, nanoseconds(start));
    span.add_fixed64(span::kEnd, nanoseconds(std::max(start, end)));
}

} // namespace

void SessionSpans::add(RequestBody& body, const BookedSession& session,
                       const SessionContents& contents) {
    payload_.setNames(omission_.omitsApplication()
                          ? applicationNames(session.names, session.userInfo)
                          : std::vector<std::string>());
    std::string bytes;
    Writer span(bytes);
    addID(span, span::kTraceID, viewOf(session.trace));
    addID(span, span::kSpanID, viewOf(session.span));
    span.add_string(span::kName, session.names.service.value_or("unknown"));
    span.add_enum(span::kKind, span::kInternal);
    addTimes(span, session.opened, session.closed.value_or(session.opened));
    addFacts(span, session);
    addEvents(span, contents);
    if (contents.changesLeftOut > 0) {
        span.add_uint32(span::kDroppedEvents, static_cast<std::uint32_t>(std::min<std::uint64_t>(
                                                  contents.changesLeftOut, UINT32_MAX)));
    }
    if (session.ended == linux_::kEndedInterrupted) {
        Writer status(span, span::kStatus);
        status.add_string(span::kStatusMessage, "the daemon ended before the session did");
        status.add_enum(span::kStatusCode, span::kStatusError);
    }
    body.add(bytes);
    for (const auto& [key, glitch] : contents.glitches) {
        body.add(glitchSpan(session, glitch));
    }
}

void SessionSpans::addFacts(Writer& span, const BookedSession& session) {
    if (session.sessionID) {
        addInteger(span, span::kAttributes, "halyard.session_id", *session.sessionID);
    }
    const auto addName = [&](std::string_view key, const std::optional<std::string>& name) {
        if (name) {
            payload_.addText(span, span::kAttributes, key, *name);
        }
    };
    addName("application", session.names.application);
    addName("service", session.names.service);
    if (!session.ended.empty()) {
        payload_.addText(span, span::kAttributes, "ended", session.ended);
    }
    reading::JsonFields fields;
    if (!fields.parse(session.userInfo)) {
        return;
    }
    fields.forEachEntry([&](std::string_view key, const rapidjson::Value& value) {
        if (key == "application_pid" && value.IsInt64() && !omission_.omits(key)) {
            addInteger(span, span::kAttributes, "process.pid", value.GetInt64());
        } else if (key == "application_binary" && value.IsString() && !omission_.omits(key)) {
            otlp::addText(span, span::kAttributes, "process.executable.name",
                          {value.GetString(), value.GetStringLength()});
        } else if (!key.starts_with(kFrameworkKeys)) {
            payload_.add(span, span::kAttributes, key, value);
        }
    });
}

void SessionSpans::addEvents(Writer& span, const SessionContents& contents) {
    const auto addEvent = [&](double time, std::string_view name, std::string_view payload) {
        Writer event(span, span::kEvents);
        event.add_fixed64(span::kEventTime, nanoseconds(time));
        event.add_string(span::kEventName, name.data(), name.size());
        payload_.addAll(event, span::kEventAttributes, payload);
    };
    for (const TimedPayload& change : contents.changes) {
        addEvent(change.time,
                 change.category == kAudioEventCategoryVolume ? "halyard.volume" : "halyard.route",
                 change.payload);
    }
    for (const auto& [key, glitch] : contents.glitches) {
        addEvent(glitch.start, "halyard.glitch", glitch.payload);
    }
}

std::string SessionSpans::glitchSpan(const BookedSession& session, const GlitchFacts& glitch) {
    std::string bytes;
    Writer span(bytes);
    addID(span, span::kTraceID, viewOf(session.trace));
    addID(span, span::kSpanID,
          viewOf(identity_.spanOfGlitch(session.row, session.opened, glitch.start, glitch.node)));
    addID(span, span::kParentSpanID, viewOf(session.span));
    span.add_string(span::kName, "glitch");
    span.add_enum(span::kKind, span::kInternal);
    addTimes(span, glitch.start, glitch.start + glitch.seconds.value_or(0));
    payload_.addAll(span, span::kAttributes, glitch.payload);
    return bytes;
}

} // namespace halyard::exporting
