// A message on its way from the client to the sinks, the batch and the upload.
#pragma once

#include <cstdint>

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

// Log lines show categories and types as signed numbers: a summary's category is -1.
inline std::int32_t shownInLog(std::uint32_t number) {
    return static_cast<std::int32_t>(number);
}

} // namespace halyard
