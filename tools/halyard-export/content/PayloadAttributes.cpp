#include "content/PayloadAttributes.h"

#include <algorithm>

#include "common/Utf8.h"
#include "content/PayloadTranscoder.h"
#include "reading/JsonFields.h"

namespace halyard::exporting {
namespace {

constexpr const char* kSummaryKey = "HY_Session_Summary_Event";
constexpr unsigned kFlags = rapidjson::kParseInsituFlag | rapidjson::kParseIterativeFlag |
                            rapidjson::kParseNumbersAsStringsFlag;
// Of a message that is remembered.
constexpr std::size_t kMostKnownBytes = 4096;

// What stands between the quotes of a key.
std::string_view nameIn(std::string_view key) {
    return key.substr(1, key.size() - 3);
}

rapidjson::SizeType lengthOf(std::string_view text) {
    return static_cast<rapidjson::SizeType>(text.size());
}

} // namespace

// Compared with what leaves, so in the same form.
void PayloadAttributes::setNames(std::vector<std::string> names) {
    for (std::string& name : names) {
        if (!isValidUtf8(name)) {
            name = replaceInvalidUtf8(name);
        }
    }
    if (names != names_) {
        names_ = std::move(names);
        known_.clear(); // other entries may leave now
        remembered_ = 0;
    }
}

bool PayloadAttributes::namesApplication(std::string_view text) const {
    return omission_.omitsApplication() &&
           std::any_of(names_.begin(), names_.end(),
                       [text](const std::string& name) { return mentions(text, name); });
}

bool PayloadAttributes::mayLeave(std::string_view key) const {
    return !omission_.omits(key) && !namesApplication(key);
}

bool PayloadAttributes::mayLeaveAsText(std::string_view text) const {
    return !namesApplication(text) && !(isSummary_ && omission_.isToldIn(text));
}

bool PayloadAttributes::isSummary(std::string_view json) const {
    if (json.starts_with(R"({"HY_Session_Summary_Event")")) {
        return true; // if it is an object at all; else nothing of it leaves
    }
    if (json.find(kSummaryKey) == std::string_view::npos) {
        return false;
    }
    reading::JsonFields fields;
    return fields.parse(json) && fields.find(kSummaryKey) != nullptr;
}

void PayloadAttributes::add(AttributeBytes& bytes, otlp::Tag tag, std::string_view json,
                            const Passes& passes) {
    // The whole text at once instead of each key and value.
    isValidUtf8(json) ? json_.assign(json) : json_.assign(replaceInvalidUtf8(json));
    isSummary_ = isSummary(json_);
    const std::size_t texts = bytes.texts.size();
    const std::size_t numbers = bytes.numbers.size();
    Transcoder transcoder(*this, bytes, tag, passes);
    rapidjson::InsituStringStream stream(json_.data());
    if (reader_.Parse<kFlags>(stream, transcoder).IsError()) {
        bytes.texts.resize(texts);
        bytes.numbers.resize(numbers);
    }
    isSummary_ = false;
}

void PayloadAttributes::addOfKind(AttributeBytes& bytes, otlp::Tag tag, std::uint64_t kind,
                                  std::string_view json, const Passes& passes) {
    if (json.size() > kMostKnownBytes || json.find(kSummaryKey) != std::string_view::npos) {
        return add(bytes, tag, json, passes);
    }
    // What one message adds at most is not much.
    if (remembered_ > kMostRemembered / 2) {
        known_.clear();
        remembered_ = 0;
    }
    const std::size_t texts = bytes.texts.size();
    const std::size_t numbers = bytes.numbers.size();
    Transcoder transcoder(*this, bytes, tag, passes);
    JsonCursor cursor(json);
    const auto [known, isNew] = known_.try_emplace(kind);
    remembered_ += isNew ? sizeof(*known) : 0;
    if (!addAgain(transcoder, bytes, cursor, known->second, passes)) {
        bytes.texts.resize(texts);
        bytes.numbers.resize(numbers);
        add(bytes, tag, json, passes);
    }
}

// False where the text is not as plain as that, or no object at all.
bool PayloadAttributes::addAgain(Transcoder& transcoder, AttributeBytes& bytes, JsonCursor& cursor,
                                 KnownEntries& known, const Passes& passes) {
    if (!cursor.take('{') || !transcoder.StartObject()) {
        return false;
    }
    for (std::size_t i = 0;; ++i) {
        if (known.size() == i) {
            known.emplace_back();
            remembered_ += sizeof(Known);
        }
        if (!meet(cursor, known[i], passes) || !addEntry(transcoder, bytes, cursor, known[i])) {
            return false;
        }
        if (cursor.take('}')) {
            return cursor.isAtEnd();
        }
        if (!cursor.take(',')) {
            return false;
        }
    }
}

// The key that comes next; what is known of another is forgotten.
bool PayloadAttributes::meet(JsonCursor& cursor, Known& known, const Passes& passes) {
    if (!known.key.empty() && cursor.take(known.key)) {
        return true;
    }
    known.key = cursor.takeKey();
    known.text.clear();
    remembered_ += known.key.size();
    if (known.key.empty() || !isValidUtf8(known.key)) {
        known.key.clear();
        return false;
    }
    const std::string_view name = nameIn(known.key);
    known.leaves = mayLeave(name) && !(passes && passes(name));
    return true;
}

bool PayloadAttributes::addEntry(Transcoder& transcoder, AttributeBytes& bytes, JsonCursor& cursor,
                                 Known& known) {
    if (!known.text.empty() && cursor.takeValue(known.text)) {
        bytes.texts += known.bytes;
        return true;
    }
    transcoder.expect(nameIn(known.key), known.leaves);
    const std::string_view number = cursor.takeNumber();
    if (!number.empty()) {
        return transcoder.RawNumber(number.data(), lengthOf(number), true);
    }
    const std::size_t start = cursor.at();
    const std::size_t texts = bytes.texts.size();
    const std::size_t numbers = bytes.numbers.size();
    const std::string_view text = cursor.takeText();
    if (!text.empty()) {
        if (!isValidUtf8(text) || !transcoder.String(text.data() + 1, lengthOf(text) - 2, true)) {
            return false;
        }
    } else if (!addValue(transcoder, cursor)) {
        return false;
    }
    // What stands among the numbers is as soon read again.
    known.text = bytes.numbers.size() == numbers ? cursor.since(start) : std::string_view();
    known.bytes.assign(bytes.texts, texts);
    remembered_ += known.text.size() + known.bytes.size();
    return true;
}

// Whatever is a value, by the parser.
bool PayloadAttributes::addValue(Transcoder& transcoder, JsonCursor& cursor) {
    json_ = cursor.rest();
    rapidjson::InsituStringStream stream(json_.data());
    if (reader_.Parse<kFlags | rapidjson::kParseStopWhenDoneFlag>(stream, transcoder).IsError()) {
        return false;
    }
    const std::size_t start = cursor.at();
    cursor.skip(stream.Tell());
    return isValidUtf8(cursor.since(start));
}

void PayloadAttributes::addText(std::string& bytes, otlp::Tag tag, std::string_view key,
                                std::string_view text) {
    const bool isValid = isValidUtf8(text);
    const std::string valid = isValid ? std::string() : replaceInvalidUtf8(text);
    const std::string_view shown = isValid ? text : std::string_view(valid);
    if (!omission_.omits(key) && mayLeaveAsText(shown)) {
        otlp::appendAttribute(bytes, tag, kPrefix, key, otlp::AnyValue::ofText(shown));
    }
}

} // namespace halyard::exporting
