// Sessions, glitches and volumes as trace events, for the viewers that engineers have.
//
// Each application is a process, each of its sessions a thread, so that sessions that
// overlap do not look nested. Times are microseconds since 1970.
#include <algorithm>
#include <fmt/format.h>
#include <unordered_map>

#include "commands/Commands.h"
#include "common/HYReportingUtility.h"
#include "linux/system/AtomicFile.h"
#include "output/JsonStream.h"
#include "output/Sanitise.h"
#include "output/Words.h"
#include "reading/Glitches.h"
#include "reading/Sessions.h"

namespace halyard::ctl {
namespace {

using reading::Glitch;
using reading::Session;
using reading::StoreReader;

// Where an event stands.
struct Track {
    std::int64_t process = 0;
    std::int64_t thread = 0;
};

class Timeline {
public:
    Timeline(Context& context, std::FILE* file) : context_(context), json_(file) {}

    Outcome<void> write(StoreReader& reader) {
        json_.beginDocument();
        json_.beginObject();
        json_.field("displayTimeUnit", "ms");
        json_.key("traceEvents");
        json_.beginArray();
        const auto sessions = writeSessions(reader);
        const auto glitches = sessions.ok() ? writeGlitches(reader) : sessions;
        const auto volumes = glitches.ok() ? writeVolumes(reader) : glitches;
        json_.endArray();
        json_.endObject();
        json_.endDocument();
        return volumes;
    }

    std::uint64_t sessions() const { return sessions_; }
    std::uint64_t glitches() const { return glitches_; }
    std::uint64_t volumes() const { return volumes_; }

private:
    Outcome<void> writeSessions(StoreReader& reader) {
        return forEachSession(
            reader, context_.range, context_.now,
            [this](const reading::SessionRow& session) {
                return context_.wantsApplication(session.application);
            },
            [this](const Session& session) {
                writeSession(session);
                return true;
            });
    }
    Outcome<void> writeGlitches(StoreReader& reader) {
        return forEachGlitch(reader, context_.range, [this](const Glitch& glitch) {
            if (context_.wantsApplication(glitch.application)) {
                writeGlitch(glitch);
            }
            return true;
        });
    }
    Outcome<void> writeVolumes(StoreReader& reader) {
        const auto ids = reader.idsIn(context_.range, "upload_message", "time");
        if (!ids.ok()) {
            return ids.failure();
        }
        const std::string range = context_.range.condition("time");
        const std::string which =
            fmt::format("category = {} AND type <> {}{}{}", kAudioEventCategoryVolume,
                        kAudioEventTypeSummary, range.empty() ? "" : " AND ", range);
        return reader.forEach({"upload_message", "upload_session, time, payload", which,
                               ids.value().after, ids.value().upTo},
                              [this](const reading::Row& row) {
                                  writeVolume(row);
                                  return true;
                              });
    }

    void writeSession(const Session& session) {
        if (!session.opened) {
            return;
        }
        const Track track{processOf(session.application.value_or("Unknown")), session.id};
        processes_.emplace(session.id, track.process);
        nameOf("thread_name", track, fmt::format("session {}", session.id));
        begin("X", session.service.value_or("unknown"), "session", track, *session.opened);
        const double end = session.closed.value_or(std::max(session.lastHeard, *session.opened));
        json_.field("dur", std::optional(microseconds(std::max(0.0, end - *session.opened))));
        json_.key("args");
        json_.beginObject();
        json_.field("session_id", session.sessionID);
        json_.field("direction", reading::nameOf(session.direction));
        json_.field("ended", session.ended);
        json_.countField("messages", session.messages);
        json_.countField("glitches", session.glitches);
        json_.field("played_seconds", std::optional(session.playedSeconds));
        json_.key("devices");
        json_.beginArray();
        for (const std::string& device : session.devices) {
            json_.text(device);
        }
        json_.endArray();
        json_.endObject();
        endEvent();
        ++sessions_;
    }

