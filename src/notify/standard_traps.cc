#include "notify/standard_traps.h"

#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>

#include "base/clock.h"
#include "engine/log.h"
#include "notify/notifier.h"
#include "notify/trap_pdu.h"

namespace tessel {
namespace {

struct TrapSink {
  NotificationTarget target;
  bool inform = false;
};

struct SinkRange {
  std::int32_t firstAgentId = 0;
  std::int32_t count = 0;
  std::shared_ptr<const std::vector<TrapSink>> sinks;
};

struct ManagerTable {
  std::mutex mutex;
  std::vector<SinkRange> ranges;
  std::atomic<bool> empty{true};  // read without the lock on every request that fails its check
};

ManagerTable& TheManagerTable() {
  static ManagerTable* table = new ManagerTable();  // never destroyed: service threads read it
  return *table;
}

std::shared_ptr<const std::vector<TrapSink>> SinksOf(std::int32_t agentId) {
  ManagerTable& table = TheManagerTable();
  if (table.empty.load(std::memory_order_relaxed)) return nullptr;
  std::lock_guard<std::mutex> lock(table.mutex);
  for (const SinkRange& range : table.ranges) {
    if (agentId >= range.firstAgentId &&
        static_cast<std::int64_t>(agentId) <
            static_cast<std::int64_t>(range.firstAgentId) + range.count)
      return range.sinks;
  }
  return nullptr;
}

// The trap as a sink of that kind receives it: a standard trap is built in its SNMPv1 form,
// which the delivery translates for SNMPv2c and SNMPv3 sinks; an inform is its SNMPv2 form.
SnmpPdu TrapFor(const TrapSink& sink, const SnmpPdu& v1Form) {
  if (!sink.inform) return v1Form;
  SnmpPdu inform = ConvertV1TrapToV2(v1Form);
  inform.type = kInformRequest;
  return inform;
}

}  // namespace

std::int32_t SetTrapSinks(std::int32_t firstAgentId, std::int32_t count,
                          const std::vector<TrapSinkConfig>& configs) {
  auto sinks = std::make_shared<std::vector<TrapSink>>();
  for (std::size_t i = 0; i < configs.size(); ++i) {
    const TrapSinkConfig& config = configs[i];
    TrapSink sink;
    if (!ResolveNotificationTarget(config.host, config.port, &sink.target)) {
      LOG_ERROR("Unable to resolve the trap sink %s\n", config.host.c_str());
      return static_cast<std::int32_t>(i);
    }
    sink.target.version = config.version;
    sink.target.community = config.community;
    sink.target.userName = config.userName;
    sink.target.contextName = config.contextName;
    sink.target.timeout = config.timeout;
    sink.target.retries = config.retries;
    sink.inform = config.inform;
    sinks->push_back(std::move(sink));
  }
  ManagerTable& table = TheManagerTable();
  std::lock_guard<std::mutex> lock(table.mutex);
  std::erase_if(table.ranges,
                [&](const SinkRange& range) { return range.firstAgentId == firstAgentId; });
  if (!sinks->empty() && count > 0) table.ranges.push_back({firstAgentId, count, std::move(sinks)});
  table.empty = table.ranges.empty();
  return -1;
}

void ClearTrapSinks() {
  ManagerTable& table = TheManagerTable();
  std::lock_guard<std::mutex> lock(table.mutex);
  table.ranges.clear();
  table.empty = true;
}

std::size_t RaiseStandardTrap(const AgentSession& device, std::int32_t genericTrap) {
  if (!device.agentInfo) return 0;
  std::shared_ptr<const std::vector<TrapSink>> sinks = SinksOf(device.agentInfo->agentId);
  if (!sinks) return 0;
  SnmpPdu v1Form = BuildStandardV1Trap(genericTrap, AgentAddressOf(device.transport.localAddress),
                                       UptimeSince(device.agentInfo->startTime, true));
  std::size_t sent = 0;
  for (const TrapSink& sink : *sinks) {
    if (DeliverNotification(TrapFor(sink, v1Form), sink.target, device).result ==
        NotifyResult::kSent)
      ++sent;
  }
  return sent;
}

}  // namespace tessel
