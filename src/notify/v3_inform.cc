#include "notify/v3_inform.h"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstring>
#include <optional>

#include "engine/log.h"
#include "notify/trap_pdu.h"
#include "snmpv3/v3_message.h"
#include "transport/udp.h"

namespace tessel {
namespace {

constexpr int kAnswerWaitMs = 600;
constexpr std::size_t kReceiveBuffer = 20000;

bool FromManager(const sockaddr_storage& source, const PeerSocketAddress& manager) {
  if (source.ss_family != manager.any.sa_family) return false;
  if (source.ss_family == AF_INET) {
    const auto& v4 = reinterpret_cast<const sockaddr_in&>(source);
    return v4.sin_port == manager.v4.sin_port && v4.sin_addr.s_addr == manager.v4.sin_addr.s_addr;
  }
  const auto& v6 = reinterpret_cast<const sockaddr_in6&>(source);
  return v6.sin6_port == manager.v6.sin6_port &&
         std::memcmp(&v6.sin6_addr, &manager.v6.sin6_addr, sizeof v6.sin6_addr) == 0;
}

// A request from the device's ephemeral socket, and the manager's answer to its msgID within
// 0.6 s; user checks and decrypts an authenticated answer.
std::optional<V3Received> Exchange(int socket, const NotificationTarget& target,
                                   const std::vector<std::uint8_t>& request, std::int32_t msgId,
                                   const UsmUser* user) {
  if (sendto(socket, request.data(), request.size(), 0, &target.managerSockAddr.any,
             SocketAddressLength(target.managerSockAddr.any.sa_family)) < 0)
    return std::nullopt;
  auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(kAnswerWaitMs);
  std::vector<std::uint8_t> buffer(kReceiveBuffer);
  for (;;) {
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    pollfd ready{socket, POLLIN, 0};
    if (left.count() <= 0 || poll(&ready, 1, static_cast<int>(left.count())) != 1) break;
    sockaddr_storage source{};
    socklen_t sourceLength = sizeof source;
    ssize_t length = recvfrom(socket, buffer.data(), buffer.size(), 0,
                              reinterpret_cast<sockaddr*>(&source), &sourceLength);
    V3Received answer;
    if (length > 0 && FromManager(source, target.managerSockAddr) &&
        ParseV3Message(buffer.data(), static_cast<std::size_t>(length), user, &answer) &&
        answer.msgId == msgId)
      return answer;
  }
  LOG_ERROR("\nNo response from the manager!!!\n");
  return std::nullopt;
}

std::vector<std::uint8_t> EncodeMessage(const V3Envelope& envelope, const SnmpPdu& pdu) {
  std::vector<std::uint8_t> encoded = EncodeNotificationPdu(pdu);
  std::vector<std::uint8_t> message(kMaxSnmpMessage);
  std::size_t length = message.size();
  if (encoded.empty() ||
      !EncodeV3Message(envelope, encoded.data(), encoded.size(), message.data(), &length))
    return {};
  message.resize(length);
  return message;
}

// The user's keys localised to the manager's engine, at level.
void Sign(V3Envelope* envelope, const UsmUser& user, std::uint8_t level) {
  envelope->level = level;
  envelope->userName = user.userName;
  if (level != kNoAuthNoPriv) {
    envelope->auth = user.auth;
    envelope->authKey = GetLocalKeyValue(user.authPassword, user.auth, envelope->engineId);
  }
  if (level == kAuthPriv) {
    envelope->priv = user.priv;
    envelope->privKey = GetLocalKeyValue(user.privPassword, user.auth, envelope->engineId);
  }
}

V3Envelope RequestEnvelope() {
  V3Envelope envelope;
  envelope.msgId = NextNotificationRequestId();
  envelope.msgMaxSize = static_cast<std::int32_t>(kMaxSnmpMessage);
  envelope.reportable = true;
  return envelope;
}

SnmpPdu GetRequest(std::int32_t requestId) {
  SnmpPdu pdu;
  pdu.type = kGetRequest;
  pdu.requestId = requestId;
  return pdu;
}

// The manager's engine ID, boots and time: discovery, then at an authenticated level the time
// synchronisation (unless the discovery answer carried them).
std::optional<V3Envelope> DiscoverManager(int socket, const V3InformJob& job) {
  V3Envelope discovery = RequestEnvelope();
  std::optional<V3Received> report =
      Exchange(socket, job.target, EncodeMessage(discovery, GetRequest(job.pdu.requestId)),
               discovery.msgId, nullptr);
  if (!report || report->engineId.empty()) {
    LOG_ERROR("\n The pdu received is NULL ... \n");
    return std::nullopt;
  }
  V3Envelope inform = RequestEnvelope();
  inform.engineId = report->engineId;
  inform.boots = report->boots;
  inform.time = report->time;
  if (job.user.securityLevel != kNoAuthNoPriv && report->boots == 0 && report->time == 0) {
    V3Envelope sync = RequestEnvelope();
    sync.engineId = report->engineId;
    Sign(&sync, job.user, kAuthNoPriv);
    std::optional<V3Received> timed =
        Exchange(socket, job.target, EncodeMessage(sync, GetRequest(job.pdu.requestId)), sync.msgId,
                 &job.user);
    if (!timed) return std::nullopt;
    inform.boots = timed->boots;
    inform.time = timed->time;
  }
  return inform;
}

}  // namespace

V3InformSender::V3InformSender(InformList& informs, Dropped dropped, Clock clock)
    : informs_(informs), dropped_(std::move(dropped)), clock_(std::move(clock)) {}

V3InformSender::~V3InformSender() { Stop(); }

void V3InformSender::Queue(V3InformJob job) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (threads_.empty()) stopping_ = false;
  jobs_.push_back(std::move(job));
  if (idle_ < jobs_.size() && threads_.size() < kWorkers) threads_.emplace_back([this] { Run(); });
  queued_.notify_one();
}

