#include "Preview.h"

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "otlp/OtlpJson.h"

namespace halyard::exporting {
namespace {

constexpr std::size_t kMostKeys = 10'000;
constexpr std::size_t kMostExample = 200;

struct Names {
    const char* resources;
    const char* scopes;
    const char* items;
};
constexpr std::array<Names, kSignals> kNames = {{{"resourceLogs", "scopeLogs", "logRecords"},
                                                 {"resourceMetrics", "scopeMetrics", "metrics"},
                                                 {"resourceSpans", "scopeSpans", "spans"}}};

const rapidjson::Value& member(const rapidjson::Value& of, const char* name) {
    static const rapidjson::Value kNone(rapidjson::kArrayType);
    const auto found = of.FindMember(name);
    return found == of.MemberEnd() ? kNone : found->value;
}

std::string textOf(const rapidjson::Value& value) {
    if (value.IsString()) {
        return {value.GetString(), value.GetStringLength()};
    }
    rapidjson::StringBuffer buffer;
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    value.Accept(writer);
    return {buffer.GetString(), buffer.GetSize()};
}

} // namespace

Answer Preview::post(Signal signal, std::string_view body, bool /*isCompressed*/) {
    Answer answer;
    answer.status = 200;
    const auto json = otlp::jsonOf(signal, body);
    rapidjson::Document document;
    if (!json || document.Parse<rapidjson::kParseIterativeFlag>(json->c_str(), json->size())
                     .HasParseError()) {
        return answer;
    }
    ++requests_;
    bytes_ += gzip_.compressed(body).size();
    const Names& names = kNames[static_cast<std::size_t>(signal)];
    for (const auto& resource : member(document, names.resources).GetArray()) {
        takeAttributes("resource", "", resource["resource"]);
        for (const auto& scope : member(resource, names.scopes).GetArray()) {
            for (const auto& item : member(scope, names.items).GetArray()) {
                takeItem(signal, item);
            }
        }
    }
    return answer;
}

void Preview::takeItem(Signal signal, const rapidjson::Value& item) {
    ++records_[static_cast<std::size_t>(signal)];
    const std::string where(nameOf(signal));
    const std::string name = textOf(item[signal == Signal::Logs ? "eventName" : "name"]);
    takeAttributes(where, name, item);
    for (const auto& event : member(item, "events").GetArray()) {
        takeAttributes(where, name + " > " + textOf(event["name"]), event);
    }
    for (const char* const kind : {"sum", "histogram"}) {
        const rapidjson::Value& data = member(item, kind);
        if (data.IsObject()) {
            for (const auto& point : member(data, "dataPoints").GetArray()) {
                takeAttributes(where, name, point);
            }
        }
    }
}

void Preview::takeAttributes(const std::string& where, const std::string& name,
                             const rapidjson::Value& holder) {
    for (const auto& attribute : member(holder, "attributes").GetArray()) {
        takeValue(where, name, textOf(attribute["key"]), attribute["value"]);
    }
}

void Preview::takeValue(const std::string& where, const std::string& name, const std::string& key,
                        const rapidjson::Value& value) {
    if (value.ObjectEmpty()) {
        return add(where, name, key, "");
    }
    const auto& [kind, content] = *value.MemberBegin();
    if (textOf(kind) != "kvlistValue") {
        return add(where, name, key, textOf(content));
    }
    for (const auto& entry : member(content, "values").GetArray()) {
        takeValue(where, name, key + "." + textOf(entry["key"]), entry["value"]);
    }
}

void Preview::add(const std::string& where, const std::string& name, const std::string& key,
                  const std::string& example) {
    const Place place{where, name, key};
    if (keys_.size() >= kMostKeys && !keys_.contains(place)) {
        ++leftOut_;
        return;
    }
    Key& known = keys_[place];
    ++known.count;
    if (known.example.empty()) {
        known.example = example.substr(0, kMostExample);
    }
}

} // namespace halyard::exporting
