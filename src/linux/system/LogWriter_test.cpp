#include "linux/system/LogWriter.h"

#include <gtest/gtest.h>

#include <climits>
#include <condition_variable>
#include <cstdio>
#include <fstream>
#include <future>
#include <mutex>
#include <sys/socket.h>
#include <unistd.h>

namespace halyard::linux_ {
namespace {

platform::LogLine line(std::string_view text, LogLevel level = LogLevel::Default) {
    return {level, HYReportingClientCategory, "Some.cpp", 42, "some()", text};
}

LogRecord record(const std::string& message) {
    return {LogLevel::Info, "hyrc", Value(message), "Some.cpp", 42, "some()"};
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
            written.emplace_back(each.message.text());
        }
    });
    log.write(line("first"));
    log.write(line("second"));
    log.flush();

    ASSERT_EQ(written.size(), 2u);
    EXPECT_TRUE(written[0].ends_with("first"));
    EXPECT_TRUE(written[1].ends_with("second"));
}

// What was written at a time.
class Batches {
public:
    LogWriter::Output output() {
        return [this](std::span<const LogRecord> records) {
            const std::lock_guard lock(mutex_);
            sizes_.push_back(records.size());
            changed_.notify_all();
        };
    }
    std::vector<std::size_t> waitFor(std::size_t count) {
        std::unique_lock lock(mutex_);
        changed_.wait(lock, [&] { return sizes_.size() >= count; });
        return sizes_;
    }

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<std::size_t> sizes_;
};

TEST(LogWriter, GathersLinesThatFollowOthersCloselyUntilOneTellsOfAnError) {
    Batches batches;
    LogWriter log(batches.output(), {std::chrono::hours(1), 0});
    log.write(line("first"));
    EXPECT_EQ(batches.waitFor(1), (std::vector<std::size_t>{1}));
    log.flush(); // So that the first is done with.
    log.write(line("gathered"));
    log.write(line("gathered"));
    log.write(line("worse", LogLevel::Error));
    EXPECT_EQ(batches.waitFor(2), (std::vector<std::size_t>{1, 3}));
}

TEST(LogWriter, GathersNothingWhereLinesAreFew) {
    Batches batches;
    LogWriter log(batches.output(), {std::chrono::hours(1), 1});
    for (std::size_t count = 1; count <= 3; ++count) {
        log.write(line("by itself"));
        EXPECT_EQ(batches.waitFor(count), std::vector<std::size_t>(count, 1));
        log.flush();
    }
}

TEST(LogWriter, WritesWhatItHasGatheredWhenThereIsMuchOfIt) {
    Batches batches;
    LogWriter log(batches.output(), {std::chrono::hours(1), 0});
    log.write(line("first"));
    batches.waitFor(1);
    log.flush();
    log.write(line(std::string(200'000, 'x')));
    batches.waitFor(2);
    log.flush();
    for (int i = 0; i < 1024; ++i) {
        log.write(line("many"));
    }
    EXPECT_EQ(batches.waitFor(3), (std::vector<std::size_t>{1, 1, 1024}));
}

TEST(LogWriter, MakesALineThatRecursOnce) {
    std::vector<std::string> written;
    LogWriter log([&](std::span<const LogRecord> records) {
        for (const LogRecord& each : records) {
            written.emplace_back(each.message.text());
        }
    });
    platform::LogMemo memo;
    platform::LogLine recurring = line("the text");
    recurring.memo = &memo;
    log.write(recurring);
    EXPECT_EQ(memo.made, Value(logMessage(line("the text"))));
    recurring.text = "not looked at";
    log.write(recurring);
    log.flush();
    EXPECT_EQ(written, std::vector(2, logMessage(line("the text"))));
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
            written.emplace_back(each.message.text());
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

std::uint64_t writesOfThisThread() {
    std::ifstream counters("/proc/thread-self/io");
    std::string name;
    std::uint64_t count = 0;
    while (counters >> name >> count && name != "syscw:") {
    }
    return count;
}

TEST(LinesOn, WritesManyLinesAtATimeIntoAFile) {
    std::FILE* const file = std::tmpfile();
    const std::vector<LogRecord> records(30, record(std::string(PIPE_BUF, 'x')));
    const std::uint64_t before = writesOfThisThread();
    LogWriter::linesOn(::fileno(file))(records);
    EXPECT_EQ(writesOfThisThread() - before, 2u); // 120 KiB, 64 at most at a time

    std::string text(std::size_t{31} * (PIPE_BUF + 16), 0);
    text.resize(static_cast<std::size_t>(::pread(::fileno(file), text.data(), text.size(), 0)));
    std::string expected;
    for (const LogRecord& each : records) {
        expected += standardErrorLine(each);
    }
    EXPECT_EQ(text, expected);
    std::fclose(file);
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
