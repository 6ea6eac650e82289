#include "client/DictionaryWriter.h"

#include <gtest/gtest.h>

#include "protocol/Wire.h"

namespace halyard::client {
namespace {

class DictionaryWriterTest : public testing::Test {
protected:
    // What the daemon would read.
    Dictionary decoded() const {
        std::string frame;
        protocol::appendArray(frame, 3);
        protocol::appendValue(frame, 2);
        protocol::appendText(frame, "setConfiguration");
        protocol::appendArray(frame, 2);
        protocol::appendMap(frame, writer_.entryCount());
        frame += writer_.body();
        protocol::appendValue(frame, 1);
        protocol::FrameScanner scanner;
        EXPECT_EQ(scanner.scan(frame), protocol::FrameScanner::Outcome::Complete);
        return protocol::CallDecoder().decode(frame)->arguments.dictionary;
    }

    DictionaryWriter writer_{0};
};

TEST_F(DictionaryWriterTest, KeepsTheKindOfEachValue) {
    writer_.setText("text", "sp\u00e4t");
    writer_.setNumber("int", -7);
    writer_.setNumber("uint", UINT64_MAX);
    writer_.setNumber("double", 48000.0);
    writer_.setNumber("float", 0.5F);
    writer_.setNumber("bool", true);
    writer_.setNumber("date", Date{-5, 250});
    const Dictionary read = decoded();
    EXPECT_EQ(read["text"].text(), "sp\u00e4t");
    EXPECT_EQ(read["int"].integerValue(), -7);
    EXPECT_EQ(read["uint"].unsignedValue(), UINT64_MAX);
    EXPECT_EQ(read["double"].kind(), Value::Kind::Double);
    EXPECT_EQ(read["float"].kind(), Value::Kind::Float);
    EXPECT_EQ(read["bool"].kind(), Value::Kind::Bool);
    EXPECT_EQ(read["date"].date(), (Date{-5, 250}));
}

TEST_F(DictionaryWriterTest, NestsListsAndDictionaries) {
    writer_.beginContainer("route", true);
    writer_.setText(nullptr, "speaker");
    writer_.beginContainer(nullptr, false);
    writer_.setNumber("channels", 2);
    writer_.endContainer();
    writer_.endContainer();
    writer_.setNumber("after", 1);
    ASSERT_EQ(writer_.error(), HALYARD_OK);
    const Dictionary read = decoded();
    EXPECT_EQ(read["route"].list()[0].text(), "speaker");
    EXPECT_EQ(read["route"].list()[1].dictionary()["channels"].integerValue(), 2);
    EXPECT_EQ(read["after"].integerValue(), 1);
}

TEST_F(DictionaryWriterTest, OfTwoEqualKeysTheLastCounts) {
    writer_.setNumber("rate", 44100);
    writer_.setNumber("rate", 48000);
    EXPECT_EQ(decoded()["rate"].integerValue(), 48000);
}

TEST_F(DictionaryWriterTest, SeesTimeStampsOnTheTopLevelOnly) {
    writer_.beginContainer("inner", false);
    writer_.setNumber("systemuptime_sec", 1);
    writer_.endContainer();
    EXPECT_EQ(writer_.stamps(), kNoStamps);
    writer_.setNumber("systemuptime_sec", 1);
    EXPECT_EQ(writer_.stamps(), stampNamed("systemuptime_sec"));
}

TEST_F(DictionaryWriterTest, IsNotWellFormedWhileAContainerIsOpen) {
    writer_.beginContainer("open", true);
    EXPECT_EQ(writer_.error(), HALYARD_INVALID);
    writer_.endContainer();
    EXPECT_EQ(writer_.error(), HALYARD_OK);
}

TEST_F(DictionaryWriterTest, StaysBrokenUntilItIsCleared) {
    EXPECT_EQ(writer_.setNumber(nullptr, 1), HALYARD_INVALID);
    EXPECT_EQ(writer_.setNumber("key", 1), HALYARD_INVALID);
    EXPECT_EQ(writer_.error(), HALYARD_INVALID);
    writer_.clear();
    EXPECT_EQ(writer_.setNumber("key", 1), HALYARD_OK);
    EXPECT_EQ(decoded().size(), 1U);
}

TEST_F(DictionaryWriterTest, AnEndWithoutABeginBreaksIt) {
    EXPECT_EQ(writer_.endContainer(), HALYARD_INVALID);
    EXPECT_EQ(writer_.error(), HALYARD_INVALID);
}

TEST_F(DictionaryWriterTest, NestsAsDeepAsTheWireAllowsAndNoDeeper) {
    int depth = 0;
    while (writer_.beginContainer("deeper", false) == HALYARD_OK) {
        ++depth;
    }
    EXPECT_EQ(depth, protocol::kMaxDepth - 3);

    writer_.clear();
    for (int i = 0; i < depth; ++i) {
        writer_.beginContainer("deeper", false);
    }
    for (int i = 0; i < depth; ++i) {
        writer_.endContainer();
    }
    EXPECT_EQ(decoded().size(), 1U);
}

TEST_F(DictionaryWriterTest, RefusesMoreThanAFrameTakes) {
    EXPECT_EQ(writer_.setText("big", std::string(protocol::kMaxFrameBytes + 1, 'x')),
              HALYARD_TOO_LARGE);
    writer_.clear();
    writer_.beginContainer("many", true);
    halyard_result result = HALYARD_OK;
    for (std::uint32_t i = 0; i < protocol::kMaxElements; ++i) {
        result = writer_.setNumber(nullptr, 0);
    }
    EXPECT_EQ(result, HALYARD_TOO_LARGE);
}

} // namespace
} // namespace halyard::client
