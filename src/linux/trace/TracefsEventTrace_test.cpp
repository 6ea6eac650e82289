// Needs tracefs and the right to write there, and is skipped elsewhere.
#include "linux/trace/TracefsEventTrace.h"

#include <dlfcn.h>
#include <fmt/format.h>
#include <fstream>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

#include "linux/queues/Queues.h"
#include "linux/trace/MarkLibraries.h"
#include "testing/TempTree.h"
#include "testing/TestPlatform.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

using ::testing::AllOf;
using ::testing::ElementsAre;
using ::testing::Field;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr std::uint32_t kFirst = 0x21040000;
constexpr std::uint32_t kLast = 0x2104408A;

using Mark = void (*)(std::uint32_t, std::uint64_t, std::uint64_t, std::uint64_t, std::uint64_t);

// The library as a client has it: loaded, once and for good.
Mark markFunction() {
    static void* const library = ::dlopen(HALYARD_LIBRARY, RTLD_NOW);
    return library != nullptr ? reinterpret_cast<Mark>(::dlsym(library, "evmark_trace")) : nullptr;
}

// A session with what it delivered.
struct Traced {
    std::unique_ptr<platform::EventTraceSession> session;
    std::vector<trace_point> points; // ours; at rest once `completed` is ready
    std::size_t pointsOfAll = 0;
    std::promise<void> completed;

    void end() {
        session->end();
        completed.get_future().wait();
    }
};

std::vector<std::string> ourTraces() {
    std::vector<std::string> names;
    const std::string prefix = fmt::format("halyard_{}_", ::getpid());
    for (const auto& entry : fs::directory_iterator(std::string(kTracefs) + "/instances")) {
        if (entry.path().filename().string().starts_with(prefix)) {
            names.push_back(entry.path().filename().string());
        }
    }
    std::ifstream probes(std::string(kTracefs) + "/uprobe_events");
    for (std::string line; std::getline(probes, line);) {
        if (line.find(prefix) != std::string::npos) {
            names.push_back(line);
        }
    }
    return names;
}

class TracefsEventTraceTest : public ::testing::Test {
protected:
    void SetUp() override {
        if (::access((std::string(kTracefs) + "/uprobe_events").c_str(), W_OK) != 0) {
            GTEST_SKIP() << "no tracefs that we may write to at " << kTracefs;
        }
        mark_ = markFunction();
        ASSERT_NE(mark_, nullptr) << ::dlerror();
    }

    std::unique_ptr<Traced> start(TracefsEventTrace& facility, int expected = 0) {
        auto traced = std::make_unique<Traced>();
        traced->session = facility.createSession();
        traced->session->setWallTimesEnabled(true);
        traced->session->setCompletionHandler(
            [traced = traced.get()] { traced->completed.set_value(); });
        EXPECT_EQ(
            traced->session->addEventsRange(kFirst, kLast,
                                            [traced = traced.get()](const trace_point& point) {
                                                ++traced->pointsOfAll;
                                                // Tests beside this one may mark, too.
                                                if (point.pid == ::getpid()) {
                                                    traced->points.push_back(point);
                                                }
                                            }),
            0);
        EXPECT_EQ(traced->session->start(
                      queues_.makeSerialQueue("Tracing Queue", platform::QueuePriority::Utility)),
                  expected);
        return traced;
    }

    halyard::testing::TestPlatform platform_;
    asio::io_context context_;
    Pressure pressure_;
    Queues queues_{context_, pressure_};
    Mark mark_ = nullptr;
};

