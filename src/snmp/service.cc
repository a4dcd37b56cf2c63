#include "snmp/service.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <new>
#include <thread>

#include "base/clock.h"
#include "engine/agent_registry.h"
#include "engine/engine_state.h"
#include "engine/log.h"
#include "snmp/message.h"
#include "snmp/statistics.h"
#include "transport/agent_sockets.h"
#include "transport/udp.h"

namespace tessel {
namespace {

// One received datagram with the session it arrived for; belongs to the worker that takes it.
struct RcvdInfo {
  std::vector<std::uint8_t> data;
  AgentSession session;
  bool viaWildcard = false;
};

// A FIFO of received datagrams; Pop blocks until there is one or the queue is stopped.
class RequestQueue {
 public:
  void Push(std::unique_ptr<RcvdInfo> item) {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      items_.push_back(std::move(item));
    }
    ready_.notify_one();
  }
  std::unique_ptr<RcvdInfo> Pop() {
    std::unique_lock<std::mutex> lock(mutex_);
    ready_.wait(lock, [this] { return stopped_ || !items_.empty(); });
    if (stopped_) return nullptr;
    std::unique_ptr<RcvdInfo> item = std::move(items_.front());
    items_.pop_front();
    return item;
  }
  void Start() {
    std::lock_guard<std::mutex> lock(mutex_);
    stopped_ = false;
    items_.clear();
  }
  // Wakes every waiting worker; datagrams still queued are dropped.
  void Stop() {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      stopped_ = true;
      items_.clear();
    }
    ready_.notify_all();
  }

 private:
  std::mutex mutex_;
  std::condition_variable ready_;
  std::deque<std::unique_ptr<RcvdInfo>> items_;
  bool stopped_ = false;
};

// The engine-wide sockets: IPv4 and IPv6 wildcards on the SNMP port and the notification socket.
struct WildcardSockets {
  std::mutex mutex;
  int ipv4 = -1;
  int ipv6 = -1;
  int notify = -1;
  std::uint16_t port = 0;
};

struct Service {
  std::array<RequestQueue, kRequestQueues> queues;
  std::array<std::atomic<int>, kRequestQueues> liveWorkers{};
  std::vector<std::thread> threads;
  std::atomic<std::uint32_t> nextQueue{0};
  int stopEvent = -1;
  int wildcardEpoll = -1;
  WildcardSockets wildcards;
};

Service& TheService() {
  static Service service;
  return service;
}

bool Readable(int epoll, int descriptor) {
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.fd = descriptor;
  return epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event) == 0;
}

// ---- Engine-wide sockets ----

int OpenWildcard(const char* address, std::uint16_t port, bool ipv6, bool wantDestination) {
  int error = 0;
  int socket = OpenUdpSocket(address, port, ipv6, UdpBindOptions{true, wantDestination}, &error);
  if (socket < 0)
    LOG_ERROR("Bind Failed : udp port %d Address %s, the engine carries on without it", port,
              address);
  return socket;
}

void CloseWildcardsLocked(Service& service) {
  WildcardSockets& wildcards = service.wildcards;
  for (int* socket : {&wildcards.ipv4, &wildcards.ipv6, &wildcards.notify}) {
    if (*socket < 0) continue;
    if (service.wildcardEpoll >= 0)
      epoll_ctl(service.wildcardEpoll, EPOLL_CTL_DEL, *socket, nullptr);
    CloseUdpSocket(*socket);
    *socket = -1;
  }
  wildcards.port = 0;
}

// Opens the wildcard sockets on the SNMP port and the notification socket; each is best effort.
void StartSnmpAgentService(Service& service) {
  WildcardSockets& wildcards = service.wildcards;
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  std::uint16_t port = gv_snmpPort.load();
  if (port == 0 || wildcards.port == port) return;
  CloseWildcardsLocked(service);
  wildcards.port = port;
  wildcards.ipv4 = OpenWildcard("0.0.0.0", port, false, true);
  wildcards.ipv6 = OpenWildcard("::", port, true, true);
  std::uint16_t trapPort = gv_trapPort.load();
  if (trapPort == 0 || trapPort == port) trapPort = static_cast<std::uint16_t>(port + 1u);
  wildcards.notify = OpenWildcard("0.0.0.0", trapPort, false, false);
  for (int socket : {wildcards.ipv4, wildcards.ipv6}) {
    if (socket >= 0) Readable(service.wildcardEpoll, socket);
  }
}

