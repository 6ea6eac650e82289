// Opened by a thread that is about to block, for as long as it may.
//
// What a thread submits within a WakeUpScope is held back until the scope ends.
// A thread that blocks in the middle would hold it back for as long, and for good
// when it is this very work that it waits for. So the section lets go of what the
// thread has submitted, and what it still submits runs at once.
//
// Whoever waits for something that takes longer than a short lock opens one; it
// need not know whether the thread is a queue's. Costs two loads where it is not.
#pragma once

namespace halyard::linux_ {

class WakeUpScope;

class [[nodiscard]] BlockingSection {
public:
    BlockingSection();
    ~BlockingSection();
    BlockingSection(const BlockingSection&) = delete;
    BlockingSection& operator=(const BlockingSection&) = delete;

private:
    WakeUpScope* const interrupted_;
};

} // namespace halyard::linux_
