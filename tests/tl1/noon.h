// A fixed local time for the TL1 tests: 2024-06-30 12:00:00, read as the response headers show it.
#pragma once

#include <ctime>

namespace tessel {

inline std::tm Noon() {
  std::tm time{};
  time.tm_year = 124;
  time.tm_mon = 5;
  time.tm_mday = 30;
  time.tm_hour = 12;
  return time;
}

}  // namespace tessel
