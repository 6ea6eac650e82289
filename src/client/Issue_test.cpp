// Issues that a program reports of itself, as the daemon gets them.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdlib>
#include <limits>
#include <new>
#include <string>

#include "halyard/halyard.hpp"
#include "testing/FakeDaemon.h"
#include "testing/TempTree.h"

namespace {

thread_local int allocations = 0;

} // namespace

// Counted for this thread, so that a test can see that there were none. Not inlined, because gcc
// would take the halves of one pair for those of two.
[[gnu::noinline]] void* operator new(std::size_t size) {
    ++allocations;
    void* const memory = std::malloc(size);
    return memory != nullptr ? memory : throw std::bad_alloc();
}
[[gnu::noinline]] void operator delete(void* memory) noexcept {
    std::free(memory);
}
[[gnu::noinline]] void operator delete(void* memory, std::size_t) noexcept {
    std::free(memory);
}

namespace halyard::client {
namespace {

using halyard::testing::FakeDaemon;
using halyard::testing::TempTree;

class IssueTest : public ::testing::Test {
protected:
    IssueTest() { daemon_.start(); }

    static reporting::Issue issue() {
        return {.category = HALYARD_CATEGORY_RECORD,
                .issueType = "client_slow",
                .rtaidClient = "org.example.recorder",
                .node = "Recorder",
                .anyChannelSilenceSeconds = 0.25};
    }
    // The message that came, after the session's creation, without its time stamps.
    protocol::Arguments arrived() {
        EXPECT_TRUE(daemon_.waitForCalls(2));
        const FakeDaemon::Calls calls = daemon_.calls();
        protocol::Arguments message = calls.back().arguments;
        EXPECT_EQ(calls.back().method, protocol::Method::SendMessage);
        Dictionary rest;
        for (const auto& [key, value] : message.dictionary) {
            stamps_ += isStamp(key.text()) ? 1 : 0;
            if (!isStamp(key.text())) {
                rest.set(key, value);
            }
        }
        message.dictionary = rest;
        return message;
    }
    Dictionary arrivedDictionary() { return arrived().dictionary; }
    static bool isStamp(std::string_view key) {
        return key == "hyreporting_timestamp" || key == "systemuptime_sec" ||
               key == "processuptime_ms";
    }
    std::uint64_t refused() const {
        const halyard_statistics statistics = client_.statistics();
        return statistics.dropped_invalid + statistics.dropped_too_large;
    }

