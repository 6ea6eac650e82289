// Our codec against msgpack-cxx, over values made at random (always the same).
#include <gtest/gtest.h>
#include <random>

#include "protocol/Wire.h"
#include "protocol/WireTestSupport.h"

namespace halyard::protocol {
namespace {

class RandomValues {
public:
    Value value(int depth) {
        switch (below(depth < 6 ? 10 : 8)) {
        case 0:
            return {};
        case 1:
            return below(2) == 0;
        case 2:
            return static_cast<std::int64_t>(bits());
        case 3:
            return bits();
        case 4:
            return static_cast<float>(static_cast<std::int64_t>(bits())) / 256.0F;
        case 5:
            return static_cast<double>(static_cast<std::int64_t>(bits())) / 1024.0;
        case 6:
            return text();
        case 7:
            return Date{static_cast<std::int64_t>(bits()),
                        below(2) == 0 ? 0 : static_cast<std::uint32_t>(below(1000000000))};
        case 8:
            return list(depth);
        default:
            return dictionary(depth);
        }
    }

    Dictionary dictionary(int depth) {
        std::vector<Dictionary::Entry> entries;
        for (std::uint64_t left = below(20); left > 0; --left) {
            entries.push_back({text(), value(depth + 1)});
        }
        return Dictionary(std::move(entries));
    }

private:
    std::uint64_t below(std::uint64_t limit) { return random_() % limit; }
    // Of every magnitude.
    std::uint64_t bits() { return random_() >> below(64); }

    std::string text() {
        std::string result(below(2) == 0 ? below(40) : below(400), '\0');
        for (char& c : result) {
            c = static_cast<char>(static_cast<unsigned char>(below(256)));
        }
        return result;
    }

    List list(int depth) {
        std::vector<Value> items;
        for (std::uint64_t left = below(20); left > 0; --left) {
            items.push_back(value(depth + 1));
        }
        return List(std::move(items));
    }

    std::mt19937_64 random_{20240229}; // NOLINT: the same values each time
};

using Packer = msgpack::packer<msgpack::sbuffer>;

void packValue(Packer& packer, const Value& value) {
    switch (value.kind()) {
    case Value::Kind::None:
        packer.pack_nil();
        break;
    case Value::Kind::Bool:
        packer.pack(value.boolValue());
        break;
    case Value::Kind::Int:
        packer.pack(value.integerValue());
        break;
    case Value::Kind::UInt:
        packer.pack(value.unsignedValue());
        break;
    case Value::Kind::Float:
        packer.pack(value.floatValue());
        break;
    case Value::Kind::Double:
        packer.pack(value.doubleValue());
        break;
    case Value::Kind::String:
        packer.pack(value.text());
        break;
    case Value::Kind::Date:
        packer.pack(timespec{value.date().seconds, static_cast<long>(value.date().nanoseconds)});
        break;
    case Value::Kind::List:
        packer.pack_array(static_cast<std::uint32_t>(value.list().size()));
        for (const Value& item : value.list()) {
            packValue(packer, item);
        }
        break;
    case Value::Kind::Dictionary:
        packer.pack_map(static_cast<std::uint32_t>(value.dictionary().size()));
        for (const auto& entry : value.dictionary()) {
            packer.pack(entry.key.text());
            packValue(packer, entry.value);
        }
        break;
    }
}

Value fromObject(const msgpack::object& object) {
    switch (object.type) {
    case msgpack::type::NIL:
        return {};
    case msgpack::type::BOOLEAN:
        return object.via.boolean;
    case msgpack::type::POSITIVE_INTEGER:
        return object.via.u64;
    case msgpack::type::NEGATIVE_INTEGER:
        return object.via.i64;
    case msgpack::type::FLOAT32:
        return static_cast<float>(object.via.f64);
    case msgpack::type::FLOAT64:
        return object.via.f64;
    case msgpack::type::STR:
        return std::string_view(object.via.str.ptr, object.via.str.size);
    case msgpack::type::EXT: {
        const auto time = object.as<timespec>();
        return Date{time.tv_sec, static_cast<std::uint32_t>(time.tv_nsec)};
    }
    case msgpack::type::ARRAY: {
        List list;
        for (const msgpack::object& item : object.via.array) {
            list.append(fromObject(item));
        }
        return list;
    }
    case msgpack::type::MAP: {
        Dictionary dictionary;
        for (const auto& [key, value] : object.via.map) {
            dictionary.set(fromObject(key), fromObject(value));
        }
        return dictionary;
    }
    default:
        ADD_FAILURE() << "unexpected object";
        return {};
    }
}

// Deep, and of the same kinds: a real is no integer of equal value.
void expectSame(const Value& left, const Value& right) {
    std::string leftBytes;
    std::string rightBytes;
    appendValue(leftBytes, left);
    appendValue(rightBytes, right);
    EXPECT_EQ(leftBytes, rightBytes);
    EXPECT_EQ(left, right);
}

constexpr int kRounds = 100;

TEST(WireOracleTest, ReadsWhatWeWrite) {
    RandomValues random;
    for (int round = 0; round < kRounds; ++round) {
        const Value value = random.value(0);
        std::string bytes;
        appendValue(bytes, value);
        const auto handle = msgpack::unpack(bytes.data(), bytes.size());
        expectSame(fromObject(handle.get()), value);
    }
}

TEST(WireOracleTest, WritesWhatWeRead) {
    RandomValues random;
    CallDecoder decoder;
    for (int round = 0; round < kRounds; ++round) {
        const Dictionary dictionary = random.dictionary(0);
        msgpack::sbuffer buffer;
        Packer packer(buffer);
        packValue(packer, dictionary);
        const auto call = decoder.decode(packedRequest(
            "setConfiguration", {std::string(buffer.data(), buffer.size()), packed(1)}));
        ASSERT_TRUE(call && call->method);
        EXPECT_EQ(Value(call->arguments.dictionary), Value(dictionary));
    }
}

TEST(WireOracleTest, EndsEachFrameWhereWeDo) {
    RandomValues random;
    for (int round = 0; round < kRounds; ++round) {
        std::string bytes;
        appendValue(bytes, random.value(0));
        const std::size_t length = bytes.size();
        bytes += "\x01\x02\x03";
        std::size_t offset = 0;
        msgpack::unpack(bytes.data(), bytes.size(), offset);
        FrameScanner scanner;
        ASSERT_EQ(scanner.scan(bytes), FrameScanner::Outcome::Complete);
        EXPECT_EQ(scanner.frameLength(), offset);
        EXPECT_EQ(scanner.frameLength(), length);
    }
}

TEST(WireOracleTest, ComesBackUnchangedThroughACall) {
    RandomValues random;
    CallDecoder decoder;
    for (int round = 0; round < kRounds; ++round) {
        Arguments arguments;
        arguments.dictionary = random.dictionary(0);
        std::string bytes;
        appendCall(bytes, 1, Method::SetConfiguration, arguments);
        const auto call = decoder.decode(bytes);
        ASSERT_TRUE(call && call->method);
        expectSame(call->arguments.dictionary, arguments.dictionary);
    }
}

} // namespace
} // namespace halyard::protocol
