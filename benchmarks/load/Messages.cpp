#include "load/Messages.h"

#include <array>

#include "protocol/Wire.h"

namespace halyard::load {
namespace {

constexpr std::uint16_t kTypeActivate = 3;
// Playback, Record, Output, IO, RouteChange: none that the daemon treats apart.
constexpr std::array<std::uint32_t, 5> kCategories = {4, 2, 5, 7, 10};
constexpr std::array kRoutes = {"Speaker", "Headphones", "HDMI", "LineOut", "BluetoothA2DP"};

// One number per index, without a pattern (SplitMix64).
std::uint64_t scramble(std::uint64_t index) {
    std::uint64_t x = (index + 1) * 0x9E3779B97F4A7C15U;
    x = (x ^ (x >> 30U)) * 0xBF58476D1CE4E5B9U;
    x = (x ^ (x >> 27U)) * 0x94D049BB133111EBU;
    return x ^ (x >> 31U);
}

std::string hexadecimal(std::uint64_t number) {
    std::string text(16, '0');
    for (char& digit : text) {
        digit = "0123456789abcdef"[number & 15U];
        number >>= 4U;
    }
    return text;
}

double fraction(std::uint64_t number) {
    return static_cast<double>(number >> 11U) / 9007199254740992.0;
}

Dictionary makeMessage(std::uint32_t client, std::uint32_t content, std::uint32_t position) {
    const std::uint64_t random = scramble((std::uint64_t{client} << 32U) + content);
    const auto part = [random](unsigned shift) { return (random >> shift) & 0xFFFFU; };
    return Dictionary{
        {"stream_identifier", hexadecimal(random) + hexadecimal(~random)},
        {"application_name", "player-" + std::to_string(part(0))},
        {"active_route", kRoutes[random % kRoutes.size()]},
        {"sample_rate", random % 2 == 0 ? 48000 : 44100},
        {"peak_level", fraction(random)},
        {"channel_underruns", List{part(4), part(12), part(20), part(28), part(36), part(44)}},
        {"device", Dictionary{{"manufacturer", "Example Audio Works"},
                              {"transport", "usb"},
                              {"channels", 2},
                              {"latency_seconds", fraction(~random)}}},
        {"hyreporting_timestamp", 1.7e9 + position * 0.001},
    };
}

} // namespace

Stream makeStream(const StreamPlan& plan) {
    Stream stream;
    stream.ends.reserve(plan.messages);
    protocol::Arguments arguments;
    arguments.category = kCategories.at(plan.client);
    arguments.type = kTypeActivate;
    arguments.reporterIDs = plan.reporterIDs;
    std::uint32_t due = 0; // hundredths of a repeat
    for (std::uint32_t i = 0; i < plan.messages; ++i) {
        due += plan.repeats;
        if (due >= 100 && i > 0) {
            due -= 100;
        } else {
            ++stream.distinct;
        }
        arguments.dictionary = makeMessage(plan.client, stream.distinct, i);
        const auto id = plan.requests ? std::optional<std::uint32_t>(i) : std::nullopt;
        protocol::appendCall(stream.bytes, id, protocol::Method::SendMessage, arguments);
        stream.ends.push_back(stream.bytes.size());
    }
    return stream;
}

} // namespace halyard::load
