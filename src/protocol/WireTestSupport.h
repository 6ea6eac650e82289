// Frames for the tests of this folder, encoded by msgpack-cxx or byte by byte.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <msgpack.hpp>
#include <string>
#include <string_view>
#include <vector>

namespace halyard::protocol {

inline std::string raw(std::initializer_list<int> bytes) {
    std::string result;
    for (const int byte : bytes) {
        result += static_cast<char>(static_cast<unsigned char>(byte));
    }
    return result;
}

template <class T> std::string packed(const T& value) {
    msgpack::sbuffer buffer;
    msgpack::pack(buffer, value);
    return {buffer.data(), buffer.size()};
}

inline std::string packedNil() {
    return raw({0xC0});
}

inline std::string joined(const std::vector<std::string>& parts) {
    std::string result;
    for (const std::string& part : parts) {
        result += part;
    }
    return result;
}

inline std::string packedArray(const std::vector<std::string>& elements) {
    msgpack::sbuffer head;
    msgpack::packer(head).pack_array(static_cast<std::uint32_t>(elements.size()));
    return std::string(head.data(), head.size()) + joined(elements);
}

// Keys and values in turn.
inline std::string packedMap(const std::vector<std::string>& keysAndValues) {
    msgpack::sbuffer head;
    msgpack::packer(head).pack_map(static_cast<std::uint32_t>(keysAndValues.size() / 2));
    return std::string(head.data(), head.size()) + joined(keysAndValues);
}

inline std::string packedRequest(std::string_view method, const std::vector<std::string>& params) {
    return packedArray({packed(0), packed(1), packed(method), packedArray(params)});
}

} // namespace halyard::protocol
