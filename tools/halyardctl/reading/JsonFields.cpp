#include "reading/JsonFields.h"

#include <cmath>

#include "reading/JsonDocument.h"

namespace halyard::reading {

bool JsonFields::parse(std::string_view text) {
    root_ = rapidjson::Value();
    allocator_.Clear();
    rapidjson::Document document(&allocator_);
    if (parseJson(text, Encoding::Any, document) && document.IsObject()) {
        root_.Swap(document);
    }
    return root_.IsObject();
}

const rapidjson::Value* JsonFields::find(const char* key) const {
    if (!root_.IsObject()) {
        return nullptr;
    }
    const auto found = root_.FindMember(key);
    return found == root_.MemberEnd() ? nullptr : &found->value;
}

std::optional<std::string_view> JsonFields::text(const char* key) const {
    const rapidjson::Value* const value = find(key);
    if (value == nullptr || !value->IsString()) {
        return std::nullopt;
    }
    return std::string_view(value->GetString(), value->GetStringLength());
}

std::optional<double> JsonFields::number(const char* key) const {
    const rapidjson::Value* const value = find(key);
    if (value != nullptr && value->IsBool()) {
        return value->GetBool() ? 1 : 0;
    }
    return value != nullptr && value->IsNumber() ? std::optional(value->GetDouble()) : std::nullopt;
}

std::optional<std::int64_t> JsonFields::integer(const char* key) const {
    const rapidjson::Value* const value = find(key);
    if (value != nullptr && value->IsInt64()) {
        return value->GetInt64();
    }
    const auto real = number(key);
    constexpr double kLargest = 9.2e18;
    return real && std::abs(*real) < kLargest ? std::optional(static_cast<std::int64_t>(*real))
                                              : std::nullopt;
}

void JsonFields::forEachEntry(
    const std::function<void(std::string_view key, const rapidjson::Value&)>& take) const {
    if (root_.IsObject()) {
        for (const auto& entry : root_.GetObject()) {
            take({entry.name.GetString(), entry.name.GetStringLength()}, entry.value);
        }
    }
}

void JsonFields::forEachText(const char* key,
                             const std::function<void(std::string_view)>& take) const {
    const rapidjson::Value* const value = find(key);
    if (value == nullptr) {
        return;
    }
    if (value->IsString()) {
        take({value->GetString(), value->GetStringLength()});
    } else if (value->IsArray()) {
        for (const rapidjson::Value& item : value->GetArray()) {
            if (item.IsString()) {
                take({item.GetString(), item.GetStringLength()});
            }
        }
    }
}

} // namespace halyard::reading
