// The driver statistics that sessions were told of, out of their messages.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <string_view>

#include "report/Digest.h"

namespace halyard::ctl {

class SessionStatistics {
public:
    // Borrows the digest.
    explicit SessionStatistics(Digest& digest) : digest_(digest) {}

    // Of any message; those that hold no statistics are passed over.
    void take(std::int64_t session, std::int64_t category, std::int64_t type,
              std::string_view payload);

private:
    void takeEntry(std::int64_t session, std::int64_t type, std::string_view key,
                   const rapidjson::Value& value);

    Digest& digest_;
};

} // namespace halyard::ctl
