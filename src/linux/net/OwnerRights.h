// Whether the owner of a file may connect, for what is read of files in place of a
// connection.
//
// The kernel knows the groups of a process, but not those of an owner: they come
// from the user database, which may have to ask other machines. So an answer is
// kept for a minute, unless the lists change.
//
// One thread at a time.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <memory>

#include "linux/net/Peer.h"
#include "platform/Clock.h"

namespace halyard::linux_ {

class OwnerRights {
public:
    // Answers another object when the lists have changed.
    using Lists = std::function<std::shared_ptr<const Access>()>;
    using FindUser = std::function<Peer(std::uint32_t uid)>;

    // Borrows the clock.
    OwnerRights(const platform::Clock& clock, Lists lists, std::uint32_t ownUid,
                FindUser findUser = peerOfUser);

    bool mayConnect(std::uint32_t uid);

private:
    struct Answer {
        bool mayConnect = false;
        platform::SteadyTime until;
    };

    const platform::Clock& clock_;
    const Lists lists_;
    const std::uint32_t ownUid_;
    const FindUser findUser_;
    std::shared_ptr<const Access> access_; // that the answers are of
    std::map<std::uint32_t, Answer> answers_;
};

} // namespace halyard::linux_
