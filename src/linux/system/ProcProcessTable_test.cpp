#include "linux/system/ProcProcessTable.h"

#include <csignal>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

TEST(ProcProcessTableTest, NamesAProcessByItsCommand) {
    const testing::TempTree proc;
    proc.write("42/comm", "music player\n");

    EXPECT_EQ(ProcProcessTable(proc.path()).infoForPID(42)->shortCommandName, "music player");
}

TEST(ProcProcessTableTest, KeepsOddNamesAsTheyAre) {
    const testing::TempTree proc;
    proc.write("1/comm", "a\nb\n\n");
    proc.write("2/comm", "\n");
    proc.write("3/comm", "kworker/u16:3-events_unbound\n");
    const ProcProcessTable table(proc.path());

    EXPECT_EQ(table.infoForPID(1)->shortCommandName, "a\nb\n");
    EXPECT_EQ(table.infoForPID(2)->shortCommandName, "");
    EXPECT_EQ(table.infoForPID(3)->shortCommandName, "kworker/u16:3-ev");
}

TEST(ProcProcessTableTest, KnowsNoProcessThatIsNotThere) {
    const testing::TempTree proc;
    proc.write("42/comm", "x\n");
    proc.write("comm", "x\n");
    const ProcProcessTable table(proc.path());

    EXPECT_FALSE(table.infoForPID(43));
    EXPECT_FALSE(table.infoForPID(0));
    EXPECT_FALSE(table.infoForPID(-1));
}

TEST(ProcProcessTableTest, FindsARealChildUntilItIsGone) {
    const ProcProcessTable table;
    int ready[2];
    ASSERT_EQ(::pipe(ready), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        ::prctl(PR_SET_NAME, "a-very-long-process-name");
        (void)!::write(ready[1], "x", 1);
        for (;;) {
            ::pause();
        }
    }
    ASSERT_GT(child, 0);
    char byte = 0;
    ASSERT_EQ(::read(ready[0], &byte, 1), 1);
    EXPECT_EQ(table.infoForPID(child)->shortCommandName, "a-very-long-pro");

    ::kill(child, SIGKILL);
    ASSERT_EQ(::waitpid(child, nullptr, 0), child);
    EXPECT_FALSE(table.infoForPID(child));
    ::close(ready[0]);
    ::close(ready[1]);
}

TEST(ProcOwnProcessTest, KnowsItself) {
    const ProcOwnProcess process([] {});

    EXPECT_EQ(process.pid(), ::getpid());
    EXPECT_EQ(process.name(), ProcProcessTable().infoForPID(::getpid())->shortCommandName);
    EXPECT_FALSE(process.name().empty());
}

TEST(ProcOwnProcessTest, IsNamelessWithoutProcfs) {
    EXPECT_EQ(ProcOwnProcess([] {}, "/nonexistent").name(), "");
}

TEST(ProcOwnProcessDeathTest, SpeaksItsLastWordsAndEndsWithTheStatus) {
    EXPECT_EXIT(ProcOwnProcess([] { (void)!::write(2, "all written", 11); }).terminate(7),
                ::testing::ExitedWithCode(7), "^all written$");
}

TEST(ProcOwnProcessDeathTest, RunsNoExitHandlers) {
    EXPECT_EXIT(
        {
            std::atexit([] { (void)!::write(2, "handler", 7); });
            ProcOwnProcess(nullptr).terminate(0);
        },
        ::testing::ExitedWithCode(0), "^$");
}

} // namespace
} // namespace halyard::linux_