TEST_F(TracefsEventTraceTest, RecordsEachMarkOfTheRangeWithAllItCarries) {
    TracefsEventTrace facility({});
    const auto before = std::chrono::system_clock::now().time_since_epoch();
    const auto traced = start(facility);
    mark_(kFirst - 1, 0, 0, 0, 0);
    mark_(kFirst, 11, 12, 13, 0xFFFFFFFFFFFFFFFF);
    mark_(kLast, 0, 0, 0, 0);
    mark_(kLast + 1, 0, 0, 0, 0);
    traced->end();
    ASSERT_THAT(traced->points, SizeIs(2));
    const trace_point& point = traced->points[0];
    EXPECT_EQ(point.code, kFirst);
    EXPECT_THAT((std::array{point.arg1, point.arg2, point.arg3, point.arg4}),
                ElementsAre(11, 12, 13, 0xFFFFFFFFFFFFFFFF));
    EXPECT_EQ(point.threadID, static_cast<std::uint64_t>(::gettid()));
    EXPECT_EQ(point.pid, ::getpid());
    EXPECT_GE(std::chrono::seconds(point.wallTime.seconds + 1), before);
    EXPECT_LE(std::chrono::seconds(point.wallTime.seconds - 1), before + std::chrono::hours(1));
    EXPECT_LE(traced->session->nanoseconds(point.timestamp),
              traced->session->nanoseconds(traced->points[1].timestamp));
    EXPECT_EQ(traced->session->eventsLost(), 0U);
    EXPECT_EQ(traced->points[1].code, kLast);
}