// An agent that needs the port gets it: the wildcards give way.
bool ReleaseWildcardPort(std::uint16_t port) {
  Service& service = TheService();
  std::lock_guard<std::mutex> lock(service.wildcards.mutex);
  if (service.wildcards.port != port || (service.wildcards.ipv4 < 0 && service.wildcards.ipv6 < 0))
    return false;
  LOG_ERROR("The wildcard sockets of port %d give way to an agent", port);
  CloseWildcardsLocked(service);
  service.wildcards.port = port;  // not reopened for this port
  return true;
}

// ---- Threads ----

void Worker(int queue) {
  Service& service = TheService();
  while (std::unique_ptr<RcvdInfo> item = service.queues[static_cast<std::size_t>(queue)].Pop()) {
    try {
      ProcessRcvdSnmpReq(item->data.data(), item->data.size(), item->session, item->viaWildcard);
    } catch (const std::bad_alloc&) {
      LOG_ERROR("Unable to allocate buffer !!! \n");
    }
  }
  service.liveWorkers[static_cast<std::size_t>(queue)].fetch_sub(1);
}

// Waits on epoll for readable sockets until the stop event; hands each to `serve`.
template <typename Serve>
void ReceiveLoop(int epoll, int stopEvent, Serve serve) {
  std::array<epoll_event, 64> events;
  for (;;) {
    int ready = epoll_wait(epoll, events.data(), static_cast<int>(events.size()), -1);
    if (ready < 0 && errno != EINTR) LOG_ERROR("Error in response select %d", errno);
    for (int i = 0; i < ready; ++i) {
      if (events[static_cast<std::size_t>(i)].data.fd == stopEvent) return;
      serve(events[static_cast<std::size_t>(i)].data.fd);
    }
  }
}

// Reads what a ready socket holds (a bounded batch, so that one busy agent cannot starve the
// others) and queues it.
void ServeAgentSocket(int socket) {
  thread_local std::vector<std::uint8_t> buffer(kUdpReceiveBuffer);
  for (int batch = 0; batch < 32; ++batch) {
    AgentSession session;
    std::size_t length = 0;
    if (!ReadAgentDatagram(socket, buffer.data(), buffer.size(), &length, &session)) return;
    CreateRcvdInfo(session, buffer.data(), length, false);
  }
}

void ServeWildcardSocket(int socket) {
  thread_local std::vector<std::uint8_t> buffer(kUdpReceiveBuffer);
  for (int batch = 0; batch < 32; ++batch) {
    TransportDomainInfo received;
    std::size_t length = 0;
    if (!ReadUdpPacket(socket, buffer.data(), buffer.size(), &length, &received)) return;
    if (received.localAddress.empty()) {
      LOG_ERROR("The agent address is NULL. Hence skipping this packet.");
      continue;
    }
    std::optional<AgentSession> agent = LookupAgentByAddress(received.localAddress);
    if (!agent) {
      LOG_ERROR("The td Info cannot be obtained for %s", received.localAddress.c_str());
      continue;
    }
    agent->socket = socket;
    agent->transport.socket = socket;
    agent->transport.peerAddress = std::move(received.peerAddress);
    agent->transport.peerPort = received.peerPort;
    agent->transport.peerSockAddr = received.peerSockAddr;
    agent->transport.localAddress = received.localAddress;
    CreateRcvdInfo(*agent, buffer.data(), length, true);
  }
}

