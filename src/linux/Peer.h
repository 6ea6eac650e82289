// Who is at the other end of a socket, and what they may do.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace halyard::linux_ {

struct Peer {
    std::int32_t pid = 0;
    std::uint32_t uid = 0;
    std::uint32_t gid = 0;
    std::vector<std::uint32_t> groups; // supplementary

    bool isInGroup(std::uint32_t group) const;
    std::string description() const;
};

enum class Access {
    Refused,
    Client,
    Administrator, // May also stop the service and use the admin methods.
};

// The kernel's record of who connected `socket`.
Peer peerOfSocket(int socket);

// Users and groups by name or number. Names that do not exist match nobody.
struct AccessLists {
    std::vector<std::string> users;
    std::vector<std::string> groups;
    std::vector<std::string> adminUsers;
};

// The daemon's own uid and root may do everything.
Access accessOf(const Peer& peer, const AccessLists& lists, std::uint32_t ownUid);

} // namespace halyard::linux_
