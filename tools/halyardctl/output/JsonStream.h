// JSON for programs, written as it comes.
//
// Every text is made valid UTF-8 first, and code points that a terminal might act
// upon are escaped, so that the output is as harmless on a screen as it is exact for
// a parser. Numbers of texts that pass through keep their digits.
//
// Not thread-safe.
#pragma once

#include <cstdint>
#include <optional>
#include <rapidjson/document.h>
#include <rapidjson/writer.h>
#include <string>
#include <string_view>

#include "common/Value.h"
#include "output/Terminal.h"

namespace halyard::ctl {

class JsonStream {
public:
    // Borrows the stream.
    explicit JsonStream(std::FILE* stream) : bytes_{stream}, writer_(bytes_) {}

    // The outermost array, an element a line.
    void beginList() { bytes_.Put('['); }
    void endList();
    void beginElement();
    // A document of its own, a line each.
    void beginDocument() { writer_.Reset(bytes_); }
    void endDocument() { endLine(); }
    // Between two things, where it means nothing.
    void endLine() { bytes_.Put('\n'); }

    void beginObject() { writer_.StartObject(); }
    void endObject() { writer_.EndObject(); }
    void beginArray() { writer_.StartArray(); }
    void endArray() { writer_.EndArray(); }

    void key(std::string_view name) { writeText(name); }
    void text(std::string_view value) { writeText(value); }
    void integer(std::int64_t value) { writer_.Int64(value); }
    void count(std::uint64_t value) { writer_.Uint64(value); }
    void boolean(bool value) { writer_.Bool(value); }
    void null() { writer_.Null(); }
    // Null for what is no number.
    void real(double value);
    // JSON as it stands in the store; null when it is none.
    void json(std::string_view text);
    void value(const rapidjson::Value& value) { write(value, 0); }
    void value(const Value& value);

    // Entries. What is not there is null.
    void field(std::string_view name, std::string_view value) {
        key(name);
        text(value);
    }
    void field(std::string_view name, const char* value);
    void field(std::string_view name, const std::optional<std::string>& value);
    void field(std::string_view name, std::optional<std::int64_t> value);
    void field(std::string_view name, std::optional<double> value);
    void countField(std::string_view name, std::uint64_t value);
    void jsonField(std::string_view name, std::string_view text);

    // What JSON takes: the text in quotes, escaped.
    static void appendQuoted(std::string& out, std::string_view text);

private:
    // What RapidJSON takes for a stream to write to.
    struct Bytes {
        using Ch = char;
        std::FILE* file;
        void Put(char c) { ::putc_unlocked(c, file); }
        void Flush() {}
    };
    struct PassThrough;

    void write(const rapidjson::Value& value, int depth);
    void writeText(std::string_view value);
    void writeRaw(std::string_view json, rapidjson::Type type) {
        writer_.RawValue(json.data(), json.size(), type);
    }

    Bytes bytes_;
    rapidjson::Writer<Bytes> writer_;
    std::string buffer_;
    bool any_ = false;
};

} // namespace halyard::ctl
