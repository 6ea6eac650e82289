#include "tracing/PropertyList.h"

#include <cstdint>
#include <cstdlib>
#include <fmt/format.h>
#include <memory>
#include <plist/plist.h>
#include <string>

#include "common/PropertyListText.h"
#include "tracing/BinaryPropertyListExtent.h"

namespace halyard {
namespace {

constexpr std::string_view kBinaryMagic = "bplist";
constexpr int kMostXmlContainers = 10'000;
// Dates count from 2001 in property lists.
constexpr std::int64_t kSecondsTo2001 = 978'307'200;

struct FreeNode {
    void operator()(void* node) const { plist_free(node); }
};
struct FreeText {
    void operator()(char* text) const { std::free(text); }
};
using Node = std::unique_ptr<void, FreeNode>;
using Text = std::unique_ptr<char, FreeText>;

Error propertyListError(std::string_view what) {
    return {std::string(kPropertyListErrorDomain), 1, std::string(what)};
}

bool beginsXml(std::string_view bytes) {
    const std::size_t first = bytes.find_first_not_of(" \t\r\n");
    const std::string_view begin =
        bytes.substr(first == std::string_view::npos ? bytes.size() : first);
    return begin.starts_with("<?xml") || begin.starts_with("<!DOCTYPE") ||
           begin.starts_with("<plist") || begin.starts_with("<!--") ||
           begin.starts_with("\xEF\xBB\xBF<");
}

// Whether what is open at `at`, behind its name, is closed at once: <array/>.
bool isEmptyElement(std::string_view bytes, std::size_t at) {
    const std::size_t next = bytes.find_first_not_of(" \t\r\n", at);
    return next != std::string_view::npos && bytes.substr(next).starts_with("/>");
}

// The library frees its tree by recursion, so depth is settled before it reads.
// Comments and attributes count like the rest; nobody nests that deep. But ends in
// them would hide levels, so all beginnings together are bounded, too: by what
// every stack has room for.
MaybeError depthError(std::string_view bytes) {
    int depth = 0;
    int openings = 0;
    for (std::size_t at = bytes.find('<'); at != std::string_view::npos;
         at = bytes.find('<', at + 1)) {
        const std::string_view tag = bytes.substr(at + 1, 6);
        const std::size_t name = tag.starts_with("dict") ? 4 : tag.starts_with("array") ? 5 : 0;
        if (name > 0 && !isEmptyElement(bytes, at + 1 + name)) {
            ++openings;
            if (++depth > kMostPropertyListLevels) {
                return propertyListError("too many levels");
            }
        } else if (tag.starts_with("/dict") || tag.starts_with("/array")) {
            --depth;
        }
    }
    return openings > kMostXmlContainers
               ? MaybeError(propertyListError("too many lists and dictionaries"))
               : std::nullopt;
}

bool isSaneBinary(std::string_view bytes) {
    BinaryPropertyListExtent extent(bytes, kMostPropertyListLevels, kMostPropertyListBytes);
    return extent.measure().has_value();
}

std::string dataText(plist_t node) {
    std::uint64_t length = 0;
    const char* const bytes = plist_get_data_ptr(node, &length);
    std::string text = "<";
    for (std::uint64_t i = 0; i < length; ++i) {
        fmt::format_to(std::back_inserter(text), "{:02x}", static_cast<unsigned char>(bytes[i]));
    }
    return text + '>';
}

// Throws Error.
Value valueOf(plist_t node, int level);

Value listOf(plist_t node, int level) {
    List list;
    plist_array_iter cursor = nullptr;
    plist_array_new_iter(node, &cursor);
    const std::unique_ptr<void, decltype(&std::free)> owned(cursor, &std::free);
    for (;;) {
        plist_t item = nullptr;
        plist_array_next_item(node, cursor, &item);
        if (item == nullptr) {
            return list;
        }
        list.append(valueOf(item, level + 1));
    }
}

Value dictionaryOf(plist_t node, int level) {
    std::vector<Dictionary::Entry> entries;
    plist_dict_iter cursor = nullptr;
    plist_dict_new_iter(node, &cursor);
    const std::unique_ptr<void, decltype(&std::free)> owned(cursor, &std::free);
    for (;;) {
        char* key = nullptr;
        plist_t item = nullptr;
        plist_dict_next_item(node, cursor, &key, &item);
        const Text ownedKey(key);
        if (item == nullptr) {
            return Dictionary(std::move(entries));
        }
        entries.push_back({std::string_view(key), valueOf(item, level + 1)});
    }
}

Value dateOf(plist_t node) {
    std::int32_t seconds = 0;
    std::int32_t microseconds = 0;
    plist_get_date_val(node, &seconds, &microseconds);
    return Date{seconds + kSecondsTo2001, 0};
}

Value valueOf(plist_t node, int level) {
    if (level >= kMostPropertyListLevels) {
        throw propertyListError("too many levels");
    }
    std::uint8_t boolean = 0;
    std::uint64_t integer = 0;
    double real = 0;
    switch (plist_get_node_type(node)) {
    case PLIST_DICT:
        return dictionaryOf(node, level);
    case PLIST_ARRAY:
        return listOf(node, level);
    case PLIST_STRING: {
        std::uint64_t length = 0;
        const char* const text = plist_get_string_ptr(node, &length);
        return text != nullptr ? Value(std::string_view(text, length)) : Value("");
    }
    case PLIST_BOOLEAN:
        plist_get_bool_val(node, &boolean);
        return boolean != 0;
    case PLIST_UINT:
        plist_get_uint_val(node, &integer);
        return static_cast<std::int64_t>(integer);
    case PLIST_REAL:
        plist_get_real_val(node, &real);
        return real;
    case PLIST_DATE:
        return dateOf(node);
    case PLIST_DATA:
        return dataText(node);
    default:
        throw propertyListError("a value of unknown type");
    }
}

std::variant<Value, Error> parseWithLibrary(std::string_view bytes, bool binary) {
    plist_t root = nullptr;
    const auto size = static_cast<std::uint32_t>(bytes.size());
    if (binary) {
        plist_from_bin(bytes.data(), size, &root);
    } else {
        plist_from_xml(bytes.data(), size, &root);
    }
    const Node owned(root);
    if (root == nullptr) {
        return propertyListError(binary ? "a damaged binary property list"
                                        : "a damaged XML property list");
    }
    try {
        return valueOf(root, 0);
    } catch (const Error& error) {
        return error;
    }
}

} // namespace

std::variant<Value, Error> parsePropertyList(std::string_view bytes) {
    if (bytes.size() > kMostPropertyListBytes) {
        return propertyListError("too large");
    }
    if (bytes.starts_with(kBinaryMagic)) {
        return isSaneBinary(bytes)
                   ? parseWithLibrary(bytes, true)
                   : propertyListError("a binary property list that is damaged or too large");
    }
    if (!beginsXml(bytes)) {
        return parsePropertyListText(bytes);
    }
    const MaybeError error = depthError(bytes);
    return error ? *error : parseWithLibrary(bytes, false);
}

} // namespace halyard
