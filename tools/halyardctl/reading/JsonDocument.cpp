#include "reading/JsonDocument.h"

#include <charconv>
#include <cstdint>

#include <rapidjson/memorystream.h>

namespace halyard::reading {
namespace {

// Passes everything on, numbers as the standard library reads them: exact, where the parser's
// own way to exact numbers shifts a zero such as "0e-88" by an undefined count.
class Numbers {
public:
    using Length = rapidjson::SizeType;

    explicit Numbers(rapidjson::Document& document) : document_(document) {}

    bool RawNumber(const char* text, Length length, bool /*copy*/) {
        const auto isWhole = [&](auto& number) {
            const auto read = std::from_chars(text, text + length, number);
            return read.ec == std::errc() && read.ptr == text + length;
        };
        std::int64_t integer = 0;
        std::uint64_t large = 0;
        double real = 0;
        if (isWhole(integer) && (integer != 0 || *text != '-')) {
            return document_.Int64(integer);
        }
        return isWhole(large) ? document_.Uint64(large) : isWhole(real) && document_.Double(real);
    }
    bool Null() { return document_.Null(); }
    bool Bool(bool value) { return document_.Bool(value); }
    bool Int(int value) { return document_.Int(value); }
    bool Uint(unsigned value) { return document_.Uint(value); }
    bool Int64(std::int64_t value) { return document_.Int64(value); }
    bool Uint64(std::uint64_t value) { return document_.Uint64(value); }
    bool Double(double value) { return document_.Double(value); }
    bool String(const char* text, Length length, bool copy) {
        return document_.String(text, length, copy);
    }
    bool Key(const char* text, Length length, bool copy) {
        return document_.Key(text, length, copy);
    }
    bool StartObject() { return document_.StartObject(); }
    bool EndObject(Length count) { return document_.EndObject(count); }
    bool StartArray() { return document_.StartArray(); }
    bool EndArray(Length count) { return document_.EndArray(count); }

private:
    rapidjson::Document& document_;
};

template <unsigned Flags> bool parse(std::string_view text, rapidjson::Document& document) {
    bool isGood = false;
    const auto feed = [&](rapidjson::Document& handler) {
        rapidjson::MemoryStream memory(text.data(), text.size());
        rapidjson::EncodedInputStream<rapidjson::UTF8<>, rapidjson::MemoryStream> stream(memory);
        rapidjson::Reader reader;
        Numbers numbers(handler);
        isGood = !reader.Parse<Flags>(stream, numbers).IsError();
        return isGood;
    };
    document.SetNull();
    document.Populate(feed);
    return isGood;
}

} // namespace

bool parseJson(std::string_view text, Encoding encoding, rapidjson::Document& document) {
    constexpr unsigned kFlags =
        rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;
    return encoding == Encoding::Checked
               ? parse<kFlags | rapidjson::kParseValidateEncodingFlag>(text, document)
               : parse<kFlags>(text, document);
}

} // namespace halyard::reading