void StartThreads(Service& service) {
  for (int queue = 0; queue < kRequestQueues; ++queue) {
    service.queues[static_cast<std::size_t>(queue)].Start();
    service.liveWorkers[static_cast<std::size_t>(queue)] = kWorkersPerQueue;
    for (int i = 0; i < kWorkersPerQueue; ++i) service.threads.emplace_back(Worker, queue);
  }
  LOG_TRACE("InitThreads with %d", kWorkersPerQueue);
  int agentEpoll = AgentSocketsEpoll();
  Readable(agentEpoll, service.stopEvent);
  Readable(service.wildcardEpoll, service.stopEvent);
  service.threads.emplace_back(ReceiveLoop<void (*)(int)>, agentEpoll, service.stopEvent,
                               ServeAgentSocket);
  service.threads.emplace_back(ReceiveLoop<void (*)(int)>, service.wildcardEpoll, service.stopEvent,
                               ServeWildcardSocket);
}

}  // namespace

void InitSnmpParams() {
  SetPortReleaser(ReleaseWildcardPort);
  InstallSessionTransport(OpenAgentSocket, CloseAgentSocket);
}

bool InitSnmpGeneralServices() {
  LOG_TRACE("\n\t@@@@@ Inside InitSnmpGeneralServices() @@@@@ \n");
  Service& service = TheService();
  if (!service.threads.empty()) return true;
  // Agent uptimes and the SNMPv3 engine time count from here.
  SetClockBase();
  service.nextQueue = 0;
  service.stopEvent = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  service.wildcardEpoll = epoll_create1(EPOLL_CLOEXEC);
  if (service.stopEvent < 0 || service.wildcardEpoll < 0) {
    LOG_ERROR("Unable to create Thread");
    StopSnmpGeneralServices();
    return false;
  }
  StartSnmpAgentService(service);
  StartThreads(service);
  return true;
}

void StopSnmpGeneralServices() {
  Service& service = TheService();
  if (service.stopEvent >= 0) {
    std::uint64_t one = 1;
    if (write(service.stopEvent, &one, sizeof one) < 0)
      LOG_ERROR("Unable to wake the receive threads");
  }
  for (RequestQueue& queue : service.queues) queue.Stop();
  for (std::thread& thread : service.threads) thread.join();
  service.threads.clear();
  {
    std::lock_guard<std::mutex> lock(service.wildcards.mutex);
    CloseWildcardsLocked(service);
  }
  int agentEpoll = AgentSocketsEpoll();
  if (service.stopEvent >= 0) epoll_ctl(agentEpoll, EPOLL_CTL_DEL, service.stopEvent, nullptr);
  for (int* descriptor : {&service.stopEvent, &service.wildcardEpoll}) {
    if (*descriptor >= 0) close(*descriptor);
    *descriptor = -1;
  }
}

bool CreateRcvdInfo(const AgentSession& session, const std::uint8_t* data, std::size_t length,
                    bool viaWildcard) {
  auto item = std::make_unique<RcvdInfo>();
  item->data.assign(data, data + length);
  item->session = session;
  item->viaWildcard = viaWildcard;
  if (session.agentInfo) session.agentInfo->engineTime = GetUptime(false);
  Service& service = TheService();
  std::uint32_t queue = service.nextQueue.fetch_add(1) % kRequestQueues;
  service.queues[queue].Push(std::move(item));
  return true;
}

bool ProcessRcvdSnmpReq(const std::uint8_t* data, std::size_t length, const AgentSession& session,
                        bool viaWildcard) {
  thread_local std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t replyLength = reply.size();
  int result = ProcessSnmpMessage(data, length, reply.data(), &replyLength, session);
  if (result != kMessageReply) {
    LOG_ERROR("ProcessSnmpPDU() is failed. ");
    return false;
  }
  if (replyLength == 0) return true;
  LOG_TRACE("The length of the pkt to send is %zu", replyLength);
  return SendUdpPacket(session.transport, static_cast<int>(session.socket), reply.data(),
                       replyLength, viaWildcard);
}

std::vector<int> LiveWorkerCounts() {
  std::vector<int> counts;
  for (const auto& live : TheService().liveWorkers) counts.push_back(live.load());
  return counts;
}

}  // namespace tessel
