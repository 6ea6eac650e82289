#include "linux/config/SettingsTesting.h"

namespace halyard::linux_ {
namespace {

using ::testing::ElementsAre;

TEST(ExportSettingsTest, NothingIsAgreedToByDefault) {
    const ExportSettings defaults = settings("[export]").exporting;

    EXPECT_EQ(defaults, ExportSettings());
    EXPECT_FALSE(defaults.consent);
    EXPECT_EQ(defaults.endpoint, "");
    EXPECT_THAT(defaults.signals, ElementsAre("logs", "metrics", "traces"));
    EXPECT_FALSE(defaults.analyticsEvents);
    EXPECT_THAT(defaults.omit, ElementsAre("device_name"));
    EXPECT_EQ(defaults.maxBytesPerDay, 52428800u);
}

TEST(ExportSettingsTest, ReadsEveryKey) {
    const ExportSettings all = settings(R"(
[export]
consent = true
endpoint = "https://collector:4318"
headers_file = "/etc/halyard/headers"
certificate = "/c"
client_certificate = "/d"
client_key = "/e"
signals = ["traces"]
analytics_events = true
omit = []
max_bytes_per_day = "1MiB"
resource = { "deployment.environment" = "field" }
)")
                                   .exporting;

    EXPECT_EQ(all, (ExportSettings{true,
                                   "https://collector:4318",
                                   "/etc/halyard/headers",
                                   "/c",
                                   "/d",
                                   "/e",
                                   {"traces"},
                                   true,
                                   {},
                                   1048576,
                                   {{"deployment.environment", "field"}}}));
}

TEST(ExportSettingsTest, MistakesAreToldWhereTheyAre) {
    const auto exporting = [](const std::string& line) { return mistake("[export]\n" + line); };

    EXPECT_EQ(exporting("consent = 'yes'"), "2:11: export.consent must be true or false");
    for (const char* wrong : {"'collector:4318'", "'ftp://x'", "'https://'"}) {
        EXPECT_EQ(exporting(std::string("endpoint = ") + wrong),
                  "2:12: export.endpoint must begin with \"http://\" or \"https://\" and name a "
                  "host");
    }
    EXPECT_EQ(exporting("endpoint = ''"), "");
    EXPECT_EQ(exporting("endpoint = 4318"), "2:12: export.endpoint must be a text");
    for (const std::string key :
         {"headers_file", "certificate", "client_certificate", "client_key"}) {
        EXPECT_EQ(exporting(key + " = 'x'"), "2:" + std::to_string(key.size() + 4) + ": export." +
                                                 key + " must be an absolute path");
        EXPECT_EQ(exporting(key + " = ''"), "");
    }
    EXPECT_EQ(exporting("signals = ['logs', 'spans']"),
              "2:20: export.signals must be a list of some of \"logs\", \"metrics\", \"traces\"");
    EXPECT_EQ(exporting("omit = 'a'"), "2:8: export.omit must be a list of texts");
    EXPECT_EQ(exporting("max_bytes_per_day = 1023"),
              "2:21: export.max_bytes_per_day must be at least 1KiB");
    EXPECT_EQ(exporting("max_bytes_per_day = 1024"), "");
    EXPECT_EQ(exporting("resource = { a = 1 }"), "2:18: export.resource.\"a\" must be a text");
    EXPECT_EQ(exporting("resource = 'a'"), "2:12: export.resource must be a table");
}

} // namespace
} // namespace halyard::linux_
