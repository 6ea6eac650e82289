#include "commands/MessageSheet.h"

#include <gtest/gtest.h>

namespace halyard::ctl {
namespace {

using Lines = std::vector<std::string>;

Dictionary quietStatus() {
    const Dictionary lost{{"upload_message", Dictionary{{"disk_full", 0}}}};
    return Dictionary{
        {"active_session_count", 1},
        {"upload_limit", 5},
        {"sessions_not_uploaded", 0},
        {"store", Dictionary{{"lost", lost}}},
        {"messages", Dictionary{{"requests", 1},
                                {"refused", 0},
                                {"bounded", 0},
                                {"unaddressed", 0},
                                {"offered", 2},
                                {"own", 3},
                                {"repeats", 1},
                                {"not_uploaded", Dictionary{{"test", 0}, {"limit", 0}}},
                                {"delivered", 4},
                                {"waiting", 0},
                                {"lost_in_clients", Dictionary{{"queue_full", 0}}}}}};
}

TEST(MessageSheetTest, SaysNothingOfWhatDidNotHappen) {
    EXPECT_EQ(messageSheet(quietStatus()), (Lines{"Messages since the daemon started",
                                                  "  offered 2 of 1 request, made by the daemon 3",
                                                  "  stored 4, repeats 1, waiting 0"}));
}

TEST(MessageSheetTest, NamesEachReason) {
    Dictionary status = quietStatus();
    status.set("store",
               Dictionary{{"lost", Dictionary{{"upload_message",
                                               Dictionary{{"disk_full", 2}, {"stuck", 1}}}}}});
    status.set("messages",
               Dictionary{{"requests", 20},
                          {"refused", 1},
                          {"bounded", 2},
                          {"unaddressed", 3},
                          {"offered", 20},
                          {"own", 0},
                          {"repeats", 4},
                          {"not_uploaded", Dictionary{{"test", 5}, {"limit", 0}, {"sampled", 1}}},
                          {"delivered", 9},
                          {"waiting", 1},
                          {"lost_in_clients", Dictionary{{"queue_full", 6}}}});
    EXPECT_EQ(messageSheet(status),
              (Lines{"Messages since the daemon started",
                     "  offered 20 of 20 requests, made by the daemon 0",
                     "  stored 6, repeats 4, waiting 1", "  not uploaded 6: test 5, sampled 1",
                     "  lost 3: disk_full 2, stuck 1", "  3 requests reached no session",
                     "  2 requests refused at a bound", "  1 request refused, for reporting is off",
                     "  lost in clients before they came here 6: queue_full 6"}));
}

TEST(MessageSheetTest, TellsThatUploadsAreWithheld) {
    Dictionary status = quietStatus();
    status.set("active_session_count", 5);
    EXPECT_EQ(messageSheet(status).size(), 3U);
    status.set("active_session_count", 6);
    status.set("sessions_not_uploaded", 1);
    EXPECT_EQ(messageSheet(status).back(),
              "Uploads are withheld: 6 sessions count as active, and those started beyond 5 are "
              "not uploaded; 1 now");
}

TEST(MessageSheetTest, IsNoneOfADaemonThatHasNone) {
    EXPECT_EQ(messageSheet({{"pid", 1}}), Lines());
}

} // namespace
} // namespace halyard::ctl
