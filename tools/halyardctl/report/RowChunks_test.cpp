#include "report/RowChunks.h"

#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

RowChunks::Limits limitsOf(std::size_t packed, std::size_t plain, std::size_t chunk) {
    RowChunks::Limits limits;
    limits.packed = packed;
    limits.plain = plain;
    limits.chunk = chunk;
    return limits;
}

void fill(RowChunks& rows, int count) {
    for (int i = 0; i < count; ++i) {
        rows.add([i](JsonStream& json) { json.integer(i); });
    }
    rows.finish();
}

std::string all(const RowChunks& rows) {
    std::string text;
    for (const auto& chunk : rows.chunks()) {
        text += RowChunks::unpacked(chunk);
    }
    return text;
}

TEST(RowChunks, GivesBackEveryRowInItsOrder) {
    RowChunks rows(limitsOf(1 << 20, 1 << 20, 20));
    fill(rows, 12);

    EXPECT_EQ(all(rows), "0\n1\n2\n3\n4\n5\n6\n7\n8\n9\n10\n11\n");
    EXPECT_EQ(rows.taken(), 12U);
    EXPECT_EQ(rows.kept(), 12U);
    EXPECT_GT(rows.chunks().size(), 1U);
}

TEST(RowChunks, KeepsTheNewestRowsWithinThePlainBytes) {
    RowChunks rows(limitsOf(1 << 20, 1000, 100));
    fill(rows, 5000);

    EXPECT_EQ(rows.taken(), 5000U);
    EXPECT_LE(all(rows).size(), 1000U);
    EXPECT_TRUE(all(rows).ends_with("4999\n"));
    std::uint64_t kept = 0;
    for (const auto& chunk : rows.chunks()) {
        kept += chunk.rows;
    }
    EXPECT_EQ(rows.kept(), kept);
}

TEST(RowChunks, KeepsTheNewestRowsWithinThePackedBytes) {
    RowChunks rows(limitsOf(2000, 1 << 20, 500));
    fill(rows, 5000);

    std::size_t packed = 0;
    for (const auto& chunk : rows.chunks()) {
        packed += chunk.packed.size();
    }
    EXPECT_LE(packed, 2000U);
    EXPECT_GT(packed, 1000U);
    EXPECT_TRUE(all(rows).ends_with("4999\n"));
}

TEST(RowChunks, OfNoRowThereIsNoChunk) {
    RowChunks rows(RowChunks::Limits{});
    rows.finish();

    EXPECT_TRUE(rows.chunks().empty());
}

} // namespace
} // namespace halyard::ctl
