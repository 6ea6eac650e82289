#include "linux/trace/TraceCmdRecorder.h"

#include <csignal>
#include <fstream>
#include <future>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

struct Delegate final : platform::PerformanceTraceDelegate {
    void performanceTraceDidStart(const MaybeError& error) override { started.set_value(error); }
    void performanceTraceDidStop(const MaybeError& error) override { stopError = error; }
    void performanceTraceDidComplete(std::string_view url, std::string_view /*token*/,
                                     const MaybeError& error) override {
        traceURL = url;
        completed.set_value(error);
    }

    std::promise<MaybeError> started;
    std::promise<MaybeError> completed;
    MaybeError stopError;
    std::string traceURL; // at rest once it has completed
};

// Recorders are scripts: real children, killed for real. $7 is the file.
class TraceCmdRecorderTest : public ::testing::Test {
protected:
    std::shared_ptr<platform::PerformanceTraceSession> start(const std::string& script) {
        const fs::path program = tree_.write("recorder", "#!/bin/sh\n" + script);
        ::chmod(program.c_str(), 0700);
        return startProgram(program.string());
    }
    std::shared_ptr<platform::PerformanceTraceSession> startProgram(const std::string& program) {
        TraceCmdRecorder recorder(
            {tree_ / "traces", program, std::chrono::milliseconds(200), tree_ / "tracefs"});
        auto session =
            recorder.initWithConfig(platform::PerformanceTraceConfig::configWithTemplate(1));
        session->setDelegate(delegate_);
        session->startPerformanceTrace();
        return session;
    }
    // The number that the script wrote there, once it has.
    ::pid_t pidIn(std::string_view name) const {
        for (::pid_t pid = 0;;) {
            std::ifstream file(tree_ / name);
            if (file >> pid && file.get() == '\n') {
                return pid;
            }
            std::this_thread::yield();
        }
    }
    // Reaped or a zombie of somebody else's; ctest's limit ends a wait in vain.
    static void waitUntilGone(::pid_t pid) {
        for (;;) {
            std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
            std::string text;
            std::getline(stat, text);
            const std::size_t name = text.rfind(')');
            if (name == std::string::npos || text.substr(name, 3) == ") Z") {
                return;
            }
            std::this_thread::yield();
        }
    }
    MaybeError started() { return delegate_->started.get_future().get(); }
    MaybeError completed() { return delegate_->completed.get_future().get(); }

    halyard::testing::TempTree tree_;
    std::shared_ptr<Delegate> delegate_ = std::make_shared<Delegate>();
};

constexpr const char* kObedient = "trap 'echo done > $6; exit 0' INT\n"
                                  "echo $$ > ${0%/*}/pid\nwhile :; do sleep 0.01; done\n";

TEST_F(TraceCmdRecorderTest, AMissingProgramFailsStartAndCompletion) {
    const auto session = startProgram((tree_ / "none").string());
    EXPECT_EQ(started()->code, ENOENT);
    EXPECT_EQ(completed()->code, ENOENT);
}

TEST_F(TraceCmdRecorderTest, AStoppedRecorderLeavesItsFile) {
    const auto session = start(kObedient);
    EXPECT_EQ(started(), std::nullopt);
    const ::pid_t pid = pidIn("pid");
    session->stopPerformanceTrace();
    EXPECT_EQ(completed(), std::nullopt);
    EXPECT_EQ(delegate_->stopError, std::nullopt);
    EXPECT_TRUE(fs::exists(delegate_->traceURL));
    waitUntilGone(pid);
}

TEST_F(TraceCmdRecorderTest, ARecorderThatDoesNotFinishIsKilledWithItsChildren) {
    const auto session = start("trap '' INT\nsleep 1000 &\necho $! > ${0%/*}/child\n"
                               "echo $$ > ${0%/*}/pid\nwhile :; do sleep 0.01; done\n");
    const ::pid_t pid = pidIn("pid");
    const ::pid_t child = pidIn("child");
    session->stopPerformanceTrace();
    EXPECT_EQ(completed()->code, ETIMEDOUT);
    waitUntilGone(pid);
    waitUntilGone(child);
}

TEST_F(TraceCmdRecorderTest, ARecorderThatEndsByItselfCompletesWithAnError) {
    const auto session = start("exit 3\n");
    EXPECT_EQ(started(), std::nullopt);
    EXPECT_NE(completed(), std::nullopt);
}

TEST_F(TraceCmdRecorderTest, AnAbandonedRecorderIsNoOrphan) {
    auto session = start(kObedient);
    const ::pid_t pid = pidIn("pid");
    session.reset();
    waitUntilGone(pid);
}

TEST_F(TraceCmdRecorderTest, OnlyTheNewestTracesAreKept) {
    for (int i = 0; i < 12; ++i) {
        tree_.write("traces/old" + std::to_string(i) + ".dat", "");
    }
    const auto session = start(kObedient);
    pidIn("pid");
    session->stopPerformanceTrace();
    EXPECT_EQ(completed(), std::nullopt);
    EXPECT_EQ(std::distance(fs::directory_iterator(tree_ / "traces"), {}),
              static_cast<std::ptrdiff_t>(TraceCmdRecorder::kKept));
}

} // namespace
} // namespace halyard::linux_
