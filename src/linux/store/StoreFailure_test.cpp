// The store while it cannot write: a full disk, other people's locks, a disk
// that answers with errors or not at all.

#include <csignal>
#include <fstream>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "linux/store/FaultyDiskTesting.h"
#include "linux/store/StoreTesting.h"

namespace halyard::linux_ {
namespace {

using namespace std::chrono_literals;

class StoreFailureTest : public StoreFixture {
protected:
    ~StoreFailureTest() override {
        store_.reset();
        if (mounted_) {
            ::umount2(directory_.path().c_str(), MNT_DETACH);
        }
    }
    bool mountSmallDisk(const char* options) {
        mounted_ = ::mount("tmpfs", directory_.path().c_str(), "tmpfs", 0, options) == 0;
        return mounted_;
    }
    void keepFew() {
        options_.marks = {.highRows = 10, .lowRows = 5, .highBytes = 1 << 20, .lowBytes = 1 << 19};
        options_.groupRows = 4;
    }

    FaultyDisk disk_;
    bool mounted_ = false;
};

TEST_F(StoreFailureTest, FullDiskIsSaidOnceAndOvercomeWhenThereIsRoom) {
    if (!mountSmallDisk("size=2m")) {
        GTEST_SKIP() << "needs the right to mount";
    }
    keepFew();
    const auto ballast = directory_.path() / "ballast";
    open();
    std::ofstream(ballast) << std::string(1600 * 1024, 'x');
    const Dictionary large{{"text", std::string(32 * 1024, 'y')}};
    addSingles(16, large); // More than there is room for.
    log_.waitFor("disk full");
    while (store_->addSingleMessage({}, {}, 1, 1, {})) { // Until the mark is reached.
    }
    EXPECT_TRUE(store_->status().failing);
    EXPECT_GE(lost(StoreLoss::DiskFull), 1U);
    std::filesystem::remove(ballast);
    flush();
    EXPECT_NE(log_.waitFor("again after").find(" rows lost"), std::string::npos);
    EXPECT_EQ(log_.countOf("cannot write", LogLevel::Error), 1U);
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"),
              static_cast<std::int64_t>(store_->status().rows[1]));
}

TEST_F(StoreFailureTest, FullDiskAtTheStartIsOvercomeToo) {
    if (!mountSmallDisk("size=64k")) {
        GTEST_SKIP() << "needs the right to mount";
    }
    const auto ballast = directory_.path() / "ballast";
    std::ofstream(ballast) << std::string(60 * 1024, 'x');
    open();
    EXPECT_TRUE(store_->isOpen());
    log_.waitFor("cannot write");
    ASSERT_EQ(::mount("tmpfs", directory_.path().c_str(), "tmpfs", MS_REMOUNT, "size=1m"), 0);
    addSingles(2, {});
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 2);
}

TEST_F(StoreFailureTest, ADiskWithoutRoomForAFileAtTheStartIsOvercomeToo) {
    if (!mountSmallDisk("size=1m,nr_inodes=2")) { // for itself and the store, not for its log
        GTEST_SKIP() << "needs the right to mount";
    }
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_NE(log_.waitFor("cannot write").find("full"), std::string::npos);
    ASSERT_EQ(::mount("tmpfs", directory_.path().c_str(), "tmpfs", MS_REMOUNT, "nr_inodes=9"), 0);
    addSingles(2, {});
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 2);
}

TEST_F(StoreFailureTest, AFileThatCannotBeOpenedForNowIsTriedAgain) {
    const auto inTheWay = options_.path.string() + "-wal";
    std::filesystem::create_directory(inTheWay);
    open();
    EXPECT_TRUE(store_->isOpen());
    log_.waitFor("cannot write");
    std::filesystem::remove(inTheWay);
    addSingles(2, {});
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 2);
}

TEST_F(StoreFailureTest, AReadOnlyDiskAtTheStartIsOvercomeToo) {
    if (!mountSmallDisk("size=1m")) {
        GTEST_SKIP() << "needs the right to mount";
    }
    keepFew();
    open();
    addSingles(1, {});
    store_.reset();
    const char* const directory = directory_.path().c_str();
    ASSERT_EQ(::mount("tmpfs", directory, "tmpfs", MS_REMOUNT | MS_RDONLY, "size=1m"), 0);
    open();
    EXPECT_TRUE(store_->isOpen());
    EXPECT_NE(log_.waitFor("cannot write").find("read-only"), std::string::npos);
    addSingles(12, {});
    EXPECT_EQ(lost(StoreLoss::ReadOnly), 2U);
    ASSERT_EQ(::mount("tmpfs", directory, "tmpfs", MS_REMOUNT, "size=1m"), 0);
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 11);
}

