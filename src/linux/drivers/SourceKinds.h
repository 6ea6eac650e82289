// The kinds of source: what each is called, what it gives, and how one is made.
//
// One table, which whoever reads an operator's channels looks at as well. Pure;
// any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "common/Result.h"
#include "linux/drivers/ChannelSource.h"
#include "linux/drivers/DriverChannel.h"

namespace halyard::linux_ {

struct SourceKind {
    std::string_view name;
    ChannelFormat format = ChannelFormat::Simple;
    // How many of its units make up a second; of states only.
    std::uint64_t residencyPerSecond = 1;
};

// The kind of a source "KIND:REST", as docs/drivers.md lists them; null when it is
// of none.
const SourceKind* findSourceKind(std::string_view source);

// Understands the whole of the source, or says what is wrong with it. Nothing needs
// to be there yet, but interrupts (irq:), which are looked for now.
Result<std::unique_ptr<ChannelSource>> makeChannelSource(std::string_view source, SourceRoot& root);

} // namespace halyard::linux_
