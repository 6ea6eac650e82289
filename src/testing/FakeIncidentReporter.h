#pragma once

#include <utility>
#include <vector>

#include "platform/IncidentReporter.h"

namespace halyard::testing {

// Records the requests; the test answers them when it wants.
class FakeIncidentReporter final : public platform::IncidentReporter {
public:
    struct Request {
        Dictionary signature;
        double duration;
        Value event;
        Value payload;
        Reply reply;
    };

    void snapshotWithSignature(const Dictionary& signature, double duration, const Value& event,
                               const Value& payload, Reply reply) override {
        requests.push_back({signature, duration, event, payload, std::move(reply)});
    }

    std::vector<Request> requests;
};

} // namespace halyard::testing
