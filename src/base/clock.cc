#include "base/clock.h"

#include <atomic>
#include <chrono>
#include <thread>

namespace tessel {
namespace {

std::atomic<std::uint32_t> clockBaseSeconds{0};

}  // namespace

std::uint32_t GetCurrentSeconds() {
  auto now = std::chrono::steady_clock::now().time_since_epoch();
  return static_cast<std::uint32_t>(std::chrono::duration_cast<std::chrono::seconds>(now).count());
}

void SetClockBase() { clockBaseSeconds.store(GetCurrentSeconds()); }

std::uint32_t UptimeSince(std::uint32_t startSeconds, bool hundredths) {
  std::uint32_t now = GetCurrentSeconds();
  std::uint32_t seconds = now > startSeconds ? now - startSeconds : 0;
  return hundredths ? seconds * 100u : seconds;
}

std::uint32_t GetUptime(bool hundredths) {
  return UptimeSince(clockBaseSeconds.load(), hundredths);
}

void SleepMicroseconds(std::uint64_t microseconds) {
  std::uint64_t milliseconds = microseconds / 1000;
  if (milliseconds > 0) std::this_thread::sleep_for(std::chrono::milliseconds(milliseconds));
}

}  // namespace tessel
