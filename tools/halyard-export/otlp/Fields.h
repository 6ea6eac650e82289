// Field numbers of the OpenTelemetry protocol, as far as they are used here.
//
// Source: the public protocol files of OpenTelemetry (opentelemetry-proto 1.5), whose
// numbers never change.
#pragma once

#include <protozero/types.hpp>

namespace halyard::exporting::otlp {

using Tag = protozero::pbf_tag_type;

// Export{Logs,Trace,Metrics}ServiceRequest, Resource{Logs,Spans,Metrics} and
// Scope{Logs,Spans,Metrics} agree.
namespace request {
inline constexpr Tag kResourceItems = 1;
inline constexpr Tag kResource = 1;
inline constexpr Tag kScopeItems = 2;
inline constexpr Tag kScope = 1;
inline constexpr Tag kItem = 2;
inline constexpr Tag kResourceAttributes = 1;
inline constexpr Tag kScopeName = 1;
inline constexpr Tag kScopeVersion = 2;
} // namespace request

// Export*ServiceResponse.
namespace answer {
inline constexpr Tag kPartialSuccess = 1;
inline constexpr Tag kRejected = 1;
inline constexpr Tag kMessage = 2;
} // namespace answer

namespace key_value {
inline constexpr Tag kKey = 1;
inline constexpr Tag kValue = 2;
} // namespace key_value

namespace any_value {
inline constexpr Tag kString = 1;
inline constexpr Tag kBool = 2;
inline constexpr Tag kInt = 3;
inline constexpr Tag kDouble = 4;
inline constexpr Tag kArray = 5;
inline constexpr Tag kDictionary = 6;
inline constexpr Tag kValues = 1; // of an ArrayValue and a KeyValueList
} // namespace any_value

namespace log_record {
inline constexpr Tag kTime = 1;
inline constexpr Tag kSeverityNumber = 2;
inline constexpr Tag kSeverityText = 3;
inline constexpr Tag kAttributes = 6;
inline constexpr Tag kTraceID = 9;
inline constexpr Tag kSpanID = 10;
inline constexpr Tag kObservedTime = 11;
inline constexpr Tag kEventName = 12;
inline constexpr int kInfo = 9;
inline constexpr int kWarn = 13;
inline constexpr int kError = 17;
} // namespace log_record

namespace span {
inline constexpr Tag kTraceID = 1;
inline constexpr Tag kSpanID = 2;
inline constexpr Tag kParentSpanID = 4;
inline constexpr Tag kName = 5;
inline constexpr Tag kKind = 6;
inline constexpr Tag kStart = 7;
inline constexpr Tag kEnd = 8;
inline constexpr Tag kAttributes = 9;
inline constexpr Tag kEvents = 11;
inline constexpr Tag kDroppedEvents = 12;
inline constexpr Tag kStatus = 15;
inline constexpr int kInternal = 1;
inline constexpr Tag kEventTime = 1;
inline constexpr Tag kEventName = 2;
inline constexpr Tag kEventAttributes = 3;
inline constexpr Tag kStatusMessage = 2;
inline constexpr Tag kStatusCode = 3;
inline constexpr int kStatusError = 2;
} // namespace span

namespace metric {
inline constexpr Tag kName = 1;
inline constexpr Tag kDescription = 2;
inline constexpr Tag kUnit = 3;
inline constexpr Tag kSum = 7;
inline constexpr Tag kHistogram = 9;
inline constexpr Tag kDataPoints = 1;
inline constexpr Tag kTemporality = 2;
inline constexpr Tag kIsMonotonic = 3;
inline constexpr int kDelta = 1;
inline constexpr int kCumulative = 2;
} // namespace metric

// NumberDataPoint and HistogramDataPoint agree in the first two.
namespace point {
inline constexpr Tag kStart = 2;
inline constexpr Tag kTime = 3;
inline constexpr Tag kDouble = 4;
inline constexpr Tag kInt = 6;
inline constexpr Tag kAttributes = 7;
inline constexpr Tag kCount = 4;
inline constexpr Tag kHistogramSum = 5;
inline constexpr Tag kBucketCounts = 6;
inline constexpr Tag kExplicitBounds = 7;
inline constexpr Tag kHistogramAttributes = 9;
inline constexpr Tag kMin = 11;
inline constexpr Tag kMax = 12;
} // namespace point

} // namespace halyard::exporting::otlp
