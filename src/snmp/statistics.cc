#include "snmp/statistics.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstring>
#include <mutex>

namespace tessel {
namespace {

std::array<std::atomic<std::uint32_t>, static_cast<std::size_t>(SnmpCounter::kCount)> counters{};

struct ErrorLogEntry {
  std::int32_t requestId = 0;
  std::int32_t pduType = 0;
  std::int32_t version = 0;
  std::int32_t errorStatus = 0;
  char managerAddress[45] = {};
};

constexpr int kErrorLogSize = 100;

struct ErrorLog {
  std::mutex mutex;
  std::array<ErrorLogEntry, kErrorLogSize> ring{};
  int next = 0;
  bool full = false;
  std::vector<std::string> lastAddresses;  // copied by the last GetErrorLogs
};

ErrorLog& Log() {
  static ErrorLog log;
  return log;
}

}  // namespace

void CountSnmp(SnmpCounter counter, std::uint32_t amount) {
  counters[static_cast<std::size_t>(counter)].fetch_add(amount, std::memory_order_relaxed);
}

std::uint32_t SnmpCount(SnmpCounter counter) {
  return counters[static_cast<std::size_t>(counter)].load(std::memory_order_relaxed);
}

std::vector<std::int32_t> GetReportOverviewDetails() {
  std::vector<std::int32_t> report(kReportedCounters);
  for (int i = 0; i < kReportedCounters; ++i) {
    report[static_cast<std::size_t>(i)] =
        static_cast<std::int32_t>(counters[static_cast<std::size_t>(i)].load());
  }
  return report;
}

void ResetSnmpStatistics() {
  for (auto& counter : counters) counter.store(0);
  ErrorLog& log = Log();
  std::lock_guard<std::mutex> lock(log.mutex);
  log.ring = {};
  log.next = 0;
  log.full = false;
  log.lastAddresses.clear();
}

void RecordErrorLog(std::int32_t requestId, std::uint8_t pduType, std::int32_t version,
                    std::int32_t errorStatus, const std::string& managerAddress) {
  ErrorLog& log = Log();
  std::lock_guard<std::mutex> lock(log.mutex);
  ErrorLogEntry& entry = log.ring[static_cast<std::size_t>(log.next)];
  entry.requestId = requestId;
  entry.pduType = pduType;
  entry.version = version;
  entry.errorStatus = errorStatus;
  std::size_t length = std::min(managerAddress.size(), sizeof entry.managerAddress - 1);
  std::memcpy(entry.managerAddress, managerAddress.data(), length);
  entry.managerAddress[length] = '\0';
  log.next = (log.next + 1) % kErrorLogSize;
  if (log.next == 0) log.full = true;
}

std::vector<std::int32_t> GetErrorLogs() {
  ErrorLog& log = Log();
  std::lock_guard<std::mutex> lock(log.mutex);
  int count = log.full ? kErrorLogSize : log.next;
  int first = log.full ? log.next : 0;
  std::vector<std::int32_t> result;
  result.reserve(static_cast<std::size_t>(count) * 4 + 1);
  log.lastAddresses.clear();
  for (int i = 0; i < count; ++i) {
    const ErrorLogEntry& entry = log.ring[static_cast<std::size_t>((first + i) % kErrorLogSize)];
    result.insert(result.end(), {entry.requestId, entry.version, entry.pduType, entry.errorStatus});
    log.lastAddresses.emplace_back(entry.managerAddress);
  }
  result.push_back(count);
  return result;
}

std::vector<std::string> GetIpAddrArr(int n) {
  ErrorLog& log = Log();
  std::lock_guard<std::mutex> lock(log.mutex);
  std::size_t count = n < 0 ? 0 : std::min(static_cast<std::size_t>(n), log.lastAddresses.size());
  return {log.lastAddresses.begin(),
          log.lastAddresses.begin() + static_cast<std::ptrdiff_t>(count)};
}

}  // namespace tessel
