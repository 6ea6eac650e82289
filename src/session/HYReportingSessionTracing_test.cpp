#include <gtest/gtest.h>

#include "session/SessionFixture.h"

namespace halyard {
namespace {

using ::testing::IsEmpty;
using ::testing::SizeIs;

class SessionTracingTest : public SessionTest {
protected:
    SessionTracingTest() {
        platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
        // Whoever blocks lets the queues go on.
        platform_.conditions.onWait = [this] { return platform_.queues.runOne(); };
        platform_.files.files["/trace.plist"] =
            "{ Children = ({ Name = audio; TraceType = evtap; Children = ("
            "{ Name = render; Type = Interval; EvtapCodeBegin = 21040010;"
            "  EvtapCodeEnd = 21040011; }); }); }";
        session_ = makeSession();
        session_->setServiceType(kAudioServiceTypeTest);
    }

    void configure(const Dictionary& configuration) {
        session_->updateConfigurationWithContentsOfConfiguration(configuration);
    }
    auto& events() { return platform_.eventTrace.sessions; }
    auto& performance() { return platform_.performanceTraces.sessions; }
    // With a parameter file, and without.
    static std::vector<Dictionary> kindsOfTrace() {
        return {{{HYReportingLoomisPlistFilePath, "/trace.plist"}}, {}};
    }
    void expectNoTrace(AudioServiceType type, const Dictionary& configuration) {
        const auto session = makeSession();
        session->setServiceType(type);
        session->updateConfigurationWithContentsOfConfiguration(configuration);
        session->start();
        EXPECT_FALSE(session->startedTracing()) << type;
        session->stop();
        EXPECT_EQ(session->tracingFileName(), std::nullopt) << type;
        EXPECT_THAT(events(), IsEmpty()) << type;
        EXPECT_THAT(performance(), IsEmpty()) << type;
        EXPECT_THAT(platform_.resultsFiles.files, IsEmpty()) << type;
    }
    // Makes a stop that waits see the trace complete: `waits_` counts.
    void completeWhenWaitedFor(std::string_view url, MaybeError error = std::nullopt) {
        platform_.performanceTraces.completes = false;
        platform_.conditions.onWait = [this, url, error] {
            ++waits_;
            waitedSince_ = session_->stopWaitsSince();
            heldWhileWaiting_ = !performance()[0]->destroyed;
            performance()[0]->delegate.lock()->performanceTraceDidComplete(url, "", error);
            return true;
        };
        session_ = makeSession();
        session_->setServiceType(kAudioServiceTypeTest);
    }
    bool loggedByTrace(LogLevel level, std::string_view text) const {
        return platform_.log.has(level, HYReportingTraceCategory, text);
    }

