#include "common/ValueSize.h"

#include <gtest/gtest.h>

namespace halyard {
namespace {

const std::string kLongText = "a text that does not fit inside the value";

// One that has not been asked for its size before.
Dictionary anew(const Dictionary& dictionary) {
    return Dictionary(std::vector<Dictionary::Entry>(dictionary.begin(), dictionary.end()));
}

TEST(ValueSizeTest, ItIsThatOfTheEntriesThereAreNow) {
    Dictionary dictionary{{"a", 1}, {"b", kLongText}};
    const auto expectSizeOfNow = [&] { EXPECT_EQ(bytesOf(dictionary), bytesOf(anew(dictionary))); };
    expectSizeOfNow();
    dictionary.set("c", kLongText);
    expectSizeOfNow();
    dictionary.set("b", 2);
    expectSizeOfNow();
    dictionary.erase("a");
    expectSizeOfNow();
    dictionary.merge({{"c", 3}, {"d", List{kLongText}}});
    expectSizeOfNow();
}

TEST(ValueSizeTest, WhoSharesEntriesCountsThoseThatItSees) {
    for (const bool longerFirst : {true, false}) {
        Dictionary::Builder builder(2);
        builder.add("a", kLongText);
        const Dictionary shorter = builder.finish();
        Dictionary longer = shorter;
        longer.set("b", kLongText);
        const std::size_t first = bytesOf(longerFirst ? longer : shorter);
        const std::size_t second = bytesOf(longerFirst ? shorter : longer);
        EXPECT_EQ(longerFirst ? first : second, bytesOf(anew(longer)));
        EXPECT_EQ(longerFirst ? second : first, bytesOf(anew(shorter)));
    }
}

TEST(ValueSizeTest, ADictionaryWithinCountsAsItDoesByItself) {
    const Dictionary inner{{"a", kLongText}};
    EXPECT_EQ(bytesOf(Value(inner)), bytesOf(inner));
    EXPECT_EQ(bytesOf(Value(Dictionary())), bytesOf(Dictionary()));
}

} // namespace
} // namespace halyard
