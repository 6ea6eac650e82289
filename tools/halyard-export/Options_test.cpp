#include "Options.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "testing/TempTree.h"

namespace halyard::exporting {
namespace {

class OptionsTest : public ::testing::Test {
protected:
    reading::Outcome<Options> read() {
        return optionsFrom(settings_, [this](std::string_view name) {
            const auto found = environment_.find(std::string(name));
            return found == environment_.end() ? std::nullopt : std::optional(found->second);
        });
    }
    Options options() {
        auto read = this->read();
        EXPECT_TRUE(read.ok()) << read.failure().message();
        return read.ok() ? read.value() : Options();
    }
    std::string file(const std::string& text, mode_t mode) {
        tree_.write("secret", text);
        const std::string path = (tree_ / "secret").native();
        EXPECT_EQ(::chmod(path.c_str(), mode), 0);
        return path;
    }

    testing::TempTree tree_;
    linux_::ExportSettings settings_;
    std::map<std::string, std::string> environment_;
};

constexpr auto kLogs = static_cast<std::size_t>(Signal::Logs);
constexpr auto kMetrics = static_cast<std::size_t>(Signal::Metrics);
constexpr auto kTraces = static_cast<std::size_t>(Signal::Traces);

TEST_F(OptionsTest, WithoutAnEndpointNothingIsSent) {
    EXPECT_FALSE(options().isAnythingSent());
}

TEST_F(OptionsTest, EachSignalHasItsPathBelowTheEndpoint) {
    settings_.endpoint = "https://collector:4318/";
    EXPECT_EQ(options().urls[kLogs], "https://collector:4318/v1/logs");
    EXPECT_EQ(options().urls[kMetrics], "https://collector:4318/v1/metrics");
    EXPECT_EQ(options().urls[kTraces], "https://collector:4318/v1/traces");
}

TEST_F(OptionsTest, TheStandardVariablesHoldOverTheFile) {
    settings_.endpoint = "https://file:4318";
    settings_.resource = {{"a", "file"}, {"b", "file"}};
    environment_ = {{"OTEL_EXPORTER_OTLP_ENDPOINT", "http://all:1"},
                    {"OTEL_EXPORTER_OTLP_LOGS_ENDPOINT", "http://own:2/exact"},
                    {"OTEL_EXPORTER_OTLP_HEADERS", "k=v%20w, x = y"},
                    {"OTEL_EXPORTER_OTLP_TIMEOUT", "2500"},
                    {"OTEL_EXPORTER_OTLP_COMPRESSION", "none"},
                    {"OTEL_RESOURCE_ATTRIBUTES", "a=variable,c=d%2Ce"},
                    {"OTEL_SERVICE_NAME", "name"},
                    {"OTEL_BLRP_SCHEDULE_DELAY", "100"},
                    {"OTEL_BLRP_MAX_EXPORT_BATCH_SIZE", "7"}};
    const Options found = options();
    EXPECT_EQ(found.urls[kLogs], "http://own:2/exact");
    EXPECT_EQ(found.urls[kTraces], "http://all:1/v1/traces");
    EXPECT_EQ(found.headers[kTraces], (Options::Headers{{"k", "v w"}, {"x", "y"}}));
    EXPECT_EQ(found.timeout.count(), 2500);
    EXPECT_FALSE(found.compress);
    EXPECT_EQ(found.resource,
              (std::map<std::string, std::string>{
                  {"a", "variable"}, {"b", "file"}, {"c", "d,e"}, {"service.name", "name"}}));
    EXPECT_EQ(found.delay.count(), 100);
    EXPECT_EQ(found.limits.records, 7U);
}

TEST_F(OptionsTest, NoVariableGivesConsent) {
    environment_ = {{"OTEL_EXPORTER_OTLP_ENDPOINT", "http://all:1"}};
    EXPECT_FALSE(options().consent);
    settings_.consent = true;
    EXPECT_TRUE(options().consent);
}

TEST_F(OptionsTest, ADisabledSystemSendsNothing) {
    settings_.endpoint = "https://collector:4318";
    environment_ = {{"OTEL_SDK_DISABLED", "True"}};
    EXPECT_FALSE(options().isAnythingSent());
}

TEST_F(OptionsTest, SignalsThatAreNotWantedAreNotSent) {
    settings_.endpoint = "https://collector:4318";
    settings_.signals = {"logs", "traces"};
    environment_ = {{"OTEL_TRACES_EXPORTER", "none"}};
    EXPECT_TRUE(options().isSent(Signal::Logs));
    EXPECT_FALSE(options().isSent(Signal::Metrics));
    EXPECT_FALSE(options().isSent(Signal::Traces));
}

TEST_F(OptionsTest, AnAddressIsShownWithoutItsSecrets) {
    EXPECT_EQ(shownAddress("https://u:p@host:4318/v1/logs?key=k#f"), "https://host:4318/v1/logs");
    EXPECT_EQ(shownAddress("http://host/a@b"), "http://host/a@b");
    EXPECT_EQ(shownAddress("http://a@b@host"), "http://host");
}

TEST_F(OptionsTest, OtherProtocolsAreRefused) {
    environment_ = {{"OTEL_EXPORTER_OTLP_PROTOCOL", "grpc"}};
    EXPECT_FALSE(read().ok());
}

TEST_F(OptionsTest, OtherAddressesAreRefused) {
    settings_.endpoint = "file:///etc/passwd";
    EXPECT_FALSE(read().ok());
}

TEST_F(OptionsTest, HeadersComeFromAFileThatIsItsUsersAlone) {
    settings_.headersFile = file("# key\nauthorization: Bearer a:b\n\nx:  y \n", 0600);
    EXPECT_EQ(options().headers[kLogs],
              (Options::Headers{{"authorization", "Bearer a:b"}, {"x", "y"}}));
}

TEST_F(OptionsTest, SecretsThatOthersMayReadAreRefused) {
    settings_.headersFile = file("a: b\n", 0640);
    EXPECT_FALSE(read().ok());
    settings_.headersFile = "";
    settings_.clientKey = file("key", 0604);
    EXPECT_FALSE(read().ok());
}

TEST_F(OptionsTest, ABrokenHeaderIsToldWithoutItsText) {
    settings_.headersFile = file("a: b\nsecret-without-colon\n", 0600);
    const auto failed = read();
    ASSERT_FALSE(failed.ok());
    EXPECT_NE(failed.failure().message().find("secret:2"), std::string::npos);
    EXPECT_EQ(failed.failure().message().find("without"), std::string::npos);
}

TEST_F(OptionsTest, AHeaderCannotBeginAnother) {
    environment_ = {{"OTEL_EXPORTER_OTLP_HEADERS", "a=b%0D%0Ac: d,e=f"}};
    EXPECT_EQ(options().headers[kLogs], (Options::Headers{{"e", "f"}}));
}

} // namespace
} // namespace halyard::exporting
