#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

#include "common/Value.h"

namespace halyard {
namespace {

const std::string kLongText = "a text that does not fit inside the value";

// Keys that sort differently from their order of insertion.
std::string keyAt(int index) {
    return "key number " + std::to_string((index * 37) % 101);
}

// On the linear and the indexed side of the threshold.
class DictionarySizeTest : public ::testing::TestWithParam<int> {
protected:
    DictionarySizeTest() {
        for (int i = 0; i < GetParam(); ++i) {
            dictionary_.set(keyAt(i), i);
        }
    }

    Dictionary dictionary_;
};

constexpr int kThreshold = static_cast<int>(Dictionary::kIndexedAbove);

INSTANTIATE_TEST_SUITE_P(AroundTheIndex, DictionarySizeTest,
                         ::testing::Values(1, kThreshold - 1, kThreshold, kThreshold + 1, 100));

TEST_P(DictionarySizeTest, FindsEveryKeyAndNoOther) {
    for (int i = 0; i < GetParam(); ++i) {
        EXPECT_EQ(dictionary_[keyAt(i)], Value(i));
    }
    EXPECT_FALSE(dictionary_.contains("key number"));
    EXPECT_FALSE(dictionary_.contains("z"));
    EXPECT_TRUE(dictionary_[""].isNone());
}

TEST_P(DictionarySizeTest, IteratesInTheOrderOfInsertion) {
    int index = 0;
    for (const auto& entry : dictionary_) {
        EXPECT_EQ(entry.key.text(), keyAt(index));
        ++index;
    }
    EXPECT_EQ(index, GetParam());
}

TEST_P(DictionarySizeTest, ReplacingKeepsThePlace) {
    dictionary_.set(keyAt(0), "new");
    EXPECT_EQ(dictionary_.size(), static_cast<std::size_t>(GetParam()));
    EXPECT_EQ(dictionary_.begin()->value, Value("new"));
}

TEST_P(DictionarySizeTest, ErasesOneKeyOnly) {
    dictionary_.erase(keyAt(0));
    dictionary_.erase("absent");
    EXPECT_FALSE(dictionary_.contains(keyAt(0)));
    EXPECT_EQ(dictionary_.size(), static_cast<std::size_t>(GetParam() - 1));
    for (int i = 1; i < GetParam(); ++i) {
        EXPECT_EQ(dictionary_[keyAt(i)], Value(i));
    }
}

TEST_P(DictionarySizeTest, EqualsTheSameEntriesInAnotherOrder) {
    std::vector<Dictionary::Entry> reversed(dictionary_.begin(), dictionary_.end());
    std::reverse(reversed.begin(), reversed.end());
    Dictionary other(reversed);
    EXPECT_EQ(dictionary_, other);
    other.set(keyAt(0), "different");
    EXPECT_FALSE(dictionary_ == other);
    other.erase(keyAt(0));
    EXPECT_FALSE(dictionary_ == other);
}

TEST_P(DictionarySizeTest, AnAbsentKeyIsNotEqualToAnother) {
    Dictionary other = dictionary_;
    other.erase(keyAt(0));
    other.set("another", 0);
    EXPECT_FALSE(dictionary_ == other);
}

TEST_P(DictionarySizeTest, ChangingACopyLeavesTheOriginalAlone) {
    Dictionary copy = dictionary_;
    copy.set("added", true);
    copy.set(keyAt(0), "changed");
    EXPECT_FALSE(dictionary_.contains("added"));
    EXPECT_EQ(dictionary_[keyAt(0)], Value(0));
    EXPECT_EQ(copy.size(), dictionary_.size() + 1);
}

TEST_P(DictionarySizeTest, TheLastOfEqualKeysWins) {
    std::vector<Dictionary::Entry> twice(dictionary_.begin(), dictionary_.end());
    for (const auto& entry : dictionary_) {
        twice.push_back({entry.key, "second"});
    }
    const Dictionary merged(twice);
    EXPECT_EQ(merged.size(), dictionary_.size());
    for (const auto& entry : merged) {
        EXPECT_EQ(entry.value, Value("second"));
    }
}

TEST_P(DictionarySizeTest, MergingReplacesAndAppends) {
    Dictionary target{{keyAt(0), "old"}, {"own", 1}};
    target.merge(dictionary_);
    EXPECT_EQ(target[keyAt(0)], Value(0));
    EXPECT_EQ(target["own"], Value(1));
    EXPECT_EQ(target.size(), dictionary_.size() + 1);
    EXPECT_EQ(target.begin()->key.text(), keyAt(0));
}

TEST_P(DictionarySizeTest, MergingIntoItselfChangesNothing) {
    const Dictionary before = dictionary_;
    dictionary_.merge(dictionary_);
    EXPECT_EQ(dictionary_, before);
}

TEST_P(DictionarySizeTest, MergingFindsWhatItAddedAmongWhatWasThere) {
    Dictionary added;
    for (int i = 0; i < 60; ++i) {
        added.set(keyAt(GetParam() - 1 + i), -i);
    }
    const Dictionary shared = dictionary_;
    dictionary_.merge(added);
    for (const auto& entry : added) {
        EXPECT_EQ(dictionary_[entry.key.text()], entry.value);
    }
    for (int i = 0; i < GetParam() - 1; ++i) {
        EXPECT_TRUE(added.contains(keyAt(i)) || dictionary_[keyAt(i)] == Value(i));
    }
    EXPECT_EQ(shared.size(), static_cast<std::size_t>(GetParam())) << "who shared it keeps it";
    dictionary_.set("another", 1);
    EXPECT_EQ(dictionary_["another"], Value(1));
}

TEST(DictionaryTest, MergingIntoNothingSharesTheContents) {
    const Dictionary source{{"a", 1}};
    Dictionary target;
    target.merge(source);
    EXPECT_EQ(target.begin(), source.begin());
    target.merge(Dictionary());
    EXPECT_EQ(target, source);
}

// A dictionary that shares its contents with nobody is changed where it is.
bool isChangedInPlace(Dictionary& dictionary) {
    const auto* const before = dictionary.begin();
    dictionary.set("a", 2);
    return dictionary.begin() == before;
}

TEST(DictionaryTest, AValueThatIsAssignedOverLetsGoOfWhatItHeld) {
    Dictionary dictionary{{"a", 1}};
    const Value other("text");
    Value copied(dictionary);
    copied = other;
    EXPECT_TRUE(isChangedInPlace(dictionary)) << "copied over";
    Value moved(dictionary);
    moved = Value("text");
    EXPECT_TRUE(isChangedInPlace(dictionary)) << "moved over";
    const Value holds(dictionary);
    EXPECT_FALSE(isChangedInPlace(dictionary)) << "still held";
}

TEST(DictionaryTest, SettingNoneErases) {
    Dictionary dictionary{{"a", 1}};
    dictionary.set("a", Value());
    EXPECT_TRUE(dictionary.empty());
    EXPECT_EQ(dictionary, Dictionary());
    dictionary.set("a", Value());
    EXPECT_TRUE(dictionary.empty());
}

TEST(DictionaryTest, EntriesOfNoneAreLeftOut) {
    const Dictionary dictionary{{"a", 1}, {"b", Value()}, {"a", Value()}};
    EXPECT_TRUE(dictionary.empty());
}

TEST(DictionaryTest, AKeyOfTheDictionaryItselfMayBeErased) {
    Dictionary dictionary{{"a key beyond the inline length", 1}, {"b", 2}};
    dictionary.erase(dictionary.begin()->key.text());
    EXPECT_EQ(dictionary, (Dictionary{{"b", 2}}));
}

TEST(DictionaryTest, CopiesShareTheirContents) {
    const Dictionary inner{{"text", "a text that does not fit inside the value"}};
    Dictionary outer{{"inner", inner}};
    Dictionary copy = outer;
    EXPECT_EQ(copy.begin(), outer.begin());
    copy.set("more", 1);
    // The entries were copied, what they refer to was not.
    EXPECT_EQ(copy["inner"].dictionary().begin(), inner.begin());
}

Dictionary withRoomForOneMore() {
    Dictionary::Builder builder(2);
    builder.add("a", 1);
    return builder.finish();
}

TEST(DictionaryTest, WhatIsSharedTakesAnotherEntryThatOthersDoNotSee) {
    const Dictionary original = withRoomForOneMore();
    Dictionary copy = original;
    copy.set("b", kLongText);
    EXPECT_EQ(copy.begin(), original.begin()) << "copied, although there was room";
    EXPECT_EQ(copy, (Dictionary{{"a", 1}, {"b", kLongText}}));
    EXPECT_EQ(original, (Dictionary{{"a", 1}}));
    EXPECT_FALSE(original.contains("b"));
}

TEST(DictionaryTest, TheRoomInWhatIsSharedIsForOneOfThose) {
    Dictionary original = withRoomForOneMore();
    Dictionary first = original;
    Dictionary second = original;
    first.set("b", 2);
    second.set("c", 3);
    original.set("d", 4);
    EXPECT_EQ(first, (Dictionary{{"a", 1}, {"b", 2}}));
    EXPECT_EQ(second, (Dictionary{{"a", 1}, {"c", 3}}));
    EXPECT_EQ(original, (Dictionary{{"a", 1}, {"d", 4}}));
}

TEST(DictionaryTest, WhatSomebodyWhoHasGoneHasAddedIsForgotten) {
    Dictionary dictionary = withRoomForOneMore();
    Dictionary(dictionary).set("b", kLongText);
    dictionary.set("c", 3);
    EXPECT_EQ(dictionary, (Dictionary{{"a", 1}, {"c", 3}}));
}

TEST(DictionaryTest, ThreadsThatAddToWhatTheyShareSeeTheirOwnEntryOnly) {
    for (int round = 0; round < 200; ++round) {
        const Dictionary original = withRoomForOneMore();
        std::vector<std::thread> threads;
        for (int i = 0; i < 2; ++i) {
            threads.emplace_back([copy = original, i]() mutable {
                copy.set("own", i);
                EXPECT_EQ(copy, (Dictionary{{"a", 1}, {"own", i}}));
            });
        }
        for (std::thread& thread : threads) {
            thread.join();
        }
        EXPECT_EQ(original, (Dictionary{{"a", 1}}));
    }
}

TEST(DictionaryTest, SortedEntriesFollowTheBytesOfTheKeys) {
    const Dictionary dictionary{{"b", 1}, {"a", 2}, {"B", 3}, {"\xC3\xA4", 4}};
    std::string keys;
    for (const auto* entry : sortedEntries({dictionary.begin(), dictionary.end()})) {
        keys += entry->key.text();
    }
    EXPECT_EQ(keys, "Bab\xC3\xA4");
}

} // namespace
} // namespace halyard
