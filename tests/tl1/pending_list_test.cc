#include "tl1/pending_list.h"

#include <gtest/gtest.h>

#include <cstdlib>

namespace tessel {
namespace {

// Every case runs in Berlin's time zone, whose daylight saving starts in March and ends in
// October, at a fake now of 2024-06-10 08:13:20 local (summer) time.
struct Tl1PendingListTest : ::testing::Test {
  Tl1PendingListTest() {
    const char* zone = std::getenv("TZ");
    if (zone) savedZone = zone;
    setenv("TZ", "Europe/Berlin", 1);
    tzset();
  }
  ~Tl1PendingListTest() override {
    if (savedZone) {
      setenv("TZ", savedZone->c_str(), 1);
    } else {
      unsetenv("TZ");
    }
    tzset();
  }
  std::optional<std::uint32_t> Add(const std::string& generalBlock, std::uint64_t session = 1) {
    Tl1InputCmd cmd;
    int errorNumber = 0;
    std::string text = "ENT-X:NE1:A:1:" + generalBlock;
    EXPECT_TRUE(InputCmdParser(&cmd, text, &errorNumber)) << text;
    return pending.AddToPendingbuffer(cmd, session, text);
  }
  std::vector<std::uint32_t> Ids() {
    std::vector<std::uint32_t> ids;
    for (const Tl1PendingEntry& entry : pending.List()) ids.push_back(entry.id);
    return ids;
  }

  static constexpr std::time_t kNow = 1718000000;
  std::optional<std::string> savedZone;
  Tl1PendingList pending{[] { return kNow; }};
};

TEST_F(Tl1PendingListTest, LocalDatesAndTimesFollowDaylightSaving) {
  // Noon in July is 10:00 UTC, noon in January 11:00 UTC.
  EXPECT_EQ(GetTimeInSecond(Tl1DateOrTime{24, 7, 15}, Tl1DateOrTime{12, 0, 0}, kNow), 1721037600);
  EXPECT_EQ(GetTimeInSecond(Tl1DateOrTime{24, 1, 15}, Tl1DateOrTime{12, 0, 0}, kNow), 1705316400);
  // Without a date: today; without a time: the time of day of now.
  EXPECT_EQ(GetTimeInSecond(std::nullopt, Tl1DateOrTime{8, 14, 20}, kNow), kNow + 60);
  EXPECT_EQ(GetTimeInSecond(Tl1DateOrTime{24, 6, 11}, std::nullopt, kNow), kNow + 86400);
}

TEST_F(Tl1PendingListTest, TimedEntriesFallDueInOrderAndManualOnesWait) {
  EXPECT_EQ(Add("ON=5"), 1u);                // manual
  EXPECT_EQ(Add("TIME=08-15-20"), 2u);       // two minutes ahead
  EXPECT_EQ(Add("ON=6,TIME=08-14-20"), 3u);  // one minute ahead
  EXPECT_EQ(Add("TIME=08-15-20", 2), 4u);    // equal expiry: after the earlier one
  EXPECT_EQ(Add("ON=5"), std::nullopt);      // same ON on the same session
  EXPECT_EQ(Add("ON=5", 2), 5u);             // on another session it is free
  EXPECT_EQ(Ids(), (std::vector<std::uint32_t>{3, 2, 4, 1, 5}));
  EXPECT_EQ(pending.List()[0].commandText, "ENT-X:NE1:A:1:ON=6,TIME=08-14-20");

  EXPECT_EQ(pending.NextExpiry(), kNow + 60);
  EXPECT_TRUE(pending.TakeDue(kNow + 59).empty());
  std::vector<Tl1PendingEntry> due = pending.TakeDue(kNow + 60);
  ASSERT_EQ(due.size(), 1u);
  EXPECT_EQ(due[0].id, 3u);
  EXPECT_EQ(Add("ON=6"), 6u);  // ON=6 ran, so it may be used again
  due = pending.TakeDue(kNow + 86400 * 365);
  ASSERT_EQ(due.size(), 2u);
  EXPECT_EQ(due[1].sessionId, 2u);
  EXPECT_EQ(pending.NextExpiry(), std::nullopt);  // only manual entries are left

  EXPECT_FALSE(pending.Cancel(3));
  EXPECT_TRUE(pending.Cancel(5));
  std::optional<Tl1PendingEntry> taken = pending.Take(1);
  ASSERT_TRUE(taken);
  EXPECT_EQ(taken->command.generalBlock->on, 5);
  EXPECT_EQ(Ids(), (std::vector<std::uint32_t>{6}));
}

TEST_F(Tl1PendingListTest, APastDateIsDueAtOnce) {
  EXPECT_EQ(Add("DATE=24-06-09"), 1u);
  EXPECT_EQ(pending.NextExpiry(), kNow - 86400);
  EXPECT_EQ(pending.TakeDue(kNow).size(), 1u);
}

}  // namespace
}  // namespace tessel
