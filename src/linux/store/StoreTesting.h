// What the store's tests share: a state directory of their own, a log that can
// be waited for, and a reader that is nobody's business but SQLite's.
#pragma once

#include <filesystem>
#include <future>
#include <gtest/gtest.h>
#include <memory>
#include <string>
#include <vector>

#include "linux/store/Store.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "testing/ManualClock.h"
#include "testing/RecordingLog.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {

// Another process's view of the file: results as rows of text joined by "|".
class Reader {
public:
    explicit Reader(const std::filesystem::path& path) {
        EXPECT_EQ(sqlite3_open_v2(path.c_str(), &database_,
                                  SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr),
                  SQLITE_OK);
    }
    ~Reader() { sqlite3_close(database_); }
    Reader(const Reader&) = delete;
    Reader& operator=(const Reader&) = delete;

    std::vector<std::string> rows(const std::string& sql) {
        std::vector<std::string> result;
        const auto add = [](void* rows, int count, char** values, char**) {
            std::string row;
            for (int i = 0; i < count; ++i) {
                row += (i == 0 ? "" : "|") + std::string(values[i] == nullptr ? "NULL" : values[i]);
            }
            static_cast<std::vector<std::string>*>(rows)->push_back(row);
            return 0;
        };
        EXPECT_EQ(sqlite3_exec(database_, sql.c_str(), add, &result, nullptr), SQLITE_OK)
            << sqlite3_errmsg(database_);
        return result;
    }
    std::string one(const std::string& sql) {
        const auto all = rows(sql);
        return all.size() == 1 ? all.front() : "not one row";
    }
    std::int64_t number(const std::string& sql) { return std::atoll(one(sql).c_str()); }

private:
    sqlite3* database_ = nullptr;
};

class StoreFixture : public ::testing::Test {
protected:
    StoreFixture() {
        options_.path = directory_.path() / "telemetry.db";
        // Only a full group or a flush commits.
        options_.limits.syncInterval = std::chrono::hours(1);
        options_.patientRows = 0;
        options_.patientPageBytes = StoreDatabase::kPageBytes;
        options_.busyTimeout = std::chrono::milliseconds(0);
        options_.firstRetry = std::chrono::milliseconds(1);
        options_.lastRetry = std::chrono::milliseconds(1);
        platform_.clock = &clock_;
        platform_.log = &log_;
        platform::install(&platform_);
    }
    ~StoreFixture() override {
        store_.reset();
        platform::install(nullptr);
    }

    Store& open() {
        store_.reset();
        store_ = std::make_unique<Store>(options_, clock_);
        return *store_;
    }
    void flush() {
        std::promise<void> done;
        store_->flush([&] { done.set_value(); });
        done.get_future().wait();
    }
    void addSingles(int count, const Dictionary& payload) {
        for (int i = 0; i < count; ++i) {
            (void)store_->addSingleMessage({}, {}, 1, 2, payload);
        }
    }
    Reader reader() { return Reader(options_.path); }
    static std::uint64_t total(const StoreLossesByTable& losses) { return sum(losses); }
    // Of all tables.
    std::uint64_t lost(StoreLoss reason) {
        std::uint64_t count = 0;
        for (const StoreLosses& each : store_->status().lost) {
            count += each[static_cast<std::size_t>(reason)];
        }
        return count;
    }

    testing::TempTree directory_;
    testing::ManualClock clock_;
    testing::RecordingLog log_;
    platform::Platform platform_;
    StoreOptions options_;
    std::unique_ptr<Store> store_;
};

inline Dictionary examplePayload() {
    return {{"audiotag", "Playback_Start"}, {"sample_rate", 48000.0}, {"channels", 2}};
}

} // namespace halyard::linux_
