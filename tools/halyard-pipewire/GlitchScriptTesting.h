// The watch with a clock, cycles and processes of a script.
#pragma once

#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "CycleTesting.h"
#include "GlitchWatch.h"
#include "ProcessTesting.h"
#include "halyard/halyard.h"

namespace halyard::pipewire {

inline constexpr Nanoseconds kStart = 1'000'000'000'000;
inline constexpr Nanoseconds kSecond = 1'000'000'000;
inline constexpr StreamKey kKey = 7;
inline constexpr ObjectId kNode = 47;
inline constexpr ObjectId kOther = 48;

class MessageSink final : public SessionSink {
public:
    void open(std::int64_t, std::uint16_t, const Contents&) override {}
    void send(std::int64_t id, const Message& message) override {
        ids.push_back(id);
        messages.push_back(message.contents);
    }
    void close(std::int64_t) override {}

    std::vector<std::int64_t> ids;
    std::vector<Contents> messages;
};

class GlitchWatchTest : public ::testing::Test {
protected:
    GlitchWatchTest() {
        processes_.process(kProgram);
        processes_.thread(kProgram, thread_);
        watch_ = std::make_unique<GlitchWatch>(
            sink_, GlitchWatch::Options{.clock = [this] { return now_; },
                                        .asleep = [this] { return asleep_; },
                                        .realTime = [this] { return realTime_ += 1'000'000; },
                                        .places = processes_.places(),
                                        .note = nullptr,
                                        .busiest = nullptr});
        watch_->settled = [this](StreamKey key) { settled_.push_back(key); };
    }

    static StreamRun run(StreamKey key = kKey, ObjectId node = kNode, pid_t process = kProgram) {
        StreamRun run{.key = key, .node = node};
        run.application = "Player";
        run.nodeName = "player.node";
        run.device = "out.speaker";
        run.process = process;
        return run;
    }
    void plays() {
        watch_->runs(run());
        live(1000);
    }

    // So long, with records of cycles that come at once and a look every 50 ms.
    void live(int milliseconds, Progress progress = Progress::Finished) {
        const Nanoseconds end = now_ + milliseconds * kMillisecond;
        while (graph_.now() + kLength <= end) {
            const Nanoseconds next = graph_.now() + kLength;
            const Cycle cycle = graph_.cycle({{kNode, progress}, {kOther}});
            pass(next);
            watch_->take(cycle);
        }
        pass(end);
    }
    void pass(Nanoseconds until) {
        while (nextTick_ <= until) {
            now_ = nextTick_;
            nextTick_ += 50 * kMillisecond;
            watch_->tick();
        }
        now_ = until;
    }
    // Five cycles are missed while the thread does what `change` makes of it; all is
    // told when this returns.
    template <class Change> void glitch(Change change) {
        live(100, Progress::Triggered);
        change(thread_);
        processes_.thread(kProgram, thread_);
        live(1000);
    }
    void glitch() {
        glitch([](FakeThread&) {});
    }

    std::string cause(std::size_t index = 0) const {
        return index < sink_.messages.size() ? sink_.messages[index].get<std::string>("issue_type")
                                             : "nothing told";
    }
    Contents evidence(std::size_t index = 0) const {
        return sink_.messages.at(index).get<Nested>("glitch_evidence").inner.at(0);
    }
    std::int64_t unreported(std::size_t index) const {
        return sink_.messages.at(index).get<std::int64_t>("glitches_unreported");
    }

    FakeProcesses processes_;
    FakeThread thread_{.id = 2, .name = "data-loop.0"};
    TestGraph graph_{kStart};
    Nanoseconds now_ = kStart - 1;
    Nanoseconds nextTick_ = kStart;
    Nanoseconds asleep_ = 0;
    Nanoseconds realTime_ = kSecond; // is being put right
    MessageSink sink_;
    std::unique_ptr<GlitchWatch> watch_;
    std::vector<StreamKey> settled_;
};

} // namespace halyard::pipewire
