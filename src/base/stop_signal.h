// A run flag that threads can block on: Wait returns once Stop is called, so a loop that would
// otherwise poll its flag with sleeps costs no CPU while idle and ends as soon as it is told.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

namespace tessel {

class StopSignal {
 public:
  void Arm() {
    std::lock_guard<std::mutex> lock(mutex_);
    stopped_ = false;
  }
  void Stop() {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      stopped_ = true;
    }
    changed_.notify_all();
  }
  bool IsStopped() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return stopped_;
  }
  void Wait() {
    std::unique_lock<std::mutex> lock(mutex_);
    changed_.wait(lock, [this] { return stopped_; });
  }
  // True when stopped within the timeout.
  bool WaitFor(std::chrono::milliseconds timeout) {
    std::unique_lock<std::mutex> lock(mutex_);
    return changed_.wait_for(lock, timeout, [this] { return stopped_; });
  }

 private:
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  bool stopped_ = false;
};

}  // namespace tessel
