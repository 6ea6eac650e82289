#include "GlitchWatch.h"

#include <algorithm>
#include <fmt/format.h>

#include "GlitchMessage.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {

namespace {

constexpr Nanoseconds kMinute = 60'000'000'000;
// Many streams may begin at once, and the history is short.
constexpr Nanoseconds kSoon = 5'000'000;

} // namespace

GlitchWatch::GlitchWatch(SessionSink& sink, Options options)
    : sink_(sink), options_(std::move(options)),
      machineReader_(options_.places.processes, options_.asleep) {
    finder_.opened = [this](const Episode& episode) { open(episode); };
    finder_.tell = [this](const Episode& episode, bool over) { tell(episode, over); };
}

GlitchWatch::~GlitchWatch() = default;

// ---- Streams

std::shared_ptr<WatchedProgram> GlitchWatch::programOf(const StreamRun& run) {
    if (!run.process) {
        return nullptr;
    }
    std::erase_if(programs_, [](const auto& entry) { return entry.second.expired(); });
    const auto found = programs_.find(*run.process);
    if (found != programs_.end()) {
        return found->second.lock();
    }
    if (programs_.size() >= kMaxPrograms) {
        ++unwatched_;
        return nullptr;
    }
    auto program = std::make_shared<WatchedProgram>(
        ProcessReader(static_cast<pid_t>(*run.process), options_.places));
    programs_[*run.process] = program;
    return program;
}

void GlitchWatch::runs(const StreamRun& run) {
    const Nanoseconds now = options_.clock();
    if (!finder_.begin(run.key, run.node, now)) {
        return;
    }
    Stream& stream = streams_[run.key];
    const bool ranBefore = std::exchange(stream.running, true);
    stream.run = run;
    if (!stream.program) {
        stream.program = programOf(run);
    }
    if (!ranBefore) {
        if (stream.program) {
            stream.program->streamRuns(now);
        }
        sampleMachine(now);
        noteThread(stream);
    }
}

void GlitchWatch::routed(StreamKey key, const std::string& device) {
    const auto found = streams_.find(key);
    if (found != streams_.end()) {
        found->second.run.device = device;
    }
}

void GlitchWatch::stopped(StreamKey key) {
    const auto found = streams_.find(key);
    if (found == streams_.end() || !std::exchange(found->second.running, false)) {
        return;
    }
    if (found->second.program) {
        found->second.program->streamStopped(options_.clock());
    }
    found->second.stoppedSince.reset();
    finder_.end(key, options_.clock());
}

bool GlitchWatch::gone(StreamKey key) {
    const bool ran = streams_.contains(key) && streams_.at(key).running;
    stopped(key);
    if (!ran && finder_.episode(key) == nullptr && !finder_.pending(key, options_.clock())) {
        return false;
    }
    leaving_[key] = options_.clock();
    return true;
}

StreamEnd GlitchWatch::closing(StreamKey key) {
    const auto found = streams_.find(key);
    if (found == streams_.end()) {
        return {};
    }
    stopped(key);
    StreamEnd end{.unreported = found->second.unreported};
    if (found->second.program) {
        const auto ending = found->second.program->ending();
        end.program = !ending.gone ? "lives" : ending.died() ? "died" : "ended";
    }
    leaving_.erase(key);
    streams_.erase(found);
    finder_.forget(key);
    return end;
}

void GlitchWatch::settleAll() {
    const Nanoseconds now = options_.clock();
    for (auto& [key, since] : leaving_) {
        conclude(key, streams_.at(key), since);
    }
    sample(now);
    finder_.flush();
}

// ---- Time

void GlitchWatch::tick() {
    const Nanoseconds now = options_.clock();
    sample(now);
    settle(now);
}

void GlitchWatch::sampleMachine(Nanoseconds now) {
    if (machine_.latest() == nullptr || now - machine_.latest()->at >= kSoon) {
        machine_.add(machineReader_.sample(now));
    }
}

void GlitchWatch::sample(Nanoseconds now) {
    sampleMachine(now);
    for (auto& [id, weak] : programs_) {
        const auto program = weak.lock();
        if (program && program->runs()) {
            program->sample(now);
        }
    }
    for (auto& [key, stream] : streams_) {
        if (!stream.running) {
            continue;
        }
        if (stream.program && !stream.run.viaServer) {
            stream.program->seek(now, finder_.cycleLength(key));
            noteThread(stream);
        }
        if (stream.run.viaServer) {
            inferStop(key, stream, now);
        }
        if (const Episode* const episode = finder_.episode(key)) {
            stream.inquiry->fold(episode->end);
        }
    }
}

// The server plays on without a program that is stopped: what it had in its buffer,
// and then silence.
void GlitchWatch::inferStop(StreamKey key, Stream& stream, Nanoseconds now) {
    const ThreadSample* const last = stream.program ? stream.program->history().latest() : nullptr;
    if (last == nullptr || !stream.run.bufferSeconds || (!isStopped(*last) && !last->frozen)) {
        stream.stoppedSince.reset();
        return;
    }
    if (!stream.stoppedSince) {
        stream.stoppedSince = now;
        stream.inferredUntil = now + static_cast<Nanoseconds>(*stream.run.bufferSeconds * 1e9);
    }
    const Nanoseconds length = std::max<Nanoseconds>(finder_.cycleLength(key), 1'000'000);
    while (stream.inferredUntil + length <= now) {
        finder_.infer(key, stream.inferredUntil, length);
        stream.inferredUntil += length;
    }
}

