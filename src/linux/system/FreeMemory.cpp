#include "linux/system/FreeMemory.h"

#include <cstdio>
#include <malloc.h>
#include <unistd.h>
#include <utility>

// The allocator's, where the daemon is linked with it.
extern "C" void mi_collect(bool force) __attribute__((weak));

namespace halyard::linux_ {

void returnFreeMemory() {
    if (mi_collect != nullptr) {
        mi_collect(true);
    } else {
        (void)::malloc_trim(0);
    }
}

std::size_t residentBytes() {
    std::FILE* const file = std::fopen("/proc/self/statm", "re");
    if (file == nullptr) {
        return 0;
    }
    unsigned long pages = 0;
    const int read = std::fscanf(file, "%*u %lu", &pages);
    (void)std::fclose(file);
    return read == 1 ? pages * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) : 0;
}

void FreeMemory::released() {
    again_ = true;
    if (!std::exchange(looking_, true)) {
        again_ = false;
        lookIn(kFirstLook);
    }
}

void FreeMemory::lookIn(std::chrono::seconds delay) {
    queue_.asyncAfter(delay, [this, delay] {
        const bool large = actions_.residentBytes() > kUsualBytes;
        if (large) {
            actions_.returnFromAllThreads();
        }
        if (std::exchange(again_, false)) {
            lookIn(kFirstLook);
        } else if (large && delay < kLastLook) {
            lookIn(delay * 2);
        } else {
            looking_ = false;
        }
    });
}

} // namespace halyard::linux_
