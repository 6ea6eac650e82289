// Offers every message to the analytics service, under a name of its category
// and type and under one that also tells the service it is about.
//
// Whether anybody wants an event of such a name is the analytics service's
// business, so the payload is built only when it asks; a message that nobody
// wants is neither copied nor does it cost an allocation.
//
// Stateless; any thread.
#pragma once

#include <memory>

#include "common/HYReportingUtility.h"
#include "platform/EventServices.h"
#include "sinks/SessionFacts.h"

namespace halyard {

class HYReportingTallyhubBridge final {
public:
    HYReportingTallyhubBridge() = delete;

    // `message` is null when it is absent, and then nothing happens. Requires a
    // session.
    static void handleEvent(const Dictionary* message, AudioEventCategory category,
                            AudioEventType type,
                            const std::shared_ptr<const SessionFacts>& session);

    // The message with the application's name put on top; without a name, what
    // the client itself claims under that key goes as well.
    static platform::EventPayload payload(Dictionary message, Value applicationName);
};

} // namespace halyard
