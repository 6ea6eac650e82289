#include "client/WakeUp.h"

#include <sys/eventfd.h>
#include <unistd.h>

#include <new>

namespace halyard::client {

WakeUp::WakeUp() : descriptor_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    if (descriptor_ < 0) {
        throw std::bad_alloc();
    }
}

WakeUp::~WakeUp() {
    ::close(descriptor_);
}

void WakeUp::ring() noexcept {
    static_cast<void>(::eventfd_write(descriptor_, 1));
}

void WakeUp::disarm() noexcept {
    if (above_.exchange(kAwake) == kAwake) { // Rung, or about to be.
        eventfd_t count = 0;
        static_cast<void>(::eventfd_read(descriptor_, &count));
    }
}

} // namespace halyard::client