TEST_F(TracefsEventTraceTest, EventsOfManyThreadsComeInTheOrderOfTime) {
    constexpr int kThreads = 4;
    constexpr std::uint64_t kMarks = 5000;
    TracefsEventTrace facility({});
    const auto traced = start(facility);
    std::vector<std::thread> threads;
    for (int i = 0; i < kThreads; ++i) {
        threads.emplace_back([this] {
            for (std::uint64_t n = 0; n < kMarks; ++n) {
                mark_(kFirst, n, 0, 0, 0);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    traced->end();
    ASSERT_THAT(traced->points, SizeIs(kThreads * kMarks));
    EXPECT_TRUE(std::is_sorted(traced->points.begin(), traced->points.end(),
                               [](const trace_point& left, const trace_point& right) {
                                   return left.timestamp < right.timestamp;
                               }));
    std::map<std::uint64_t, std::uint64_t> next; // by thread
    for (const trace_point& point : traced->points) {
        EXPECT_EQ(point.arg1, next[point.threadID]++);
    }
    EXPECT_THAT(next, SizeIs(kThreads));
}

TEST_F(TracefsEventTraceTest, SessionsAtOnceEachRecordTheirOwnTime) {
    TracefsEventTrace facility({});
    const auto first = start(facility);
    mark_(kFirst, 1, 0, 0, 0);
    const auto second = start(facility);
    mark_(kFirst, 2, 0, 0, 0);
    first->end();
    mark_(kFirst, 3, 0, 0, 0);
    second->end();
    const auto argument = [](std::uint64_t value) { return Field(&trace_point::arg1, value); };
    EXPECT_THAT(first->points, ElementsAre(argument(1), argument(2)));
    EXPECT_THAT(second->points, ElementsAre(argument(2), argument(3)));
}

TEST_F(TracefsEventTraceTest, EventsBeyondTheBoundAreCountedAsLost) {
    TracefsEventTrace facility({kTracefs, {}, 10});
    const auto traced = start(facility);
    for (int i = 0; i < 25; ++i) {
        mark_(kFirst, 0, 0, 0, 0);
    }
    traced->end();
    EXPECT_EQ(traced->pointsOfAll, 10U);
    const std::uint64_t lost = traced->session->eventsLost();
    EXPECT_GE(lost, 15U);
    EXPECT_TRUE(platform_.log.has(
        LogLevel::Error, HYReportingTraceCategory,
        fmt::format("{0} trace events lost: 0 by the kernel, {0} beyond the 10 that are kept",
                    lost)));
}

TEST_F(TracefsEventTraceTest, NothingStaysInTheKernel) {
    TracefsEventTrace facility({});
    const auto ended = start(facility);
    ended->end();
    ended->session.reset();
    const auto running = start(facility);
    EXPECT_THAT(ourTraces(), SizeIs(2));
    mark_(kFirst, 0, 0, 0, 0);
    running->session.reset();
    EXPECT_THAT(ourTraces(), IsEmpty());
}

TEST_F(TracefsEventTraceTest, WhatAKilledDaemonLeftIsRemoved) {
    const ::pid_t child = ::fork();
    if (child == 0) {
        ::_exit(0);
    }
    ::waitpid(child, nullptr, 0); // Its number belongs to nobody now.
    const std::string name = fmt::format("halyard_{}_1_0", child);
    const fs::path instance = fs::path(kTracefs) / "instances" / name;
    const auto libraries = MarkLibraries().newLibrariesOf({::getpid()});
    ASSERT_THAT(libraries, SizeIs(1));
    ASSERT_EQ(writeTracefs(fs::path(kTracefs) / "uprobe_events",
                           fmt::format("p:{}/mark0 {}:0x{:x}\n", name, libraries[0].path,
                                       libraries[0].offset),
                           true),
              std::errc{});
    ASSERT_EQ(::mkdir(instance.c_str(), 0700), 0);
    ASSERT_EQ(writeTracefs(instance / "events" / name / "mark0/enable", "1"), std::errc{});

    TracefsEventTrace facility({});
    EXPECT_FALSE(fs::exists(instance));
    EXPECT_FALSE(fs::exists(fs::path(kTracefs) / "events" / name));
    EXPECT_TRUE(platform_.log.has(LogLevel::Default, HYReportingTraceCategory,
                                  "removed 2 trace instances and probes of daemons that are gone"));
}

TEST_F(TracefsEventTraceTest, ARunningDaemonsTracesAreLeftAlone) {
    TracefsEventTrace facility({});
    const auto running = start(facility);
    TracefsEventTrace another({});
    mark_(kFirst, 0, 0, 0, 0);
    running->end();
    EXPECT_THAT(running->points, SizeIs(1));
}

TEST_F(TracefsEventTraceTest, WithoutTracefsNothingStartsButTheEndCompletes) {
    const halyard::testing::TempTree tree;
    TracefsEventTrace facility({tree / "none", {}, 10});
    const auto traced = start(facility, ENOENT);
    traced->end();
    EXPECT_THAT(traced->points, IsEmpty());
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre(AllOf(HasSubstr("no kernel event trace"), HasSubstr("No such file"),
                                  HasSubstr("it needs tracefs at"))));
}

TEST_F(TracefsEventTraceTest, ARangeThatIsNoneIsRefused) {
    TracefsEventTrace facility({});
    EXPECT_EQ(facility.createSession()->addEventsRange(2, 1, [](const trace_point&) {}), EINVAL);
}

TEST(MarkLibrariesTest, FindsTheFunctionInTheLibraryAndOnlyOnce) {
    ASSERT_NE(markFunction(), nullptr) << ::dlerror();
    MarkLibraries libraries;
    const auto found = libraries.newLibrariesOf({::getpid()});
    ASSERT_THAT(found, SizeIs(1));
    EXPECT_EQ(fs::canonical(found[0].path), fs::canonical(HALYARD_LIBRARY));
    std::ifstream file(found[0].path, std::ios::binary);
    file.seekg(static_cast<std::streamoff>(found[0].offset));
    char begin[4];
    file.read(begin, sizeof begin);
    EXPECT_EQ(std::memcmp(begin, reinterpret_cast<const void*>(markFunction()), sizeof begin), 0);
    EXPECT_THAT(libraries.newLibrariesOf({::getpid(), ::getppid(), -1}), IsEmpty());
}

TEST(MarkLibrariesTest, FilesThatAreNoSuchLibraryHaveNoOffset) {
    const halyard::testing::TempTree tree;
    EXPECT_EQ(functionOffset(tree / "none", "evmark_trace"), std::nullopt);
    EXPECT_EQ(functionOffset(tree.path(), "evmark_trace"), std::nullopt);
    EXPECT_EQ(functionOffset(tree.write("text", "no library"), "evmark_trace"), std::nullopt);
    EXPECT_EQ(functionOffset(HALYARD_LIBRARY, "evmark_trac"), std::nullopt);
    EXPECT_EQ(functionOffset(HALYARD_LIBRARY, std::string(100, 'e')), std::nullopt);
}

// Whatever a client maps under our name may be damaged.
TEST(MarkLibrariesTest, ACutLibraryIsHarmless) {
    const halyard::testing::TempTree tree;
    std::ifstream file(HALYARD_LIBRARY, std::ios::binary);
    const std::string whole(std::istreambuf_iterator<char>(file), {});
    for (const std::size_t size : {std::size_t{16}, std::size_t{100}, whole.size() / 2}) {
        (void)functionOffset(tree.write("cut", whole.substr(0, size)), "evmark_trace");
    }
    EXPECT_NE(functionOffset(tree.write("cut", whole), "evmark_trace"), std::nullopt);
}

} // namespace
} // namespace halyard::linux_
