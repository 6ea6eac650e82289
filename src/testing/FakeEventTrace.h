#pragma once

#include <functional>
#include <memory>
#include <utility>
#include <vector>

#include "platform/EventTrace.h"

namespace halyard::testing {

// One event as tests need it.
inline trace_point tracePoint(std::uint32_t code, std::uint64_t timestamp,
                              std::uint64_t thread = 1) {
    trace_point point{};
    point.code = code;
    point.timestamp = timestamp;
    point.threadID = thread;
    return point;
}

// Sessions whose events a test delivers. A time stamp is nanosecondsPerUnit ns.
class FakeEventTrace final : public platform::EventTrace {
public:
    // Outlives the session, so that a test can look at it afterwards.
    struct State {
        std::function<void()> completion;
        platform::EventTraceSession::EventHandler handler;
        std::shared_ptr<platform::SerialQueue> queue;
        std::uint32_t first = 0;
        std::uint32_t last = 0;
        bool wallTimes = false;
        bool started = false;
        int ended = 0;
        bool destroyed = false;
        std::uint64_t lost = 0;

        void deliver(const trace_point& point) const {
            queue->async([handler = handler, point] { handler(point); });
        }
    };

    std::unique_ptr<platform::EventTraceSession> createSession() override {
        auto state = std::make_shared<State>();
        sessions.push_back(state);
        return std::make_unique<Session>(*this, std::move(state));
    }

    std::vector<std::shared_ptr<State>> sessions; // in the order of their making
    int rangeResult = 0;
    int startResult = 0;
    std::uint64_t nanosecondsPerUnit = 1;

private:
    class Session final : public platform::EventTraceSession {
    public:
        Session(const FakeEventTrace& owner, std::shared_ptr<State> state)
            : owner_(owner), state_(std::move(state)) {}
        ~Session() override {
            state_->destroyed = true;
            state_->queue = nullptr;
        }

        void setCompletionHandler(std::function<void()> handler) override {
            state_->completion = std::move(handler);
        }
        void setWallTimesEnabled(bool enabled) override { state_->wallTimes = enabled; }
        int addEventsRange(std::uint32_t first, std::uint32_t last, EventHandler handler) override {
            state_->first = first;
            state_->last = last;
            state_->handler = std::move(handler);
            return owner_.rangeResult;
        }
        int start(std::shared_ptr<platform::SerialQueue> queue) override {
            state_->queue = std::move(queue);
            state_->started = owner_.startResult == 0;
            return owner_.startResult;
        }
        void end() override {
            ++state_->ended;
            state_->queue->async([completion = state_->completion] { completion(); });
        }
        std::uint64_t nanoseconds(std::uint64_t timestamp) const override {
            return timestamp * owner_.nanosecondsPerUnit;
        }
        std::uint64_t eventsLost() const override { return state_->lost; }
        std::string clockName() const override { return "fake"; }

    private:
        const FakeEventTrace& owner_;
        const std::shared_ptr<State> state_;
    };
};

} // namespace halyard::testing
