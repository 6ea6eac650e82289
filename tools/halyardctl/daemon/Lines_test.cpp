#include "daemon/Lines.h"

#include <gtest/gtest.h>

#include "daemon/Stamps.h"
#include "testing/TempTree.h"

namespace halyard::ctl {
namespace {

// "NUMBER:LINE" of each.
std::vector<std::string> linesOf(const std::string& text) {
    const testing::TempTree tree;
    auto lines = Lines::open(tree.write("lines", text));
    EXPECT_TRUE(lines.ok());
    std::vector<std::string> all;
    while (const auto line = lines.value().next()) {
        all.push_back(std::to_string(lines.value().number()) + ":" + *line);
    }
    return all;
}

using Expected = std::vector<std::string>;

TEST(LinesTest, BlankLinesCountButAreNotGiven) {
    EXPECT_EQ(linesOf("a\n\n \t\nb\r\nc"), (Expected{"1:a", "4:b\r", "5:c"}));
    EXPECT_EQ(linesOf(""), Expected());
    EXPECT_EQ(linesOf("\n\n"), Expected());
}

TEST(LinesTest, LinesMayBeLongerThanWhatIsReadAtOnce) {
    const std::string line(200'000, 'x');
    EXPECT_EQ(linesOf(line + "\n" + line + "\nend"), (Expected{"1:" + line, "2:" + line, "3:end"}));
}

TEST(LinesTest, ALineWithoutBoundsIsEmptyAndTheNextIsNot) {
    const std::string flood(Lines::kLongest + 100'000, 'x');
    EXPECT_EQ(linesOf(flood + "\nnext\n"), (Expected{"1:", "2:next"}));
    EXPECT_EQ(linesOf(flood), Expected{"1:"});
}

TEST(LinesTest, AFileThatIsNotThereIsTold) {
    EXPECT_FALSE(Lines::open("/nonexistent").ok());
}

TEST(DictionaryInTest, JsonBecomesTheValuesOfAMessage) {
    const auto message = dictionaryIn(
        R"({"u":18446744073709551615,"i":-9223372036854775808,"d":1.5,"t":"ä","b":true,)"
        R"("n":null,"l":[1,{"x":2}],"o":{"k":"v"}})");
    ASSERT_TRUE(message);
    EXPECT_EQ((*message)["u"], Value(UINT64_MAX));
    EXPECT_EQ((*message)["i"], Value(INT64_MIN));
    EXPECT_EQ((*message)["d"], Value(1.5));
    EXPECT_EQ((*message)["t"], Value("ä"));
    EXPECT_EQ((*message)["b"], Value(true));
    EXPECT_FALSE(message->contains("n"));
    EXPECT_EQ((*message)["l"], Value(List{1, Dictionary{{"x", 2}}}));
    EXPECT_EQ((*message)["o"], Value(Dictionary{{"k", "v"}}));
}

TEST(DictionaryInTest, EverythingElseIsNone) {
    for (const std::string& text :
         {std::string(), std::string("[1]"), std::string("{"), std::string("{} x"),
          std::string("{\"a\":\"\xFF\"}"),
          std::string("{\"a\":") + std::string(100'000, '[') + std::string(100'000, ']') + "}"}) {
        EXPECT_FALSE(dictionaryIn(text)) << text.substr(0, 20);
    }
}

TEST(StampsTest, OnlyWhatLacksIsAdded) {
    Dictionary message{{"systemuptime_sec", 7}};
    addStamps(message);
    EXPECT_EQ(message["systemuptime_sec"], Value(7));
    EXPECT_GT(message["hyreporting_timestamp"].doubleValue(), 1.6e9);
    EXPECT_GE(message["processuptime_ms"].integerValue(), 0);
    EXPECT_EQ(message.size(), 3U);
}

} // namespace
} // namespace halyard::ctl
