// Interns message keys, so that the few hundred keys a device ever uses are
// stored once and copied without touching a reference count.
//
// Interned keys are never freed and the table behind all KeyTables is shared by
// the process, which is why both its entries and their length are bounded: a
// client that invents keys merely gets ordinary, counted ones.
//
// Not thread-safe: one table per decoding thread. Values it returns may go
// anywhere.
#pragma once

#include <cstddef>
#include <string_view>
#include <unordered_map>

#include "common/Value.h"

namespace halyard {

class KeyTable {
public:
    static constexpr std::size_t kMaxKeys = 4096;
    static constexpr std::size_t kMaxKeyLength = 64;

    // A string value equal to `key`.
    Value intern(std::string_view key);

private:
    std::unordered_map<std::string_view, Value> known_;
};

} // namespace halyard
