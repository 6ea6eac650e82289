#include "otlp/RequestBody.h"

namespace halyard::exporting::otlp {
namespace {

constexpr std::string_view kScopeName = "halyard";

std::string scopeItems(const std::string& items) {
    std::string scope;
    Writer about(scope);
    about.add_string(request::kScopeName, kScopeName.data(), kScopeName.size());
    about.add_string(request::kScopeVersion, HALYARD_VERSION);
    std::string message;
    message.reserve(items.size() + scope.size() + 16);
    Writer(message).add_message(request::kScope, scope);
    return message += items;
}

} // namespace

std::string RequestBody::finished(std::string_view attributes) const {
    if (count_ == 0) {
        return {};
    }
    std::string resource;
    Writer writer(resource);
    writer.add_message(request::kResource, attributes.data(), attributes.size());
    writer.add_message(request::kScopeItems, scopeItems(items_));
    std::string body;
    Writer(body).add_message(request::kResourceItems, resource);
    return body;
}

} // namespace halyard::exporting::otlp
