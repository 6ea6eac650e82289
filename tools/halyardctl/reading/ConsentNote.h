// What a store says of its owner's consent.
#pragma once

#include <optional>

#include "reading/StoreReader.h"

namespace halyard::reading {

struct ConsentNote {
    bool given = false;
    double time = 0; // seconds since 1970
};

// The newest; none when nothing was ever noted, or the store is of a daemon that noted
// nothing.
Outcome<std::optional<ConsentNote>> newestConsentNote(StoreReader& reader);

} // namespace halyard::reading
