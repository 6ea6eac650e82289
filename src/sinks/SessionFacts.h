#pragma once

#include "common/HYReportingUtility.h"
#include "common/Value.h"

namespace halyard {

// The little that a sink reads of the session a message came in for. Held by
// reference count, because a payload may be built long after the call.
// Any thread.
class SessionFacts {
public:
    virtual ~SessionFacts() = default;
    virtual AudioServiceType serviceType() const = 0;
    // As it is now; later changes do not show in what was returned.
    virtual Dictionary configuration() const = 0;
};

} // namespace halyard
