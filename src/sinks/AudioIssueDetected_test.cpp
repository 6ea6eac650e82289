#include "sinks/AudioIssueDetected.h"

#include <gtest/gtest.h>

namespace tmxmetrics {
namespace {

using namespace std::string_literals;

AudioIssueDetected sample() {
    AudioIssueDetected issue;
    issue.issuetype = "silence";
    issue.node = "out";
    issue.rtaidclient = "mpv";
    issue.timestamp = 300;
    issue.duration = -2;
    return issue;
}

// None when the bytes are refused.
std::optional<AudioIssueDetected> decoded(std::string_view bytes) {
    WireReader reader(bytes);
    AudioIssueDetected issue;
    return issue.readFrom(reader) ? std::optional(issue) : std::nullopt;
}

TEST(AudioIssueDetectedTest, DefaultsAreWrittenButNoTimestamp) {
    EXPECT_EQ(AudioIssueDetected().encoded(), "\x10\x00\x1A\x00\x22\x00\x2A\x00"s);
}

TEST(AudioIssueDetectedTest, FieldsAreWrittenInTheOrderOfTheirNumbers) {
    EXPECT_EQ(sample().encoded(), "\x08\xAC\x02"
                                  "\x10\xFE\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"
                                  "\x1A\x07silence\x22\x03out\x2A\x03mpv"s);
}

TEST(AudioIssueDetectedTest, ReadsBackWhatItWrote) {
    AudioIssueDetected issue = sample();
    issue.node = std::string(1000, '\0');
    issue.timestamp = 0xFFFFFFFFFFFFFFFF;
    EXPECT_EQ(decoded(issue.encoded()), issue);
    EXPECT_EQ(decoded(AudioIssueDetected().encoded()), AudioIssueDetected());
    EXPECT_EQ(decoded(""), AudioIssueDetected());
}

TEST(AudioIssueDetectedTest, TheLastOfRepeatedFieldsWins) {
    EXPECT_EQ(decoded("\x10\x01\x10\x02"s)->duration, 2);
}

TEST(AudioIssueDetectedTest, DurationIsCutTo32Bits) {
    EXPECT_EQ(decoded("\x10\x81\x80\x80\x80\x10"s)->duration, 1); // 2^32 + 1
}

TEST(AudioIssueDetectedTest, UnknownFieldsOfEveryWireTypeAreSkipped) {
    const std::string unknown = "\x30\x96\x01"                         // field 6, varint
                                "\x31\x01\x02\x03\x04\x05\x06\x07\x08" // 64 bits
                                "\x32\x03xyz"                          // bytes
                                "\x35\x01\x02\x03\x04"s                // 32 bits
                                "\x33\x30\x01\x3B\x3C\x34"s;           // group with a group inside
    EXPECT_EQ(decoded(unknown + sample().encoded()), sample());
    EXPECT_EQ(decoded(sample().encoded() + unknown), sample());
}

TEST(AudioIssueDetectedTest, AFieldNumberOfManyBitsIsSkipped) {
    EXPECT_EQ(decoded("\xF8\xFF\xFF\xFF\x0F\x01\x10\x05"s)->duration, 5);
}

TEST(AudioIssueDetectedTest, StopsAtTheEndOfAnEnclosingGroup) {
    const std::string bytes = "\x10\x05\x34\x10\x06"s;
    WireReader reader(bytes);
    AudioIssueDetected issue;
    EXPECT_TRUE(issue.readFrom(reader));
    EXPECT_EQ(issue.duration, 5);
    EXPECT_FALSE(reader.atEnd());
}

TEST(AudioIssueDetectedTest, EveryTruncationInsideAFieldIsRefused) {
    const std::string bytes = sample().encoded();
    const std::size_t boundaries[] = {0, 3, 14, 23, 28, 33};
    for (std::size_t length = 0; length <= bytes.size(); ++length) {
        const bool whole =
            std::find(std::begin(boundaries), std::end(boundaries), length) != std::end(boundaries);
        EXPECT_EQ(decoded(bytes.substr(0, length)).has_value(), whole) << length;
    }
}

TEST(AudioIssueDetectedTest, MalformedBytesAreRefused) {
    EXPECT_EQ(decoded("\x08\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"s), std::nullopt);
    EXPECT_EQ(decoded("\x1A\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF\x01"s), std::nullopt);
    EXPECT_EQ(decoded("\x36"s), std::nullopt); // wire types 6 and 7 do not exist
    EXPECT_EQ(decoded("\x37"s), std::nullopt);
    EXPECT_EQ(decoded("\x80\x80\x80\x80\x80\x01"s), std::nullopt); // key of 35 bits
}

TEST(AudioIssueDetectedTest, BrokenGroupsAreRefused) {
    EXPECT_EQ(decoded("\x33"s), std::nullopt);         // never ends
    EXPECT_EQ(decoded("\x33\x3C"s), std::nullopt);     // ends as another
    EXPECT_EQ(decoded("\x33\x36\x34"s), std::nullopt); // holds what does not exist
    EXPECT_EQ(decoded("\x33\x32\x05x\x34"s), std::nullopt);
}

TEST(AudioIssueDetectedTest, GroupsNestUpToABound) {
    const auto nested = [](std::size_t depth) {
        return std::string(depth, '\x33') + std::string(depth, '\x34');
    };
    EXPECT_TRUE(decoded(nested(WireReader::kMaxGroupDepth)).has_value());
    EXPECT_FALSE(decoded(nested(WireReader::kMaxGroupDepth + 1)).has_value());
}

TEST(AudioIssueDetectedTest, EqualityLooksAtEveryField) {
    EXPECT_EQ(sample(), sample());
    const auto differs = [](auto change) {
        AudioIssueDetected changed = sample();
        change(changed);
        return !(changed == sample());
    };
    EXPECT_TRUE(differs([](auto& issue) { issue.issuetype = "x"; }));
    EXPECT_TRUE(differs([](auto& issue) { issue.node = "x"; }));
    EXPECT_TRUE(differs([](auto& issue) { issue.rtaidclient = "x"; }));
    EXPECT_TRUE(differs([](auto& issue) { issue.duration = 1; }));
    EXPECT_TRUE(differs([](auto& issue) { issue.timestamp = 301; }));
    EXPECT_TRUE(differs([](auto& issue) { issue.timestamp.reset(); }));
}

TEST(AudioIssueDetectedTest, AZeroTimestampIsNotTheSameAsNone) {
    AudioIssueDetected zero;
    zero.timestamp = 0;
    EXPECT_FALSE(zero == AudioIssueDetected());
    EXPECT_EQ(zero.hash_value(), AudioIssueDetected().hash_value());
    EXPECT_EQ(zero.encoded().substr(0, 2), "\x08\x00"s);
}

TEST(AudioIssueDetectedTest, HashesCombineTheFieldsByExclusiveOr) {
    const std::hash<std::string> hash;
    EXPECT_EQ(sample().hash_value(),
              300 ^ 0xFFFFFFFFFFFFFFFE ^ hash("silence") ^ hash("out") ^ hash("mpv"));
}

TEST(AudioIssueDetectedTest, SwapExchangesEverything) {
    AudioIssueDetected left = sample();
    AudioIssueDetected right;
    swap(left, right);
    EXPECT_EQ(left, AudioIssueDetected());
    EXPECT_EQ(right, sample());
}

TEST(AudioIssueDetectedTest, TextShowsTheTimestampOnlyWhenPresent) {
    std::string text;
    AudioIssueDetected().formatText(text, "issue");
    EXPECT_EQ(text, "issue = {\n    duration = 0;\n    issuetype = \"\";\n    node = \"\";\n"
                    "    rtaidclient = \"\";\n}");
    text.clear();
    sample().formatText(text, "issue");
    EXPECT_EQ(text, "issue = {\n    duration = -2;\n    issuetype = silence;\n    node = out;\n"
                    "    rtaidclient = mpv;\n    timestamp = 300;\n}");
}

} // namespace
} // namespace tmxmetrics
