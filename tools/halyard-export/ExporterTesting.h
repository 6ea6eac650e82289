// An exporter between a store that a test fills and a receiver that it plays.
#pragma once

#include <deque>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <string>
#include <utility>
#include <vector>

#include "Exporter.h"
#include "otlp/OtlpJson.h"
#include "platform/Platform.h"
#include "reading/TestStoreTesting.h"
#include "testing/RecordingLog.h"

namespace halyard::exporting {

class FakeReceiver final : public Receiver {
public:
    struct Request {
        Signal signal;
        std::string body;
        std::string json;
    };

    Answer post(Signal signal, std::string_view body, bool isCompressed) override {
        EXPECT_FALSE(isCompressed);
        requests.push_back(
            {signal, std::string(body), otlp::jsonOf(signal, body).value_or("no request")});
        Answer answer;
        answer.status = 200;
        if (!answers.empty()) {
            answer = answers.front();
            answers.pop_front();
        }
        return answer;
    }
    void answerWith(int status, int retryAfter = 0, std::string body = {}) {
        Answer answer;
        answer.status = status;
        answer.retryAfter = std::chrono::seconds(retryAfter);
        answer.body = std::move(body);
        answers.push_back(answer);
    }
    // The items of all requests of a signal: log records, spans or metrics.
    std::vector<rapidjson::Document> items(Signal signal) const {
        static constexpr const char* kNames[][3] = {{"resourceLogs", "scopeLogs", "logRecords"},
                                                    {"resourceMetrics", "scopeMetrics", "metrics"},
                                                    {"resourceSpans", "scopeSpans", "spans"}};
        const auto* const names = kNames[static_cast<std::size_t>(signal)];
        std::vector<rapidjson::Document> found;
        for (const Request& request : requests) {
            rapidjson::Document document;
            if (request.signal != signal || document.Parse(request.json.c_str()).HasParseError()) {
                continue;
            }
            for (const auto& item : document[names[0]][0][names[1]][0][names[2]].GetArray()) {
                found.emplace_back().CopyFrom(item, found.back().GetAllocator());
            }
        }
        return found;
    }

    std::vector<Request> requests;
    std::deque<Answer> answers; // 200 once there are no more
};

// The value of an attribute, as JSON has it; null when there is none.
inline std::string attribute(const rapidjson::Value& item, std::string_view key) {
    if (!item.HasMember("attributes")) {
        return "none";
    }
    for (const auto& each : item["attributes"].GetArray()) {
        if (key == each["key"].GetString() && !each["value"].ObjectEmpty()) {
            const auto& value = each["value"].MemberBegin()->value;
            return value.IsString()   ? value.GetString()
                   : value.IsBool()   ? (value.GetBool() ? "true" : "false")
                   : value.IsNumber() ? fmt::format("{}", value.GetDouble())
                                      : "other";
        }
    }
    return "none";
}

class ExporterTest : public ::testing::Test {
protected:
    static constexpr double kBegin = 1.7e9;

    ExporterTest() {
        platform_.log = &log_;
        platform::install(&platform_);
        store_.execute("CREATE TABLE IF NOT EXISTS identity(device TEXT);"
                       "INSERT INTO identity VALUES('6f3a');"
                       "CREATE TABLE IF NOT EXISTS consent(id INTEGER PRIMARY KEY, given INTEGER,"
                       " time REAL)");
        note(true, kBegin);
        plan_.options.consent = true;
        plan_.options.compress = false;
        plan_.options.maxBytesPerDay = 1'000'000'000;
        plan_.options.urls = {"http://r/v1/logs", "http://r/v1/metrics", "http://r/v1/traces"};
        now_ = kBegin + 1000;
    }
    ~ExporterTest() override { platform::install(nullptr); }

    void note(bool given, double time) {
        store_.execute("INSERT INTO consent(given, time) VALUES(" + std::to_string(given) + ", " +
                       std::to_string(time) + ")");
    }
    std::int64_t message(double at, const std::string& payload = "{\"a\":1}",
                         std::optional<std::int64_t> session = {}, int category = 4, int type = 1) {
        return store_.addMessage(session, category, type, payload, kBegin + at);
    }
    static std::string glitch(double start, double seconds, const std::string& cause = "memory",
                              const std::string& more = "") {
        return "{\"issue_type\":\"" + cause +
               "\",\"node\":\"n\",\"glitch_start\":" + std::to_string(kBegin + start) +
               ",\"any_channel_silence_seconds\":" + std::to_string(seconds) + more + "}";
    }
    // As after a restart: what it knows is what stands in its file.
    Exporter& restarted() {
        exporter_.reset();
        auto place = ExportPlace::open(tree_ / "export.db", now_);
        EXPECT_TRUE(place.ok());
        exporter_.emplace(store_.path(), std::move(place.value()),
                          ExporterWorld{[this] { return now_; }, [] { return 0.0; },
                                        [this] { return mayGoOn_; }});
        plan_.receiver = &receiver_;
        exporter_->follow(plan_);
        return *exporter_;
    }
    // Steps until there is nothing more to do now.
    Exporter::Step run() {
        store_.close();
        Exporter& exporter = exporter_ ? *exporter_ : restarted();
        Exporter::Step step;
        int steps = 0;
        do {
            step = exporter.step();
        } while (step.hasMore && ++steps < 1000);
        EXPECT_LT(steps, 1000);
        store_.reopen();
        return step;
    }
    std::uint64_t lost(Signal signal, Loss loss) {
        return exporter_->place().counts(now_).losses[{std::string(nameOf(signal)), loss}];
    }
    std::vector<std::string> eventNames() const {
        std::vector<std::string> names;
        for (const auto& record : receiver_.items(Signal::Logs)) {
            names.emplace_back(record["eventName"].GetString());
        }
        return names;
    }

    reading::TestStore store_;
    testing::TempTree tree_;
    testing::RecordingLog log_;
    platform::Platform platform_;
    FakeReceiver receiver_;
    Exporter::Plan plan_;
    std::optional<Exporter> exporter_;
    double now_ = 0;
    bool mayGoOn_ = true;
};

} // namespace halyard::exporting
