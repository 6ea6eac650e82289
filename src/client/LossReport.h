// Tells daemons of messages that came no further than the client, so that they are missed
// where the others are counted: each once, unless the connection breaks while it is told.
//
// Belongs to the client's thread.
#pragma once

#include <optional>
#include <string>

#include "client/Client.h"

namespace halyard::client {

class LossReport {
public:
    // Appends a call that tells what has been lost since the last, if anything has.
    void append(std::string& out, const Client::Losses& losses);
    // What was appended is written; or the connection is gone with it.
    void written();
    void gone() { telling_.reset(); }

private:
    Client::Losses told_{};
    std::optional<Client::Losses> telling_;
};

} // namespace halyard::client
