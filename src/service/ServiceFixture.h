// What the tests of the service share: a service object over a platform of
// fakes, and peers that connect to it and ask as clients do.
#pragma once

#include <gmock/gmock.h>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "service/HYReportingClientServerInstance.h"
#include "service/HYReportingServiceDelegate.h"
#include "session/HYReportingSession.h"
#include "testing/FakeConnection.h"
#include "testing/TestPlatform.h"

namespace halyard {

// One connected client. Every request runs all work that it causes, so its
// answer, if it gets one, is there at once.
class Peer {
public:
    using Answer = std::shared_ptr<testing::Answer>;
    using Method = protocol::Method;

    Peer(std::shared_ptr<testing::FakeConnection> connection, testing::ManualQueues& queues)
        : connection_(std::move(connection)), queues_(queues) {}

    Answer create(std::int64_t id) const {
        return ask(Method::CreateReportingSession, {.reporterID = id});
    }
    Answer setServiceType(AudioServiceType type, std::int64_t id) const {
        return ask(Method::SetServiceType, {.reporterID = id, .serviceType = type});
    }
    Answer serviceType(std::int64_t id) const {
        return ask(Method::GetServiceNameForReporterID, {.reporterID = id});
    }
    Answer configure(Dictionary configuration, std::int64_t id) const {
        return ask(Method::SetConfiguration,
                   {.reporterID = id, .dictionary = std::move(configuration)});
    }
    Answer start(std::int64_t id) const {
        return ask(Method::StartReportingSessionForID, {.reporterID = id});
    }
    Answer stop(std::int64_t id) const {
        return ask(Method::StopReportingSessionForID, {.reporterID = id});
    }
    Answer destroy(std::int64_t id) const {
        return ask(Method::DestroyReportingSession, {.reporterID = id});
    }
    Answer validate(std::int64_t id) const {
        return ask(Method::ReporterIDValid, {.reporterID = id});
    }
    // Of category Playback and type Start; no list broadcasts.
    Answer send(Dictionary message, std::optional<protocol::ReporterIDs> ids) const {
        return ask(Method::SendMessage, {.dictionary = std::move(message),
                                         .category = kAudioEventCategoryPlayback,
                                         .type = kAudioEventTypeStart,
                                         .reporterIDs = std::move(ids)});
    }
    void createAndStart(std::int64_t id) const {
        create(id);
        start(id);
    }
    Answer ask(Method method, protocol::Arguments arguments = {}) const {
        auto answer = connection_->send(method, std::move(arguments));
        queues_.runUntilIdle();
        return answer;
    }

    testing::FakeConnection& connection() const { return *connection_; }

private:
    std::shared_ptr<testing::FakeConnection> connection_;
    testing::ManualQueues& queues_;
};

class ServiceTest : public ::testing::Test {
protected:
    explicit ServiceTest(bool internalBuild = false) {
        platform_.deviceProperties.booleans["InternalBuild"] = internalBuild;
        restartService();
    }

    // For what the service reads once, at its construction.
    void restartService() {
        service_ = HYReportingServiceDelegate::make();
        listener_.setDelegate(service_.get());
    }
    // A client that the service does not know yet: its list has not been brought
    // up to date.
    Peer connectOnly(std::int32_t pid) { return Peer(listener_.connect(pid), platform_.queues); }
    Peer connect(std::int32_t pid, const std::string& name = "player") {
        platform_.processTable.names[pid] = name;
        Peer peer = connectOnly(pid);
        run();
        return peer;
    }

    void run() { platform_.queues.runUntilIdle(); }
    // For what belongs there and no request asks for.
    void onServiceQueue(platform::Task task) {
        service_->serviceQueue()->async(std::move(task));
        run();
    }
    // The session of the client that connected first, second, ...
    std::shared_ptr<HYReportingSession> session(std::int64_t id, std::size_t client = 0) const {
        return service_->getAllClients().at(client)->ownSession(id);
    }
    bool logged(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingServiceDelegateCategory, text);
    }
    bool loggedByClient(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingClientCategory, text);
    }
    static bool succeeded(const std::shared_ptr<testing::Answer>& answer) {
        return answer->count == 1 && !answer->error && answer->result == Value(true);
    }

    testing::TestPlatform platform_;
    testing::FakeListener listener_;
    std::shared_ptr<HYReportingServiceDelegate> service_;
};

} // namespace halyard
