#include "send/Answer.h"

#include <algorithm>

#include <protozero/pbf_reader.hpp>

#include "otlp/Fields.h"

namespace halyard::exporting {
namespace {

constexpr std::chrono::milliseconds kLongest = std::chrono::minutes(5);
constexpr std::chrono::seconds kLongestAsked = std::chrono::hours(1);

} // namespace

Verdict verdictOn(const Answer& answer) {
    const int status = answer.status;
    if (status >= 200 && status < 300) {
        return Verdict::Accepted;
    }
    if (status == 0 || status == 429 || (status >= 502 && status <= 504)) {
        return Verdict::Later;
    }
    return status == 401 || status == 403 ? Verdict::Refused : Verdict::Dropped;
}

PartialSuccess partialSuccessIn(std::string_view body) {
    namespace field = otlp::answer;
    PartialSuccess found;
    try {
        protozero::pbf_reader response(body.data(), body.size());
        while (response.next(field::kPartialSuccess, protozero::pbf_wire_type::length_delimited)) {
            protozero::pbf_reader partial = response.get_message();
            while (partial.next()) {
                switch (partial.tag_and_type()) {
                case protozero::tag_and_type(field::kRejected, protozero::pbf_wire_type::varint):
                    found.rejected =
                        static_cast<std::uint64_t>(std::max<std::int64_t>(partial.get_int64(), 0));
                    break;
                case protozero::tag_and_type(field::kMessage,
                                             protozero::pbf_wire_type::length_delimited):
                    found.message = partial.get_string();
                    break;
                default:
                    partial.skip();
                }
            }
        }
    } catch (const protozero::exception&) {
        return {};
    }
    return found;
}

std::chrono::milliseconds delayAfter(unsigned failures, double share,
                                     std::chrono::seconds retryAfter) {
    const unsigned doublings = std::min(failures == 0 ? 0 : failures - 1, 16U);
    const auto whole = std::min(std::chrono::milliseconds(1000) * (1U << doublings), kLongest);
    const auto half = whole / 2;
    const auto random = std::chrono::milliseconds(
        static_cast<std::int64_t>(static_cast<double>(half.count()) * std::clamp(share, 0.0, 1.0)));
    return std::max<std::chrono::milliseconds>(half + random, std::min(retryAfter, kLongestAsked));
}

} // namespace halyard::exporting
