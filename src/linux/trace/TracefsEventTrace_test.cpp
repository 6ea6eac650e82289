// Needs tracefs and the right to write there, and is skipped elsewhere.
#include "linux/trace/TracefsEventTrace.h"

#include <csignal>
#include <dlfcn.h>
#include <elf.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <fstream>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
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

int enabledProbes(const std::string& trace) {
    const std::string probes = fmt::format("{0}/instances/{1}/events/{1}/mark", kTracefs, trace);
    int enabled = 0;
    for (int i = 0; i < 3; ++i) {
        enabled += std::ifstream(fmt::format("{}{}/enable", probes, i)).get() == '1' ? 1 : 0;
    }
    return enabled;
}

std::string libraryBytes() {
    std::ifstream file(HALYARD_LIBRARY, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

// A library whose function begins with the instruction that probes are made of,
// which no kernel takes.
std::string unprobeableBytes() {
    std::string bytes = libraryBytes();
    bytes.at(functionOffset(HALYARD_LIBRARY, "evmark_trace").value()) = '\xCC';
    return bytes;
}

// Maps a file as code, as a process has its libraries.
class MappedCode {
public:
    explicit MappedCode(const fs::path& path) {
        const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
        at_ = ::mmap(nullptr, kSize, PROT_READ | PROT_EXEC, MAP_PRIVATE, file, 0);
        ::close(file);
    }
    ~MappedCode() { ::munmap(at_, kSize); }
    MappedCode(const MappedCode&) = delete;
    MappedCode& operator=(const MappedCode&) = delete;

private:
    static constexpr std::size_t kSize = 1024 * 1024; // all of it
    void* at_;
};

// Another process, with what this one has mapped by then.
class Child {
public:
    Child() : pid_(::fork()) {
        if (pid_ == 0) {
            for (;;) {
                ::pause();
            }
        }
    }
    ~Child() {
        ::kill(pid_, SIGKILL);
        ::waitpid(pid_, nullptr, 0);
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;

    ::pid_t pid() const { return pid_; }

private:
    const ::pid_t pid_;
};

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

TEST_F(TracefsEventTraceTest, ALibraryThatCannotBeProbedIsLeftOutAndTheOthersAreTraced) {
    const halyard::testing::TempTree tree;
    const fs::path bad = tree.write("libhalyard.so.bad", unprobeableBytes());
    const MappedCode mapped(bad);
    TracefsEventTrace facility({});
    const auto traced = start(facility);
    mark_(kFirst, 7, 0, 0, 0);
    traced->end();
    EXPECT_THAT(traced->points, ElementsAre(Field(&trace_point::arg1, 7)));
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre(AllOf(HasSubstr("a client's library is not traced: "),
                                  HasSubstr(bad.string()))));
    traced->session.reset();
    EXPECT_THAT(ourTraces(), IsEmpty());
}

TEST_F(TracefsEventTraceTest, LibrariesFoundAfterTheStartAreTracedButForThoseThatCannotBe) {
    const halyard::testing::TempTree tree;
    const fs::path good = tree.write("libhalyard.so.good", libraryBytes());
    std::atomic<::pid_t> client{0};
    TracefsEventTrace facility({kTracefs, [&] { return std::vector<std::int32_t>{client}; }});
    const auto traced = start(facility);
    const MappedCode bad(tree.write("libhalyard.so.bad", unprobeableBytes()));
    void* const library = ::dlopen(good.c_str(), RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(library, nullptr) << ::dlerror();
    const auto mark = reinterpret_cast<Mark>(::dlsym(library, "evmark_trace"));
    const Child child;
    client = child.pid();
    while (enabledProbes(ourTraces().at(0)) < 2) { // ctest's limit ends a wait in vain
        std::this_thread::yield();
    }
    mark(kFirst, 9, 0, 0, 0); // whichever comes first
    traced->end();
    EXPECT_THAT(traced->points, ElementsAre(Field(&trace_point::arg1, 9)));
    EXPECT_THAT(platform_.log.texts(LogLevel::Error),
                ElementsAre(HasSubstr("libhalyard.so.bad: ")));
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
    ASSERT_TRUE(writeTracefs(fs::path(kTracefs) / "uprobe_events",
                             fmt::format("p:{}/mark0 {}:0x{:x}\n", name, HALYARD_LIBRARY,
                                         libraries[0].offset),
                             true)
                    .ok());
    ASSERT_EQ(::mkdir(instance.c_str(), 0700), 0);
    ASSERT_TRUE(writeTracefs(instance / "events" / name / "mark0/enable", "1").ok());

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
    EXPECT_EQ(fs::canonical(found[0].name), fs::canonical(HALYARD_LIBRARY));
    EXPECT_TRUE(fs::equivalent(found[0].file->path(), HALYARD_LIBRARY));
    std::ifstream file(found[0].name, std::ios::binary);
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

TEST(MarkLibrariesTest, FurtherPathsOfOneProcessAreNotLookedAt) {
    ASSERT_NE(markFunction(), nullptr) << ::dlerror();
    const halyard::testing::TempTree tree;
    std::vector<std::unique_ptr<MappedCode>> copies;
    for (std::size_t i = 0; i < MarkLibraries::kMostLibraries * 2; ++i) {
        const auto copy = tree.write(fmt::format("libhalyard.so.{}", i), libraryBytes());
        copies.push_back(std::make_unique<MappedCode>(copy));
        copies.push_back(std::make_unique<MappedCode>(copy));
    }
    const Child hostile;
    copies.clear();
    MarkLibraries libraries;
    EXPECT_THAT(libraries.newLibrariesOf({hostile.pid()}), SizeIs(MarkLibraries::kMostOfProcess));
    EXPECT_THAT(libraries.newLibrariesOf({hostile.pid(), ::getpid()}), SizeIs(1));
}

TEST(MarkLibrariesTest, WhatIsMoreThanAllTogetherMayHaveIsLeftOutAndToldOnce) {
    const halyard::testing::TestPlatform platform;
    const halyard::testing::TempTree tree;
    MarkLibraries libraries;
    std::size_t probed = 0;
    std::vector<std::string> leftOut;
    for (std::size_t i = 0; i < MarkLibraries::kMostLibraries + 2; ++i) {
        const fs::path path = tree.write(fmt::format("libhalyard.so.{}", i), libraryBytes());
        const MappedCode copy(path);
        const auto found = libraries.newLibrariesOf({::getpid()});
        probed += found.size();
        if (found.empty()) {
            leftOut.push_back(path);
        }
        EXPECT_THAT(libraries.newLibrariesOf({}), IsEmpty()); // Forgets the process.
    }
    EXPECT_EQ(probed, 32U);
    ASSERT_GE(leftOut.size(), 2U);
    EXPECT_THAT(platform.log.texts(),
                ElementsAre("a client's library is not traced: " + leftOut[0] +
                            ": 32 others are; no line tells of further ones"));
}

TEST(MarkLibrariesTest, AProcessThatHasGoneIsForgotten) {
    ASSERT_NE(markFunction(), nullptr) << ::dlerror();
    const halyard::testing::TempTree tree;
    MarkLibraries libraries;
    EXPECT_THAT(libraries.newLibrariesOf({::getpid()}), SizeIs(1));
    const MappedCode copy(tree.write("libhalyard.so.1", libraryBytes()));
    EXPECT_THAT(libraries.newLibrariesOf({::getpid()}), IsEmpty()); // was looked at
    EXPECT_THAT(libraries.newLibrariesOf({}), IsEmpty());
    EXPECT_THAT(libraries.newLibrariesOf({::getpid()}), SizeIs(1)); // is another by that number
}

TEST(MarkLibrariesTest, ALibraryIsHeldWhateverBecomesOfItsName) {
    const halyard::testing::TempTree tree;
    const fs::path path = tree.write("libhalyard.so.1", libraryBytes());
    const MappedCode copy(path);
    const auto found = MarkLibraries().newLibrariesOf({::getpid()});
    ASSERT_FALSE(found.empty());
    const auto file = found.back().file;
    fs::remove(path);
    tree.write("libhalyard.so.1", "another file");
    EXPECT_EQ(functionOffset(file->path(), "evmark_trace"),
              functionOffset(HALYARD_LIBRARY, "evmark_trace"));
}

TEST(MarkLibrariesTest, OnlyRegularFilesAreRead) {
    const halyard::testing::TempTree tree;
    const fs::path pipe = tree / "pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    const int writer = ::open(pipe.c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
    EXPECT_EQ(functionOffset(pipe, "evmark_trace"), std::nullopt);
    ::close(writer);
    EXPECT_EQ(functionOffset("/dev/null", "evmark_trace"), std::nullopt);
}

// Tables of absurd lengths and places, whatever the rest says.
TEST(MarkLibrariesTest, ALibraryWithAbsurdTablesIsHarmless) {
    const halyard::testing::TempTree tree;
    const auto offsetWith = [&](auto change) {
        std::string bytes = libraryBytes();
        Elf64_Ehdr header;
        std::memcpy(&header, bytes.data(), sizeof header);
        change(header);
        std::memcpy(bytes.data(), &header, sizeof header);
        return functionOffset(tree.write("absurd", bytes), "evmark_trace");
    };
    EXPECT_NE(offsetWith([](Elf64_Ehdr&) {}), std::nullopt);
    EXPECT_EQ(offsetWith([](Elf64_Ehdr& header) { header.e_shnum = 65535; }), std::nullopt);
    EXPECT_EQ(offsetWith([](Elf64_Ehdr& header) { header.e_phnum = 65535; }), std::nullopt);
    EXPECT_EQ(offsetWith([](Elf64_Ehdr& header) { header.e_shoff = UINT64_MAX; }), std::nullopt);
    EXPECT_EQ(offsetWith([](Elf64_Ehdr& header) { header.e_phoff = UINT64_MAX; }), std::nullopt);
    EXPECT_EQ(offsetWith([](Elf64_Ehdr& header) { header.e_ident[EI_CLASS] = ELFCLASS32; }),
              std::nullopt);
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
