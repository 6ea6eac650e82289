#include "common/KeyTable.h"

#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace halyard {
namespace {

TEST(KeyTableTest, InternedKeysEqualTheirText) {
    KeyTable table;
    for (const std::size_t length : {std::size_t{0}, std::size_t{14}, std::size_t{15},
                                     KeyTable::kMaxKeyLength, KeyTable::kMaxKeyLength + 1}) {
        const std::string key(length, 'k');
        EXPECT_EQ(table.intern(key).text(), key);
        EXPECT_EQ(table.intern(key), Value(key));
    }
}

TEST(KeyTableTest, TablesShareOneCopyOfALongKey) {
    KeyTable one;
    KeyTable other;
    const std::string key = "a key that several tables see";
    const Value first = one.intern(key);
    EXPECT_EQ(first.text().data(), one.intern(key).text().data());
    EXPECT_EQ(first.text().data(), other.intern(key).text().data());
}

TEST(KeyTableTest, KeysAreKeptUpToTheirLongest) {
    KeyTable table;
    for (const std::size_t length : {std::size_t{15}, KeyTable::kMaxKeyLength}) {
        const std::string key(length, 'm');
        const Value first = table.intern(key);
        EXPECT_EQ(first.text().data(), table.intern(key).text().data()) << length;
    }
}

TEST(KeyTableTest, TooLongKeysAreNotKept) {
    KeyTable table;
    const std::string key(KeyTable::kMaxKeyLength + 1, 'l');
    const Value first = table.intern(key);
    EXPECT_NE(first.text().data(), table.intern(key).text().data());
}

TEST(KeyTableTest, ThreadsMayInternTheSameKeysAtOnce) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i) {
        threads.emplace_back([] {
            KeyTable table;
            for (int n = 0; n < 200; ++n) {
                const std::string key = "concurrent key " + std::to_string(n % 20);
                ASSERT_EQ(table.intern(key).text(), key);
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
}

// Last in this file's order of business: it fills the process's table.
TEST(KeyTableTest, InventedKeysBeyondTheBoundStayOrdinaryValues) {
    KeyTable table;
    for (std::size_t i = 0; i < KeyTable::kMaxKeys + 100; ++i) {
        const std::string key = "an invented key with number " + std::to_string(i);
        ASSERT_EQ(table.intern(key).text(), key);
    }
    const std::string late = "a key that comes when the table is full";
    const Value first = table.intern(late);
    EXPECT_NE(first.text().data(), table.intern(late).text().data());
}

} // namespace
} // namespace halyard