TEST_F(StoreFailureTest, ADirectoryWithoutRightsAtTheStartIsOvercomeToo) {
    if (::geteuid() == 0) {
        GTEST_SKIP() << "root has every right";
    }
    open();
    addSingles(1, {});
    store_.reset();
    ASSERT_EQ(::chmod(directory_.path().c_str(), 0500), 0);
    ASSERT_EQ(::chmod(options_.path.c_str(), 0400), 0);
    open();
    addSingles(2, {});
    EXPECT_NE(log_.waitFor("cannot write").find("read-only"), std::string::npos);
    ASSERT_EQ(::chmod(directory_.path().c_str(), 0700), 0);
    ASSERT_EQ(::chmod(options_.path.c_str(), 0600), 0);
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 3);
}

TEST_F(StoreFailureTest, WithoutAStoreEverythingIsCountedAndFlushAnswers) {
    options_.path = directory_.path() / "absent" / "telemetry.db";
    open();
    EXPECT_FALSE(store_->isOpen());
    EXPECT_FALSE(store_->addSingleMessage({}, {}, 1, 1, {}));
    store_->addMetric(1, "x");
    bool done = false;
    store_->flush([&done] { done = true; });
    EXPECT_TRUE(done);
    EXPECT_EQ(lost(StoreLoss::NoStore), 1U); // Messages have no back end.
    EXPECT_EQ(log_.countOf("running without a store", LogLevel::Error), 1U);
}

TEST_F(StoreFailureTest, ALockHeldByAnotherProcessLosesOnlyWhatIsBeyondTheMark) {
    keepFew();
    open();
    auto other = std::make_unique<Reader>(options_.path);
    other->rows("BEGIN IMMEDIATE");
    addSingles(4, {});
    EXPECT_NE(log_.waitFor("cannot write").find("locked by another process"), std::string::npos);
    addSingles(20, {});
    EXPECT_EQ(lost(StoreLoss::Locked), 14U);
    EXPECT_EQ(store_->status().queuedRows, 10U);
    other->rows("ROLLBACK");
    flush();
    log_.waitFor("again after 0 s, 14 rows lost");
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 10);
    EXPECT_FALSE(store_->status().failing);
}

TEST_F(StoreFailureTest, PressureIsLetGoWhileNothingCanBeWritten) {
    keepFew();
    std::vector<bool> told; // Guarded by being told in turn, and read at the end.
    options_.onPressure = [&told](bool on) { told.push_back(on); };
    options_.vfs = FaultyDisk::kName;
    open();
    disk_.hang();
    addSingles(12, {});
    disk_.fail(SQLITE_IOERR);
    disk_.goOn();
    EXPECT_NE(log_.waitFor("cannot write").find("input/output error"), std::string::npos);
    addSingles(3, {});
    EXPECT_EQ(lost(StoreLoss::IoError), 3U);
    disk_.fail(SQLITE_OK);
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 12);
    store_.reset();
    ASSERT_GE(told.size(), 2U);
    EXPECT_TRUE(told[0]);
    EXPECT_FALSE(told[1]);
    EXPECT_FALSE(told.back());
}

TEST_F(StoreFailureTest, AHangingDiskLetsTheClientsGo) {
    keepFew();
    std::promise<void> released;
    options_.watchPeriod = 1ms;
    options_.onPressure = [&released, first = true](bool on) mutable {
        if (!on && first) {
            first = false;
            released.set_value();
        }
    };
    options_.vfs = FaultyDisk::kName;
    open();
    disk_.hang();
    addSingles(12, {});
    disk_.waitForVictim();
    clock_.advance(options_.stuckAfter);
    released.get_future().wait();
    log_.waitFor("the file system does not answer");
    addSingles(5, {});
    EXPECT_EQ(lost(StoreLoss::Stuck), 5U);
    disk_.goOn();
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 12);
}

