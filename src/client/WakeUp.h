// How writers wake the client's thread, only when it has to be woken.
//
// The thread says before it sleeps from how many queued bytes on it wants to
// know: at once when it has nothing to do; later when it is about to look by
// itself soon, so that a stream of messages costs its writers no system call;
// not before memory gets short when there is no daemon anyway.
#pragma once

#include <atomic>
#include <cstdint>

namespace halyard::client {

class WakeUp {
public:
    // Throws std::bad_alloc when there is no descriptor to be had.
    WakeUp();
    ~WakeUp();
    WakeUp(const WakeUp&) = delete;
    WakeUp& operator=(const WakeUp&) = delete;

    // Any thread, after its record is claimed: `used` bytes are queued. Urgent:
    // somebody waits for an answer. At most one system call, which never blocks.
    void notify(std::uint64_t used, bool urgent) noexcept {
        const std::uint64_t above = above_.load();
        if (above != kAwake && (urgent || used > above) && above_.exchange(kAwake) != kAwake) {
            ring();
        }
    }

    // The client's thread: from here on notify() makes descriptor() readable.
    // What was queued before may not have been told: look once more after this.
    void arm(std::uint64_t above) noexcept { above_.store(above); }
    void disarm() noexcept;
    int descriptor() const noexcept { return descriptor_; }

private:
    static constexpr std::uint64_t kAwake = UINT64_MAX;
    void ring() noexcept;

    std::atomic<std::uint64_t> above_{kAwake};
    int descriptor_;
};

} // namespace halyard::client
