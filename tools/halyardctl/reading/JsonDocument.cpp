#include "reading/JsonDocument.h"

#include <cstdint>

#include <rapidjson/memorystream.h>

#include "reading/JsonNumbers.h"

namespace halyard::reading {
namespace {

// Passes everything on, numbers as what they are.
class Numbers {
public:
    using Length = rapidjson::SizeType;

    explicit Numbers(rapidjson::Document& document) : document_(document) {}

    bool RawNumber(const char* text, Length length, bool /*copy*/) {
        return takeNumber({text, length}, document_);
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
