#include "linux/drivers/GuardedReader.h"

#include <future>
#include <gtest/gtest.h>
#include <thread>

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class FixedSource final : public ChannelSource {
public:
    Reading read(platform::SteadyTime) override {
        Reading reading;
        reading.status = ReadStatus::Read;
        reading.numbers = {7};
        return reading;
    }
};

// Does not come back before it is released.
class BlockingSource final : public ChannelSource {
public:
    ~BlockingSource() override { gone_->set_value(); }
    Reading read(platform::SteadyTime) override {
        released_.wait();
        Reading reading;
        reading.status = ReadStatus::Read;
        return reading;
    }
    // Both outlive the source.
    std::shared_ptr<std::promise<void>> release() const { return release_; }
    std::shared_ptr<std::promise<void>> gone() const { return gone_; }

private:
    const std::shared_ptr<std::promise<void>> release_ = std::make_shared<std::promise<void>>();
    const std::shared_future<void> released_ = release_->get_future().share();
    const std::shared_ptr<std::promise<void>> gone_ = std::make_shared<std::promise<void>>();
};

class GuardedReaderTest : public ::testing::Test {
protected:
    using Sources = std::vector<std::shared_ptr<ChannelSource>>;

    std::vector<ReadStatus> read(const Sources& sources) {
        std::vector<ReadStatus> result;
        for (const Reading& reading : reader_.read(sources, {})) {
            result.push_back(reading.status);
        }
        return result;
    }

    const std::shared_ptr<ChannelSource> fixed_ = std::make_shared<FixedSource>();
    GuardedReader reader_{60s};
};

TEST_F(GuardedReaderTest, ReadsInOrderAgainAndAgain) {
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(read({fixed_, fixed_}), (std::vector{ReadStatus::Read, ReadStatus::Read}));
    }
    EXPECT_TRUE(read({}).empty());
}

TEST_F(GuardedReaderTest, OneThatBlocksCostsItselfOnly) {
    const auto blocking = std::make_shared<BlockingSource>();
    GuardedReader reader(30ms);
    const Sources sources{fixed_, blocking, fixed_};
    const auto first = reader.read(sources, {});
    EXPECT_EQ(first[0].status, ReadStatus::Read);
    EXPECT_EQ(first[1].status, ReadStatus::Failed);
    EXPECT_EQ(first[1].fault, "reading it does not come to an end");
    // While it hangs it is passed over.
    EXPECT_EQ(reader.read(sources, {})[1].status, ReadStatus::Failed);
    blocking->release()->set_value();
}

TEST_F(GuardedReaderTest, OneThatComesBackIsReadAgain) {
    const auto blocking = std::make_shared<BlockingSource>();
    GuardedReader reader(30ms);
    const Sources sources{blocking};
    EXPECT_EQ(reader.read(sources, {})[0].status, ReadStatus::Failed);
    blocking->release()->set_value();
    while (reader.read(sources, {})[0].status != ReadStatus::Read) {
        std::this_thread::yield();
    }
}

TEST_F(GuardedReaderTest, BeyondItsThreadsNothingIsRead) {
    GuardedReader reader(30ms);
    std::vector<std::shared_ptr<BlockingSource>> blocking;
    Sources sources;
    for (std::size_t i = 0; i <= GuardedReader::kMaxStuck; ++i) {
        blocking.push_back(std::make_shared<BlockingSource>());
        sources.push_back(blocking.back());
    }
    EXPECT_EQ(reader.read(sources, {}).size(), GuardedReader::kMaxStuck + 1);
    EXPECT_EQ(reader.read(Sources{fixed_}, {})[0].status, ReadStatus::Failed);
    for (const auto& each : blocking) {
        each->release()->set_value();
    }
    while (reader.read(Sources{fixed_}, {})[0].status != ReadStatus::Read) {
        std::this_thread::yield();
    }
}

TEST_F(GuardedReaderTest, AReaderThatGoesLeavesABlockedSourceToItsThread) {
    auto blocking = std::make_shared<BlockingSource>();
    const auto release = blocking->release();
    const auto gone = blocking->gone();
    const auto isGone = gone->get_future();
    {
        GuardedReader reader(30ms);
        (void)reader.read(Sources{blocking}, {});
    }
    blocking.reset();
    EXPECT_EQ(isGone.wait_for(0s), std::future_status::timeout);
    release->set_value();
    isGone.wait();
}

} // namespace
} // namespace halyard::linux_