    std::shared_ptr<HYReportingSession> session_;
    int waits_ = 0;
    std::optional<platform::SteadyTime> waitedSince_;
    bool heldWhileWaiting_ = false; // the trace session
};

TEST_F(SessionTracingTest, AParameterFileWithoutAKindRunsTheEventTrace) {
    configure({{HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    EXPECT_TRUE(session_->startedTracing());
    ASSERT_THAT(events(), SizeIs(1));
    EXPECT_THAT(performance(), IsEmpty());
    EXPECT_TRUE(loggedByTrace(LogLevel::Debug, "Got the tracefile /trace.plist, setting up trace"));
    EXPECT_TRUE(loggedByTrace(LogLevel::Info, "Setting up tracing for test"));
    events()[0]->deliver(testing::tracePoint(0x21040010, 100));
    events()[0]->deliver(testing::tracePoint(0x21040011, 350));

    session_->stop();
    EXPECT_FALSE(session_->startedTracing());
    ASSERT_THAT(platform_.resultsFiles.files, SizeIs(1));
    EXPECT_THAT(platform_.resultsFiles.files[0]->values,
                ::testing::ElementsAre(testing::FakeResultsFiles::NamedValue{"render", 250}));
    EXPECT_TRUE(platform_.resultsFiles.files[0]->closed);
}

TEST_F(SessionTracingTest, WithoutAParameterFileItRunsAPerformanceTrace) {
    session_->start();
    ASSERT_THAT(performance(), SizeIs(1));
    EXPECT_EQ(performance()[0]->templateNumber, 1);
    EXPECT_EQ(performance()[0]->started, 1);
    EXPECT_TRUE(platform_.log.has(LogLevel::Default, HYReportingPlatformCategory,
                                  "started performance trace."));
    EXPECT_TRUE(loggedByTrace(LogLevel::Info, "Performance Trace Started"));

    session_->stop();
    EXPECT_EQ(performance()[0]->stopped, 1);
    EXPECT_TRUE(performance()[0]->destroyed);
    EXPECT_TRUE(performance()[0]->delegate.expired());
    EXPECT_EQ(session_->getPSTraceFileURL(), "/traces/one.dat");
    EXPECT_TRUE(loggedByTrace(LogLevel::Info, "Performance Trace Stopped"));
    EXPECT_TRUE(loggedByTrace(LogLevel::Info, "Performance Trace Completed: /traces/one.dat"));
}

TEST_F(SessionTracingTest, AClientsEvtapIsNotTheConstant) {
    configure({{HYReportingTraceType, "evtap"}, {HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    EXPECT_THAT(events(), IsEmpty());
    EXPECT_THAT(performance(), SizeIs(1));
    EXPECT_EQ(session_->tracingFileName(), std::nullopt);
}

TEST_F(SessionTracingTest, NotEvenTheConstantsOwnTextMatchesOnceItIsAValue) {
    configure({{HYReportingTraceType, HYReportingTraceTypeEvtap},
               {HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    EXPECT_THAT(events(), IsEmpty());
}

TEST_F(SessionTracingTest, OtherServiceTypesNeverTrace) {
    std::vector<AudioServiceType> others{kAudioServiceTypeUnknown};
    for (AudioServiceType type = 0; type <= kAudioServiceTypeSystemSounds + 1; ++type) {
        if (type != kAudioServiceTypeTest) {
            others.push_back(type);
        }
    }
    for (const Dictionary& configuration : kindsOfTrace()) {
        for (const AudioServiceType type : others) {
            expectNoTrace(type, configuration);
        }
    }
}

TEST_F(SessionTracingTest, WithTheFeatureOffNothingTraces) {
    for (const bool configuredAsOff : {true, false}) {
        platform_.featureFlags.flags.clear();
        if (configuredAsOff) {
            platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = false;
        }
        // Another flag of that name, and another of that domain.
        platform_.featureFlags.flags[{"Audio", "Tracing"}] = true;
        platform_.featureFlags.flags[{"AudioAnalytics", "Trace"}] = true;
        for (const Dictionary& configuration : kindsOfTrace()) {
            expectNoTrace(kAudioServiceTypeTest, configuration);
        }
    }
}

TEST_F(SessionTracingTest, ATraceThatMayNotBeStoppedRunsOn) {
    configure({{HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    platform_.featureFlags.flags.clear();
    session_->stop();
    EXPECT_TRUE(session_->startedTracing());
    EXPECT_THAT(platform_.resultsFiles.files, IsEmpty());
    EXPECT_EQ(events()[0]->ended, 0);

    platform_.featureFlags.flags[{"AudioAnalytics", "Tracing"}] = true;
    session_->start();
    EXPECT_THAT(events(), SizeIs(1)); // It still runs.
    session_->stop();
    EXPECT_THAT(platform_.resultsFiles.files, SizeIs(1));
}

TEST_F(SessionTracingTest, WhatIsSetUpHasNotStarted) {
    session_->start();
    ASSERT_TRUE(session_->startedTracing());
    const std::string fileName = "/trace.plist";
    session_->setupTracing(&fileName);
    EXPECT_FALSE(session_->startedTracing());
    EXPECT_THAT(events(), IsEmpty());
}

TEST_F(SessionTracingTest, ATraceOfASessionThatHasAnotherTypeByThenRunsOn) {
    session_->start();
    session_->setServiceType(kAudioServiceTypeGeneric);
    session_->stop();
    EXPECT_TRUE(session_->startedTracing());
    EXPECT_EQ(performance()[0]->stopped, 0);
}

TEST_F(SessionTracingTest, AStartOfAStartedSessionStartsNoSecondTrace) {
    session_->start();
    session_->start();
    EXPECT_THAT(performance(), SizeIs(1));
}

TEST_F(SessionTracingTest, AMissingParameterFileTracesNothingButIsStoppedLikeAny) {
    configure({{HYReportingLoomisPlistFilePath, "/none"}});
    session_->start();
    EXPECT_TRUE(session_->startedTracing());
    session_->stop();
    EXPECT_TRUE(platform_.resultsFiles.files.at(0)->values.empty());
}

TEST_F(SessionTracingTest, SetupWithoutAFileNameIsRefused) {
    session_->setupTracing(nullptr);
    EXPECT_EQ(session_->tracingFileName(), std::nullopt);
    EXPECT_TRUE(loggedByTrace(LogLevel::Error, "TracefileName empty. Failed to setup tracing"));
}

TEST_F(SessionTracingTest, ATraceThatCannotStartDoesNotHoldUpTheStop) {
    platform_.performanceTraces.startError = Error{"posix", 2, "No such file or directory"};
    session_->start();
    EXPECT_TRUE(session_->startedTracing());
    EXPECT_TRUE(performance()[0]->destroyed);
    session_->stop();
    EXPECT_EQ(performance()[0]->stopped, 0);
    EXPECT_FALSE(session_->started());
    EXPECT_TRUE(
        loggedByTrace(LogLevel::Error, "performanceTraceDidStart No such file or directory"));
    EXPECT_TRUE(
        loggedByTrace(LogLevel::Error, "performanceTraceDidComplete No such file or directory"));
    EXPECT_EQ(session_->getPSTraceFileURL(), "");
}

// Only the completion ends the wait: an error of the start, or of the stop, does not.
TEST_F(SessionTracingTest, TheStopOfATraceThatCouldNotStartWaitsForItsCompletion) {
    platform_.performanceTraces.startError = Error{"posix", 2, "No such file or directory"};
    completeWhenWaitedFor("", platform_.performanceTraces.startError);
    session_->start();
    session_->stop();
    EXPECT_EQ(waits_, 1);
    EXPECT_EQ(performance()[0]->stopped, 0);
}

TEST_F(SessionTracingTest, TheStopOfATraceThatCannotStopWaitsForItsCompletion) {
    platform_.performanceTraces.stopError = Error{"posix", 5, "Input/output error"};
    completeWhenWaitedFor("", platform_.performanceTraces.stopError);
    session_->start();
    session_->stop();
    EXPECT_EQ(waits_, 1);
    EXPECT_EQ(performance()[0]->stopped, 1);
    EXPECT_FALSE(heldWhileWaiting_);
}

TEST_F(SessionTracingTest, AStopWaitsForTheCompletionAndTellsSinceWhen) {
    completeWhenWaitedFor("/traces/two.dat");
    session_->start();
    EXPECT_EQ(session_->stopWaitsSince(), std::nullopt);
    platform_.clock.advance(std::chrono::seconds(5));
    session_->stop();
    EXPECT_EQ(waits_, 1);
    EXPECT_TRUE(heldWhileWaiting_);
    EXPECT_EQ(waitedSince_, platform_.clock.steadyTime());
    EXPECT_EQ(session_->stopWaitsSince(), std::nullopt);
    EXPECT_EQ(session_->getPSTraceFileURL(), "/traces/two.dat");
}

TEST_F(SessionTracingTest, ATraceThatCompletesWithAnErrorLeavesTheURLOfTheLast) {
    session_->start();
    const auto delegate = performance()[0]->delegate.lock();
    session_->stop();
    ASSERT_EQ(session_->getPSTraceFileURL(), "/traces/one.dat");
    delegate->performanceTraceDidComplete("/traces/broken.dat", "", Error{"posix", 5, "broken"});
    EXPECT_EQ(session_->getPSTraceFileURL(), "/traces/one.dat");
    EXPECT_TRUE(loggedByTrace(LogLevel::Error, "performanceTraceDidComplete broken"));
    EXPECT_FALSE(loggedByTrace(LogLevel::Info, "Performance Trace Completed: /traces/broken.dat"));
}

TEST_F(SessionTracingTest, ATraceThatCannotStopDropsItsSession) {
    platform_.performanceTraces.stopError = Error{"posix", 5, "Input/output error"};
    platform_.performanceTraces.completeError = platform_.performanceTraces.stopError;
    session_->start();
    session_->stop();
    EXPECT_TRUE(loggedByTrace(LogLevel::Error, "performanceTraceDidStop Input/output error"));
    EXPECT_TRUE(performance()[0]->destroyed);
}

TEST_F(SessionTracingTest, ASessionMayBeTracedAgain) {
    configure({{HYReportingLoomisPlistFilePath, "/trace.plist"}});
    for (int i = 0; i < 2; ++i) {
        session_->start();
        session_->stop();
    }
    EXPECT_THAT(events(), SizeIs(2));
    EXPECT_THAT(platform_.resultsFiles.files, SizeIs(2));
}

TEST_F(SessionTracingTest, ARunnerGoesWithItsEventsOnceTheResultsAreWritten) {
    configure({{HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    EXPECT_EQ(platform_.queues.queuesHeld("Tracing Queue"), 1U);
    session_->stop();
    EXPECT_EQ(platform_.queues.queuesHeld("Tracing Queue"), 0U);
    EXPECT_EQ(session_->tracingFileName(), "/trace.plist");
}

// The file's name stays, so the stop is that of an event trace whatever was
// started. Its results stay as they are.
TEST_F(SessionTracingTest, OnceAnEventTraceNoStopGoesToAPerformanceTrace) {
    configure({{HYReportingLoomisPlistFilePath, "/trace.plist"}});
    session_->start();
    session_->stop();
    configure({{HYReportingTraceType, "artrace"}});
    session_->start();
    session_->stop();
    EXPECT_FALSE(session_->startedTracing());
    ASSERT_THAT(performance(), SizeIs(1));
    EXPECT_EQ(performance()[0]->stopped, 0);
    EXPECT_THAT(platform_.resultsFiles.files, SizeIs(1));
}

TEST_F(SessionTracingTest, ADestroyedSessionGivesItsTracesUp) {
    session_->start();
    session_.reset();
    EXPECT_TRUE(performance()[0]->destroyed);
}

} // namespace
} // namespace halyard
