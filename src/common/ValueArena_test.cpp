#include "common/ValueArena.h"

#include <gtest/gtest.h>

namespace halyard {
namespace {

const std::string kLongText = "a text that does not fit inside the value";

// {"text": kLongText, "list": [kLongText, 2], "inner": {"text": kLongText}}, with room for one
// more.
Dictionary inOnePiece() {
    ValueArena::Size size;
    size.addText(kLongText.size());
    size.addText(kLongText.size());
    size.addText(kLongText.size());
    size.addList(2);
    size.addDictionary(1);
    ValueArena arena(4, size);
    auto* const list = arena.list(2);
    list->add(arena.text(kLongText));
    list->add(Value(2));
    auto* const inner = arena.dictionary(1);
    inner->add(Value("text"), arena.text(kLongText));
    arena.root().add(Value("text"), arena.text(kLongText));
    arena.root().add(Value("list"), ValueArena::finish(list));
    arena.root().add(Value("inner"), ValueArena::finish(inner));
    return arena.finish();
}

Dictionary inPieces() {
    return {{"text", kLongText},
            {"list", List{kLongText, 2}},
            {"inner", Dictionary{{"text", kLongText}}}};
}

TEST(ValueArenaTest, MakesADictionaryLikeAnyOther) {
    EXPECT_EQ(inOnePiece(), inPieces());
}

TEST(ValueArenaTest, APartOutlivesTheDictionary) {
    Dictionary dictionary = inOnePiece();
    const Value text = dictionary["text"];
    const List list = dictionary["list"].list();
    const Dictionary inner = dictionary["inner"].dictionary();
    dictionary = Dictionary();
    EXPECT_EQ(text, Value(kLongText));
    EXPECT_EQ(list, (List{kLongText, 2}));
    EXPECT_EQ(inner, (Dictionary{{"text", kLongText}}));
}

TEST(ValueArenaTest, TheDictionaryMayBeChangedInEveryWay) {
    Dictionary replaced = inOnePiece();
    replaced.set("text", 1);
    EXPECT_EQ(replaced["text"], Value(1));
    Dictionary erased = inOnePiece();
    erased.erase("list");
    EXPECT_EQ(erased.size(), 2U);
    Dictionary merged = inOnePiece();
    merged.merge({{"more", kLongText}, {"text", 2}});
    EXPECT_EQ(merged.size(), 4U);
    Dictionary added = inOnePiece();
    for (int i = 0; i < 20; ++i) {
        added.set("more" + std::to_string(i), kLongText);
    }
    EXPECT_EQ(added.size(), 23U);
    EXPECT_EQ(added["inner"], Value(Dictionary{{"text", kLongText}}));
}

TEST(ValueArenaTest, PartsMayBeChangedWithoutChangingTheDictionary) {
    const Dictionary dictionary = inOnePiece();
    List list = dictionary["list"].list();
    list.append(3);
    Dictionary inner = dictionary["inner"].dictionary();
    inner.set("more", kLongText);
    EXPECT_EQ(dictionary, inPieces());
    EXPECT_EQ(list, (List{kLongText, 2, 3}));
    EXPECT_EQ(inner.size(), 2U);
}

TEST(ValueArenaTest, WhatIsAddedIsSharedLikeAnyOtherValue) {
    Dictionary dictionary = inOnePiece();
    const Dictionary before = dictionary;
    dictionary.set("more", kLongText);
    const Value more = dictionary["more"];
    dictionary = Dictionary();
    EXPECT_EQ(more, Value(kLongText));
    EXPECT_EQ(before, inPieces());
}

TEST(ValueArenaTest, WhatIsDetachedIsTheSameAndNoPart) {
    const Dictionary dictionary = inOnePiece();
    for (const auto& [key, value] : dictionary) {
        const Value detached = value.detached();
        EXPECT_EQ(detached, value);
        EXPECT_TRUE(value.text().empty() || value.text().data() != detached.text().data());
    }
    EXPECT_EQ(Value(1).detached(), Value(1));
}

TEST(ValueArenaTest, OfEqualKeysTheLastOneWinsAndNoneIsLeftOut) {
    ValueArena::Size size;
    size.addText(kLongText.size());
    ValueArena arena(3, size);
    arena.root().add(Value("a"), arena.text(kLongText));
    arena.root().add(Value("a"), Value(2));
    arena.root().add(Value("b"), Value());
    EXPECT_EQ(arena.finish(), (Dictionary{{"a", 2}}));
}

TEST(ValueArenaTest, WhatIsNotFinishedGoesWithItsParts) {
    ValueArena::Size size;
    size.addText(kLongText.size());
    ValueArena arena(1, size);
    const Value dropped = arena.text(kLongText);
    EXPECT_EQ(dropped.text(), kLongText);
}

} // namespace
} // namespace halyard