TEST_F(StoreFailureTest, AHangIsNoticedHoweverFewRowsCome) {
    options_.calmWatchPeriod = 1ms;
    options_.vfs = FaultyDisk::kName;
    open();
    addSingles(1, {});
    flush();
    disk_.hang();
    addSingles(1, {});
    store_->flush([] {});
    disk_.waitForVictim();
    clock_.advance(options_.stuckAfter);
    log_.waitFor("the file system does not answer");
    EXPECT_TRUE(store_->status().failing);
    disk_.goOn();
    log_.waitFor("0 rows lost");
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 2);
}

TEST_F(StoreFailureTest, ClosingGivesUpOnADiskThatHangsAndTellsWhatIsLost) {
    options_.vfs = FaultyDisk::kName;
    options_.closeLimit = 1ms;
    options_.groupRows = 3;
    open();
    disk_.hang();
    store_->closeUpload(store_->openUpload(1, {}, {})); // A row, and no further one.
    addSingles(4, {});
    EXPECT_FALSE(store_->close());
    disk_.goOn();
    while (!store_->close()) { // Waits a while each time.
    }
    EXPECT_EQ(log_.countOf("5 rows lost: the file system does not answer", LogLevel::Error), 1U);
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 4);
}

TEST_F(StoreFailureTest, ARowThatIsRefusedForItselfIsLostAlone) {
    open();
    reader().rows("CREATE TRIGGER picky BEFORE INSERT ON metric WHEN new.metric_id = 2 "
                  "BEGIN SELECT RAISE(ABORT, 'not this one'); END");
    store_->addMetric(1, "before");
    store_->addMetric(2, "refused");
    store_->addMetric(3, "behind");
    flush();
    EXPECT_EQ(reader().rows("SELECT id, metric_id FROM metric"),
              (std::vector<std::string>{"1|1", "2|3"}));
    EXPECT_EQ(lost(StoreLoss::Rejected), 1U);
    EXPECT_EQ(log_.countOf("the store rejected 1 rows: not this one", LogLevel::Error), 1U);
    EXPECT_FALSE(store_->status().failing);
}

TEST_F(StoreFailureTest, WhyAFileInItsPlaceIsNotTakenIsTold) {
    open();
    addSingles(1, {});
    flush();
    const auto newer = directory_.path() / "newer.db";
    Reader(newer).rows("PRAGMA user_version = 3");
    std::filesystem::rename(newer, options_.path); // At once: the store may be looking.
    for (const char* end : {"-wal", "-shm"}) {
        std::filesystem::remove(options_.path.string() + end);
    }
    addSingles(1, {});
    store_->flush([] {});
    EXPECT_NE(log_.waitFor("cannot write").find("its schema is newer than this program"),
              std::string::npos);
    std::filesystem::remove(options_.path);
    flush();
    EXPECT_EQ(reader().number("SELECT count(*) FROM upload_message"), 1);
}

TEST_F(StoreFailureTest, AFailedGroupIsRolledBackWhole) {
    options_.vfs = FaultyDisk::kName;
    open();
    addSingles(1, {});
    flush();
    disk_.fail(SQLITE_IOERR);
    const auto upload = store_->openUpload(5, {}, {});
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    store_->flush([] {});
    log_.waitFor("cannot write");
    EXPECT_EQ(reader().one("SELECT count(*) FROM upload_message"), "1");
    disk_.fail(SQLITE_OK);
    flush();
    EXPECT_EQ(reader().one("SELECT m.id, s.id, s.session_id FROM upload_message m "
                           "JOIN upload_session s ON s.id = m.upload_session"),
              "2|1|5");
    EXPECT_EQ(store_->status().rows, (StoreDatabase::RowCounts{1, 2, 0, 0, 0, 0}));
    EXPECT_EQ(total(store_->status().lost), 0U);
}

TEST_F(StoreFailureTest, ClosingCountsWhatItCouldNotWrite) {
    open();
    Reader other(options_.path);
    other.rows("BEGIN IMMEDIATE");
    addSingles(3, {});
    EXPECT_TRUE(store_->close());
    EXPECT_EQ(lost(StoreLoss::Locked), 3U);
    EXPECT_EQ(log_.countOf("3 rows lost: locked by another process", LogLevel::Error), 1U);
}