    TempTree directory_;
    std::string socket_ = directory_ / "reporting.sock";
    FakeDaemon daemon_{socket_};
    reporting::Client client_{socket_.c_str()};
    reporting::Session session_ = client_.createSession(42);
    int stamps_ = 0;
};

TEST_F(IssueTest, IsOneMessageOfItsSession) {
    ASSERT_EQ(session_.reportIssue(issue()), HALYARD_OK);
    const protocol::Arguments message = arrived();
    EXPECT_EQ(message.category, std::uint32_t{HALYARD_CATEGORY_RECORD});
    EXPECT_EQ(message.type, HALYARD_TYPE_ISSUE_DETECTOR);
    EXPECT_EQ(message.reporterIDs, protocol::ReporterIDs{42});
    EXPECT_EQ(message.dictionary, (Dictionary{{"issue_type", "client_slow"},
                                              {"rtaid_client", "org.example.recorder"},
                                              {"node", "Recorder"},
                                              {"any_channel_silence_seconds", 0.25}}));
    EXPECT_EQ(stamps_, 3);
}

TEST_F(IssueTest, TakesFurtherEntriesAlong) {
    reporting::Dictionary more;
    more.set("cycles", 12).beginDictionary("evidence").set("cpu_seconds", 0.5).end();
    ASSERT_EQ(session_.reportIssue(issue(), more), HALYARD_OK);
    const Dictionary message = arrivedDictionary();
    EXPECT_EQ(message["cycles"], Value(12));
    EXPECT_EQ(message["evidence"], Value(Dictionary{{"cpu_seconds", 0.5}}));
    EXPECT_EQ(message["node"], Value("Recorder"));
    EXPECT_EQ(message.size(), 6U);
}

TEST_F(IssueTest, ItsFieldsCountBeforeTheDictionarysEntries) {
    reporting::Dictionary more;
    more.set("issue_type", "memory").set("node", 5).set("any_channel_silence_seconds", 9.0);
    ASSERT_EQ(session_.reportIssue(issue(), more), HALYARD_OK);
    const Dictionary message = arrivedDictionary();
    EXPECT_EQ(message["issue_type"], Value("client_slow"));
    EXPECT_EQ(message["node"], Value("Recorder"));
    EXPECT_EQ(message["any_channel_silence_seconds"], Value(0.25));
    EXPECT_EQ(message.size(), 4U);
}

TEST_F(IssueTest, ATextThatIsMissingLeavesTheDictionarysEntryOrNone) {
    reporting::Issue some = issue();
    some.node = nullptr;
    some.rtaidClient = nullptr;
    ASSERT_EQ(session_.reportIssue(some, reporting::Dictionary().set("node", "Other")), HALYARD_OK);
    const Dictionary message = arrivedDictionary();
    EXPECT_EQ(message["node"], Value("Other"));
    EXPECT_FALSE(message.contains("rtaid_client"));
}

TEST_F(IssueTest, TextsGoAsTheyAre) {
    reporting::Issue odd = issue();
    odd.rtaidClient = "";
    odd.node = "caf\xE9\x01 \xFF";
    ASSERT_EQ(session_.reportIssue(odd), HALYARD_OK);
    const Dictionary message = arrivedDictionary();
    EXPECT_EQ(message["rtaid_client"], Value(""));
    EXPECT_EQ(message["node"], Value("caf\xE9\x01 \xFF"));
}

TEST_F(IssueTest, ATextMayBeThisLongAndNoLonger) {
    const std::string longest(1024, 'x');
    const std::string tooLong = longest + 'x';
    reporting::Issue named = issue();
    named.node = tooLong.c_str();
    EXPECT_EQ(session_.reportIssue(named), HALYARD_TOO_LARGE);
    EXPECT_EQ(client_.statistics().dropped_too_large, 1U);
    named.issueType = named.rtaidClient = named.node = longest.c_str();
    EXPECT_EQ(session_.reportIssue(named), HALYARD_OK);
    const Dictionary message = arrivedDictionary();
    EXPECT_EQ(message["issue_type"], Value(longest));
    EXPECT_EQ(message["rtaid_client"], Value(longest));
    EXPECT_EQ(message["node"], Value(longest));
}

// A text without an end is no further looked at.
TEST_F(IssueTest, ReadsOneByteBeyondTheLongestText) {
    const std::unique_ptr<char[]> endless(new char[1025]);
    std::fill_n(endless.get(), 1025, 'x');
    reporting::Issue named = issue();
    named.node = endless.get();
    EXPECT_EQ(session_.reportIssue(named), HALYARD_TOO_LARGE);
}

TEST_F(IssueTest, SecondsAreATimeThatTheDaemonCanCount) {
    reporting::Issue timed = issue();
    const double infinity = std::numeric_limits<double>::infinity();
    const double beyond = std::nextafter(2147483647.0, infinity);
    for (const double wrong : {std::nan(""), infinity, -infinity, beyond, -1e-300}) {
        timed.anyChannelSilenceSeconds = wrong;
        EXPECT_EQ(session_.reportIssue(timed), HALYARD_INVALID) << wrong;
    }
    EXPECT_EQ(client_.statistics().dropped_invalid, 5U);
    for (const double right : {0.0, 2147483647.0}) {
        timed.anyChannelSilenceSeconds = right;
        EXPECT_EQ(session_.reportIssue(timed), HALYARD_OK) << right;
    }
}

TEST_F(IssueTest, HasToSayWhatItIsAndOfWhat) {
    reporting::Issue wrong = issue();
    for (const std::uint32_t category : {0U, 3U, 6U, 4U | HALYARD_GROUP_HAL}) {
        wrong.category = category;
        EXPECT_EQ(session_.reportIssue(wrong), HALYARD_INVALID) << category;
    }
    wrong.category = HALYARD_CATEGORY_PLAYBACK;
    EXPECT_EQ(session_.reportIssue(wrong), HALYARD_OK);
    for (const char* type : {"", static_cast<const char*>(nullptr)}) {
        wrong.issueType = type;
        EXPECT_EQ(session_.reportIssue(wrong, reporting::Dictionary().set("issue_type", "x")),
                  HALYARD_INVALID);
    }
    EXPECT_EQ(refused(), 6U);
}

TEST_F(IssueTest, ABrokenDictionaryIsRefused) {
    reporting::Dictionary open;
    open.beginList("open");
    EXPECT_EQ(session_.reportIssue(issue(), open), HALYARD_INVALID);
    EXPECT_EQ(client_.statistics().dropped_invalid, 1U);
}

TEST_F(IssueTest, OfAProgramBuiltBeforeReadsWhatItHas) {
    halyard_issue old{};
    old.size = offsetof(halyard_issue, node);
    old.category = HALYARD_CATEGORY_PLAYBACK;
    old.issue_type = "unknown";
    old.node = reinterpret_cast<const char*>(8); // Not part of it.
    ASSERT_EQ(halyard_session_report_issue(session_.get(), &old), HALYARD_OK);
    EXPECT_EQ(arrivedDictionary(),
              (Dictionary{{"issue_type", "unknown"}, {"any_channel_silence_seconds", 0.0}}));
    old.size = sizeof(old.size) - 1;
    EXPECT_EQ(halyard_session_report_issue(session_.get(), &old), HALYARD_INVALID);
}

TEST_F(IssueTest, NothingGivenIsAnsweredAndDoesNothing) {
    const halyard_issue empty{};
    EXPECT_EQ(halyard_session_report_issue(nullptr, &empty), HALYARD_INVALID);
    EXPECT_EQ(halyard_session_report_issue(session_.get(), nullptr), HALYARD_INVALID);
}

TEST_F(IssueTest, FillsAFrameAndNoMore) {
    reporting::Dictionary more;
    const std::string text(1024 * 1024 - 600, 'x');
    more.set("text", text);
    EXPECT_EQ(session_.reportIssue(issue(), more), HALYARD_OK);
    EXPECT_EQ(arrivedDictionary()["text"], Value(text));
    const std::string longest(1024, 'n');
    reporting::Issue named = issue();
    named.node = longest.c_str();
    EXPECT_EQ(session_.reportIssue(named, more), HALYARD_TOO_LARGE);
}

TEST_F(IssueTest, ItsEntriesCountAmongThoseOfTheFrame) {
    constexpr int kMost =
        65536 - 17 - 2 - 8; // Besides: the frame's, a list with its key, four fields.
    reporting::Dictionary more;
    more.beginList("list");
    for (int i = 0; i < kMost; ++i) {
        more.set(nullptr, i);
    }
    more.end();
    EXPECT_EQ(session_.reportIssue(issue(), more), HALYARD_OK);
    more.set("n", true);
    EXPECT_EQ(session_.reportIssue(issue(), more), HALYARD_TOO_LARGE);
    EXPECT_EQ(session_.send(more, HALYARD_CATEGORY_PLAYBACK, HALYARD_TYPE_START), HALYARD_OK);
}

TEST_F(IssueTest, AllocatesNothing) {
    const reporting::Dictionary more = std::move(reporting::Dictionary().set("cycles", 1));
    const reporting::Issue reported = issue();
    const int before = allocations;
    const reporting::Result result = session_.reportIssue(reported, more);
    ASSERT_GT(before, 0);
    EXPECT_EQ(allocations, before);
    EXPECT_EQ(result, HALYARD_OK);
}

TEST_F(IssueTest, OfADestroyedClientIsNotTaken) {
    { const reporting::Client passing = std::move(client_); }
    EXPECT_EQ(session_.reportIssue(issue()), HALYARD_CLOSED);
}

} // namespace
} // namespace halyard::client
