// What turning one message's bytes into a call costs: our codec beside
// msgpack-cxx, in the same run, on the same frame.
#include <benchmark/benchmark.h>
#include <cstdlib>
#include <msgpack.hpp>
#include <string>
#include <vector>

#include "protocol/Wire.h"

namespace {

using namespace halyard;
using namespace halyard::protocol;

// About 300 bytes and 8 keys, as a player reports them.
std::string messageFrame() {
    Arguments arguments;
    arguments.dictionary = Dictionary{
        {"hyreporting_timestamp", 1700000000.25},
        {"systemuptime_sec", 86400},
        {"processuptime_ms", 123456789},
        {"application_bundle", "com.example.player.music"},
        {"audio_route_description", "Speaker, built in, two channels"},
        {"underrun_frame_counts", List{128, 256, 512, 1024}},
        {"stream_is_spatial", true},
        {"output_format_details", Dictionary{{"sample_rate", 48000.0},
                                             {"channel_count", 2},
                                             {"encoding_name", "linear PCM float"}}},
    };
    arguments.category = 65550;
    arguments.type = 7;
    arguments.reporterIDs = ReporterIDs{0x123456789AB};
    std::string frame;
    appendCall(frame, 1234, Method::SendMessage, arguments);
    return frame;
}

void ourScanAndDecode(benchmark::State& state) {
    const std::string frame = messageFrame();
    FrameScanner scanner;
    CallDecoder decoder;
    for (auto _ : state) {
        scanner.reset();
        if (scanner.scan(frame) != FrameScanner::Outcome::Complete) {
            std::abort();
        }
        benchmark::DoNotOptimize(decoder.decode({frame.data(), scanner.frameLength()}));
    }
    state.SetLabel(std::to_string(frame.size()) + " bytes");
}
BENCHMARK(ourScanAndDecode);

void ourScan(benchmark::State& state) {
    const std::string frame = messageFrame();
    FrameScanner scanner;
    for (auto _ : state) {
        scanner.reset();
        benchmark::DoNotOptimize(scanner.scan(frame));
    }
}
BENCHMARK(ourScan);

void ourDecode(benchmark::State& state) {
    const std::string frame = messageFrame();
    CallDecoder decoder;
    for (auto _ : state) {
        benchmark::DoNotOptimize(decoder.decode(frame));
    }
}
BENCHMARK(ourDecode);

// msgpack-cxx's parser into the same Values, with the same limits, keys interned
// and containers reserved: what we would have written with it. The frame becomes
// a List; its parts would still have to be checked and taken out.
class ValueVisitor : public msgpack::null_visitor {
public:
    explicit ValueVisitor(KeyTable& keys) : keys_(keys) { open_.reserve(kMaxDepth); }

    bool visit_nil() { return add({}); }
    bool visit_boolean(bool value) { return add(value); }
    bool visit_positive_integer(std::uint64_t value) { return add(value); }
    bool visit_negative_integer(std::int64_t value) { return add(value); }
    bool visit_float32(float value) { return add(value); }
    bool visit_float64(double value) { return add(value); }
    bool visit_str(const char* text, std::uint32_t size) {
        const std::string_view view(text, size);
        if (inKey_) {
            open_.back().entries.push_back({keys_.intern(view), Value()});
            return true;
        }
        return add(Value(view));
    }
    bool visit_bin(const char* text, std::uint32_t size) { return visit_str(text, size); }
    bool start_array(std::uint32_t size) {
        if (!open(size)) {
            return false;
        }
        open_.back().items.reserve(size);
        return true;
    }
    bool end_array() { return close(Value(List(std::move(open_.back().items)))); }
    bool start_map(std::uint32_t size) {
        if (!open(2 * std::size_t{size})) {
            return false;
        }
        open_.back().isMap = true;
        open_.back().entries.reserve(size);
        return true;
    }
    bool end_map() { return close(Value(Dictionary(std::move(open_.back().entries)))); }
    bool start_map_key() { return inKey_ = true; }
    bool end_map_key() {
        inKey_ = false;
        return true;
    }

