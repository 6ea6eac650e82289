#include "common/KeyTable.h"

#include "common/Mutex.h"

namespace halyard {
namespace {

struct SharedKeys {
    Mutex mutex;
    std::unordered_map<std::string_view, Value> keys HY_GUARDED_BY(mutex);
};

SharedKeys& sharedKeys() {
    static auto* shared = new SharedKeys; // Interned keys outlive every thread.
    return *shared;
}

} // namespace

Value KeyTable::intern(std::string_view key) {
    if (key.size() <= Value::kMaxInline || key.size() > kMaxKeyLength) {
        return Value(key);
    }
    if (const auto known = known_.find(key); known != known_.end()) {
        return known->second;
    }
    SharedKeys& shared = sharedKeys();
    const MutexLock lock(shared.mutex);
    auto at = shared.keys.find(key);
    if (at == shared.keys.end()) {
        if (shared.keys.size() >= kMaxKeys) {
            return Value(key);
        }
        Value interned(key);
        interned.wide_.block->references.store(detail::Counted::kImmortal,
                                               std::memory_order_relaxed);
        at = shared.keys.emplace(interned.text(), interned).first;
    }
    known_.emplace(at->first, at->second);
    return at->second;
}

} // namespace halyard
