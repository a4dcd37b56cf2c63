// The resource lock table: a lock for any object, keyed by its address. Not reentrant and
// without owner: any thread may unlock a key. A waiting thread blocks until the key is free.
// The table itself is guarded by the engine's global mutex, which is held only for a moment.
#pragma once

#include <mutex>

namespace tessel {

void LockResource(const void* key);
void UnlockResource(const void* key);

// The process-wide mutex that also guards reopening the log file.
std::mutex& GlobalMutex();

// Holds a resource lock for a scope.
class ResourceLockGuard {
 public:
  explicit ResourceLockGuard(const void* key) : key_(key) { LockResource(key_); }
  ~ResourceLockGuard() { UnlockResource(key_); }
  ResourceLockGuard(const ResourceLockGuard&) = delete;
  ResourceLockGuard& operator=(const ResourceLockGuard&) = delete;

 private:
  const void* key_;
};

}  // namespace tessel
