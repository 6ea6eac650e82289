// Trace parameter files are named by clients: no text may do more than be
// refused, and what is accepted must survive being written and read again.

#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <variant>

#include "Require.h"
#include "common/Description.h"
#include "common/PropertyListText.h"

using halyard::Error;
using halyard::Value;
using halyard::fuzz::require;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto first = halyard::parsePropertyListText({reinterpret_cast<const char*>(data), size});
    if (const auto* const error = std::get_if<Error>(&first)) {
        require(!error->message.empty());
        return 0;
    }
    const auto& value = std::get<Value>(first);
    require(!value.isNone());
    if (value.isList() || value.isDictionary()) {
        const auto second = halyard::parsePropertyListText(halyard::describe(value));
        require(std::holds_alternative<Value>(second) && std::get<Value>(second) == value);
    }
    return 0;
}
