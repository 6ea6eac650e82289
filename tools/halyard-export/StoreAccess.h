// The daemon's store, opened for a moment at a time.
//
// Not kept open: the last who closes it tidies up, and that is for the daemon to do. Not
// thread-safe.
#pragma once

#include <filesystem>
#include <optional>
#include <string>

#include "content/ConsentHistory.h"
#include "reading/StoreReader.h"

namespace halyard::exporting {

struct StoreFacts {
    std::string device; // empty: the daemon gave it no identity yet
    ConsentHistory consent;
};

// None where there is nothing to be read now: no store, or one that a daemon which was
// killed left with a write-ahead log, which is for the next daemon to take up.
reading::Outcome<std::optional<reading::StoreReader>> openStore(const std::filesystem::path& path);

reading::Outcome<StoreFacts> factsOf(reading::StoreReader& reader);

} // namespace halyard::exporting
