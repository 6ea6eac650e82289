// What something that is made later is taken to weigh until then: like the largest of
// late, since a guess that is too small lets memory grow.
//
// Any thread asks; one at a time notes what a thing has come to.
#pragma once

#include <algorithm>
#include <atomic>
#include <cstddef>

namespace halyard::platform {

class SizeExpectation {
public:
    std::size_t bytes() const { return bytes_.load(std::memory_order_relaxed); }
    void note(std::size_t bytes) {
        const std::size_t expected = this->bytes();
        bytes_.store(std::max(bytes, expected - expected / kForgetShare),
                     std::memory_order_relaxed);
    }

private:
    // How fast a large one is forgotten.
    static constexpr std::size_t kForgetShare = 64;

    std::atomic<std::size_t> bytes_{1024};
};

} // namespace halyard::platform
