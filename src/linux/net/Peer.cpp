#include "linux/net/Peer.h"

#include <algorithm>
#include <charconv>
#include <fmt/format.h>
#include <grp.h>
#include <optional>
#include <pwd.h>
#include <sys/socket.h>

namespace halyard::linux_ {
namespace {

constexpr std::size_t kLookupBuffer = 16384;
constexpr int kMaxGroups = 1024; // of a user

std::optional<std::uint32_t> asNumber(const std::string& name) {
    std::uint32_t number = 0;
    const auto result = std::from_chars(name.data(), name.data() + name.size(), number);
    if (result.ec != std::errc{} || result.ptr != name.data() + name.size()) {
        return std::nullopt;
    }
    return number;
}

std::optional<std::uint32_t> uidOf(const std::string& name) {
    if (const auto number = asNumber(name)) {
        return number;
    }
    char buffer[kLookupBuffer];
    passwd entry{};
    passwd* found = nullptr;
    ::getpwnam_r(name.c_str(), &entry, buffer, sizeof buffer, &found);
    return found != nullptr ? std::optional(found->pw_uid) : std::nullopt;
}

std::optional<std::uint32_t> gidOf(const std::string& name) {
    if (const auto number = asNumber(name)) {
        return number;
    }
    char buffer[kLookupBuffer];
    group entry{};
    group* found = nullptr;
    ::getgrnam_r(name.c_str(), &entry, buffer, sizeof buffer, &found);
    return found != nullptr ? std::optional(found->gr_gid) : std::nullopt;
}

bool namesUser(const std::vector<std::string>& names, std::uint32_t uid) {
    return std::any_of(names.begin(), names.end(),
                       [&](const auto& name) { return uidOf(name) == uid; });
}

bool namesGroupOf(const std::vector<std::string>& names, const Peer& peer) {
    return std::any_of(names.begin(), names.end(), [&](const auto& name) {
        const auto group = gidOf(name);
        return group && peer.isInGroup(*group);
    });
}

} // namespace

bool Peer::isInGroup(std::uint32_t group) const {
    return gid == group || std::find(groups.begin(), groups.end(), group) != groups.end();
}

std::string Peer::description() const {
    return fmt::format("pid={},uid={},gid={}", pid, uid, gid);
}

Peer peerOfSocket(int socket) {
    ucred credentials{};
    socklen_t length = sizeof credentials;
    Peer peer;
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) {
        peer.uid = peer.gid = static_cast<std::uint32_t>(-1); // Nobody: gets refused.
        return peer;
    }
    peer.pid = credentials.pid;
    peer.uid = credentials.uid;
    peer.gid = credentials.gid;
    std::vector<gid_t> groups(64);
    length = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
    int result = ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length);
    if (result != 0 && length > groups.size() * sizeof(gid_t)) {
        groups.resize(length / sizeof(gid_t));
        result = ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &length);
    }
    if (result == 0) {
        groups.resize(length / sizeof(gid_t));
        peer.groups.assign(groups.begin(), groups.end());
    }
    return peer;
}

std::optional<std::uint32_t> groupNumber(const std::string& name) {
    return gidOf(name);
}

Peer peerOfUser(std::uint32_t uid) {
    Peer peer;
    peer.uid = uid;
    peer.gid = static_cast<std::uint32_t>(-1); // Nobody's, unless the user is known.
    char buffer[kLookupBuffer];
    passwd entry{};
    passwd* found = nullptr;
    ::getpwuid_r(uid, &entry, buffer, sizeof buffer, &found);
    if (found != nullptr) {
        peer.gid = found->pw_gid;
        int count = kMaxGroups;
        peer.groups.resize(kMaxGroups);
        ::getgrouplist(found->pw_name, found->pw_gid, peer.groups.data(), &count);
        peer.groups.resize(static_cast<std::size_t>(std::clamp(count, 0, kMaxGroups)));
    }
    return peer;
}

PeerRights rightsOf(const Peer& peer, const Access& lists, std::uint32_t ownUid) {
    if (peer.uid == 0 || peer.uid == ownUid) {
        return PeerRights::Administrator;
    }
    if (namesUser(lists.adminUsers, peer.uid)) {
        return PeerRights::Administrator;
    }
    return namesUser(lists.users, peer.uid) || namesGroupOf(lists.groups, peer) ? PeerRights::Client
                                                                                : PeerRights::None;
}

} // namespace halyard::linux_
