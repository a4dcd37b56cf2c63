// The informs that wait for their Response: each is kept with its encoded InformRequest until a
// Response acknowledges it, or it is sent again when its timeout passes with retries left, or it
// is dropped and reported when none are left. Time is given by the caller in milliseconds of a
// monotonic clock, so the list itself never reads a clock; its timer thread waits, blocked, until
// the earliest deadline, a new inform or a stop.
// Thread-safe: informs are added, acknowledged and expired from any thread at once. The sender
// runs under the list's lock (a non-blocking send); the reporters run outside it.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "snmp/pdu.h"
#include "snmpv3/usm_users.h"
#include "transport/transport_domain.h"

namespace tessel {

// Where a notification goes, and under which identity.
struct NotificationTarget {
  std::string managerAddress;  // numeric text of the resolved manager address
  std::uint16_t managerPort = 0;
  PeerSocketAddress managerSockAddr{};
  std::int32_t version = kSnmpV2c;
  std::string community;
  std::string userName;
  std::string contextName;
  std::uint32_t timeout = 5;  // seconds an inform waits for its Response
  std::uint32_t retries = 0;  // InformRequests sent again after the first
};

// The device a notification leaves from: its own address and SNMP port.
struct DeviceEndpoint {
  std::string address;
  std::uint16_t port = 0;
  bool operator==(const DeviceEndpoint&) const = default;
};

// What an SNMPv3 inform's Response must carry: the manager (authoritative for the inform) answers
// with the inform's msgID, authenticated by the user at the inform's level.
struct V3InformSecurity {
  std::int32_t msgId = 0;
  std::string engineId;
  std::uint8_t level = 0;
  UsmUser user;
};

struct PendingInform {
  std::uint32_t informId = 0;
  std::int32_t requestId = 0;
  DeviceEndpoint device;
  NotificationTarget target;
  std::vector<std::uint8_t> message;  // the encoded InformRequest
  VarBindList bindings;               // reported to the host
  std::optional<V3InformSecurity> v3;
  std::uint32_t retriesLeft = 0;
  std::uint32_t sends = 0;
  std::uint64_t deadline = 0;  // milliseconds
};

// Where a Response came from and to which device.
struct ResponseOrigin {
  DeviceEndpoint device;
  PeerSocketAddress manager{};
  std::string community;  // SNMPv1/SNMPv2c: the Response's community
};

class InformList {
 public:
  // Sends one InformRequest; false when it cannot be sent at all (no device socket, no route).
  using Sender = std::function<bool(const PendingInform&)>;
  using Reporter = std::function<void(const PendingInform&)>;
  using Clock = std::function<std::uint64_t()>;

  InformList(Sender sender, Reporter dropped);
  ~InformList();
  InformList(const InformList&) = delete;
  InformList& operator=(const InformList&) = delete;

  // An inform ID for an inform that is added later (one without an ID gets its own in Add).
  std::uint32_t ReserveInformId();
  // The most informs kept waiting at once: a flood that raises informs (a sink that takes them
  // and requests with a bad community, say) cannot grow the list without bound.
  static constexpr std::size_t kMaxPending = 10000;

  // Sends the inform and keeps it until now + timeout. An inform whose first send fails, or that
  // finds kMaxPending informs waiting, is reported dropped at once and not kept.
  struct Added {
    std::uint32_t informId = 0;
    bool sent = false;
  };
  Added Add(PendingInform inform, std::uint64_t now);
  // Takes the inform that a Response with this request-id answers: one sent by that device to
  // exactly that manager address and port, with that community.
  std::optional<PendingInform> Acknowledge(const ResponseOrigin& origin, std::int32_t requestId);
  // The security of the SNMPv3 inform that device sent to that manager with this msgID.
  std::optional<V3InformSecurity> FindV3(const ResponseOrigin& origin, std::int32_t msgId) const;
  // Sends again every inform whose deadline has passed and that has retries left; drops and
  // reports the others. The earliest deadline still pending, if any.
  std::optional<std::uint64_t> Expire(std::uint64_t now);
  std::size_t Pending() const;
  // Drops every inform without reporting it.
  void Clear();

  // Runs Expire on a thread of its own at each deadline, reading now from clock.
  void StartTimer(Clock clock);
  // Stops and joins the timer thread; harmless when none runs.
  void StopTimer();

 private:
  void TimerLoop(Clock clock);
  std::uint32_t NextInformId();

  Sender sender_;
  Reporter dropped_;
  mutable std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<PendingInform> informs_;
  std::uint32_t lastInformId_ = 0;
  std::uint64_t additions_ = 0;  // lets the timer tell that an inform came while it expired
  bool stopping_ = false;
  std::thread timer_;
};

// The next request-id of a notification: 1 to 2^31 - 1, then 1 again. Wide, so that the
// request-ids of informs outstanding at one manager never meet.
std::int32_t NextNotificationRequestId();

}  // namespace tessel
