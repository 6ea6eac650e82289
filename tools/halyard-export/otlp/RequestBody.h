// One request's body as it grows: the items of one resource and one scope, which logs,
// spans and metrics have alike.
//
// Items of a kind stand together, because what is alike is compressed best when it is near:
// that takes a twelfth of the logs' bytes. Kinds are in the order of their first items, items of
// a kind in theirs. Not thread-safe.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "otlp/Attributes.h"

namespace halyard::exporting::otlp {

class RequestBody {
public:
    // `item` is an encoded LogRecord, Span or Metric.
    void add(std::string_view item, std::string_view kind = {});
    // As new, but for the memory of what was in it.
    void clear();
    std::size_t count() const { return count_; }
    // Of the items alone.
    std::size_t bytes() const { return bytes_; }

    // Writes the whole message to `body`; empty when it has no items. `attributes` are those
    // of the resource, encoded as fields of a Resource.
    void finish(std::string_view attributes, std::string& body) const;

private:
    // Clients make kinds up: what comes beyond these goes with the last.
    static constexpr std::size_t kMostKinds = 32;
    // Of what is kept for the next.
    static constexpr std::size_t kMostKept = 4 * 1024 * 1024;
    struct Items {
        std::string kind;
        std::string bytes;
    };
    Items& itemsOf(std::string_view kind);

    std::vector<Items> kinds_;
    std::size_t used_ = 0; // of these kinds
    std::size_t count_ = 0;
    std::size_t bytes_ = 0;
};

} // namespace halyard::exporting::otlp
