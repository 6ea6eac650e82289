#include "linux/system/LogWriter.h"

#include <gtest/gtest.h>

#include <climits>
#include <future>
#include <sys/socket.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

platform::LogLine line(std::string_view text, LogLevel level = LogLevel::Default) {
    return {level, HYReportingClientCategory, "Some.cpp", 42, "some()", text};
}

LogRecord record(std::string message) {
    return {LogLevel::Info, "hyrc", std::move(message), "Some.cpp", 42, "some()"};
}

TEST(LogMessage, PutsFileAndLineInFront) {
    EXPECT_EQ(logMessage(line("text")), "                 Some.cpp:42    text");
}

TEST(StandardErrorLine, IsLevelCategoryAndMessage) {
    EXPECT_EQ(standardErrorLine(record("text")), "info hyrc text\n");
}

TEST(StandardErrorLine, EscapesWhatCouldForgeALine) {
    EXPECT_EQ(standardErrorLine(record("a\nerror hyrs forged\r\t\x1b[1m\\n\x7f")),
              "info hyrc a\\nerror hyrs forged\\r\\t\\x1b[1m\\\\n\\x7f\n");
}

TEST(LogWriter, WritesInTheOrderOfTheLines) {
    std::vector<std::string> written;
    LogWriter log([&](std::span<const LogRecord> records) {
        for (const LogRecord& each : records) {
            written.push_back(each.message);
        }
    });
    log.write(line("first"));
    log.write(line("second"));
    log.flush();

    ASSERT_EQ(written.size(), 2u);
    EXPECT_TRUE(written[0].ends_with("first"));
    EXPECT_TRUE(written[1].ends_with("second"));
}

TEST(LogWriter, LevelsBelowTheSetOneAreOff) {
    LogWriter log([](std::span<const LogRecord>) {});
    EXPECT_FALSE(log.isEnabled(LogLevel::Debug));
    EXPECT_TRUE(log.isEnabled(LogLevel::Info));

    log.setLevel(LogLevel::Error);
    EXPECT_FALSE(log.isEnabled(LogLevel::Default));
    EXPECT_TRUE(log.isEnabled(LogLevel::Error));
}

TEST(LogWriter, AStuckReaderCostsLinesAndTellsHowMany) {
    std::promise<void> gate;
    std::promise<void> stuck;
    auto opened = gate.get_future().share();
    std::vector<std::string> written;
    LogWriter log([&](std::span<const LogRecord> records) {
        if (written.empty()) {
            stuck.set_value();
        }
        opened.wait();
        for (const LogRecord& each : records) {
            written.push_back(each.message);
        }
    });
    log.write(line("first"));
    stuck.get_future().wait();
    const std::string large(LogWriter::kMaxQueuedBytes / 4, 'x');
    for (int i = 0; i < 8; ++i) {
        log.write(line(large));
    }
    EXPECT_EQ(log.droppedLines(), 5u);

    gate.set_value();
    log.flush();
    EXPECT_TRUE(written.back().ends_with("5 messages dropped"));
}

TEST(LogWriter, KeepsTheNewestLines) {
    LogWriter log([](std::span<const LogRecord>) {});
    for (std::size_t i = 0; i < LogWriter::kRecentLines + 1; ++i) {
        log.write(line(std::to_string(i)));
    }
    log.flush();

    const auto recent = log.recentLines();
    ASSERT_EQ(recent.size(), LogWriter::kRecentLines);
    EXPECT_TRUE(recent.front().ends_with(" 1\n"));
}

// A pair of which each write is read by itself.
TEST(LinesOn, WritesSeveralWholeLinesAtATimeAndNoMoreThanAPipeTakes) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET, 0, ends), 0);
    const std::vector<LogRecord> records(3, record(std::string(PIPE_BUF / 2 - 50, 'x')));
    LogWriter::linesOn(ends[0])(records);
    ::close(ends[0]);

    std::vector<std::string> pieces;
    std::string piece(std::size_t{4} * PIPE_BUF, 0);
    for (ssize_t n = 0; (n = ::read(ends[1], piece.data(), piece.size())) > 0;) {
        pieces.emplace_back(piece, 0, static_cast<std::size_t>(n));
    }
    ::close(ends[1]);
    const std::string text = standardErrorLine(records.front());
    EXPECT_EQ(pieces, (std::vector{text + text, text}));
}

TEST(LeadsToJournal, IsFalseForAPipe) {
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    EXPECT_FALSE(leadsToJournal(ends[1]));
    ::close(ends[0]);
    ::close(ends[1]);
}

} // namespace
} // namespace halyard::linux_
