#include "otlp/RequestBody.h"

#include <algorithm>

#include <protozero/varint.hpp>

namespace halyard::exporting::otlp {
namespace {

constexpr std::string_view kScopeName = "halyard";

// What stands before a field of `length` bytes: a writer would have to be given them.
std::string headOf(Tag tag, std::size_t length) {
    std::string head;
    protozero::add_varint_to_buffer(
        &head, (tag << 3U) | static_cast<Tag>(protozero::pbf_wire_type::length_delimited));
    protozero::add_varint_to_buffer(&head, length);
    return head;
}

std::string scopeField() {
    std::string scope;
    Writer about(scope);
    about.add_string(request::kScopeName, kScopeName.data(), kScopeName.size());
    about.add_string(request::kScopeVersion, HALYARD_VERSION);
    return headOf(request::kScope, scope.size()) + scope;
}

} // namespace

RequestBody::Items& RequestBody::itemsOf(std::string_view kind) {
    const auto end = kinds_.begin() + static_cast<std::ptrdiff_t>(used_);
    const auto found =
        std::find_if(kinds_.begin(), end, [kind](const Items& each) { return each.kind == kind; });
    if (found != end) {
        return *found;
    }
    if (used_ == kMostKinds) {
        return kinds_.back();
    }
    if (used_ == kinds_.size()) {
        kinds_.emplace_back();
    }
    Items& items = kinds_[used_++];
    items.kind = kind;
    return items;
}

void RequestBody::clear() {
    std::size_t kept = 0;
    for (Items& items : kinds_) {
        items.bytes.clear();
        kept += items.bytes.capacity();
    }
    if (kept > kMostKept) {
        kinds_.clear();
    }
    used_ = count_ = bytes_ = 0;
}

void RequestBody::add(std::string_view item, std::string_view kind) {
    std::string& bytes = itemsOf(kind).bytes;
    const std::size_t before = bytes.size();
    Writer(bytes).add_message(request::kItem, item.data(), item.size());
    bytes_ += bytes.size() - before;
    ++count_;
}

// The items are copied once, although they are three messages deep.
void RequestBody::finish(std::string_view attributes, std::string& body) const {
    body.clear();
    if (count_ == 0) {
        return;
    }
    const std::string scope = scopeField();
    std::string resource = headOf(request::kResource, attributes.size());
    resource.append(attributes);
    resource += headOf(request::kScopeItems, scope.size() + bytes_);
    const std::size_t inner = resource.size() + scope.size() + bytes_;
    body = headOf(request::kResourceItems, inner);
    body.reserve(body.size() + inner);
    body.append(resource).append(scope);
    for (std::size_t i = 0; i < used_; ++i) {
        body.append(kinds_[i].bytes);
    }
}

} // namespace halyard::exporting::otlp
