#pragma once

#include <memory>
#include <vector>

#include "platform/PerformanceTrace.h"

namespace halyard::testing {

// Traces that start and complete at once, with what a test sets as errors.
class FakePerformanceTraces final : public platform::PerformanceTraces {
public:
    // Outlives the session.
    struct State {
        int templateNumber = 0;
        int started = 0;
        int stopped = 0;
        bool destroyed = false;
        std::weak_ptr<platform::PerformanceTraceDelegate> delegate;
    };

    std::shared_ptr<platform::PerformanceTraceSession>
    initWithConfig(const platform::PerformanceTraceConfig& config) override {
        sessions.push_back(std::make_shared<State>());
        sessions.back()->templateNumber = config.templateNumber;
        return std::make_shared<Session>(*this, sessions.back());
    }

    std::vector<std::shared_ptr<State>> sessions;
    bool completes = true; // when it is stopped or cannot start; else a test says so
    MaybeError startError; // completes, too
    MaybeError stopError;
    MaybeError completeError;

private:
    class Session final : public platform::PerformanceTraceSession {
    public:
        Session(const FakePerformanceTraces& owner, std::shared_ptr<State> state)
            : owner_(owner), state_(std::move(state)) {}
        ~Session() override { state_->destroyed = true; }

        void setDelegate(std::weak_ptr<platform::PerformanceTraceDelegate> delegate) override {
            state_->delegate = std::move(delegate);
        }
        void startPerformanceTrace() override {
            ++state_->started;
            const auto delegate = state_->delegate.lock();
            delegate->performanceTraceDidStart(owner_.startError);
            if (owner_.startError && owner_.completes) {
                delegate->performanceTraceDidComplete("", "", owner_.startError);
            }
        }
        void stopPerformanceTrace() override {
            ++state_->stopped;
            const auto delegate = state_->delegate.lock();
            delegate->performanceTraceDidStop(owner_.stopError);
            if (owner_.completes) {
                delegate->performanceTraceDidComplete("/traces/one.dat", "one",
                                                      owner_.completeError);
            }
        }

    private:
        const FakePerformanceTraces& owner_;
        const std::shared_ptr<State> state_;
    };
};

} // namespace halyard::testing
