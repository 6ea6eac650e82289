#include "session/SummaryFile.h"

#include <gtest/gtest.h>

#include "common/Json.h"

namespace halyard {
namespace {

using namespace std::chrono_literals;

constexpr platform::WallTime kTime{std::chrono::seconds{1709211909}}; // 2024-02-29 13:05:09 UTC

TEST(SummaryFileName, IsLocalTimeProjectApplicationAndService) {
    EXPECT_EQ(summaryFileName(kTime, 0s, "player", "alarms"),
              "20240229-130509+0000-halyard-player-alarms.json");
    EXPECT_EQ(summaryFileName(kTime, 5h + 30min, "player", "alarms"),
              "20240229-183509+0530-halyard-player-alarms.json");
    EXPECT_EQ(summaryFileName(kTime, -(3h + 30min), "player", "alarms"),
              "20240229-093509-0330-halyard-player-alarms.json");
}

TEST(SummaryFileName, WritesNowhereElseWhateverTheApplicationIsCalled) {
    EXPECT_EQ(summaryFileName(kTime, 0s, "../../etc/passwd", "a/b"),
              "20240229-130509+0000-halyard-_.._.._etc_passwd-a_b.json");
}

TEST(SafePathComponent, KeepsOrdinaryNames) {
    EXPECT_EQ(safePathComponent("com.example.Player 2"), "com.example.Player 2");
    EXPECT_EQ(safePathComponent("Ü-Musik"), "Ü-Musik");
}

TEST(SafePathComponent, ReplacesWhatAFileSystemWouldTakeAmiss) {
    EXPECT_EQ(safePathComponent("a/b\n\\c:"), "a_b__c_");
    EXPECT_EQ(safePathComponent("a\x01\x1F \x7F"), "a__ _");
    EXPECT_EQ(safePathComponent(".hidden"), "_.hidden");
    EXPECT_EQ(safePathComponent(".."), "_..");
    EXPECT_EQ(safePathComponent(""), "_");
    EXPECT_EQ(safePathComponent("\xff"), "\xEF\xBF\xBD");
}

TEST(SafePathComponent, CutsBetweenCharacters) {
    const std::string text = std::string(79, 'x') + "ü";
    EXPECT_EQ(safePathComponent(std::string(80, 'x')).size(), 80u);
    EXPECT_EQ(safePathComponent(std::string(81, 'x')).size(), 80u);
    EXPECT_EQ(safePathComponent(std::string(78, 'x') + "üü"), std::string(78, 'x') + "ü");
    EXPECT_EQ(safePathComponent(std::string(78, 'x') + "♫"), std::string(78, 'x'));
    EXPECT_EQ(safePathComponent(text), std::string(79, 'x'));
}

TEST(SummaryFileContents, IsAListOfMessagesByIdentifier) {
    MessageBatch batch;
    ASSERT_FALSE(batch.addUnlessRedundant(4, 1, Dictionary{{"a\"b", 1.5}}));
    ASSERT_FALSE(batch.addUnlessRedundant(4, 1, Dictionary{{"a", "\xff\n"}}));

    EXPECT_EQ(toJson(summaryFileContents(batch.entries())),
              "[{\"Playback_Start_1\":{\"a\\\"b\":1.5}},"
              "{\"Playback_Start_2\":{\"a\":\"\xEF\xBF\xBD\\n\"}}]");
}

} // namespace
} // namespace halyard
