#include "common/Value.h"

#include <gtest/gtest.h>
#include <limits>
#include <thread>

namespace halyard {
namespace {

constexpr std::int64_t kMinInt64 = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMaxInt64 = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t kMaxUInt64 = std::numeric_limits<std::uint64_t>::max();
constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();
constexpr double kInfinity = std::numeric_limits<double>::infinity();

const std::string kLongText = "a text that does not fit inside the value";

TEST(ValueTest, DefaultIsNone) {
    EXPECT_TRUE(Value().isNone());
    EXPECT_EQ(Value(), Value());
    EXPECT_FALSE(Value() == Value(0));
}

TEST(ValueTest, UnsignedKindStartsAboveTheSignedRange) {
    EXPECT_EQ(Value(std::uint64_t{1}).kind(), Value::Kind::Int);
    EXPECT_EQ(Value(static_cast<std::uint64_t>(kMaxInt64)).kind(), Value::Kind::Int);
    EXPECT_EQ(Value(static_cast<std::uint64_t>(kMaxInt64) + 1).kind(), Value::Kind::UInt);
    EXPECT_EQ(Value(kMaxUInt64).unsignedValue(), kMaxUInt64);
    EXPECT_EQ(Value(kMaxUInt64).integerValue(), -1);
}

TEST(ValueTest, NumbersCompareByValueAcrossKinds) {
    EXPECT_EQ(Value(1), Value(1.0));
    EXPECT_EQ(Value(true), Value(1));
    EXPECT_EQ(Value(false), Value(0.0));
    EXPECT_EQ(Value(0.5f), Value(0.5));
    EXPECT_EQ(Value(0.0), Value(-0.0));
    EXPECT_FALSE(Value(0.1f) == Value(0.1));
    EXPECT_FALSE(Value(1) == Value(1.5));
    EXPECT_FALSE(Value(1) == Value("1"));
}

TEST(ValueTest, ItDoesNotMatterWhichSideIsTheReal) {
    EXPECT_EQ(Value(1.0), Value(1));
    EXPECT_EQ(Value(0.0f), Value(false));
    EXPECT_FALSE(Value(1.5) == Value(1));
    EXPECT_FALSE(Value(9223372036854775808.0) == Value(kMaxInt64));
    EXPECT_FALSE(Value(kMaxUInt64) == Value(-1.0));
    EXPECT_FALSE(Value(-1.0) == Value(kMaxUInt64));
    EXPECT_FALSE(Value("1") == Value(1.0));
}

TEST(ValueTest, LargeIntegersAreNotRoundedThroughReals) {
    const std::int64_t odd = (std::int64_t{1} << 53) + 1;
    EXPECT_FALSE(Value(odd) == Value(static_cast<double>(odd)));
    EXPECT_EQ(Value(odd - 1), Value(static_cast<double>(odd - 1)));
    EXPECT_FALSE(Value(kMaxInt64) == Value(9223372036854775808.0));
    EXPECT_FALSE(Value(kMinInt64) == Value(9223372036854775808.0));
    EXPECT_EQ(Value(kMinInt64), Value(-9223372036854775808.0));
    EXPECT_EQ(Value(std::uint64_t{1} << 63), Value(9223372036854775808.0));
    EXPECT_FALSE(Value(kMaxUInt64) == Value(18446744073709551616.0));
    EXPECT_FALSE(Value(kMaxUInt64) == Value(-1));
}

TEST(ValueTest, NotANumberEqualsNothing) {
    EXPECT_FALSE(Value(kNaN) == Value(kNaN));
    EXPECT_FALSE(Value(kNaN) == Value(0));
    const Value list = List{Value(kNaN)};
    EXPECT_FALSE(list == list);
    const Dictionary dictionary{{"a", kNaN}};
    EXPECT_FALSE(dictionary == dictionary);
}

TEST(ValueTest, TextSurvivesOnBothSidesOfTheInlineLength) {
    for (std::size_t length = 0; length <= 40; ++length) {
        const std::string text = kLongText.substr(0, length);
        Value value(text);
        const Value copy = value;
        const Value moved = std::move(value);
        EXPECT_EQ(copy.text(), text);
        EXPECT_EQ(moved, copy);
        EXPECT_EQ(moved.text(), text);
    }
}

TEST(ValueTest, TextKeepsEmbeddedZeroBytes) {
    const std::string_view text("a\0b", 3);
    EXPECT_EQ(Value(text).text(), text);
}

TEST(ValueTest, AssigningAValueToItselfKeepsIt) {
    Value value(kLongText);
    const Value& same = value;
    value = same;
    EXPECT_EQ(value.text(), kLongText);
}

TEST(ValueTest, AValueMayBeReplacedByAPartOfItself) {
    Value value = List{Value(kLongText)};
    const Value part = value.list()[0];
    value = part;
    EXPECT_EQ(value.text(), kLongText);
}

TEST(ValueTest, RealsTruncateTowardZeroAndSaturate) {
    EXPECT_EQ(Value(2.9).integerValue(), 2);
    EXPECT_EQ(Value(-2.9).integerValue(), -2);
    EXPECT_EQ(Value(1e300).integerValue(), kMaxInt64);
    EXPECT_EQ(Value(9223372036854775808.0).integerValue(), kMaxInt64);
    EXPECT_EQ(Value(9223372036854774784.0).integerValue(), 9223372036854774784);
    EXPECT_EQ(Value(-9223372036854775808.0).integerValue(), kMinInt64);
    EXPECT_EQ(Value(-9223372036854777856.0).integerValue(), kMinInt64);
    EXPECT_EQ(Value(-2.5f).integerValue(), -2);
    EXPECT_EQ(Value(-kInfinity).integerValue(), kMinInt64);
    EXPECT_EQ(Value(kNaN).integerValue(), 0);
}

TEST(ValueTest, IntegersAreRealsToo) {
    EXPECT_EQ(Value(kMaxUInt64).doubleValue(), 18446744073709551616.0);
    EXPECT_EQ(Value(kMinInt64).doubleValue(), -9223372036854775808.0);
    EXPECT_EQ(Value(true).doubleValue(), 1);
    EXPECT_EQ(Value(0.5f).doubleValue(), 0.5);
}

TEST(ValueTest, WhatIsNoNumberNorTextIsZero) {
    for (const Value& value :
         {Value(), Value(Date{5, 7}), Value(List{Value(5)}), Value(Dictionary{{"a", 5}})}) {
        EXPECT_EQ(value.integerValue(), 0);
        EXPECT_EQ(value.doubleValue(), 0);
        EXPECT_EQ(value.text(), "");
    }
}

TEST(ValueTest, TextGivesItsLeadingDecimalNumber) {
    EXPECT_EQ(Value("\t\r\n 5").integerValue(), 5);
    EXPECT_EQ(Value("\v5").integerValue(), 0);
    EXPECT_EQ(Value("1E-999").doubleValue(), 0);
    EXPECT_EQ(Value("-1e999").doubleValue(), std::numeric_limits<double>::lowest());
    EXPECT_EQ(Value("0x10").integerValue(), 0);
    EXPECT_EQ(Value("42 apples").integerValue(), 42);
    EXPECT_EQ(Value("  -7.9").integerValue(), -7);
    EXPECT_EQ(Value("+3").integerValue(), 3);
    EXPECT_EQ(Value("99999999999999999999").integerValue(), kMaxInt64);
    EXPECT_EQ(Value("-99999999999999999999").integerValue(), kMinInt64);
    EXPECT_EQ(Value("-.5x").doubleValue(), -0.5);
    EXPECT_EQ(Value("1e3").doubleValue(), 1000);
    EXPECT_EQ(Value("1e-999").doubleValue(), 0);
    EXPECT_EQ(Value("1e999").doubleValue(), std::numeric_limits<double>::max());
}

TEST(ValueTest, TextWithoutANumberIsZero) {
    for (const char* text : {"", " ", "+", "-", ".", "x1", "inf", "nan", "-inf", "--1", "+-1"}) {
        EXPECT_EQ(Value(text).integerValue(), 0) << text;
        EXPECT_EQ(Value(text).doubleValue(), 0) << text;
    }
}

TEST(ValueTest, TruthIsANonZeroNumber) {
    EXPECT_TRUE(Value(true).boolValue());
    EXPECT_TRUE(Value(0.1).boolValue());
    EXPECT_TRUE(Value("1").boolValue());
    EXPECT_FALSE(Value("yes").boolValue());
    EXPECT_FALSE(Value(0).boolValue());
    EXPECT_FALSE(Value().boolValue());
}

TEST(ValueTest, ContainersOfOtherKindsReadAsEmpty) {
    EXPECT_TRUE(Value("text longer than fourteen").list().empty());
    EXPECT_TRUE(Value(List{Value(1)}).dictionary().empty());
    EXPECT_TRUE(Value(List()).isList());
    EXPECT_TRUE(Value(Dictionary()).isDictionary());
    EXPECT_FALSE(Value(List()) == Value(Dictionary()));
}

TEST(ValueTest, OtherKindsHaveNoItemsToWalk) {
    const Value text("text longer than fourteen");
    EXPECT_TRUE(List::itemsOf(text).empty());
    EXPECT_TRUE(Dictionary::entriesOf(text).empty());
    EXPECT_TRUE(List::itemsOf(Value(List())).empty());
    EXPECT_TRUE(Dictionary::entriesOf(Value(Dictionary())).empty());
    EXPECT_EQ(List::itemsOf(Value(List{Value(1), Value(2)})).size(), 2U);
    EXPECT_EQ(Dictionary::entriesOf(Value(Dictionary{{"a", 1}})).size(), 1U);
}

TEST(ValueTest, DatesCompareByBothParts) {
    EXPECT_FALSE(Value(Date{5, 7}) == Value(Date{6, 7}));
    EXPECT_FALSE(Value(Date{5, 0}) == Value(5));
    EXPECT_EQ(Value(Date{5, 7}), Value(Date{5, 7}));
    EXPECT_FALSE(Value(Date{5, 7}) == Value(Date{5, 8}));
    EXPECT_EQ(Value(Date{-1, 999'999'999}).date(), (Date{-1, 999'999'999}));
}

TEST(ValueTest, SharedContentsMayBeCopiedAndDroppedByManyThreads) {
    const Value shared = Dictionary{{"text", kLongText}, {"list", List{Value(kLongText)}}};
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([&shared] {
            for (int round = 0; round < 1000; ++round) {
                Dictionary own = shared.dictionary();
                own.set("round", round);
                ASSERT_EQ(own["text"].text(), kLongText);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(shared.dictionary().size(), 2U);
}

TEST(ListTest, AppendingToACopyLeavesTheOriginalAlone) {
    const List original{Value(1), Value(kLongText)};
    List copy = original;
    copy.append(Value(3));
    EXPECT_EQ(original.size(), 2U);
    ASSERT_EQ(copy.size(), 3U);
    EXPECT_EQ(copy[1], original[1]);
    EXPECT_FALSE(copy == original);
}

TEST(ListTest, AnElementOfTheListItselfMayBeAppended) {
    List list{Value(kLongText)};
    for (int i = 0; i < 20; ++i) {
        list.append(list[0]);
    }
    EXPECT_EQ(list.size(), 21U);
    EXPECT_EQ(list[20].text(), kLongText);
}

TEST(ListTest, OrderMatters) {
    EXPECT_FALSE((List{Value(1), Value(2)}) == (List{Value(2), Value(1)}));
    EXPECT_EQ(List(), List());
}

} // namespace
} // namespace halyard
