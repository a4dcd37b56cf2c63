#include "base/resource_lock.h"

#include <condition_variable>
#include <cstdint>
#include <unordered_set>

#include "base/log.h"

namespace tessel {
namespace {

struct LockTable {
  std::condition_variable released;
  std::unordered_set<std::uintptr_t> lockedKeys;
};

LockTable& Table() {
  static LockTable table;
  return table;
}

}  // namespace

std::mutex& GlobalMutex() {
  static std::mutex mutex;
  return mutex;
}

void LockResource(const void* key) {
  auto id = reinterpret_cast<std::uintptr_t>(key);
  LockTable& table = Table();
  std::unique_lock<std::mutex> lock(GlobalMutex());
  table.released.wait(lock, [&] { return !table.lockedKeys.contains(id); });
  table.lockedKeys.insert(id);
}

void UnlockResource(const void* key) {
  auto id = reinterpret_cast<std::uintptr_t>(key);
  LockTable& table = Table();
  bool wasLocked;
  {
    std::lock_guard<std::mutex> lock(GlobalMutex());
    wasLocked = table.lockedKeys.erase(id) == 1;
  }
  if (!wasLocked) {
    LOG_ERROR("Alert! something went wrong...");
    return;
  }
  table.released.notify_all();
}

}  // namespace tessel
