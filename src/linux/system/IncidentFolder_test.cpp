#include "linux/system/IncidentFolder.h"

#include <algorithm>
#include <cstdlib>
#include <fstream>
#include <future>
#include <gtest/gtest.h>
#include <map>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

#include "linux/system/ProcessFacts.h"
#include "testing/ManualClock.h"
#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;

std::string contents(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

class IncidentTree : public ::testing::Test {
protected:
    IncidentTree() { fs::create_directory(proc_); }

    void addProcess(int pid, std::string_view name) {
        const fs::path process = proc_ / std::to_string(pid);
        root_.write(process / "comm", std::string(name) + '\n');
        root_.write(process / "status", "State:\tR (running)\n");
        root_.write(process / "environ", "SECRET=1");
        root_.write(process / "cmdline", "mpv --password=x");
    }
    std::vector<std::string> namesIn(const fs::path& directory) {
        std::vector<std::string> names;
        for (const auto& entry : fs::directory_iterator(directory)) {
            names.push_back(entry.path().filename().string());
        }
        std::sort(names.begin(), names.end());
        return names;
    }

    const testing::TempTree root_;
    const fs::path proc_ = root_ / "proc";
};

class IncidentFolderTest : public IncidentTree {
protected:
    IncidentFolder::Options options() {
        IncidentFolder::Options options;
        options.directory = directory_;
        options.procRoot = proc_;
        options.recentLines = [] { return std::vector<std::string>{"one\n", "two"}; };
        options.record = [this](const Dictionary& signature, std::string_view report,
                                platform::WallTime time) {
            recordedSignature_ = signature;
            recordedReport_ = report;
            recordedTime_ = time;
        };
        return options;
    }
    // Takes a snapshot and waits for the response.
    Dictionary take(IncidentFolder& folder, const Dictionary& signature) {
        std::promise<Dictionary> response;
        folder.snapshotWithSignature(
            signature, 0, Value(), Value(),
            [&response](const Dictionary& answer) { response.set_value(answer); });
        return response.get_future().get();
    }

    const fs::path directory_ = root_ / "state" / "incidents";
    const Dictionary signature_{{"domain", "AudioAnalytics"},
                                {"type", "haptics"},
                                {"subType", "DSP_IO"},
                                {"subtypeContext", "EnergyLedger"},
                                {"detectedProcess", "mpv"}};
    testing::ManualClock clock_;
    Dictionary recordedSignature_;
    std::string recordedReport_;
    platform::WallTime recordedTime_;
};

TEST_F(IncidentFolderTest, KeepsSignatureProcessFactsAndLogLines) {
    addProcess(4711, "mpv");
    addProcess(4712, "other");
    IncidentFolder folder(clock_, options());
    const Dictionary response = take(folder, signature_);
    ASSERT_EQ(response["success"], Value(true));
    const fs::path kept(std::string(response["path"].text()));
    EXPECT_EQ(kept, directory_ / "000001-20231114T221320Z-AudioAnalytics-haptics-DSP_IO-mpv");
    EXPECT_EQ(namesIn(kept),
              (std::vector<std::string>{"incident.json", "log.txt", "process-4711"}));
    EXPECT_EQ(contents(kept / "log.txt"), "one\ntwo\n");
    EXPECT_EQ(namesIn(kept / "process-4711"), std::vector<std::string>{"status"});
    EXPECT_EQ(contents(kept / "process-4711" / "status"), "State:\tR (running)\n");
    EXPECT_NE(contents(kept / "incident.json").find("\"detectedProcess\": \"mpv\""),
              std::string::npos);
    EXPECT_EQ(namesIn(directory_).size(), 1U);
}

TEST_F(IncidentFolderTest, TheFolderIsNobodyElsesToRead) {
    IncidentFolder folder(clock_, options());
    const Dictionary response = take(folder, signature_);
    struct stat status {};
    ASSERT_EQ(::stat(std::string(response["path"].text()).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0750U);
}

TEST_F(IncidentFolderTest, RecordsTheSnapshotWithThePathOfItsFolder) {
    IncidentFolder folder(clock_, options());
    const auto asked = clock_.wallTime();
    const Dictionary response = take(folder, signature_);
    EXPECT_EQ(recordedSignature_, signature_);
    EXPECT_EQ(recordedReport_, response["path"].text());
    EXPECT_EQ(recordedTime_, asked);
}

TEST_F(IncidentFolderTest, ASignatureWithoutProcessIsKeptAlone) {
    addProcess(4711, "mpv");
    IncidentFolder folder(clock_, options());
    Dictionary signature = signature_;
    signature.erase("detectedProcess");
    const fs::path kept(std::string(take(folder, signature)["path"].text()));
    EXPECT_EQ(namesIn(kept), (std::vector<std::string>{"incident.json", "log.txt"}));
}

TEST_F(IncidentFolderTest, TheNewestFiftyStayEvenWhenTheClockGoesBack) {
    IncidentFolder folder(clock_, options());
    for (std::size_t i = 0; i < IncidentFolder::kKept; ++i) {
        take(folder, signature_);
    }
    clock_.setWallTime(platform::WallTime(100s));
    take(folder, signature_);
    const auto names = namesIn(directory_);
    ASSERT_EQ(names.size(), IncidentFolder::kKept);
    EXPECT_EQ(names.front().substr(0, 7), "000002-");
    EXPECT_EQ(names.back().substr(0, 16), "000051-19700101T");
}

TEST_F(IncidentFolderTest, FoldersHaveABoundInBytesToo) {
    for (const char* const name : {"000001-a", "000002-b"}) {
        root_.write(directory_ / name / "log.txt", "");
        fs::resize_file(directory_ / name / "log.txt", IncidentFolder::kKeptBytes / 2);
    }
    IncidentFolder folder(clock_, options());
    take(folder, signature_);
    const auto names = namesIn(directory_);
    ASSERT_EQ(names.size(), 2U);
    EXPECT_EQ(names.front(), "000002-b");
}

TEST_F(IncidentFolderTest, NumbersGoOnAfterARestart) {
    {
        IncidentFolder folder(clock_, options());
        take(folder, signature_);
    }
    IncidentFolder folder(clock_, options());
    take(folder, signature_);
    EXPECT_EQ(namesIn(directory_).back().substr(0, 7), "000002-");
}

TEST_F(IncidentFolderTest, ForeignAndUnfinishedEntriesAreToldApart) {
    root_.write(directory_ / "notes.txt", "mine");
    root_.write(directory_ / "7-file", "no folder");
    root_.write(directory_ / ".unfinished" / "old", "of a killed daemon");
    IncidentFolder folder(clock_, options());
    const fs::path kept(std::string(take(folder, signature_)["path"].text()));
    EXPECT_EQ(kept.filename().string().substr(0, 7), "000001-");
    EXPECT_FALSE(fs::exists(kept / "old"));
    EXPECT_TRUE(fs::exists(directory_ / "notes.txt"));
    EXPECT_TRUE(fs::exists(directory_ / "7-file"));
    EXPECT_FALSE(fs::exists(directory_ / ".unfinished"));
}

TEST_F(IncidentFolderTest, AFolderThatCannotBeMadeIsToldInTheResponse) {
    root_.write(root_ / "state", "a file where the folder should be");
    IncidentFolder folder(clock_, options());
    const Dictionary response = take(folder, signature_);
    EXPECT_EQ(response["success"], Value(false));
    EXPECT_FALSE(response["error"].text().empty());
    EXPECT_EQ(folder.failedSnapshots(), 1U);
    EXPECT_TRUE(recordedReport_.empty());
}

TEST_F(IncidentFolderTest, SnapshotsBeyondTheBoundAreRefusedAtOnce) {
    std::promise<void> release;
    const std::shared_future<void> released = release.get_future().share();
    IncidentFolder::Options slow = options();
    slow.recentLines = [released] {
        released.wait();
        return std::vector<std::string>();
    };
    IncidentFolder folder(clock_, std::move(slow));
    std::vector<std::promise<Dictionary>> responses(IncidentFolder::kMostWaiting + 1);
    for (auto& response : responses) {
        folder.snapshotWithSignature(
            signature_, 0, Value(), Value(),
            [&response](const Dictionary& answer) { response.set_value(answer); });
    }
    EXPECT_EQ(responses.back().get_future().get()["success"], Value(false));
    EXPECT_EQ(folder.refusedSnapshots(), 1U);
    release.set_value();
    for (std::size_t i = 0; i < IncidentFolder::kMostWaiting; ++i) {
        EXPECT_EQ(responses[i].get_future().get()["success"], Value(true));
    }
}

TEST_F(IncidentFolderTest, OnlyTheNewestLogLinesThatFitAreKept) {
    IncidentFolder::Options options = this->options();
    options.recentLines = [] {
        return std::vector<std::string>{std::string(IncidentFolder::kMostLogBytes, 'x'), "new"};
    };
    IncidentFolder folder(clock_, std::move(options));
    const fs::path kept(std::string(take(folder, signature_)["path"].text()));
    EXPECT_EQ(contents(kept / "log.txt"), "new\n");
}

TEST(IncidentFolderNameTest, PartsOfTheSignatureWriteNowhereElse) {
    const Dictionary signature{{"type", "../../etc"},
                               {"subType", std::string(200, 'a')},
                               {"detectedProcess", "a/b\nc\xC3\xA4.."}};
    EXPECT_EQ(incidentFolderName(7, platform::WallTime(0s), signature),
              "000007-19700101T000000Z-______etc-" + std::string(40, 'a') + "-a_b_c____");
}

class ProcessFactsTest : public IncidentTree {};

TEST_F(ProcessFactsTest, FindsProcessesByTheirKernelName) {
    addProcess(10, "a-long-process-");
    addProcess(11, "a-long");
    EXPECT_EQ(processesNamed("a-long-process-name", proc_).processes.size(), 1U);
    EXPECT_EQ(processesNamed("a-long", proc_).processes.at(0).pid, 11);
    EXPECT_TRUE(processesNamed("a-lon", proc_).processes.empty());
}

TEST_F(ProcessFactsTest, NamesThatAreNoTextAreFoundByTheirRepairedForm) {
    addProcess(10, "player \xC3");
    EXPECT_EQ(processesNamed("player \xEF\xBF\xBD", proc_).processes.size(), 1U);
}

TEST_F(ProcessFactsTest, ReportsTheFirstFewAndCountsTheRest) {
    for (int pid = 100; pid < 112; ++pid) {
        addProcess(pid, "mpv");
    }
    const NamedProcesses named = processesNamed("mpv", proc_);
    ASSERT_EQ(named.processes.size(), kMostProcessesReported);
    EXPECT_EQ(named.processes.front().pid, 100);
    EXPECT_EQ(named.leftOut, 4U);
}

TEST_F(ProcessFactsTest, CutsLongFilesAndSkipsWhatIsNoProcess) {
    addProcess(10, "mpv");
    root_.write(proc_ / "10" / "status", std::string(kMostFactBytes + 1, 's'));
    root_.write(proc_ / "self" / "comm", "mpv\n");
    root_.write(proc_ / "12x" / "comm", "mpv\n");
    const NamedProcesses named = processesNamed("mpv", proc_);
    ASSERT_EQ(named.processes.size(), 1U);
    EXPECT_EQ(named.processes[0].facts.at(0).text.size(), kMostFactBytes);
}

TEST_F(ProcessFactsTest, AMissingTreeHasNoProcesses) {
    EXPECT_TRUE(processesNamed("mpv", root_ / "absent").processes.empty());
}

TEST(ProcessFactsOfThisMachineTest, FindsThisVeryProcess) {
    std::ifstream comm("/proc/self/comm");
    std::string name;
    std::getline(comm, name);
    const NamedProcesses named = processesNamed(name, "/proc");
    const auto own = std::find_if(named.processes.begin(), named.processes.end(),
                                  [](const auto& process) { return process.pid == ::getpid(); });
    if (own == named.processes.end()) {
        EXPECT_GT(named.leftOut, 0U); // Further instances of this test run at once.
        return;
    }
    EXPECT_GE(own->facts.size(), 5U);
}

} // namespace
} // namespace halyard::linux_