void V3InformSender::Stop() {
  std::vector<std::thread> threads;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stopping_ = true;
    jobs_.clear();
    queued_.notify_all();
    threads.swap(threads_);
  }
  for (std::thread& thread : threads) thread.join();
  std::lock_guard<std::mutex> lock(mutex_);
  idle_ = 0;
}

void V3InformSender::Run() {
  std::unique_lock<std::mutex> lock(mutex_);
  for (;;) {
    ++idle_;
    queued_.wait(lock, [&] { return stopping_ || !jobs_.empty(); });
    --idle_;
    if (stopping_) return;
    V3InformJob job = std::move(jobs_.front());
    jobs_.pop_front();
    lock.unlock();
    Process(job);
    lock.lock();
  }
}

void V3InformSender::Process(const V3InformJob& job) {
  PendingInform inform;
  inform.informId = job.informId;
  inform.requestId = job.pdu.requestId;
  inform.device = job.device;
  inform.target = job.target;
  inform.bindings = job.pdu.requestVarBinds;
  int error = 0;
  int socket = OpenUdpSocket(job.device.address, 0, job.ipv6, UdpBindOptions{}, &error);
  std::optional<V3Envelope> envelope;
  std::uint64_t synchronised = clock_();
  if (socket >= 0) {
    envelope = DiscoverManager(socket, job);
    CloseUdpSocket(socket);
  }
  if (envelope) {
    std::uint64_t elapsed = (clock_() - synchronised) / 1000u;
    envelope->time += static_cast<std::uint32_t>(elapsed);
    envelope->contextEngineId = envelope->engineId;
    envelope->contextName = job.target.contextName;
    Sign(&*envelope, job.user, job.user.securityLevel);
    inform.message = EncodeMessage(*envelope, job.pdu);
    inform.v3 = V3InformSecurity{envelope->msgId, envelope->engineId, envelope->level, job.user};
  }
  if (inform.message.empty()) {
    LOG_ERROR("The SNMPv3 inform to %s cannot be sent: dropped\n",
              job.target.managerAddress.c_str());
    dropped_(inform);
    return;
  }
  informs_.Add(std::move(inform), clock_());
}

}  // namespace tessel
