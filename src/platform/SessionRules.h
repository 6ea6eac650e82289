// What an operator may settle about sessions.
//
// Kept with the platform (see Platform). Any thread; a change holds from the next
// decision on.
#pragma once

#include <atomic>
#include <cstdint>

namespace halyard::platform {

class SessionRules {
public:
    struct Values {
        // How many sessions may be active for one more to be uploaded still.
        std::int64_t uploadLimit = 5;
        // Whether a session that is lost, destroyed or replaced while it runs stops
        // counting as active.
        bool recount = false;

        bool operator==(const Values&) const = default;
    };

    // Const like the platform that they are kept with.
    void set(const Values& values) const {
        uploadLimit_ = values.uploadLimit;
        recount_ = values.recount;
    }
    std::int64_t uploadLimit() const { return uploadLimit_; }
    bool recount() const { return recount_; }

private:
    mutable std::atomic<std::int64_t> uploadLimit_{Values().uploadLimit};
    mutable std::atomic<bool> recount_{Values().recount};
};

} // namespace halyard::platform
