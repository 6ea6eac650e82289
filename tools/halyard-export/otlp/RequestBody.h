// One request's body as it grows: the items of one resource and one scope, which logs,
// spans and metrics have alike.
//
// Not thread-safe.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "otlp/Attributes.h"

namespace halyard::exporting::otlp {

class RequestBody {
public:
    // `item` is an encoded LogRecord, Span or Metric.
    void add(std::string_view item) {
        Writer(items_).add_message(request::kItem, item.data(), item.size());
        ++count_;
    }
    std::size_t count() const { return count_; }
    // Of the items alone.
    std::size_t bytes() const { return items_.size(); }

    // Writes the whole message to `body`; empty when it has no items. `attributes` are those
    // of the resource, encoded as fields of a Resource.
    void finish(std::string_view attributes, std::string& body) const;

private:
    std::string items_;
    std::size_t count_ = 0;
};

} // namespace halyard::exporting::otlp
