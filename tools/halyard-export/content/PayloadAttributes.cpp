#include "content/PayloadAttributes.h"

#include <algorithm>

namespace halyard::exporting {
namespace {

// Deeper than any message that the daemon takes.
constexpr int kMaxDepth = 128;

std::string_view textOf(const rapidjson::Value& value) {
    return {value.GetString(), value.GetStringLength()};
}

// What has no 64-bit integer there keeps its digits as a text.
void appendNumber(std::string& any, const rapidjson::Value& value) {
    if (value.IsInt64()) {
        otlp::appendInteger(any, value.GetInt64());
    } else if (value.IsUint64()) {
        otlp::appendText(any, std::to_string(value.GetUint64()));
    } else {
        otlp::appendReal(any, value.GetDouble());
    }
}

} // namespace

bool PayloadAttributes::namesApplication(std::string_view text) const {
    return omission_.omitsApplication() &&
           std::any_of(names_.begin(), names_.end(),
                       [text](const std::string& name) { return mentions(text, name); });
}

bool PayloadAttributes::isLeftOut(std::string_view key, std::string_view text) const {
    return omission_.omits(key) || namesApplication(text) ||
           (isSummary_ && omission_.isToldIn(text));
}

void PayloadAttributes::addAll(otlp::Writer& writer, otlp::Tag tag, std::string_view json) {
    if (!fields_.parse(json)) {
        return;
    }
    isSummary_ = fields_.find("HY_Session_Summary_Event") != nullptr;
    fields_.forEachEntry(
        [&](std::string_view key, const rapidjson::Value& value) { add(writer, tag, key, value); });
    isSummary_ = false;
}

void PayloadAttributes::add(otlp::Writer& writer, otlp::Tag tag, std::string_view key,
                            const rapidjson::Value& value) {
    any_.clear();
    if (omission_.omits(key) || namesApplication(key) || !append(any_, value, 0)) {
        return;
    }
    key_.assign(kPrefix).append(key);
    otlp::addAny(writer, tag, key_, any_);
}

void PayloadAttributes::addText(otlp::Writer& writer, otlp::Tag tag, std::string_view key,
                                std::string_view text) {
    if (!isLeftOut(key, text)) {
        key_.assign(kPrefix).append(key);
        otlp::addText(writer, tag, key_, text);
    }
}

bool PayloadAttributes::append(std::string& any, const rapidjson::Value& value, int depth) {
    switch (value.GetType()) {
    case rapidjson::kStringType: {
        const std::string_view text = textOf(value);
        const bool leaves = !namesApplication(text) && !(isSummary_ && omission_.isToldIn(text));
        if (leaves) {
            otlp::appendText(any, text);
        }
        return leaves;
    }
    case rapidjson::kNumberType:
        appendNumber(any, value);
        return true;
    case rapidjson::kTrueType:
    case rapidjson::kFalseType:
        otlp::appendBoolean(any, value.GetBool());
        return true;
    case rapidjson::kObjectType:
        return appendDictionary(any, value, depth + 1);
    case rapidjson::kArrayType:
        return appendList(any, value, depth + 1);
    default:
        return true; // a value that is empty
    }
}

bool PayloadAttributes::appendDictionary(std::string& any, const rapidjson::Value& value,
                                         int depth) {
    if (depth > kMaxDepth) {
        return false;
    }
    std::string entries;
    otlp::Writer writer(entries);
    for (const auto& entry : value.GetObject()) {
        std::string inner;
        const std::string_view key = textOf(entry.name);
        if (!omission_.omits(key) && !namesApplication(key) && append(inner, entry.value, depth)) {
            otlp::addAny(writer, otlp::any_value::kValues, key, inner);
        }
    }
    otlp::Writer(any).add_message(otlp::any_value::kDictionary, entries);
    return true;
}

bool PayloadAttributes::appendList(std::string& any, const rapidjson::Value& value, int depth) {
    if (depth > kMaxDepth) {
        return false;
    }
    std::string items;
    otlp::Writer writer(items);
    for (const rapidjson::Value& item : value.GetArray()) {
        std::string inner;
        if (append(inner, item, depth)) {
            writer.add_message(otlp::any_value::kValues, inner);
        }
    }
    otlp::Writer(any).add_message(otlp::any_value::kArray, items);
    return true;
}

} // namespace halyard::exporting
