// Keeps the log lines of a test, all levels on.
#pragma once

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/LogSink.h"

namespace halyard::testing {

// Any thread; but for waitFor() and countOf(), looking wants the writers at rest.
class RecordingLog final : public platform::LogSink {
public:
    struct Line {
        LogLevel level;
        std::string category;
        std::string text;

        bool operator==(const Line&) const = default;
    };

    bool isEnabled(LogLevel level) const override { return level >= least; }
    void write(const platform::LogLine& line) override {
        const std::lock_guard lock(mutex_);
        lines_.push_back({line.level, std::string(line.category), std::string(line.text)});
        changed_.notify_all();
    }
    // The text of a line that holds `text`, once there is one.
    std::string waitFor(std::string_view text) {
        std::unique_lock lock(mutex_);
        const auto find = [&] {
            return std::find_if(lines_.begin(), lines_.end(), [&](const Line& line) {
                return line.text.find(text) != std::string::npos;
            });
        };
        changed_.wait(lock, [&] { return find() != lines_.end(); });
        return find()->text;
    }
    // Lines that hold `text`, also while others write.
    std::size_t countOf(std::string_view text, LogLevel level) {
        const std::lock_guard lock(mutex_);
        return static_cast<std::size_t>(
            std::count_if(lines_.begin(), lines_.end(), [&](const Line& line) {
                return line.level == level && line.text.find(text) != std::string::npos;
            }));
    }

    const std::vector<Line>& lines() const { return lines_; }
    void clear() { lines_.clear(); }
    std::size_t count(std::string_view text) const {
        return static_cast<std::size_t>(std::count_if(
            lines_.begin(), lines_.end(), [&](const Line& line) { return line.text == text; }));
    }
    bool has(LogLevel level, std::string_view category, std::string_view text) const {
        return std::find(lines_.begin(), lines_.end(),
                         Line{level, std::string(category), std::string(text)}) != lines_.end();
    }
    std::vector<std::string> texts(LogLevel from = LogLevel::Debug) const {
        std::vector<std::string> result;
        for (const Line& line : lines_) {
            if (line.level >= from) {
                result.push_back(line.text);
            }
        }
        return result;
    }

    LogLevel least = LogLevel::Debug;

private:
    std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<Line> lines_;
};

} // namespace halyard::testing
