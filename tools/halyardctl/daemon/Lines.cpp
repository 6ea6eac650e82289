#include "daemon/Lines.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <rapidjson/document.h>
#include <unistd.h>
#include <utility>
#include <vector>

#include "protocol/Wire.h"
#include "reading/JsonDocument.h"

namespace halyard::ctl {
namespace {

using reading::Exit;
using reading::Outcome;
using reading::Trouble;

std::string_view textOf(const rapidjson::Value& json) {
    return {json.GetString(), json.GetStringLength()};
}

// None when it is too deep.
std::optional<Value> valueOf(const rapidjson::Value& json, int depth);

std::optional<Value> listOf(const rapidjson::Value& json, int depth) {
    std::vector<Value> items;
    for (const rapidjson::Value& item : json.GetArray()) {
        auto value = valueOf(item, depth + 1);
        if (!value) {
            return std::nullopt;
        }
        items.push_back(*std::move(value));
    }
    return Value(List(std::move(items)));
}

std::optional<Value> dictionaryOf(const rapidjson::Value& json, int depth) {
    std::vector<Dictionary::Entry> entries;
    for (const auto& entry : json.GetObject()) {
        auto value = valueOf(entry.value, depth + 1);
        if (!value) {
            return std::nullopt;
        }
        if (!value->isNone()) {
            entries.push_back({Value(textOf(entry.name)), *std::move(value)});
        }
    }
    return Value(Dictionary(std::move(entries)));
}

Value numberOf(const rapidjson::Value& json) {
    return json.IsInt64()    ? Value(json.GetInt64())
           : json.IsUint64() ? Value(json.GetUint64())
                             : Value(json.GetDouble());
}

std::optional<Value> valueOf(const rapidjson::Value& json, int depth) {
    if (depth > protocol::kMaxDepth) {
        return std::nullopt;
    }
    switch (json.GetType()) {
    case rapidjson::kObjectType:
        return dictionaryOf(json, depth);
    case rapidjson::kArrayType:
        return listOf(json, depth);
    case rapidjson::kStringType:
        return Value(textOf(json));
    case rapidjson::kNumberType:
        return numberOf(json);
    case rapidjson::kNullType:
        return Value();
    default:
        return Value(json.GetBool());
    }
}

} // namespace

Outcome<Lines> Lines::open(const std::string& path) {
    if (path == "-") {
        return Lines(::dup(STDIN_FILENO));
    }
    Lines lines(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (lines.descriptor_ < 0) {
        return Trouble(errno == EACCES ? Exit::NotAllowed : Exit::Failed,
                       Failure::ofErrno(fmt::format("cannot read {}", path)).message());
    }
    return lines;
}

Lines::Lines(Lines&& other) noexcept : descriptor_(std::exchange(other.descriptor_, -1)) {}

Lines::~Lines() {
    if (descriptor_ >= 0) {
        ::close(descriptor_);
    }
}

bool Lines::fill() {
    buffer_.erase(0, std::exchange(at_, 0));
    std::array<char, 65536> room{};
    ssize_t count = -1;
    do {
        count = ::read(descriptor_, room.data(), room.size());
    } while (count < 0 && errno == EINTR);
    ended_ = count <= 0;
    if (!ended_) {
        buffer_.append(room.data(), static_cast<std::size_t>(count));
    }
    return !ended_;
}

std::optional<std::string> Lines::nextOfAny() {
    std::size_t looked = 0;
    wasTooLong_ = false;
    for (;;) {
        const std::size_t end = buffer_.find('\n', at_ + looked);
        if (end != std::string::npos || (ended_ && at_ < buffer_.size())) {
            const std::size_t length = (end == std::string::npos ? buffer_.size() : end) - at_;
            std::string line = wasTooLong_ ? std::string() : buffer_.substr(at_, length);
            at_ += std::min(length + 1, buffer_.size() - at_);
            return line;
        }
        if (ended_) {
            return wasTooLong_ ? std::optional(std::string()) : std::nullopt;
        }
        if (buffer_.size() - at_ > kLongest) {
            wasTooLong_ = true;
            at_ = buffer_.size();
        }
        looked = buffer_.size() - at_;
        fill();
    }
}

std::optional<std::string> Lines::next() {
    constexpr std::string_view kBlanks = " \t\r";
    for (;;) {
        const std::uint64_t before = number_++;
        auto line = nextOfAny();
        if (!line) {
            number_ = before;
            return line;
        }
        const bool isBlank = line->find_first_not_of(kBlanks) == std::string::npos;
        if (!isBlank || wasTooLong_) {
            return line;
        }
    }
}

std::optional<Dictionary> dictionaryIn(std::string_view json) {
    rapidjson::Document document;
    if (!parseJson(json, reading::Encoding::Checked, document) || !document.IsObject()) {
        return std::nullopt;
    }
    const auto value = valueOf(document, 0);
    return value ? std::optional(value->dictionary()) : std::nullopt;
}

} // namespace halyard::ctl