    Value take() { return std::move(result_); }

private:
    struct Open {
        bool isMap = false;
        std::vector<Value> items;
        std::vector<Dictionary::Entry> entries;
    };

    bool open(std::size_t children) {
        elements_ += children;
        if (inKey_ || elements_ > kMaxElements || open_.size() == std::size_t{kMaxDepth}) {
            return false;
        }
        open_.emplace_back();
        return true;
    }
    bool close(Value value) {
        open_.pop_back();
        return add(std::move(value));
    }
    bool add(Value value) {
        if (inKey_) {
            return false;
        }
        if (open_.empty()) {
            result_ = std::move(value);
        } else if (open_.back().isMap) {
            open_.back().entries.back().value = std::move(value);
        } else {
            open_.back().items.push_back(std::move(value));
        }
        return true;
    }

    KeyTable& keys_;
    std::vector<Open> open_;
    std::size_t elements_ = 0;
    bool inKey_ = false;
    Value result_;
};

void msgpackCxxVisitor(benchmark::State& state) {
    const std::string frame = messageFrame();
    KeyTable keys;
    for (auto _ : state) {
        ValueVisitor visitor(keys);
        std::size_t offset = 0;
        if (!msgpack::parse(frame.data(), frame.size(), offset, visitor)) {
            std::abort();
        }
        benchmark::DoNotOptimize(visitor.take());
    }
}
BENCHMARK(msgpackCxxVisitor);

// Its own tree only, strings left in the buffer: no Values yet.
void msgpackCxxUnpack(benchmark::State& state) {
    const std::string frame = messageFrame();
    const auto reference = [](msgpack::type::object_type, std::size_t, void*) { return true; };
    for (auto _ : state) {
        std::size_t offset = 0;
        benchmark::DoNotOptimize(
            msgpack::unpack(frame.data(), frame.size(), offset, reference, nullptr));
    }
}
BENCHMARK(msgpackCxxUnpack);

Value valueOf(const msgpack::object& object, KeyTable& keys) {
    switch (object.type) {
    case msgpack::type::BOOLEAN:
        return object.via.boolean;
    case msgpack::type::POSITIVE_INTEGER:
        return object.via.u64;
    case msgpack::type::NEGATIVE_INTEGER:
        return object.via.i64;
    case msgpack::type::FLOAT32:
    case msgpack::type::FLOAT64:
        return object.via.f64;
    case msgpack::type::STR:
        return std::string_view(object.via.str.ptr, object.via.str.size);
    case msgpack::type::ARRAY: {
        std::vector<Value> items;
        items.reserve(object.via.array.size);
        for (const msgpack::object& item : object.via.array) {
            items.push_back(valueOf(item, keys));
        }
        return List(std::move(items));
    }
    case msgpack::type::MAP: {
        std::vector<Dictionary::Entry> entries;
        entries.reserve(object.via.map.size);
        for (const auto& [key, value] : object.via.map) {
            entries.push_back(
                {keys.intern({key.via.str.ptr, key.via.str.size}), valueOf(value, keys)});
        }
        return Dictionary(std::move(entries));
    }
    default:
        return {};
    }
}

void msgpackCxxUnpackToValues(benchmark::State& state) {
    const std::string frame = messageFrame();
    const auto reference = [](msgpack::type::object_type, std::size_t, void*) { return true; };
    KeyTable keys;
    for (auto _ : state) {
        std::size_t offset = 0;
        const auto handle = msgpack::unpack(frame.data(), frame.size(), offset, reference, nullptr);
        benchmark::DoNotOptimize(valueOf(handle.get(), keys));
    }
}
BENCHMARK(msgpackCxxUnpackToValues);

void ourEncode(benchmark::State& state) {
    const std::string frame = messageFrame();
    const auto call = CallDecoder().decode(frame);
    std::string out;
    for (auto _ : state) {
        out.clear();
        appendCall(out, call->messageID, *call->method, call->arguments);
        benchmark::DoNotOptimize(out.data());
    }
}
BENCHMARK(ourEncode);

} // namespace
