#include "platform/Log.h"

#include <gmock/gmock.h>
#include <string>
#include <vector>

#include "common/LogCategory.h"
#include "platform/Platform.h"

namespace halyard::platform {
namespace {

using ::testing::ElementsAre;

// Keeps where each line stands.
class PlaceLog final : public LogSink {
public:
    bool isEnabled(LogLevel asked) const override { return asked >= LogLevel::Default; }
    void write(const LogLine& line) override {
        texts.emplace_back(line.text);
        file = line.file;
        function = line.function;
        number = line.line;
        level = line.level;
        category = line.category;
    }

    std::vector<std::string> texts;
    std::string file;
    std::string function;
    std::string category;
    int number = 0;
    LogLevel level = LogLevel::Debug;
};

class LogTest : public ::testing::Test {
protected:
    LogTest() {
        platform_.log = &log_;
        install(&platform_);
    }
    ~LogTest() override { install(nullptr); }

    PlaceLog log_;
    Platform platform_;
};

TEST_F(LogTest, ALineTellsWhereItStands) {
    const int here = __LINE__ + 1;
    HY_LOG_ERROR(HYReportingClientCategory, "{} and {}", 1, Value(List{Value("a b")}));
    EXPECT_THAT(log_.texts, ElementsAre("1 and (\n    \"a b\"\n)"));
    EXPECT_EQ(log_.file, "Log_test.cpp");
    EXPECT_EQ(log_.function, "TestBody");
    EXPECT_EQ(log_.number, here);
    EXPECT_EQ(log_.level, LogLevel::Error);
    EXPECT_EQ(log_.category, HYReportingClientCategory);
}

TEST_F(LogTest, ALineIsNoLongerThanSixteenKilobytesAndSaysHowMuchIsMissing) {
    HY_LOG_ERROR(HYReportingClientCategory, "{}", std::string(16 * 1024, 'x'));
    HY_LOG_ERROR(HYReportingClientCategory, "{}", Value(std::string(1'000'000, 'x')));
    EXPECT_THAT(log_.texts, ElementsAre(std::string(16 * 1024, 'x'),
                                        std::string(16 * 1024, 'x') + "... (983616 bytes more)"));
}

TEST_F(LogTest, ALineThatNobodyReadsCostsNothing) {
    int looked = 0;
    HY_LOG_INFO(HYReportingClientCategory, "{}", ++looked);
    HY_LOG_DEBUG(HYReportingClientCategory, "{}", ++looked);
    EXPECT_EQ(looked, 0);
    HY_LOG_DEFAULT(HYReportingClientCategory, "{}", ++looked);
    EXPECT_THAT(log_.texts, ElementsAre("1"));
}

TEST_F(LogTest, WithoutAPlatformNothingIsRead) {
    install(nullptr);
    EXPECT_FALSE(logEnabled(LogLevel::Error));
    install(&platform_);
    EXPECT_TRUE(logEnabled(LogLevel::Error));
}

} // namespace
} // namespace halyard::platform
