#include "platform/KeptLine.h"

#include <gmock/gmock.h>
#include <string>
#include <vector>

#include "common/LogCategory.h"
#include "platform/Platform.h"

namespace halyard::platform {
namespace {

using ::testing::ElementsAre;

// Makes something of a line that it has not made anything of before.
class MemoLog final : public LogSink {
public:
    bool isEnabled(LogLevel asked) const override { return asked >= LogLevel::Default; }
    void write(const LogLine& line) override {
        texts.emplace_back(line.text);
        file = line.file;
        if (line.memo->made.isNone()) {
            ++made;
            line.memo->made = made;
        }
    }

    std::vector<std::string> texts;
    std::string file;
    int made = 0;
};

class KeptLineTest : public ::testing::Test {
protected:
    KeptLineTest() {
        platform_.log = &log_;
        install(&platform_);
    }
    ~KeptLineTest() override { install(nullptr); }

    void write(const std::string& name, int number, LogLevel level = LogLevel::Default) {
        HY_LOG_KEPT(line_, level, HYReportingClientCategory,
                    (std::vector<Value>{Value(name), Value(number)}), "{}: {} {}", ++formatted_,
                    name, number);
    }

    MemoLog log_;
    Platform platform_;
    KeptLine line_;
    int formatted_ = 0;
};

TEST_F(KeptLineTest, IsPutTogetherOnceForAsLongAsItTellsTheSame) {
    write("a", 1);
    write("a", 1);
    EXPECT_THAT(log_.texts, ElementsAre("1: a 1", "1: a 1"));
    EXPECT_EQ(log_.file, "KeptLine_test.cpp");
    EXPECT_EQ(log_.made, 1);
}

TEST_F(KeptLineTest, IsPutTogetherAnewWheneverItTellsSomethingElse) {
    write("a", 1);
    write("b", 1);
    write("b", 2);
    write("a", 1);
    EXPECT_THAT(log_.texts, ElementsAre("1: a 1", "2: b 1", "3: b 2", "4: a 1"));
    EXPECT_EQ(log_.made, 4);
}

TEST_F(KeptLineTest, CostsNothingWhereNobodyReadsIt) {
    write("a", 1, LogLevel::Info);
    EXPECT_EQ(formatted_, 0);
    EXPECT_THAT(log_.texts, ElementsAre());
}

TEST_F(KeptLineTest, IsNoLongerThanOtherLines) {
    HY_LOG_KEPT(line_, LogLevel::Error, HYReportingClientCategory, {}, "{}",
                std::string(17 * 1024, 'x'));
    EXPECT_THAT(log_.texts, ElementsAre(std::string(16 * 1024, 'x') + "... (1024 bytes more)"));
}

} // namespace
} // namespace halyard::platform
