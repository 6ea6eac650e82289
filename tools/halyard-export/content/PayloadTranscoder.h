// Turns the events of a JSON parser into attributes: what PayloadAttributes works with, and
// nobody else.
//
// An entry that is left out, or what is inside of it, is `skipped_` containers deep. Not
// thread-safe.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "content/PayloadAttributes.h"
#include "reading/JsonNumbers.h"

namespace halyard::exporting {

class PayloadAttributes::Transcoder {
public:
    using Length = rapidjson::SizeType;

    // Borrows all.
    Transcoder(PayloadAttributes& owner, AttributeBytes& bytes, otlp::Tag tag, const Passes& passes)
        : owner_(owner), bytes_(bytes), tag_(tag), passes_(passes) {}

    // Instead of Key(), where it is known whether the entry leaves. Not inside of another.
    void expect(std::string_view key, bool leaves) {
        key_ = key;
        leavesOut_ = !leaves;
    }
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

    // Deeper than any message that the daemon takes.
    static constexpr std::size_t kMaxDepth = 128;

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

} // namespace halyard::exporting
