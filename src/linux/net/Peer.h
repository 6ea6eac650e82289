// Who is at the other end of a socket, and what they may do.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace halyard::linux_ {

// Names, or numeric ids in decimal, of those who are let in beside the daemon's
// own user and root.
struct Access {
    std::vector<std::string> users;
    std::vector<std::string> groups;
    std::vector<std::string> adminUsers;
    std::string readers{}; // The group that may read what is kept; empty: none.

    bool operator==(const Access&) const = default;
};

struct Peer {
    std::int32_t pid = 0;
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
    std::vector<std::uint32_t> groups; // supplementary

    bool isInGroup(std::uint32_t group) const;
    std::string description() const;
};

enum class PeerRights {
    None,
    Client,
    Administrator, // May also stop the service and use the admin methods.
};

// The kernel's record of who connected `socket`.
Peer peerOfSocket(int socket);

// By name, or by number in decimal.
std::optional<std::uint32_t> groupNumber(const std::string& name);

// The user with their groups, as the user database has them; may ask other machines.
Peer peerOfUser(std::uint32_t uid);

// The daemon's own uid and root may do everything.
PeerRights rightsOf(const Peer& peer, const Access& lists, std::uint32_t ownUid);

} // namespace halyard::linux_
