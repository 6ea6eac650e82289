// The table of methods: what each is called and which arguments it takes.
// Private to protocol/; decoder and encoder both go by it.
#pragma once

#include <array>
#include <cstdint>
#include <limits>
#include <optional>
#include <span>
#include <string_view>

#include "protocol/Request.h"

namespace halyard::protocol {

// One for each member of Arguments.
enum class Argument : std::uint8_t {
    ReporterID,
    ServiceType,
    Dictionary,
    Category,
    Type,
    ReporterIDList,
    Name,
};

struct MethodEntry {
    static constexpr std::size_t kMaxArguments = 4;

    Method method;
    std::string_view name;
    std::uint8_t count = 0;
    std::array<Argument, kMaxArguments> list{};

    std::span<const Argument> arguments() const { return {list.data(), count}; }
};

const MethodEntry& methodEntry(Method method);
// Null when there is no such method.
const MethodEntry* findMethod(std::string_view name);

std::string_view argumentName(Argument argument);
// "an integer from 0 to 65535"
std::string_view argumentType(Argument argument);

} // namespace halyard::protocol
