#include "common/KeptTexts.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace halyard {
namespace {

TEST(KeptTexts, AreFoundByWhatTheySay) {
    const int things[3] = {};
    KeptTexts texts;
    EXPECT_EQ(texts.find(&things[0]), "");
    texts.keep(&things[0], "first");
    texts.keep(&things[1], "second");
    EXPECT_EQ(texts.find(&things[0]), "first");
    EXPECT_EQ(texts.find(&things[1]), "second");
    EXPECT_EQ(texts.find(&things[2]), "");
}

TEST(KeptTexts, AreForgottenTogether) {
    const int thing = 0;
    KeptTexts texts;
    texts.keep(&thing, "before");
    texts.forget();
    EXPECT_EQ(texts.find(&thing), "");
    texts.keep(&thing, "after");
    EXPECT_EQ(texts.find(&thing), "after");
}

TEST(KeptTexts, AreAsManyAsTheBoundAllows) {
    const std::vector<int> things(KeptTexts::kMostTexts + 1);
    KeptTexts texts;
    for (const int& thing : things) {
        texts.keep(&thing, std::to_string(&thing - things.data()));
    }
    for (std::size_t i = 0; i < KeptTexts::kMostTexts; ++i) {
        ASSERT_EQ(texts.find(&things[i]), std::to_string(i));
    }
    EXPECT_EQ(texts.find(&things.back()), "");
}

TEST(KeptTexts, TakeNoMoreRoomThanTheBoundAllows) {
    const int things[2] = {};
    KeptTexts texts;
    texts.keep(&things[1], std::string(KeptTexts::kMostBytes, 'x'));
    EXPECT_EQ(texts.find(&things[1]), "");
    texts.keep(&things[0], std::string(KeptTexts::kMostBytes - 4, 'x'));
    texts.keep(&things[1], "y");
    EXPECT_EQ(texts.find(&things[0]).size(), KeptTexts::kMostBytes - 4);
    EXPECT_EQ(texts.find(&things[1]), "");
}

} // namespace
} // namespace halyard
