// What rows become.
#include <fmt/format.h>
#include <set>

#include "ExporterTesting.h"

namespace halyard::exporting {
namespace {

class ContentsTest : public ExporterTest {
protected:
    std::int64_t session(const std::string& more = "", const std::string& name = "player") {
        return store_.addSession(name, kBegin + 1, kBegin + 100, more);
    }
    // As an event has it: field 1, eight bytes, the lowest first.
    static std::string timeField(double at) {
        const std::uint64_t nanoseconds = otlp::nanoseconds(kBegin + at);
        std::string field = "\x09";
        for (unsigned shift = 0; shift < 64; shift += 8) {
            field += static_cast<char>(nanoseconds >> shift);
        }
        return field;
    }
    std::string everythingSent() const {
        std::string all;
        for (const auto& request : receiver_.requests) {
            all += request.json;
        }
        return all;
    }
};

TEST_F(ContentsTest, APayloadKeepsItsTypes) {
    message(1, R"({"i":-3,"d":0.5,"t":"x","b":true,"n":null,"l":[1,[]],"o":{"k":{}},
                   "u":18446744073709551615})");
    run();
    const std::string& json = receiver_.requests.at(0).json;
    for (
        const char* const part :
        {R"({"key":"halyard.i","value":{"intValue":"-3"}})",
         R"({"key":"halyard.d","value":{"doubleValue":0.5}})",
         R"({"key":"halyard.t","value":{"stringValue":"x"}})",
         R"({"key":"halyard.b","value":{"boolValue":true}})", R"({"key":"halyard.n","value":{}})",
         R"({"key":"halyard.l","value":{"arrayValue":{"values":[{"intValue":"1"},{"arrayValue":{}}]}}})",
         R"({"key":"halyard.o","value":{"kvlistValue":{"values":[{"key":"k","value":{"kvlistValue":{}}}]}}})",
         R"({"key":"halyard.u","value":{"stringValue":"18446744073709551615"}})"}) {
        EXPECT_NE(json.find(part), std::string::npos) << part;
    }
}

TEST_F(ContentsTest, OfAListThatIsTooDeepTheInnermostStays) {
    const auto nested = [](std::size_t depth) {
        return std::string(depth, '[') + std::string(depth, ']');
    };
    message(1, R"({"deep":)" + nested(129) + R"(,"flat":)" + nested(128) + R"(,"beside":[7]})");
    run();
    const auto records = receiver_.items(Signal::Logs);
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(attribute(records[0], "halyard.beside"), "other");
    const std::string& json = receiver_.requests.at(0).json;
    std::size_t lists = 0;
    for (std::size_t at = 0; (at = json.find("arrayValue", at)) != std::string::npos; ++at) {
        ++lists;
    }
    EXPECT_EQ(lists, 128U + 128U + 1U); // the innermost of the first stays
}

TEST_F(ContentsTest, APayloadThatIsNoDictionaryHasNoAttributes) {
    for (const char* const payload :
         {R"({"a":1,"b":)", R"([{"a":1}])", R"("a")", "7", "", R"({"a":1e999})", R"({"a":1} {)"}) {
        message(1, payload);
    }
    run();
    const auto records = receiver_.items(Signal::Logs);
    ASSERT_EQ(records.size(), 7U);
    for (const auto& record : records) {
        EXPECT_EQ(record["attributes"].Size(), 1U); // its identity
    }
}

TEST_F(ContentsTest, TextsThatAreNotUtf8BecomeSo) {
    message(1, "{\"k\xff\":\"v\xc3\",\"escaped\":\"\\u00e9\\n\"}");
    run();
    const auto records = receiver_.items(Signal::Logs);
    EXPECT_EQ(attribute(records.at(0), "halyard.k\xef\xbf\xbd"), "v\xef\xbf\xbd");
    EXPECT_EQ(attribute(records.at(0), "halyard.escaped"), "\xc3\xa9\n");
}

TEST_F(ContentsTest, AnOmittedNameThatIsNotUtf8IsNamedNowhere) {
    plan_.options.omit = {"application"};
    message(1, "{\"said\":\"by pl\xffyer\",\"x\":1}", session("", "pl\xffyer"));
    run();
    const auto records = receiver_.items(Signal::Logs);
    EXPECT_EQ(attribute(records.at(0), "halyard.said"), "none");
    EXPECT_EQ(attribute(records.at(0), "halyard.x"), "1");
}

TEST_F(ContentsTest, ALogRecordBelongsToTheSpanOfItsSession) {
    message(2, "{}", session());
    run();
    const auto records = receiver_.items(Signal::Logs);
    const auto spans = receiver_.items(Signal::Traces);
    ASSERT_TRUE(records.size() == 1 && spans.size() == 1);
    EXPECT_STREQ(records[0]["traceId"].GetString(), spans[0]["traceId"].GetString());
    EXPECT_STREQ(records[0]["spanId"].GetString(), spans[0]["spanId"].GetString());
    EXPECT_EQ(records[0]["traceId"].GetStringLength(), 32U);
    EXPECT_EQ(records[0]["spanId"].GetStringLength(), 16U);
    EXPECT_STREQ(spans[0]["name"].GetString(), "alarms");
    EXPECT_STREQ(spans[0]["startTimeUnixNano"].GetString(), "1700000001000000000");
    EXPECT_STREQ(spans[0]["endTimeUnixNano"].GetString(), "1700000100000000000");
    EXPECT_FALSE(spans[0].HasMember("status"));
}

TEST_F(ContentsTest, TheTimeOfARecordIsToldOnce) {
    message(2);
    run();
    const auto records = receiver_.items(Signal::Logs);
    EXPECT_STREQ(records.at(0)["timeUnixNano"].GetString(), "1700000002000000000");
    EXPECT_FALSE(records[0].HasMember("observedTimeUnixNano"));
}

TEST_F(ContentsTest, RecordsOfAKindStandTogetherInTheirOrder) {
    const auto row = session();
    message(1, R"({"n":1})", row, 14, 3);
    message(2, R"({"n":2})", row, 10, 3);
    message(3, R"({"n":3})", row, 14, 3);
    message(4, R"({"n":4})", row, 10, 3);
    run();
    std::vector<std::string> order;
    for (const auto& record : receiver_.items(Signal::Logs)) {
        order.push_back(attribute(record, "halyard.n"));
    }
    EXPECT_EQ(order, (std::vector<std::string>{"1", "3", "2", "4"}));
}

TEST_F(ContentsTest, AnyNumberOfKindsLeavesWhole) {
    for (int i = 0; i < 100; ++i) {
        message(1, "{}", {}, 1 + i % 14, 1 + i / 14);
    }
    run();
    const auto names = eventNames();
    EXPECT_EQ(names.size(), 100U);
    EXPECT_GT(std::set<std::string>(names.begin(), names.end()).size(), 40U);
}

TEST_F(ContentsTest, AnInterruptedSessionIsAnError) {
    const auto row = session();
    store_.execute(
        fmt::format("UPDATE upload_session SET ended = 'interrupted' WHERE id = {}", row));
    run();
    EXPECT_EQ(receiver_.items(Signal::Traces).at(0)["status"]["code"].GetInt(), 2);
}

TEST_F(ContentsTest, AGlitchIsAnEventAndAChildWithItsFinalLength) {
    const auto row = session();
    message(10, glitch(9, 0.25), row, 4, 7);
    message(12, glitch(9, 0.75), row, 4, 7);
    run();
    const auto spans = receiver_.items(Signal::Traces);
    ASSERT_EQ(spans.size(), 2U);
    ASSERT_EQ(spans[0]["events"].Size(), 1U);
    EXPECT_STREQ(spans[0]["events"][0]["name"].GetString(), "halyard.glitch");
    EXPECT_EQ(attribute(spans[0]["events"][0], "halyard.any_channel_silence_seconds"), "0.75");
    EXPECT_STREQ(spans[1]["parentSpanId"].GetString(), spans[0]["spanId"].GetString());
    EXPECT_STREQ(spans[1]["startTimeUnixNano"].GetString(), "1700000009000000000");
    EXPECT_STREQ(spans[1]["endTimeUnixNano"].GetString(), "1700000009750000000");
}

TEST_F(ContentsTest, ChangesOfRouteAndVolumeAreEvents) {
    const auto row = session();
    message(10, R"({"active_devices":["a"]})", row, 10, 3);
    message(11, R"({"VQSessionVolume":0.5})", row, 14, 3);
    run();
    const auto spans = receiver_.items(Signal::Traces);
    ASSERT_EQ(spans.at(0)["events"].Size(), 2U);
    EXPECT_STREQ(spans[0]["events"][0]["name"].GetString(), "halyard.route");
    EXPECT_EQ(attribute(spans[0]["events"][1], "halyard.VQSessionVolume"), "0.5");
}

TEST_F(ContentsTest, AnEventEndsWithItsTimeWhichIsNeverLikeTheLast) {
    message(10, R"({"VQSessionVolume":0.5})", session(), 14, 3);
    run();
    std::string body;
    for (const auto& request : receiver_.requests) {
        body = request.signal == Signal::Traces ? request.body : body;
    }
    ASSERT_NE(body.find(timeField(10)), std::string::npos);
    EXPECT_LT(body.find("halyard.volume"), body.find("halyard.VQSessionVolume"));
    EXPECT_LT(body.find("halyard.VQSessionVolume"), body.find(timeField(10)));
}

TEST_F(ContentsTest, AGlitchToldTwiceCountsOnceWithTheLast) {
    const auto row = session();
    message(10, glitch(9, 0.25), row, 4, 7);
    message(12, glitch(9, 0.75), row, 4, 7);
    message(13, glitch(12, 0.1), row, 4, 7);
    run();
    const auto metrics = receiver_.items(Signal::Metrics);
    ASSERT_EQ(metrics.size(), 1U);
    EXPECT_STREQ(metrics[0]["name"].GetString(), "halyard.audio.issue.duration");
    EXPECT_STREQ(metrics[0]["unit"].GetString(), "s");
    EXPECT_EQ(metrics[0]["histogram"]["aggregationTemporality"].GetInt(), 1);
    const auto& point = metrics[0]["histogram"]["dataPoints"][0];
    EXPECT_STREQ(point["count"].GetString(), "2");
    EXPECT_DOUBLE_EQ(point["sum"].GetDouble(), 0.85);
    EXPECT_STREQ(point["bucketCounts"][3].GetString(), "1"); // up to 0.1 s
    EXPECT_STREQ(point["bucketCounts"][6].GetString(), "1"); // up to 1 s
    EXPECT_EQ(attribute(point, "issue_type"), "memory");
}

TEST_F(ContentsTest, AGlitchOfASingleMessageCountsOnce) {
    message(10, glitch(9, 0.25), {}, 4, 7);
    run();
    message(12, glitch(9, 0.75), {}, 4, 7);
    run();
    const auto metrics = receiver_.items(Signal::Metrics);
    ASSERT_EQ(metrics.size(), 1U);
    EXPECT_STREQ(metrics[0]["histogram"]["dataPoints"][0]["count"].GetString(), "1");
}

TEST_F(ContentsTest, DriverStatisticsAreMetricsOverTheSession) {
    plan_.drivers = DriverNames(
        {{"Group", "Sub", "drv", "Chan", "frames", linux_::ChannelFormat::Simple, "file:/x"}});
    const auto row = session();
    message(90, R"({"drv_Group_Sub_Simple_Chan":7,"out.x_Speaker_Simple_Cycles":3})", row, 12, 16);
    message(
        90,
        R"({"out.x_Speaker_Histogram_Wait":"count=4,lower=0,upper=40,min=3,max=37,unit=us::0-10:5;30-40:2"})",
        row, 12, 17);
    message(90,
            R"({"drv_Group_Sub_State_P":"name:idle,transition:2,residency:90,duty_cycle:0.5;"})",
            row, 12, 18);
    run();
    const std::string all = everythingSent();
    for (
        const char* const part :
        {R"("name":"halyard.driver.count","description":"What a driver counted during a session","unit":"frames","sum":{"dataPoints":[{"startTimeUnixNano":"1700000001000000000","timeUnixNano":"1700000100000000000","asInt":"7","attributes":[{"key":"group","value":{"stringValue":"Group"}},{"key":"subgroup","value":{"stringValue":"Sub"}},{"key":"driver","value":{"stringValue":"drv"}},{"key":"channel","value":{"stringValue":"Chan"}}]}],"aggregationTemporality":1,"isMonotonic":true})",
         R"("asInt":"3","attributes":[{"key":"group","value":{"stringValue":"Speaker"}},{"key":"driver","value":{"stringValue":"out.x"}},{"key":"channel","value":{"stringValue":"Cycles"}}])",
         R"("bucketCounts":["0","5","0","2","0"],"explicitBounds":[0.0,10.0,30.0,40.0])",
         R"("unit":"us")", R"("count":"7","sum":95.0)", R"("name":"halyard.driver.residency")",
         R"("asInt":"90")", R"({"key":"state","value":{"stringValue":"idle"}})"}) {
        EXPECT_NE(all.find(part), std::string::npos) << part << "\n" << all;
    }
}

TEST_F(ContentsTest, OmittedKeysLeaveAtNoDepthAndInNoSummary) {
    plan_.options.omit = {"secret"};
    message(1, R"({"secret":"s1","a":{"b":[{"secret":"s2","c":1}]}})");
    message(2, R"({"HY_Session_Summary_Event":"2","a":"{\n    secret = s3;\n}","b":"kept"})", {},
            65535, 65535);
    run();
    const std::string all = everythingSent();
    EXPECT_EQ(all.find("secret"), std::string::npos);
    for (const char* const part : {"s1", "s2", "s3"}) {
        EXPECT_EQ(all.find(part), std::string::npos) << part;
    }
    EXPECT_NE(all.find("kept"), std::string::npos);
}

TEST_F(ContentsTest, AnOmittedApplicationIsNamedNowhere) {
    plan_.options.omit = {"application"};
    const auto row = session(R"(,"application_binary":"playerd","media_name":"by player")");
    message(2, R"({"rtaid_client":"player","node":"player","x":["player","kept"],"y":"playerd"})",
            row, 4, 7);
    message(3, R"({"HY_Session_Summary_Event":"2","w":"player,player"})", row, 65535, 65535);
    run();
    const std::string all = everythingSent();
    EXPECT_EQ(all.find("player"), std::string::npos) << all;
    EXPECT_NE(all.find("kept"), std::string::npos);
}

TEST_F(ContentsTest, IncidentsEnergyAndEventsAreLogRecordsOfTheirOwnNames) {
    plan_.options.analyticsEvents = true;
    store_.insert("incident(signature, report, time)",
                  "'{\"kType\":\"Audio\"}', 'r', " + std::to_string(kBegin + 1));
    store_.insert("energy_event(client, name, payload, time)",
                  "9, 'e', '{\"p\":1}', " + std::to_string(kBegin + 1));
    store_.insert("analytics_event(name, payload, time)",
                  "'a', '{\"q\":1}', " + std::to_string(kBegin + 1));
    run();
    EXPECT_EQ(eventNames(),
              (std::vector<std::string>{"halyard.incident", "halyard.energy", "halyard.event"}));
    const auto records = receiver_.items(Signal::Logs);
    EXPECT_EQ(attribute(records[0], "halyard.kType"), "Audio");
    EXPECT_EQ(attribute(records[1], "halyard.client"), "9");
    EXPECT_EQ(attribute(records[1], "halyard.p"), "1");
    EXPECT_EQ(attribute(records[2], "halyard.name"), "a");
}

TEST_F(ContentsTest, AnalyticsEventsStayUnlessAskedFor) {
    store_.insert("analytics_event(name, payload, time)",
                  "'a', '{}', " + std::to_string(kBegin + 1));
    run();
    EXPECT_TRUE(receiver_.requests.empty());
}

TEST_F(ContentsTest, TheResourceSaysWhichDeviceItIs) {
    plan_.deviceName = "kitchen";
    plan_.options.resource = {{"deployment.environment", "field"}, {"service.name", "own"}};
    message(1);
    run();
    const std::string all = everythingSent();
    for (const char* const part :
         {R"({"key":"device.id","value":{"stringValue":"6f3a"}})",
          R"({"key":"service.instance.id","value":{"stringValue":"6f3a"}})",
          R"({"key":"os.type","value":{"stringValue":"linux"}})",
          R"({"key":"service.name","value":{"stringValue":"own"}})",
          R"({"key":"deployment.environment","value":{"stringValue":"field"}})", "kitchen"}) {
        EXPECT_NE(all.find(part), std::string::npos) << part;
    }
}

TEST_F(ContentsTest, TheDevicesNameStaysWhereItIsOmitted) {
    plan_.deviceName = "kitchen";
    plan_.options.omit = {"device_name"};
    message(1);
    run();
    EXPECT_EQ(everythingSent().find("kitchen"), std::string::npos);
}

TEST_F(ContentsTest, ErrorsAndGlitchesAreMoreSevere) {
    message(1, "{}", {}, 11, 1);
    message(2, glitch(1, 1), {}, 4, 7);
    message(3);
    run();
    const auto records = receiver_.items(Signal::Logs);
    EXPECT_EQ(records.at(0)["severityNumber"].GetInt(), 17);
    EXPECT_EQ(records.at(1)["severityNumber"].GetInt(), 13);
    EXPECT_EQ(records.at(2)["severityNumber"].GetInt(), 9);
}

} // namespace
} // namespace halyard::exporting