void GlitchWatch::settle(Nanoseconds now) {
    std::vector<StreamKey> done;
    for (const auto& [key, since] : leaving_) {
        if (!finder_.pending(key, now)) {
            conclude(key, streams_.at(key), since);
            done.push_back(key);
        }
    }
    finder_.due(now);
    for (const StreamKey key : done) {
        if (finder_.episode(key) == nullptr) {
            leaving_.erase(key);
            if (settled) {
                settled(key);
            }
        }
    }
}

// A program that died in the middle of its sound did not deliver the next cycle, be
// the server ever so quick to take its node away.
void GlitchWatch::conclude(StreamKey key, Stream& stream, Nanoseconds since) {
    const Nanoseconds length = finder_.cycleLength(key);
    if (stream.program && length > 0 && stream.program->ending().died()) {
        finder_.end(key, since, true);
        if (finder_.episode(key) == nullptr) {
            finder_.infer(key, since, length);
        }
    }
}

// ---- Episodes

void GlitchWatch::open(const Episode& episode) {
    const auto found = streams_.find(episode.stream);
    if (found != streams_.end()) {
        Stream& stream = found->second;
        stream.realTime = options_.realTime();
        stream.inquiry.emplace(episode.start, stream.program, stream.run.viaServer, machine_);
    }
}

std::optional<double> GlitchWatch::othersCpu(const Episode& episode, const Stream& stream) const {
    double sum = 0;
    for (const auto& [key, other] : streams_) {
        if (!other.running || other.program == stream.program) {
            continue;
        }
        const auto* const before =
            other.program ? other.program->history().before(episode.start) : nullptr;
        const auto* const after =
            other.program ? other.program->history().after(episode.end) : nullptr;
        const auto ran = before != nullptr ? growth(before->cpu, after->cpu) : std::nullopt;
        if (!ran) {
            return std::nullopt;
        }
        sum += static_cast<double>(*ran) / 1e9;
    }
    return sum;
}

// What a program missed some time before it died has another cause.
bool GlitchWatch::endsWithProgram(const Episode& episode) const {
    const auto left = leaving_.find(episode.stream);
    return left != leaving_.end() && left->second - episode.end < GlitchFinder::gapOf(episode);
}

CauseFacts GlitchWatch::factsOf(const Episode& episode, const Stream& stream) const {
    CauseFacts facts = stream.inquiry->factsOf(episode);
    facts.gone = facts.gone && endsWithProgram(episode);
    if (facts.thread.cpu) {
        facts.othersCpuSeconds = othersCpu(episode, stream);
    }
    return facts;
}

// One place is kept for the end of an episode that is told before its end.
bool GlitchWatch::allowed(Stream& stream, bool over) {
    const Nanoseconds now = options_.clock();
    while (!stream.told.empty() && now - stream.told.front() >= kMinute) {
        stream.told.pop_front();
    }
    if (stream.told.size() + (over ? 0 : 1) >= kMaxMessages) {
        return false;
    }
    stream.told.push_back(now);
    return true;
}

void GlitchWatch::tell(const Episode& episode, bool over) {
    const auto found = streams_.find(episode.stream);
    if (found == streams_.end() || !found->second.inquiry) {
        return;
    }
    Stream& stream = found->second;
    stream.inquiry->fold(episode.end);
    const CauseFacts facts = factsOf(episode, stream);
    const GlitchCause cause = causeOf(facts);
    note(stream, episode, facts, cause);
    if (allowed(stream, over)) {
        GlitchEvidence evidence = stream.inquiry->evidenceOf(episode);
        if (options_.busiest) {
            evidence.busiest = options_.busiest();
        }
        const GlitchMessage message{.cause = cause,
                                    .application = stream.run.application,
                                    .node = stream.run.nodeName,
                                    .device = stream.run.device,
                                    .evidence = contentsOf(evidence),
                                    .unreported = std::exchange(stream.unreported, 0)};
        sink_.send(episode.stream,
                   messageOf(episode, message, stream.run.direction, stream.realTime));
    } else if (over) {
        ++stream.unreported;
    }
    if (over) {
        stream.inquiry.reset();
    }
}

void GlitchWatch::noteThread(Stream& stream) const {
    if (!options_.note || !stream.program || stream.run.viaServer ||
        stream.program->thread() == stream.notedThread) {
        return;
    }
    stream.notedThread = stream.program->thread();
    options_.note(fmt::format("session {}: the thread of \"{}\" in the graph is {}", stream.run.key,
                              stream.run.application, stream.notedThread));
}

void GlitchWatch::note(const Stream& stream, const Episode& episode, const CauseFacts& facts,
                       GlitchCause cause) const {
    if (!options_.note) {
        return;
    }
    const auto figure = [](const std::optional<Range>& value) {
        return value ? fmt::format("{:.4f} to {:.4f}", value->least, value->most)
                     : std::string("unknown");
    };
    options_.note(fmt::format(
        "session {}: {} of \"{}\": {} cycles of {:.5f} s, {} by a late driver ({:.4f} s); held up "
        "{:.4f} s; thread ran {} s and waited {} s more than usual, {} major faults; own work "
        "{:.2f} cycles, others {:.2f} (largest {:.2f}, ran {:.4f} s); stopped {}, frozen {}, gone "
        "{}, "
        "asleep {:.3f} s, stood still {:.3f} s",
        episode.stream, nameOf(cause), stream.run.nodeName, episode.cycles, facts.cycleSeconds,
        episode.lateCycles, facts.latenessSeconds, facts.heldSeconds, figure(facts.thread.cpu),
        figure(facts.thread.delay), figure(facts.thread.majorFaults), facts.ownCycles,
        facts.othersCycles, facts.largestOther, facts.othersCpuSeconds.value_or(-1), facts.stopped,
        facts.frozen, facts.gone, facts.asleepSeconds, facts.stoodStillSeconds));
}

} // namespace halyard::pipewire