TEST_F(StoreFailureTest, ALazyPayloadIsBuiltOnceHoweverOftenItsGroupIsWritten) {
    options_.vfs = FaultyDisk::kName;
    open();
    std::atomic<int> built{0};
    disk_.fail(SQLITE_IOERR);
    store_->addAnalyticsEvent("name", [&built] {
        ++built;
        return examplePayload();
    });
    store_->flush([] {});
    log_.waitFor("cannot write");
    disk_.fail(SQLITE_OK);
    flush();
    EXPECT_EQ(built.load(), 1);
    EXPECT_EQ(reader().number("SELECT count(*) FROM analytics_event"), 1);
}

TEST_F(StoreFailureTest, ASessionOpenedWhileNothingWasTakenGetsItsRowWithItsFirstMessage) {
    keepFew();
    options_.vfs = FaultyDisk::kName;
    open();
    disk_.fail(SQLITE_IOERR);
    addSingles(4, {});
    log_.waitFor("cannot write");
    addSingles(6, {});
    const auto upload = store_->openUpload(5, {}, {});
    EXPECT_FALSE(store_->addMessage(upload, 1, 1, {}));
    disk_.fail(SQLITE_OK);
    flush();
    EXPECT_TRUE(store_->addMessage(upload, 1, 1, {}));
    store_->closeUpload(upload);
    flush();
    EXPECT_EQ(
        reader().one("SELECT s.id, s.session_id, s.closed IS NULL, m.id "
                     "FROM upload_session s JOIN upload_message m ON m.upload_session = s.id"),
        "1|5|0|11");
    EXPECT_EQ(lost(StoreLoss::IoError), 1U);
}

TEST_F(StoreFailureTest, AReaderThatNeverEndsCannotGrowTheLogWithoutBound) {
    options_.limits.maxBytes = 1024 * 1024;
    options_.groupRows = 64; // Half a megabyte.
    options_.mostGroups = 1;
    open();
    addSingles(1, {});
    flush();
    auto reading = std::make_unique<Reader>(options_.path);
    reading->rows("BEGIN; SELECT * FROM upload_message");
    const Dictionary large{{"text", std::string(8 * 1024, 'z')}};
    addSingles(64 * 50, large);
    log_.waitFor("cannot write");
    EXPECT_LT(store_->status().logBytes, 32U * 1024 * 1024);
    reading->rows("COMMIT");
    flush();
    EXPECT_LT(store_->status().logBytes, 16U * 1024 * 1024);
}

// Writes at full speed and tells the other end of the pipe how many rows were
// acknowledged.
[[noreturn]] void writeUntilKilled(StoreOptions options, const platform::Clock& clock, int pipe) {
    options.limits.syncInterval = 1ms;
    Store store(std::move(options), clock);
    for (std::int64_t rows = 100;; rows += 100) {
        for (int i = 0; i < 100; ++i) {
            (void)store.addSingleMessage({}, {}, 1, 1, examplePayload());
        }
        std::promise<void> done;
        store.flush([&done] { done.set_value(); });
        done.get_future().wait();
        (void)!::write(pipe, &rows, sizeof rows);
    }
}

TEST_F(StoreFailureTest, NothingThatWasCommittedIsMissingAfterAKill) {
    std::array<int, 2> ends{};
    ASSERT_EQ(::pipe(ends.data()), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        ::close(ends[0]);
        writeUntilKilled(options_, clock_, ends[1]);
    }
    ::close(ends[1]);
    std::int64_t acknowledged = 0;
    while (acknowledged < 2000 && ::read(ends[0], &acknowledged, sizeof acknowledged) > 0) {
    }
    ::kill(child, SIGKILL);
    while (::read(ends[0], &acknowledged, sizeof acknowledged) > 0) {
    }
    ::close(ends[0]);
    int status = 0;
    ::waitpid(child, &status, 0);
    open();
    EXPECT_EQ(log_.countOf("damaged", LogLevel::Error), 0U);
    EXPECT_EQ(reader().one("PRAGMA integrity_check"), "ok");
    EXPECT_GE(reader().number("SELECT count(*) FROM upload_message"), acknowledged);
    EXPECT_EQ(reader().one("SELECT count(*) = max(id) FROM upload_message"), "1");
}

} // namespace
} // namespace halyard::linux_
