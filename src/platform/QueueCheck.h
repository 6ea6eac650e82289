// "Runs on this queue", said so that debug builds check it: for queues what the
// thread annotations are for locks. Nothing of it is left in a release build.
//
// Code that knows its queue states it with HY_ASSERT_ON_QUEUE at its entry. An
// object that is only ever used where it was made, and does not know where that
// is, keeps a SameQueue; a test that drives it on its own thread, outside of any
// queue, keeps to the rule as well.
#pragma once

#include <cassert>

#include "platform/WorkQueue.h"

// `queue` is a pointer, or acts like one.
#define HY_ASSERT_ON_QUEUE(queue) assert((queue)->isCurrent())

namespace halyard::platform {

class SameQueue {
public:
    SameQueue() noexcept {} // A const member without one needs a member to set.
    // Requires the queue that it was made on.
    void check() const { assert(SerialQueue::current() == madeOn_); }

#ifndef NDEBUG
private:
    const SerialQueue* const madeOn_ = SerialQueue::current();
#endif
};

} // namespace halyard::platform
