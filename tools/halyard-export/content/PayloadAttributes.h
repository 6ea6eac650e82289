// The dictionaries of the store as attributes.
//
// The text of a row is read once, from its bytes right into those of the request: no tree
// stands between, which would cost more than all the rest. What varies from record to record
// is kept apart from what mostly stays the same, because what stays the same is compressed
// best in one piece.
//
// Messages of a kind mostly say the same in the same order. So the entries of the last of a
// kind are remembered, and what is said again is not read again; what is not as expected is
// left to the parser, which comes to the same.
//
// Not thread-safe: the scratch buffers are used again.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include <rapidjson/reader.h>

#include "content/JsonCursor.h"
#include "content/Omission.h"
#include "otlp/Attributes.h"

namespace halyard::exporting {

// What stands before each key of ours.
inline constexpr std::string_view kPrefix = "halyard.";

// Encoded attributes, which belong to one message and may be put there in any order.
struct AttributeBytes {
    std::string texts; // and lists and dictionaries
    std::string numbers;

    void clear() {
        texts.clear();
        numbers.clear();
    }
};

class PayloadAttributes {
public:
    // Whether an entry is told elsewhere.
    using Passes = std::function<bool(std::string_view key)>;

    // Borrows `omission`.
    explicit PayloadAttributes(const Omission& omission) : omission_(omission) {}

    // The names that stand for the application of what follows.
    void setNames(std::vector<std::string> names);

    // Appends all entries of a JSON object, their keys after kPrefix, as fields `tag`. What
    // is no object has none.
    void add(AttributeBytes& bytes, otlp::Tag tag, std::string_view json,
             const Passes& passes = nullptr);
    // The same, sooner, where messages of this kind have been. Requires the same `tag` and
    // `passes` for all of a kind.
    void addOfKind(AttributeBytes& bytes, otlp::Tag tag, std::uint64_t kind, std::string_view json,
                   const Passes& passes = nullptr);
    // One entry; nothing where it is left out.
    void addText(std::string& bytes, otlp::Tag tag, std::string_view key, std::string_view text);

    // More than this is not remembered, whatever clients make up.
    static constexpr std::size_t kMostRemembered = 2 * 1024 * 1024;
    std::size_t rememberedBytes() const { return remembered_; }

private:
    class Transcoder;
    struct Container {
        std::string bytes;
        std::string_view key; // of the entry that is about to come
        bool isList = false;
    };

    // An entry of the message before.
    struct Known {
        std::string key; // as JSON, with the colon
        bool leaves = false;
        std::string text;  // a value as JSON that became...
        std::string bytes; // ...these attributes; none where `text` is empty
    };
    using KnownEntries = std::vector<Known>;

    bool addAgain(Transcoder& transcoder, AttributeBytes& bytes, JsonCursor& cursor,
                  KnownEntries& known, const Passes& passes);
    bool addEntry(Transcoder& transcoder, AttributeBytes& bytes, JsonCursor& cursor, Known& known);
    bool addValue(Transcoder& transcoder, JsonCursor& cursor);
    bool meet(JsonCursor& cursor, Known& known, const Passes& passes);
    bool mayLeave(std::string_view key) const;
    bool mayLeaveAsText(std::string_view text) const;
    bool namesApplication(std::string_view text) const;
    bool isSummary(std::string_view json) const;

    const Omission& omission_;
    std::vector<std::string> names_;
    bool isSummary_ = false;
    rapidjson::Reader reader_;
    std::string json_;                                      // which is parsed in its place
    std::vector<Container> containers_;                     // by their depth
    std::unordered_map<std::uint64_t, KnownEntries> known_; // by their kind
    // What was written there since it was empty, which the memory it has is bounded by.
    std::size_t remembered_ = 0;
};

} // namespace halyard::exporting
