#include "base/clock.h"

#include <gtest/gtest.h>
#include <time.h>

namespace tessel {
namespace {

std::int64_t MonotonicSeconds() {
  timespec now{};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return now.tv_sec;
}

// Engine time and uptimes must not follow a wall clock that is set back or forward.
TEST(ClockTest, ElapsedTimeIsMeasuredOnTheMonotonicClock) {
  EXPECT_NEAR(static_cast<double>(GetCurrentSeconds()), static_cast<double>(MonotonicSeconds()), 1);
  std::uint32_t now = GetCurrentSeconds();
  EXPECT_EQ(UptimeSince(now + 5, false), 0u);  // not 2^32 - 5 seconds
  EXPECT_NEAR(UptimeSince(now - 3, true), 300, 100);
}

}  // namespace
}  // namespace tessel
