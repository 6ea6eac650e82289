// Watches the streams that run: finds the cycles that they miss, finds out why, and
// tells each glitch in its stream's session.
//
// The server tells what was missed, late; what the stream's process did meanwhile
// can only be seen while it does it. So while a stream runs its process is looked at
// often, and cheaply; while none does, nothing is.
//
// Single-threaded, like everything here.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "GlitchCause.h"
#include "GlitchFinder.h"
#include "GlitchInquiry.h"
#include "MachineReader.h"
#include "ProcessReader.h"
#include "SessionSink.h"
#include "StreamObserver.h"
#include "WatchedProgram.h"

namespace halyard::pipewire {

class GlitchWatch final : public StreamObserver {
public:
    static constexpr std::size_t kMaxPrograms = 128;
    static constexpr std::size_t kMaxMessages = 6; // of a stream, a minute
    static constexpr std::chrono::milliseconds kTick{50};

    struct Options {
        std::function<Nanoseconds()> clock = monotonicNow;
        std::function<Nanoseconds()> asleep = timeAsleep;
        // What to add to the clock for the time since 1970.
        std::function<Nanoseconds()> realTime = realTimeOffset;
        ProcessReader::Places places = {};
        // Takes each decision with its figures.
        std::function<void(const std::string&)> note = nullptr;
        // Names the processes that had the processors; may be empty.
        std::function<Dictionaries()> busiest = nullptr;
    };

    // Borrows `sink`.
    GlitchWatch(SessionSink& sink, Options options);
    ~GlitchWatch() override;

    void runs(const StreamRun& run) override;
    void routed(StreamKey stream, const std::string& device) override;
    void stopped(StreamKey stream) override;
    bool gone(StreamKey stream) override;
    void settleAll() override;
    StreamEnd closing(StreamKey stream) override;

    void take(const Cycle& cycle) { finder_.take(cycle); }
    // To be called every kTick while there is something to watch.
    void tick();
    bool watching() const { return !leaving_.empty() || finder_.waiting(options_.clock()); }

    // Called from tick() for a stream of which everything is known after its node
    // went.
    std::function<void(StreamKey)> settled;

    // Streams and programs beyond the bounds.
    std::uint64_t unwatched() const { return unwatched_ + finder_.ignoredStreams(); }

private:
    struct Stream {
        StreamRun run;
        std::shared_ptr<WatchedProgram> program;
        bool running = false;
        std::string notedThread;
        std::deque<Nanoseconds> told;
        std::uint64_t unreported = 0;
        std::optional<GlitchInquiry> inquiry;    // into the open episode
        Nanoseconds realTime = 0;                // as it began
        std::optional<Nanoseconds> stoppedSince; // a program behind a server
        Nanoseconds inferredUntil = 0;
    };

    std::shared_ptr<WatchedProgram> programOf(const StreamRun& run);
    void sample(Nanoseconds now);
    void sampleMachine(Nanoseconds now);
    void inferStop(StreamKey key, Stream& stream, Nanoseconds now);
    void conclude(StreamKey key, Stream& stream, Nanoseconds now);
    void settle(Nanoseconds now);
    void open(const Episode& episode);
    void tell(const Episode& episode, bool over);
    CauseFacts factsOf(const Episode& episode, const Stream& stream) const;
    bool endsWithProgram(const Episode& episode) const;
    std::optional<double> othersCpu(const Episode& episode, const Stream& stream) const;
    bool allowed(Stream& stream, bool over);
    void noteThread(Stream& stream) const;
    void note(const Stream& stream, const Episode& episode, const CauseFacts& facts,
              GlitchCause cause) const;

    SessionSink& sink_;
    const Options options_;
    GlitchFinder finder_;
    MachineReader machineReader_;
    History<MachineSample> machine_;
    std::map<StreamKey, Stream> streams_;
    std::map<std::int64_t, std::weak_ptr<WatchedProgram>> programs_;
    std::map<StreamKey, Nanoseconds> leaving_; // gone, and since when
    std::uint64_t unwatched_ = 0;
};

} // namespace halyard::pipewire
