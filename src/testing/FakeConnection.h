// Connections and a listener whose peers are the test itself.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/Listener.h"

namespace halyard::testing {

// What a peer got for one request.
struct Answer {
    int count = 0; // how often it was answered
    MaybeError error;
    Value result;

    bool given() const { return count > 0; }
    bool succeeded() const { return given() && !error; }
};

class FakeConnection final : public platform::Connection {
public:
    explicit FakeConnection(std::int32_t pid) : pid_(pid) {}

    std::int32_t processIdentifier() const override { return pid_; }
    std::string description() const override { return "peer " + std::to_string(pid_); }
    platform::ClientBudgetPtr budget() const override { return clientBudget; }
    void setExportedObject(std::shared_ptr<platform::ExportedObject> object) override {
        exportedBeforeResume = resumed == 0;
        exported = std::move(object);
    }
    void setInterruptionHandler(std::function<void()> handler) override {
        interruptionHandler = std::move(handler);
    }
    void setInvalidationHandler(std::function<void()> handler) override {
        invalidationHandler = std::move(handler);
    }
    void resume() override { ++resumed; }

    // The peer's side. Requires an exported object.
    std::shared_ptr<Answer> send(protocol::Method method, protocol::Arguments arguments = {}) {
        auto answer = std::make_shared<Answer>();
        exported->handle({method, std::move(arguments),
                          protocol::Reply(std::make_unique<Recorder>(answer, answered_))});
        return answer;
    }
    void notify(protocol::Method method, protocol::Arguments arguments = {}) {
        exported->handle({method, std::move(arguments), protocol::Reply()});
    }
    // In the order in which they were given.
    const std::vector<std::shared_ptr<Answer>>& answered() const { return *answered_; }
    void interrupt() { std::exchange(interruptionHandler, nullptr)(); }
    // Lets the exported object go afterwards, as a closed connection does.
    void invalidate() {
        std::exchange(invalidationHandler, nullptr)();
        exported = nullptr;
    }

    std::shared_ptr<platform::ExportedObject> exported;
    std::function<void()> interruptionHandler;
    std::function<void()> invalidationHandler;
    int resumed = 0;
    bool exportedBeforeResume = false;
    std::shared_ptr<platform::SharedLimits> limits = std::make_shared<platform::SharedLimits>();
    platform::ClientBudgetPtr clientBudget = std::make_shared<platform::ClientBudget>(limits);

private:
    class Recorder final : public protocol::Responder {
    public:
        Recorder(std::shared_ptr<Answer> answer,
                 std::shared_ptr<std::vector<std::shared_ptr<Answer>>> answered)
            : answer_(std::move(answer)), answered_(std::move(answered)) {}
        void answer(const MaybeError& error, const Value& result) override {
            answered_->push_back(answer_);
            ++answer_->count;
            answer_->error = error;
            answer_->result = result;
        }

    private:
        std::shared_ptr<Answer> answer_;
        std::shared_ptr<std::vector<std::shared_ptr<Answer>>> answered_;
    };

    const std::int32_t pid_;
    const std::shared_ptr<std::vector<std::shared_ptr<Answer>>> answered_ =
        std::make_shared<std::vector<std::shared_ptr<Answer>>>();
};

class FakeListener final : public platform::Listener {
public:
    void setDelegate(platform::ListenerDelegate* delegate) override { delegate_ = delegate; }
    void resume() override { ++resumed; }

    // Null when the delegate refuses. Requires a delegate.
    std::shared_ptr<FakeConnection> connect(std::int32_t pid) {
        auto connection = std::make_shared<FakeConnection>(pid);
        return delegate_->shouldAcceptNewConnection(connection) ? connection : nullptr;
    }

    int resumed = 0;

private:
    platform::ListenerDelegate* delegate_ = nullptr;
};

} // namespace halyard::testing
