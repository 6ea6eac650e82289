// Who takes what is sent.
//
// An interface, so that the exporter's decisions are tested without a network. One thread.
#pragma once

#include <string>
#include <string_view>

#include "place/ExportPlace.h"
#include "send/Answer.h"

namespace halyard::exporting {

class Receiver {
public:
    virtual ~Receiver() = default;
    // Sends one request and waits for its answer.
    virtual Answer post(Signal signal, std::string_view body, bool isCompressed) = 0;
};

} // namespace halyard::exporting
