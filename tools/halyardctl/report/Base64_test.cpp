#include "report/Base64.h"

#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

TEST(Base64, FillsTheLastFourLetters) {
    EXPECT_EQ(base64(""), "");
    EXPECT_EQ(base64("f"), "Zg==");
    EXPECT_EQ(base64("fo"), "Zm8=");
    EXPECT_EQ(base64("foo"), "Zm9v");
    EXPECT_EQ(base64("foobar"), "Zm9vYmFy");
}

TEST(Base64, TakesAllBytes) {
    EXPECT_EQ(base64(std::string("\xff\x00\xfe\x3f", 4)), "/wD+Pw==");
}

} // namespace
} // namespace halyard::ctl
