#include <gtest/gtest.h>
#include <set>

#include "content/Identity.h"

namespace halyard::exporting {
namespace {

std::string recordOf(const char* device, const char* table, std::int64_t row, double time) {
    std::string text;
    Identity(device).appendRecord(text, table, row, time);
    return text;
}

TEST(IdentityTest, ARecordIsNamedByDeviceTableRowAndTime) {
    const std::string one = recordOf("6f3a", "incident", 12, 1.7e9);
    EXPECT_TRUE(one.starts_with("6f3a/incident/") && one.ends_with("/12")) << one;
    EXPECT_EQ(one, recordOf("6f3a", "incident", 12, 1.7e9));
    const std::set<std::string> others = {
        recordOf("6f3b", "incident", 12, 1.7e9), recordOf("6f3a", "energy_event", 12, 1.7e9),
        recordOf("6f3a", "incident", 13, 1.7e9), recordOf("6f3a", "incident", 12, 1.7e9 + 1e-6),
        recordOf("6f3a", "incident", 12, 1.8e9)};
    EXPECT_EQ(others.size(), 5U);
    EXPECT_FALSE(others.contains(one));
}

} // namespace
} // namespace halyard::exporting
