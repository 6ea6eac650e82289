#include "ProcessReader.h"

#include <atomic>
#include <csignal>
#include <cstdlib>
#include <functional>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include "ProcessTesting.h"

namespace halyard::pipewire {
namespace {

class ProcessReaderTest : public ::testing::Test {
protected:
    ProcessReaderTest() { processes_.process(kProgram); }

    void thread(pid_t id, const char* name, std::uint64_t slices, bool realTime = false) {
        processes_.thread(
            kProgram, {.id = id, .name = name, .realTime = realTime, .cpu = id, .slices = slices});
    }
    // The thread whose processor time is read, which is its ID here; -1 when none is.
    static std::int64_t found(ProcessReader& reader) { return reader.sample(1).cpu.value_or(-1); }

    FakeProcesses processes_;
};

TEST_F(ProcessReaderTest, TheOnlyThreadThatIsNamedForItIsKnownAtOnce) {
    thread(1, "main", 100);
    thread(2, "data-loop.0", 7);
    ProcessReader reader(kProgram, processes_.places());
    EXPECT_FALSE(reader.threadKnown());
    reader.beginSearch();
    EXPECT_TRUE(reader.threadKnown());
    EXPECT_EQ(found(reader), 2);
    EXPECT_EQ(reader.thread(), "2");
}

TEST_F(ProcessReaderTest, OfTwoNamedThreadsTheOneThatWakesWithTheCyclesIsTaken) {
    thread(2, "data-loop.0", 7);
    thread(3, "data-loop.1", 7);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    EXPECT_FALSE(reader.threadKnown());
    thread(2, "data-loop.0", 8);
    thread(3, "data-loop.1", 26);
    EXPECT_TRUE(reader.findThread(20));
    EXPECT_EQ(found(reader), 3);
}

TEST_F(ProcessReaderTest, AnUnnamedThreadOfARealTimeClassComesBeforeOrdinaryOnes) {
    thread(2, "worker", 0);
    thread(3, "sound", 0, true);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    thread(2, "worker", 20);
    thread(3, "sound", 31, true);
    EXPECT_TRUE(reader.findThread(20));
    EXPECT_EQ(found(reader), 3);
}

TEST_F(ProcessReaderTest, TheOnlyThreadOfARealTimeClassIsTakenUntilAnotherIsFound) {
    thread(2, "data-loop.0", 0);
    thread(3, "data-loop.1", 0);
    thread(4, "sound", 0, true);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    EXPECT_FALSE(reader.threadKnown());
    EXPECT_EQ(found(reader), 4);
    thread(3, "data-loop.1", 20);
    EXPECT_TRUE(reader.findThread(20));
    EXPECT_EQ(found(reader), 3);
}

TEST_F(ProcessReaderTest, AnOrdinaryThreadThatDoesNotWakeWithTheCyclesIsNotTaken) {
    thread(2, "worker", 0);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    thread(2, "worker", 31); // at more than 1.5 times their rate
    EXPECT_FALSE(reader.findThread(20));
    thread(2, "worker", 30);
    EXPECT_TRUE(reader.findThread(20));
}

TEST_F(ProcessReaderTest, AnOrdinaryThreadOfSeveralStreamsMayWakeForEachOfThem) {
    thread(2, "worker", 0);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    thread(2, "worker", 50);
    EXPECT_FALSE(reader.findThread(20));
    EXPECT_TRUE(reader.findThread(20, 2));
}

TEST_F(ProcessReaderTest, AThreadThatCameAfterTheFirstLookIsNotTaken) {
    ProcessReader reader(kProgram, processes_.places());
    thread(1, "main", 0);
    reader.beginSearch();
    thread(2, "data-loop.0", 500);
    EXPECT_FALSE(reader.findThread(20));
}

TEST_F(ProcessReaderTest, SamplesSayWhatTheFilesSay) {
    const FakeThread data{.id = 2,
                          .name = "data-loop.0",
                          .state = 'R',
                          .cpu = 5000,
                          .delay = 600,
                          .slices = 1,
                          .majorFaults = 12};
    processes_.thread(kProgram, data);
    ProcessReader reader(kProgram, processes_.places());
    reader.beginSearch();
    const ThreadSample sample = reader.sample(77);
    EXPECT_EQ(sample.at, 77);
    EXPECT_EQ(sample.state, 'R');
    EXPECT_EQ(sample.cpu, 5000);
    EXPECT_EQ(sample.delay, 600);
    EXPECT_EQ(sample.majorFaults, 12U);
    EXPECT_FALSE(sample.frozen);
}

TEST_F(ProcessReaderTest, BeforeTheThreadIsKnownOnlyTheProcesssStateIs) {
    processes_.process(kProgram, 'T');
    ProcessReader reader(kProgram, processes_.places());
    const ThreadSample sample = reader.sample(1);
    EXPECT_EQ(sample.state, 'T');
    EXPECT_FALSE(sample.cpu);
    EXPECT_FALSE(sample.delay);
    EXPECT_FALSE(sample.majorFaults);
}

TEST_F(ProcessReaderTest, OfAProcessThatIsNotThereNothingIsKnown) {
    ProcessReader reader(kProgram + 1, processes_.places());
    reader.beginSearch();
    EXPECT_FALSE(reader.findThread(1));
    EXPECT_EQ(reader.sample(1).state, 0);
    EXPECT_FALSE(reader.ending().gone);
    EXPECT_FALSE(reader.ending().died());
}

TEST_F(ProcessReaderTest, AFrozenGroupOfEitherKindIsSeen) {
    processes_.frozen(false);
    processes_.frozenInFirstHierarchy(false);
    ProcessReader reader(kProgram, processes_.places());
    EXPECT_FALSE(reader.sample(1).frozen);
    processes_.frozen(true);
    EXPECT_TRUE(reader.sample(1).frozen);
    processes_.frozen(false);
    EXPECT_FALSE(reader.sample(1).frozen);
    processes_.frozenInFirstHierarchy(true);
    EXPECT_TRUE(reader.sample(1).frozen);
}

TEST_F(ProcessReaderTest, AProcessThatMovesToAnotherGroupIsFollowed) {
    processes_.frozen(true);
    processes_.tree().write("groups/free/cgroup.events", "populated 1\nfrozen 0\n");
    ProcessReader reader(kProgram, processes_.places());
    EXPECT_TRUE(reader.sample(1).frozen);
    processes_.tree().write("proc/" + std::to_string(kProgram) + "/cgroup", "0::/free\n");
    EXPECT_FALSE(reader.sample(1).frozen);
}

TEST_F(ProcessReaderTest, OnlySignalsThatNobodySendsForAnEndAreADeath) {
    const auto died = [this](int status) {
        processes_.process(kProgram, 'Z', status);
        return ProcessReader(kProgram, processes_.places()).ending().died();
    };
    EXPECT_TRUE(died(SIGSEGV));
    EXPECT_TRUE(died(SIGKILL));
    EXPECT_TRUE(died(SIGABRT | 0x80)); // with a core file
    EXPECT_FALSE(died(SIGTERM));
    EXPECT_FALSE(died(SIGINT));
    EXPECT_FALSE(died(SIGHUP));
    EXPECT_FALSE(died(0));
    EXPECT_FALSE(died(3 << 8));
}

// ---- Real processes

ProcessReader::Places realPlaces() {
    return {};
}

TEST(RealProcessTest, TimesOfAThreadOfOursGrow) {
    std::atomic<bool> named = false;
    std::atomic<bool> done = false;
    std::thread worker([&] {
        pthread_setname_np(pthread_self(), "data-loop.0");
        named = true;
        while (!done) {
        }
    });
    while (!named) {
    }
    ProcessReader reader(getpid(), realPlaces());
    reader.beginSearch();
    ASSERT_TRUE(reader.threadKnown());
    const ThreadSample first = reader.sample(1);
    ThreadSample second = first;
    while (second.cpu == first.cpu) { // it runs, so this ends
        second = reader.sample(2);
    }
    done = true;
    worker.join();
    EXPECT_GT(*second.cpu, *first.cpu);
    EXPECT_FALSE(second.frozen);
    EXPECT_FALSE(reader.ending().gone);
}

class ChildTest : public ::testing::Test {
protected:
    void start(const std::function<void()>& work) {
        child_ = fork();
        if (child_ == 0) {
            work();
            _exit(0);
        }
        reader_ = std::make_unique<ProcessReader>(child_, realPlaces());
    }
    void reap() {
        waitpid(child_, nullptr, 0);
        child_ = 0;
    }
    void waitForEnd() const { // leaves it a zombie
        siginfo_t ignored{};
        waitid(P_PID, static_cast<id_t>(child_), &ignored, WEXITED | WNOWAIT);
    }
    ~ChildTest() override {
        if (child_ > 0) {
            kill(child_, SIGKILL);
            reap();
        }
    }

