// A message that goes out on its own: where no session is started to carry it.
//
// Any thread.
#pragma once

#include <functional>

#include "common/Error.h"
#include "common/Message.h"

namespace halyard {

using SendReply = std::function<void(const MaybeError&)>;

// Uploads it one second later, from the background queue. The reply may be null;
// it learns what became of the upload.
void sendSingleMessage(Message message, AudioServiceType serviceType, SendReply reply);

} // namespace halyard
