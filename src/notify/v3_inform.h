// SNMPv3 informs: the manager is the authoritative engine of an inform, so before the first
// InformRequest the device discovers the manager's engine ID and, above noAuthNoPriv, its boots
// and time (RFC 3414). That exchange runs on the sender's own threads (up to kWorkers informs at
// once), from an ephemeral port of the device's address (the device's SNMP port is its agent's),
// and waits at most 0.6 s for each answer, so it never holds up the host's call, the service
// threads or the other notifications. The
// InformRequest itself then leaves from the device's agent socket like every notification and is
// kept by the inform list; an inform whose manager does not answer discovery is dropped at once.
// Safe from any thread.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

#include "notify/inform_list.h"
#include "snmp/pdu.h"
#include "snmpv3/usm_users.h"

namespace tessel {

struct V3InformJob {
  std::uint32_t informId = 0;  // reserved in the inform list
  SnmpPdu pdu;                 // the InformRequest, request-id given
  NotificationTarget target;
  DeviceEndpoint device;
  bool ipv6 = false;
  UsmUser user;  // of the engine's table: its passwords are localised to the manager's engine
};

class V3InformSender {
 public:
  using Dropped = std::function<void(const PendingInform&)>;
  using Clock = std::function<std::uint64_t()>;  // milliseconds, as the inform list's

  V3InformSender(InformList& informs, Dropped dropped, Clock clock);
  ~V3InformSender();
  V3InformSender(const V3InformSender&) = delete;
  V3InformSender& operator=(const V3InformSender&) = delete;

  static constexpr std::size_t kWorkers = 8;

  // Discovers the manager and sends the inform, on one of the sender's threads (started as
  // informs come).
  void Queue(V3InformJob job);
  // Joins the threads; informs still queued are forgotten.
  void Stop();

 private:
  void Run();
  void Process(const V3InformJob& job);

  InformList& informs_;
  Dropped dropped_;
  Clock clock_;
  std::mutex mutex_;
  std::condition_variable queued_;
  std::deque<V3InformJob> jobs_;
  bool stopping_ = false;
  std::size_t idle_ = 0;  // threads waiting for a job
  std::vector<std::thread> threads_;
};

}  // namespace tessel
