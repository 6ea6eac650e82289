#include "content/PayloadAttributes.h"

#include <algorithm>

#include "common/Utf8.h"
#include "reading/JsonFields.h"
#include "reading/JsonNumbers.h"

namespace halyard::exporting {
namespace {

// Deeper than any message that the daemon takes.
constexpr std::size_t kMaxDepth = 128;
constexpr const char* kSummaryKey = "HY_Session_Summary_Event";

} // namespace

// Takes the events of the parser. An entry that is left out, or what is inside of it, is
// `skipped_` containers deep.
class PayloadAttributes::Transcoder {
public:
    using Length = rapidjson::SizeType;

    Transcoder(PayloadAttributes& owner, AttributeBytes& bytes, otlp::Tag tag, const Passes& passes)
        : owner_(owner), bytes_(bytes), tag_(tag), passes_(passes) {}

    bool Null() { return put({}, bytes_.texts); }
    bool Bool(bool value) { return put(otlp::AnyValue::ofBoolean(value), bytes_.numbers); }
    bool Int64(std::int64_t value) { return put(otlp::AnyValue::ofInteger(value), bytes_.numbers); }
    // What has no 64-bit integer there keeps its digits as a text.
    bool Uint64(std::uint64_t value) {
        return put(otlp::AnyValue::ofText(std::to_string(value)), bytes_.texts);
    }
    bool Double(double value) { return put(otlp::AnyValue::ofReal(value), bytes_.numbers); }
    bool Int(int value) { return Int64(value); }
    bool Uint(unsigned value) { return Int64(value); }
    bool RawNumber(const char* text, Length length, bool /*copy*/) {
        return reading::takeNumber({text, length}, *this);
    }
    bool String(const char* text, Length length, bool /*copy*/) {
        const std::string_view view(text, length);
        if (isSkipping() || !owner_.mayLeaveAsText(view)) {
            return skip();
        }
        return put(otlp::AnyValue::ofText(view), bytes_.texts);
    }
    bool Key(const char* text, Length length, bool /*copy*/) {
        if (skipped_ == 0) {
            const std::string_view key(text, length);
            (depth_ == 0 ? key_ : top().key) = key;
            leavesOut_ = !owner_.mayLeave(key) || (depth_ == 0 && passes_ && passes_(key));
        }
        return true;
    }
    bool StartObject() { return begin(false); }
    bool StartArray() { return begin(true); }
    bool EndObject(Length /*count*/) { return end(); }
    bool EndArray(Length /*count*/) { return end(); }

private:
    Container& top() { return owner_.containers_[depth_ - 1]; }
    bool isSkipping() const { return skipped_ > 0 || leavesOut_; }
    bool skip() {
        leavesOut_ = false;
        return true;
    }
    bool put(const otlp::AnyValue& value, std::string& bytes) {
        if (isSkipping()) {
            return skip();
        }
        if (!isBegun_) {
            return false; // no object at all
        }
        if (depth_ == 0) {
            otlp::appendAttribute(bytes, tag_, kPrefix, key_, value);
        } else if (top().isList) {
            otlp::appendItem(top().bytes, value);
        } else {
            otlp::appendEntry(top().bytes, top().key, value);
        }
        return true;
    }
    bool begin(bool isList) {
        if (!isBegun_) {
            isBegun_ = true;
            return !isList;
        }
        if (isSkipping() || depth_ == kMaxDepth) {
            ++skipped_;
            return skip();
        }
        if (owner_.containers_.size() == depth_) {
            owner_.containers_.emplace_back();
        }
        ++depth_;
        top().bytes.clear();
        top().isList = isList;
        return true;
    }
    bool end() {
        if (skipped_ > 0) {
            --skipped_;
            return true;
        }
        if (depth_ == 0) {
            return true; // the object itself
        }
        const Container& ended = top();
        --depth_;
        return put(ended.isList ? otlp::AnyValue::ofList(ended.bytes)
                                : otlp::AnyValue::ofDictionary(ended.bytes),
                   bytes_.texts);
    }

    PayloadAttributes& owner_;
    AttributeBytes& bytes_;
    const otlp::Tag tag_;
    const Passes& passes_;
    std::string_view key_; // of the attribute
    bool isBegun_ = false;
    bool leavesOut_ = false; // the value that comes next
    std::size_t skipped_ = 0;
    std::size_t depth_ = 0;
};

// Compared with what leaves, so in the same form.
void PayloadAttributes::setNames(std::vector<std::string> names) {
    names_ = std::move(names);
    for (std::string& name : names_) {
        if (!isValidUtf8(name)) {
            name = replaceInvalidUtf8(name);
        }
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
    if (json.find(kSummaryKey) == std::string_view::npos) {
        return false;
    }
    reading::JsonFields fields;
    return fields.parse(json) && fields.find(kSummaryKey) != nullptr;
}

void PayloadAttributes::add(AttributeBytes& bytes, otlp::Tag tag, std::string_view json,
                            const Passes& passes) {
    constexpr unsigned kFlags = rapidjson::kParseInsituFlag | rapidjson::kParseIterativeFlag |
                                rapidjson::kParseNumbersAsStringsFlag;
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
