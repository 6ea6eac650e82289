#include "content/SessionSpans.h"

#include <algorithm>

#include "common/HYReportingUtility.h"
#include "linux/store/Schema.h"

namespace halyard::exporting {
namespace {

using namespace otlp;

// Of the upload framework itself, which the span's own attributes tell better.
constexpr std::string_view kFrameworkKeys = "kRelay";
// Which the protocol has attributes of its own for.
constexpr const char* kPid = "application_pid";
constexpr const char* kBinary = "application_binary";

// What only says when a message was made, and what repeats its event's name. The log record of
// the same message has them.
constexpr std::string_view kStamps[] = {"hyreporting_timestamp", "systemuptime_sec",
                                        "processuptime_ms", "audiotag"};

// Kinds of what is told of sessions.
enum Kind : std::uint8_t { kVolume, kRoute, kGlitch };

bool isStamp(std::string_view key) {
    return std::find(std::begin(kStamps), std::end(kStamps), key) != std::end(kStamps);
}

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
    addFacts(bytes, session);
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

void SessionSpans::addFacts(std::string& bytes, const BookedSession& session) {
    attributes_.clear();
    const auto addName = [&](std::string_view key, const std::optional<std::string>& name) {
        if (name) {
            payload_.addText(attributes_.texts, span::kAttributes, key, *name);
        }
    };
    addName("application", session.names.application);
    addName("service", session.names.service);
    if (!session.ended.empty()) {
        addName("ended", session.ended);
    }
    if (session.sessionID) {
        appendAttribute(attributes_.numbers, span::kAttributes, kPrefix, "session_id",
                        AnyValue::ofInteger(*session.sessionID));
    }
    addProcess(session);
    bytes.append(attributes_.texts).append(attributes_.numbers);
}

void SessionSpans::addProcess(const BookedSession& session) {
    reading::JsonFields fields;
    (void)fields.parse(session.userInfo);
    const rapidjson::Value* const pid = fields.find(kPid);
    const bool hasPid = pid != nullptr && pid->IsInt64();
    const auto binary = fields.text(kBinary);
    if (hasPid && !omission_.omits(kPid)) {
        appendAttribute(attributes_.numbers, span::kAttributes, {}, "process.pid",
                        AnyValue::ofInteger(pid->GetInt64()));
    }
    if (binary && !omission_.omits(kBinary)) {
        Writer writer(attributes_.texts);
        otlp::addText(writer, span::kAttributes, "process.executable.name", *binary);
    }
    payload_.add(attributes_, span::kAttributes, session.userInfo, [&](std::string_view key) {
        return (hasPid && key == kPid) || (binary && key == kBinary) ||
               key.starts_with(kFrameworkKeys);
    });
}

void SessionSpans::addPayload(std::string& bytes, Tag tag, std::uint64_t kind,
                              std::string_view payload) {
    attributes_.clear();
    payload_.addOfKind(attributes_, tag, kind, payload, isStamp);
    bytes.append(attributes_.texts).append(attributes_.numbers);
}

void SessionSpans::addEvents(Writer& span, const SessionContents& contents) {
    std::string event;
    Writer writer(event);
    const auto begin = [&](std::string_view name) {
        event.clear();
        writer.add_string(span::kEventName, name.data(), name.size());
    };
    // Its time last, which is never alike.
    const auto end = [&](double time) {
        writer.add_fixed64(span::kEventTime, nanoseconds(time));
        span.add_message(span::kEvents, event);
    };
    for (const TimedPayload& change : contents.changes) {
        const bool isVolume = change.category == kAudioEventCategoryVolume;
        begin(isVolume ? "halyard.volume" : "halyard.route");
        addPayload(event, span::kEventAttributes, isVolume ? kVolume : kRoute, change.payload);
        end(change.time);
    }
    for (const auto& [key, glitch] : contents.glitches) {
        begin("halyard.glitch");
        addGlitch(event, glitch);
        end(glitch.start);
    }
}

// Its cause and length; the child span has the rest.
void SessionSpans::addGlitch(std::string& event, const GlitchFacts& glitch) {
    payload_.addText(event, span::kEventAttributes, kGlitchCause, glitch.cause);
    if (glitch.seconds && !omission_.omits(kGlitchSeconds)) {
        appendAttribute(event, span::kEventAttributes, kPrefix, kGlitchSeconds,
                        AnyValue::ofReal(*glitch.seconds));
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
    addPayload(bytes, span::kAttributes, kGlitch, glitch.payload);
    return bytes;
}

} // namespace halyard::exporting
