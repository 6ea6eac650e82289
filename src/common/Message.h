// A message on its way from the client to the sinks, the batch and the upload.
#pragma once

#include "common/HYReportingUtility.h"
#include "common/Value.h"

namespace halyard {

// A request carries the type in 16 bits and an upload the category in 16;
// between the two both are whole.
struct Message {
    Dictionary payload;
    AudioEventCategory category = kAudioEventCategoryUndefined;
    AudioEventType type = kAudioEventTypeUnknown;
};

} // namespace halyard
