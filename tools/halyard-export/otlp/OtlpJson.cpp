#include "otlp/OtlpJson.h"

#include <cmath>
#include <cstdint>
#include <span>

#include <fmt/format.h>
#include <protozero/pbf_reader.hpp>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "otlp/Fields.h"

namespace halyard::exporting::otlp {
namespace {

enum class Kind : std::uint8_t {
    Text,
    Identity, // bytes in hexadecimal
    Number32, // and enumerations
    Number64,
    Fixed64,
    SignedFixed64,
    Real,
    Truth,
    Message,
    PackedFixed64,
    PackedReal,
};

struct Field;
using Schema = std::span<const Field>;

struct Field {
    Tag tag;
    const char* name;
    Kind kind;
    bool isRepeated = false;
    const Schema* schema = nullptr; // of a message
};

extern const Schema kAnyValue;
extern const Schema kKeyValue;

constexpr Field kKeyValueFields[] = {
    {key_value::kKey, "key", Kind::Text},
    {key_value::kValue, "value", Kind::Message, false, &kAnyValue},
};
constexpr Field kArrayFields[] = {
    {any_value::kValues, "values", Kind::Message, true, &kAnyValue},
};
constexpr Field kDictionaryFields[] = {
    {any_value::kValues, "values", Kind::Message, true, &kKeyValue},
};
constexpr Schema kArray = kArrayFields;
constexpr Schema kDictionary = kDictionaryFields;
constexpr Field kAnyValueFields[] = {
    {any_value::kString, "stringValue", Kind::Text},
    {any_value::kBool, "boolValue", Kind::Truth},
    {any_value::kInt, "intValue", Kind::Number64},
    {any_value::kDouble, "doubleValue", Kind::Real},
    {any_value::kArray, "arrayValue", Kind::Message, false, &kArray},
    {any_value::kDictionary, "kvlistValue", Kind::Message, false, &kDictionary},
};
const Schema kAnyValue = kAnyValueFields;
const Schema kKeyValue = kKeyValueFields;

constexpr Field kResourceFields[] = {
    {request::kResourceAttributes, "attributes", Kind::Message, true, &kKeyValue},
};
constexpr Field kScopeFields[] = {
    {request::kScopeName, "name", Kind::Text},
    {request::kScopeVersion, "version", Kind::Text},
};
constexpr Schema kResource = kResourceFields;
constexpr Schema kScope = kScopeFields;

constexpr Field kLogFields[] = {
    {log_record::kTime, "timeUnixNano", Kind::Fixed64},
    {log_record::kSeverityNumber, "severityNumber", Kind::Number32},
    {log_record::kSeverityText, "severityText", Kind::Text},
    {log_record::kAttributes, "attributes", Kind::Message, true, &kKeyValue},
    {log_record::kTraceID, "traceId", Kind::Identity},
    {log_record::kSpanID, "spanId", Kind::Identity},
    {log_record::kObservedTime, "observedTimeUnixNano", Kind::Fixed64},
    {log_record::kEventName, "eventName", Kind::Text},
};

constexpr Field kEventFields[] = {
    {span::kEventTime, "timeUnixNano", Kind::Fixed64},
    {span::kEventName, "name", Kind::Text},
    {span::kEventAttributes, "attributes", Kind::Message, true, &kKeyValue},
};
constexpr Field kStatusFields[] = {
    {span::kStatusMessage, "message", Kind::Text},
    {span::kStatusCode, "code", Kind::Number32},
};
constexpr Schema kEvent = kEventFields;
constexpr Schema kStatus = kStatusFields;
constexpr Field kSpanFields[] = {
    {span::kTraceID, "traceId", Kind::Identity},
    {span::kSpanID, "spanId", Kind::Identity},
    {span::kParentSpanID, "parentSpanId", Kind::Identity},
    {span::kName, "name", Kind::Text},
    {span::kKind, "kind", Kind::Number32},
    {span::kStart, "startTimeUnixNano", Kind::Fixed64},
    {span::kEnd, "endTimeUnixNano", Kind::Fixed64},
    {span::kAttributes, "attributes", Kind::Message, true, &kKeyValue},
    {span::kEvents, "events", Kind::Message, true, &kEvent},
    {span::kDroppedEvents, "droppedEventsCount", Kind::Number32},
    {span::kStatus, "status", Kind::Message, false, &kStatus},
};

constexpr Field kNumberPointFields[] = {
    {point::kStart, "startTimeUnixNano", Kind::Fixed64},
    {point::kTime, "timeUnixNano", Kind::Fixed64},
    {point::kDouble, "asDouble", Kind::Real},
    {point::kInt, "asInt", Kind::SignedFixed64},
    {point::kAttributes, "attributes", Kind::Message, true, &kKeyValue},
};
constexpr Field kHistogramPointFields[] = {
    {point::kStart, "startTimeUnixNano", Kind::Fixed64},
    {point::kTime, "timeUnixNano", Kind::Fixed64},
    {point::kCount, "count", Kind::Fixed64},
    {point::kHistogramSum, "sum", Kind::Real},
    {point::kBucketCounts, "bucketCounts", Kind::PackedFixed64},
    {point::kExplicitBounds, "explicitBounds", Kind::PackedReal},
    {point::kHistogramAttributes, "attributes", Kind::Message, true, &kKeyValue},
    {point::kMin, "min", Kind::Real},
    {point::kMax, "max", Kind::Real},
};
constexpr Schema kNumberPoint = kNumberPointFields;
constexpr Schema kHistogramPoint = kHistogramPointFields;
constexpr Field kSumFields[] = {
    {metric::kDataPoints, "dataPoints", Kind::Message, true, &kNumberPoint},
    {metric::kTemporality, "aggregationTemporality", Kind::Number32},
    {metric::kIsMonotonic, "isMonotonic", Kind::Truth},
};
constexpr Field kHistogramFields[] = {
    {metric::kDataPoints, "dataPoints", Kind::Message, true, &kHistogramPoint},
    {metric::kTemporality, "aggregationTemporality", Kind::Number32},
};
constexpr Schema kSum = kSumFields;
constexpr Schema kHistogram = kHistogramFields;
constexpr Field kMetricFields[] = {
    {metric::kName, "name", Kind::Text},
    {metric::kDescription, "description", Kind::Text},
    {metric::kUnit, "unit", Kind::Text},
    {metric::kSum, "sum", Kind::Message, false, &kSum},
    {metric::kHistogram, "histogram", Kind::Message, false, &kHistogram},
};

// The three requests differ in the names of their levels.
template <const auto& ItemFields, class Names> struct Request {
    static constexpr Schema kItem = ItemFields;
    static constexpr Field kScopeItemsFields[] = {
        {request::kScope, "scope", Kind::Message, false, &kScope},
        {request::kItem, Names::kItems, Kind::Message, true, &kItem},
    };
    static constexpr Schema kScopeItems = kScopeItemsFields;
    static constexpr Field kResourceItemsFields[] = {
        {request::kResource, "resource", Kind::Message, false, &kResource},
        {request::kScopeItems, Names::kScopes, Kind::Message, true, &kScopeItems},
    };
    static constexpr Schema kResourceItems = kResourceItemsFields;
    static constexpr Field kFields[] = {
        {request::kResourceItems, Names::kResources, Kind::Message, true, &kResourceItems},
    };
    static constexpr Schema kSchema = kFields;
};
struct LogNames {
    static constexpr const char* kItems = "logRecords";
    static constexpr const char* kScopes = "scopeLogs";
    static constexpr const char* kResources = "resourceLogs";
};
struct MetricNames {
    static constexpr const char* kItems = "metrics";
    static constexpr const char* kScopes = "scopeMetrics";
    static constexpr const char* kResources = "resourceMetrics";
};
struct SpanNames {
    static constexpr const char* kItems = "spans";
    static constexpr const char* kScopes = "scopeSpans";
    static constexpr const char* kResources = "resourceSpans";
};

using Json = rapidjson::Writer<rapidjson::StringBuffer>;
using Reader = protozero::pbf_reader;

void writeText(Json& json, std::string_view text) {
    json.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
}

void writeReal(Json& json, double value) {
    if (std::isfinite(value)) {
        json.Double(value);
    } else {
        writeText(json, std::isnan(value) ? "NaN" : value > 0 ? "Infinity" : "-Infinity");
    }
}

std::string_view viewOf(protozero::data_view bytes) {
    return {bytes.data(), bytes.size()};
}

void writeMessage(Json& json, const Schema& schema, protozero::data_view bytes);

void writePacked(Json& json, Kind kind, Reader& reader) {
    json.StartArray();
    if (kind == Kind::PackedFixed64) {
        for (const std::uint64_t value : reader.get_packed_fixed64()) {
            writeText(json, std::to_string(value));
        }
    } else {
        for (const double value : reader.get_packed_double()) {
            writeReal(json, value);
        }
    }
    json.EndArray();
}

void writeIdentity(Json& json, std::string_view bytes) {
    std::string text;
    for (const char byte : bytes) {
        text += fmt::format("{:02x}", static_cast<unsigned char>(byte));
    }
    writeText(json, text);
}

void writeValue(Json& json, const Field& field, Reader& reader) {
    switch (field.kind) {
    case Kind::Text:
        return writeText(json, viewOf(reader.get_view()));
    case Kind::Identity:
        return writeIdentity(json, viewOf(reader.get_view()));
    case Kind::Number32:
        return static_cast<void>(json.Uint64(reader.get_uint64()));
    case Kind::Number64:
        return writeText(json, std::to_string(reader.get_int64()));
    case Kind::Fixed64:
        return writeText(json, std::to_string(reader.get_fixed64()));
    case Kind::SignedFixed64:
        return writeText(json, std::to_string(reader.get_sfixed64()));
    case Kind::Real:
        return writeReal(json, reader.get_double());
    case Kind::Truth:
        return static_cast<void>(json.Bool(reader.get_bool()));
    case Kind::Message:
        return writeMessage(json, *field.schema, reader.get_view());
    default:
        return writePacked(json, field.kind, reader);
    }
}

// The fields of one tag need not stand together.
void writeMessage(Json& json, const Schema& schema, protozero::data_view bytes) {
    json.StartObject();
    for (const Field& field : schema) {
        Reader reader(bytes);
        bool isBegun = false;
        while (reader.next(field.tag)) {
            if (!isBegun) {
                json.Key(field.name);
                if (field.isRepeated) {
                    json.StartArray();
                }
                isBegun = true;
            } else if (!field.isRepeated) {
                break;
            }
            writeValue(json, field, reader);
        }
        if (isBegun && field.isRepeated) {
            json.EndArray();
        }
    }
    json.EndObject();
}

} // namespace

std::optional<std::string> jsonOf(Signal signal, std::string_view body) {
    const Schema& schema = signal == Signal::Logs ? Request<kLogFields, LogNames>::kSchema
                           : signal == Signal::Metrics
                               ? Request<kMetricFields, MetricNames>::kSchema
                               : Request<kSpanFields, SpanNames>::kSchema;
    rapidjson::StringBuffer buffer;
    Json json(buffer);
    try {
        writeMessage(json, schema, {body.data(), body.size()});
    } catch (const protozero::exception&) {
        return std::nullopt;
    }
    return std::string(buffer.GetString(), buffer.GetSize());
}

} // namespace halyard::exporting::otlp
