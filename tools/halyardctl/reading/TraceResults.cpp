#include "reading/TraceResults.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>
#include <fmt/format.h>
#include <memory>
#include <numeric>
#include <optional>
#include <rapidjson/filereadstream.h>
#include <rapidjson/reader.h>
#include <string_view>
#include <unordered_map>

namespace halyard::reading {
namespace {

// Entries stand in a list in an object.
constexpr int kEntryDepth = 3;

double nanosecondsIn(std::string_view unit) {
    return unit == "s" ? 1e9 : unit == "ms" ? 1e6 : unit == "us" ? 1e3 : 1;
}

// Takes what the parser finds. Beside the entries of "benchmarks" nothing counts.
class Collector : public rapidjson::BaseReaderHandler<rapidjson::UTF8<>, Collector> {
public:
    bool foundList() const { return foundList_; }
    std::vector<TraceDurations> durations() {
        std::vector<TraceDurations> all;
        for (const std::string* name : order_) {
            all.push_back(durationsOf(*name, values_[*name]));
        }
        return all;
    }

    bool Default() { return true; } // Null and Bool
    // The library's own exact way of reading zeroes shifts by no defined number of bits.
    bool RawNumber(const char* digits, rapidjson::SizeType length, bool) {
        double value = 0;
        const bool fits = std::from_chars(digits, digits + length, value).ec == std::errc();
        return !fits || number(value);
    }
    bool String(const char* text, rapidjson::SizeType length, bool) {
        if (inEntry()) {
            if (key_ == "name") {
                name_.assign(text, length);
            } else if (key_ == "time_unit") {
                unit_ = nanosecondsIn({text, length});
            } else if (key_ == "run_type") {
                isValue_ = std::string_view(text, length) != "aggregate";
            }
        }
        return true;
    }
    bool Key(const char* text, rapidjson::SizeType length, bool) {
        key_.assign(text, length);
        if (depth_ == 1) {
            inList_ = key_ == "benchmarks";
        }
        return true;
    }
    bool StartObject() {
        ++depth_;
        if (inEntry()) {
            name_.reset();
            time_.reset();
            unit_ = 1;
            isValue_ = true;
        }
        return true;
    }
    bool EndObject(rapidjson::SizeType) {
        if (inEntry() && name_ && time_ && isValue_) {
            add(*name_, *time_ * unit_);
        }
        --depth_;
        return true;
    }
    bool StartArray() {
        foundList_ = foundList_ || (inList_ && depth_ == 1);
        ++depth_;
        return true;
    }
    bool EndArray(rapidjson::SizeType) {
        --depth_;
        return true;
    }

private:
    // A text that may be there.
    struct Name : std::optional<std::string> {
        void assign(const char* text, std::size_t length) { emplace(text, length); }
    };

    bool inEntry() const { return inList_ && depth_ == kEntryDepth; }
    bool number(double value) {
        if (inEntry() && key_ == "real_time") {
            time_ = value;
        }
        return true;
    }
    void add(const std::string& name, double value) {
        const auto [entry, isNew] = values_.try_emplace(name);
        if (isNew) {
            order_.push_back(&entry->first);
        }
        if (std::isfinite(value)) {
            entry->second.push_back(value);
        }
    }
    static TraceDurations durationsOf(const std::string& name, std::vector<double>& values) {
        TraceDurations result;
        result.name = name;
        result.count = values.size();
        if (values.empty()) {
            return result;
        }
        std::sort(values.begin(), values.end());
        const auto rank = [&](double share) {
            const auto place = std::ceil(share * static_cast<double>(values.size()));
            return values[static_cast<std::size_t>(std::max(place, 1.0)) - 1];
        };
        const std::size_t half = values.size() / 2;
        result.min = values.front();
        result.max = values.back();
        result.median =
            values.size() % 2 == 1 ? values[half] : (values[half - 1] + values[half]) / 2;
        result.p90 = rank(0.9);
        result.p99 = rank(0.99);
        result.total = std::accumulate(values.begin(), values.end(), 0.0);
        return result;
    }

    int depth_ = 0;
    bool inList_ = false;
    bool foundList_ = false;
    std::string key_;
    Name name_;
    std::optional<double> time_;
    double unit_ = 1;
    bool isValue_ = true;
    std::unordered_map<std::string, std::vector<double>> values_;
    std::vector<const std::string*> order_;
};

} // namespace

std::optional<std::vector<TraceDurations>> readTraceResults(std::FILE* file) {
    std::array<char, 65536> buffer{};
    rapidjson::FileReadStream stream(file, buffer.data(), buffer.size());
    rapidjson::Reader reader;
    Collector collector;
    constexpr unsigned kFlags =
        rapidjson::kParseIterativeFlag | rapidjson::kParseNumbersAsStringsFlag;
    if (reader.Parse<kFlags>(stream, collector).IsError() || !collector.foundList()) {
        return std::nullopt;
    }
    return collector.durations();
}

Outcome<std::vector<TraceDurations>> readTraceResults(const std::filesystem::path& path) {
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(path.c_str(), "re"),
                                                               std::fclose);
    if (file == nullptr) {
        return Trouble(errno == EACCES ? Exit::NotAllowed : Exit::Failed,
                       fmt::format("cannot read {}: {}", path.native(), std::strerror(errno)));
    }
    auto durations = readTraceResults(file.get());
    if (!durations) {
        return Trouble(
            Exit::Failed,
            fmt::format("{} is no results file of a trace (tracing_results.pbj)", path.native()));
    }
    return *std::move(durations);
}

} // namespace halyard::reading
