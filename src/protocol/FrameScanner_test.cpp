#include <gtest/gtest.h>

#include "protocol/Wire.h"
#include "protocol/WireTestSupport.h"

namespace halyard::protocol {
namespace {

using Outcome = FrameScanner::Outcome;

Outcome scanOnce(std::string_view stream) {
    return FrameScanner().scan(stream);
}

// `depth` arrays, one in the other, the innermost empty.
std::string nested(int depth) {
    return std::string(static_cast<std::size_t>(depth - 1), '\x91') + '\x90';
}

// One array of `count` nils, with a 32-bit head.
std::string arrayOf(std::uint32_t count) {
    std::string result = raw({0xDD, static_cast<int>(count >> 24U), static_cast<int>(count >> 16U),
                              static_cast<int>(count >> 8U), static_cast<int>(count)});
    return result + std::string(count, '\xC0');
}

// An array of one bin whose whole frame is `length` bytes.
std::string frameOf(std::size_t length) {
    const std::size_t content = length - 6;
    return raw({0x91, 0xC6, static_cast<int>(content >> 24U), static_cast<int>(content >> 16U),
                static_cast<int>(content >> 8U), static_cast<int>(content)}) +
           std::string(content, 'x');
}

TEST(FrameScannerTest, FindsTheEndOfTheFirstOfSeveralFrames) {
    const std::string first = packedRequest("startReportingSessionForID", {packed(5)});
    FrameScanner scanner;
    EXPECT_EQ(scanner.scan(first + "\x93 and more"), Outcome::Complete);
    EXPECT_EQ(scanner.frameLength(), first.size());
}

TEST(FrameScannerTest, StartsAfreshAfterReset) {
    FrameScanner scanner;
    ASSERT_EQ(scanner.scan(nested(5)), Outcome::Complete);
    scanner.reset();
    EXPECT_EQ(scanner.scan(raw({0x92, 0x01})), Outcome::Incomplete);
    EXPECT_EQ(scanner.scan(raw({0x92, 0x01, 0x02})), Outcome::Complete);
    EXPECT_EQ(scanner.frameLength(), 3U);
}

TEST(FrameScannerTest, NeedsAtLeastOneByte) {
    EXPECT_EQ(scanOnce({}), Outcome::Incomplete);
}

TEST(FrameScannerTest, KnowsTheLengthOfEveryFormat) {
    for (int byte = 0; byte <= 0xFF; ++byte) {
        // Lengths that follow such a head are all 1, of containers and payloads.
        const std::string stream =
            raw({byte}) +
            (byte == 0xC4 || byte == 0xD9 || byte == 0xC7 ? raw({1})
             : byte == 0xC5 || byte == 0xDA || byte == 0xC8 || byte == 0xDC || byte == 0xDE
                 ? raw({0, 1})
             : byte == 0xC6 || byte == 0xDB || byte == 0xC9 || byte == 0xDD || byte == 0xDF
                 ? raw({0, 0, 0, 1})
                 : "");
        const std::string padded = stream + std::string(64, '\x01');
        FrameScanner scanner;
        if (byte == 0xC1) {
            EXPECT_EQ(scanner.scan(padded), Outcome::Malformed);
            continue;
        }
        ASSERT_EQ(scanner.scan(padded), Outcome::Complete) << byte;
        std::size_t offset = 0;
        msgpack::unpack(padded.data(), padded.size(), offset);
        EXPECT_EQ(scanner.frameLength(), offset) << byte;
    }
}

TEST(FrameScannerTest, FindsTheSameEndByteByByte) {
    const std::string map =
        packedMap({packed("text"), packed(std::string(300, 'x')), packed("list"),
                   packedArray({packed(1), packed(70000), packed(2.5), packedNil(), nested(3)}),
                   packed("when"), raw({0xC7, 12, 0xFF, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 9})});
    const std::string frame =
        packedRequest("sendMessage", {map, packed(14), packed(7), packedArray({packed(-5)})});

    FrameScanner scanner;
    std::string stream;
    for (const char byte : frame) {
        EXPECT_EQ(scanner.scan(stream), Outcome::Incomplete) << stream.size();
        stream += byte;
    }
    EXPECT_EQ(scanner.scan(stream), Outcome::Complete);
    EXPECT_EQ(scanner.frameLength(), frame.size());
}

TEST(FrameScannerTest, TakesAFrameOfOneMebibyteAndNotOneByteMore) {
    FrameScanner scanner;
    EXPECT_EQ(scanner.scan(frameOf(kMaxFrameBytes)), Outcome::Complete);
    EXPECT_EQ(scanner.frameLength(), kMaxFrameBytes);
    EXPECT_EQ(scanOnce(frameOf(kMaxFrameBytes + 1)), Outcome::TooLarge);
}

TEST(FrameScannerTest, SumsTheBytesOfAllElements) {
    const std::string half = frameOf(kMaxFrameBytes / 2 - 1);
    EXPECT_EQ(scanOnce("\x92" + half + half), Outcome::Complete);
    EXPECT_EQ(scanOnce("\x93" + half + half), Outcome::Incomplete); // One byte may come.
    EXPECT_EQ(scanOnce("\x94" + half + half), Outcome::TooLarge);   // Two will at least.
}

TEST(FrameScannerTest, RefusesAnnouncedSizesBeforeTheirBytesCome) {
    for (const int byte : {0xC6, 0xDB, 0xC9, 0xDD, 0xDF}) { // bin, str, ext, array, map
        EXPECT_EQ(scanOnce(raw({byte, 0xFF, 0xFF, 0xFF, 0xFF})), Outcome::TooLarge) << byte;
        EXPECT_EQ(scanOnce(raw({0x91, byte, 0, 0x10, 0, 0})), Outcome::TooLarge) << byte;
        EXPECT_EQ(scanOnce(raw({0x91, byte, 0, 0, 0x7F, 0})), Outcome::Incomplete) << byte;
    }
}

TEST(FrameScannerTest, Takes32LevelsAndNotOneMore) {
    EXPECT_EQ(scanOnce(nested(kMaxDepth)), Outcome::Complete);
    EXPECT_EQ(scanOnce(nested(kMaxDepth + 1)), Outcome::TooDeep);
}

TEST(FrameScannerTest, RefusesTheLevelTooManyAtItsHead) {
    EXPECT_EQ(scanOnce(std::string(kMaxDepth, '\x91')), Outcome::Incomplete);
    EXPECT_EQ(scanOnce(std::string(kMaxDepth + 1, '\x91')), Outcome::TooDeep);
    // Maps count as arrays do.
    EXPECT_EQ(scanOnce(std::string(kMaxDepth - 1, '\x91') + raw({0x81, 1, 0x80})),
              Outcome::TooDeep);
}

TEST(FrameScannerTest, ForgetsLevelsThatAreClosed) {
    std::vector<std::string> elements(100, nested(kMaxDepth - 1));
    EXPECT_EQ(scanOnce(packedArray(elements)), Outcome::Complete);
}

TEST(FrameScannerTest, Takes65536ElementsAndNotOneMore) {
    EXPECT_EQ(scanOnce(arrayOf(kMaxElements)), Outcome::Complete);
    EXPECT_EQ(scanOnce(arrayOf(kMaxElements + 1)), Outcome::TooManyElements);
}

TEST(FrameScannerTest, CountsElementsOverTheWholeFrame) {
    // 3 elements in the frame itself.
    const std::string half = arrayOf(kMaxElements / 2 - 2);
    EXPECT_EQ(scanOnce("\x93" + half + half + "\xC0"), Outcome::Complete);
    EXPECT_EQ(scanOnce("\x93" + half + half + "\x91\xC0"), Outcome::Complete);
    EXPECT_EQ(scanOnce("\x93" + half + half + "\x92\xC0\xC0"), Outcome::TooManyElements);
}

TEST(FrameScannerTest, CountsKeysAndValuesOfMaps) {
    const auto map = [](int pairs) {
        return raw({0xDE, pairs >> 8, pairs & 0xFF}) +
               std::string(2 * static_cast<std::size_t>(pairs), '\x01');
    };
    EXPECT_EQ(scanOnce(map(kMaxElements / 2)), Outcome::Complete);
    EXPECT_EQ(scanOnce(map(kMaxElements / 2 + 1)), Outcome::TooManyElements);
}

TEST(FrameScannerTest, RefusesTooManyElementsAtTheHead) {
    EXPECT_EQ(scanOnce(raw({0xDD, 0, 1, 0, 1})), Outcome::TooManyElements);
    EXPECT_EQ(scanOnce(raw({0xDD, 0, 1, 0, 0})), Outcome::Incomplete);
}

TEST(FrameScannerTest, RefusesTheUnusedByteWhereverAnObjectBegins) {
    EXPECT_EQ(scanOnce(raw({0xC1})), Outcome::Malformed);
    EXPECT_EQ(scanOnce(raw({0x92, 0x01, 0xC1})), Outcome::Malformed);
    EXPECT_EQ(scanOnce(raw({0x91, 0xA1, 0xC1})), Outcome::Complete); // Within text.
}

} // namespace
} // namespace halyard::protocol
