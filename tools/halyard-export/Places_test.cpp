#include "Places.h"

#include <gtest/gtest.h>
#include <map>

namespace halyard::exporting {
namespace {

linux_::Environment environmentOf(std::map<std::string, std::string, std::less<>> variables) {
    return [variables](std::string_view name) -> std::optional<std::string> {
        const auto found = variables.find(name);
        return found == variables.end() ? std::nullopt : std::optional(found->second);
    };
}

TEST(PlacesTest, NobodyAsksForAHomeWhereAllPlacesAreGiven) {
    const auto places = placesOf(
        "/store",
        environmentOf({{"STATE_DIRECTORY", "/own"}, {"CONFIGURATION_DIRECTORY", "/etc/h"}}), 1000,
        "/nowhere");
    ASSERT_TRUE(places.ok());
    EXPECT_EQ(places.value().store, "/store");
    EXPECT_EQ(places.value().own, "/own");
    EXPECT_EQ(places.value().configuration, "/etc/h");
}

TEST(PlacesTest, AStoreThatIsNotGivenIsLookedForAtHome) {
    const auto environment =
        environmentOf({{"STATE_DIRECTORY", "/own"}, {"CONFIGURATION_DIRECTORY", "/etc/h"}});
    EXPECT_FALSE(placesOf({}, environment, 1000, "/nowhere").ok());
}

} // namespace
} // namespace halyard::exporting
