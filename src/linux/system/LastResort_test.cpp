#include "linux/system/LastResort.h"

#include <future>
#include <gtest/gtest.h>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

TEST(LastResortTest, ActsWhenTimeIsUp) {
    std::promise<void> acted;
    const LastResort last(1ms, [&acted] { acted.set_value(); });
    acted.get_future().wait();
}

TEST(LastResortTest, DoesNothingWhenItIsNotNeeded) {
    bool acted = false;
    {
        const LastResort last(1h, [&acted] { acted = true; });
    }
    EXPECT_FALSE(acted);
}

} // namespace
} // namespace halyard::linux_