    pid_t child_ = 0;
    std::unique_ptr<ProcessReader> reader_;
};

TEST_F(ChildTest, AStoppedProcessIsSeenToBe) {
    start([] { pause(); });
    kill(child_, SIGSTOP);
    siginfo_t ignored{};
    waitid(P_PID, static_cast<id_t>(child_), &ignored, WSTOPPED | WNOWAIT);
    EXPECT_TRUE(isStopped(reader_->sample(1)));
    EXPECT_FALSE(reader_->ending().gone);
}

TEST_F(ChildTest, AKilledProcessDied) {
    start([] { pause(); });
    kill(child_, SIGKILL);
    waitForEnd();
    EXPECT_TRUE(reader_->ending().gone);
    EXPECT_TRUE(reader_->ending().died());
}

TEST_F(ChildTest, AnEndThatWasAskedForIsNoDeath) {
    start([] { pause(); });
    kill(child_, SIGTERM);
    waitForEnd();
    EXPECT_TRUE(reader_->ending().gone);
    EXPECT_FALSE(reader_->ending().died());
}

TEST_F(ChildTest, AnExitIsNoDeath) {
    start([] { _exit(3); });
    waitForEnd();
    EXPECT_TRUE(reader_->ending().gone);
    EXPECT_FALSE(reader_->ending().died());
}

// Where the kernel keeps it (since 6.15), how it ended is known after it was reaped.
TEST_F(ChildTest, AReapedProcessIsGoneAndNeverTakenForAnother) {
    start([] { pause(); });
    kill(child_, SIGKILL);
    reap();
    const ProcessReader::Ending ending = reader_->ending();
    EXPECT_TRUE(ending.gone);
    EXPECT_EQ(ending.died(), ending.status.has_value());
    EXPECT_EQ(reader_->sample(1).state, 0);
}

} // namespace
} // namespace halyard::pipewire
