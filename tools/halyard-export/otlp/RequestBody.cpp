#include "otlp/RequestBody.h"

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

// The items are copied once, although they are three messages deep.
void RequestBody::finish(std::string_view attributes, std::string& body) const {
    body.clear();
    if (count_ == 0) {
        return;
    }
    const std::string scope = scopeField();
    std::string resource = headOf(request::kResource, attributes.size());
    resource.append(attributes);
    resource += headOf(request::kScopeItems, scope.size() + items_.size());
    const std::size_t inner = resource.size() + scope.size() + items_.size();
    body = headOf(request::kResourceItems, inner);
    body.reserve(body.size() + inner);
    body.append(resource).append(scope).append(items_);
}

} // namespace halyard::exporting::otlp
