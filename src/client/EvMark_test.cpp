#include <gtest/gtest.h>

#include <cstring>

#include "halyard/halyard.h"

namespace {

// Whatever stood before it (a prologue, a landing pad, a profiler's call) would
// cost every probed call a single step in the kernel, and could move arguments.
TEST(EvMarkTest, BeginsWithANopAndReturns) {
    unsigned char code[8];
    std::memcpy(code, reinterpret_cast<const void*>(&evmark_trace), sizeof(code));
#if defined(__x86_64__)
    const unsigned char expected[] = {0x0F, 0x1F, 0x44, 0x00, 0x00, 0xC3};
#else
    const unsigned char expected[] = {0x1F, 0x20, 0x03, 0xD5, 0xC0, 0x03, 0x5F, 0xD6};
#endif
    EXPECT_EQ(std::memcmp(code, expected, sizeof(expected)), 0);
}

TEST(EvMarkTest, MayBeCalledWithoutAClient) {
    evmark_trace(0x21044814, 1, 2, 3, 4);
}

} // namespace