    void writeGlitch(const Glitch& glitch) {
        const auto known = glitch.session ? processes_.find(*glitch.session) : processes_.end();
        const Track track = known == processes_.end()
                                ? Track{processOf(glitch.application.value_or("Unknown")), 0}
                                : Track{known->second, known->first};
        begin("i", glitch.cause.value_or("unknown"), "glitch", track, glitch.time());
        json_.field("s", "t");
        json_.key("args");
        json_.beginObject();
        json_.field("application", glitch.application);
        json_.field("device", glitch.device);
        json_.field("seconds", glitch.seconds);
        json_.field("cycles", glitch.cycles);
        json_.key("inferred");
        json_.boolean(glitch.inferred);
        json_.key("evidence");
        glitch.evidence == nullptr ? json_.null() : json_.value(*glitch.evidence);
        json_.endObject();
        endEvent();
        ++glitches_;
    }

    // What was to be heard: nothing while the session does not play.
    void writeVolume(const reading::Row& row) {
        const auto known = processes_.find(row.integer(1));
        if (known == processes_.end() || !fields_.parse(row.text(3))) {
            return;
        }
        const auto volume = fields_.number("VQSessionVolume");
        const bool plays = fields_.integer("VQSessionVolumePlayingState").value_or(1) != 0;
        if (!volume) {
            return;
        }
        begin("C", fmt::format("volume of session {}", known->first), "volume",
              {known->second, known->first},
              fields_.number("hyreporting_timestamp").value_or(row.real(2)));
        json_.key("args");
        json_.beginObject();
        json_.field("volume", std::optional(plays ? *volume : 0));
        json_.endObject();
        endEvent();
        ++volumes_;
    }

    std::int64_t processOf(const std::string& application) {
        const auto [entry, isNew] = applications_.try_emplace(
            application, static_cast<std::int64_t>(applications_.size()) + 1);
        if (isNew) {
            nameOf("process_name", {entry->second, 0}, application);
        }
        return entry->second;
    }

    void nameOf(const char* what, Track track, const std::string& name) {
        begin("M", what, "", track, std::nullopt);
        json_.key("args");
        json_.beginObject();
        json_.field("name", std::string_view(name));
        json_.endObject();
        endEvent();
    }

    void begin(const char* phase, std::string_view name, std::string_view category, Track track,
               std::optional<double> time) {
        json_.beginObject();
        json_.field("ph", phase);
        json_.field("name", name);
        json_.field("pid", std::optional(track.process));
        json_.field("tid", std::optional(track.thread));
        if (time) {
            json_.field("cat", category);
            json_.field("ts", std::optional(microseconds(*time)));
        }
    }
    void endEvent() {
        json_.endObject();
        json_.endLine();
    }

    static std::int64_t microseconds(double seconds) {
        constexpr double kMost = 9e12;
        return static_cast<std::int64_t>(std::clamp(seconds, -kMost, kMost) * 1e6);
    }

    Context& context_;
    JsonStream json_;
    reading::JsonFields fields_;
    std::unordered_map<std::string, std::int64_t> applications_;
    std::unordered_map<std::int64_t, std::int64_t> processes_; // of sessions
    std::uint64_t sessions_ = 0;
    std::uint64_t glitches_ = 0;
    std::uint64_t volumes_ = 0;
};

void tell(Context& context, const Timeline& timeline, const std::string& file) {
    if (context.json) {
        JsonStream json(context.terminal.stream());
        json.beginDocument();
        json.beginObject();
        json.countField("sessions", timeline.sessions());
        json.countField("glitches", timeline.glitches());
        json.countField("volumes", timeline.volumes());
        json.endObject();
        json.endDocument();
    } else {
        context.terminal.write(fmt::format("{}: {}, {}, {}\n", sanitised(file),
                                           counted(timeline.sessions(), "session", "sessions"),
                                           counted(timeline.glitches(), "glitch", "glitches"),
                                           counted(timeline.volumes(), "volume", "volumes")));
    }
}

} // namespace

Exit runTimeline(Context& context, const std::string& file) {
    auto reader = context.openStore();
    if (!reader.ok()) {
        return fail(reader.failure());
    }
    linux_::AtomicFile output(file);
    if (output.stream() == nullptr) {
        const auto failed = output.commit();
        return fail({Exit::Failed, failed.ok() ? file : failed.failure().message()});
    }
    Timeline timeline(context, output.stream());
    if (const auto written = timeline.write(reader.value()); !written.ok()) {
        return fail(written.failure());
    }
    if (const auto committed = output.commit(); !committed.ok()) {
        return fail({Exit::Failed, committed.failure().message()});
    }
    tell(context, timeline, file);
    return finish(context, {});
}

} // namespace halyard::ctl
