#include "snmp/service.h"

#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <memory>
#include <new>
#include <optional>
#include <span>
#include <thread>

#include "base/clock.h"
#include "engine/agent_registry.h"
#include "engine/engine_state.h"
#include "engine/log.h"
#include "snmp/agent_sockets.h"
#include "snmp/message.h"
#include "snmp/statistics.h"
#include "transport/socket_batch.h"
#include "transport/udp.h"
#include "transport/udp_batch.h"
#include "transport/wildcard_sockets.h"

namespace tessel {
namespace {

// Tags of epoll events besides agent sockets (whose tag is their descriptor, below 2^32).
constexpr std::uint64_t kStopTag = 1ull << 32;
constexpr std::uint64_t kWildcardTag = 2ull << 32;
constexpr std::uint64_t kDescriptorMask = 0xFFFFFFFFull;

// Up to this many ready agent sockets are read socket by socket, each with one recvmmsg (busy
// agents hold many requests each); more are read together, one request each.
constexpr std::size_t kFewSockets = 8;

struct Service {
  std::vector<std::thread> threads;
  std::atomic<int> liveThreads{0};
  int stopEvent = -1;
  int wildcardEpoll = -1;  // the first shard's epoll
  std::atomic<std::uint64_t> manySocketWakeups{0};
  std::atomic<std::uint64_t> socketBatches{0};
};

Service& TheService() {
  static Service service;
  return service;
}

bool Readable(int epoll, int descriptor, std::uint64_t tag) {
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.u64 = tag | static_cast<std::uint64_t>(descriptor);
  return epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event) == 0;
}

// Opens the wildcard sockets on the SNMP port and the notification socket; each is best effort.
void StartSnmpAgentService(const Service& service) {
  std::uint16_t port = gv_snmpPort.load();
  std::uint16_t trapPort = gv_trapPort.load();
  if (trapPort == 0 || trapPort == port) trapPort = static_cast<std::uint16_t>(port + 1u);
  int failures =
      OpenWildcardSockets(port, trapPort, WildcardWatch{service.wildcardEpoll, kWildcardTag});
  if (failures > 0)
    LOG_ERROR(
        "%d of the wildcard sockets of udp port %d could not be bound, the engine carries "
        "on without them",
        failures, port);
}

// ---- Threads ----

// What one service thread reuses from request to request.
struct ThreadState {
  UdpBatch batch;
  std::unique_ptr<SocketBatch> spread = SocketBatch::Create();  // null without io_uring
  AgentSession request;  // the agent's session with the peer of the request at hand
  std::vector<std::uint8_t> buffer = std::vector<std::uint8_t>(kUdpReceiveBuffer);
};

// Runs one request through message processing into reply (capacity *length). request is the
// agent's session; it gets the datagram's peer. False when nothing is to be sent.
bool Answer(const sockaddr_storage& peer, std::span<const std::uint8_t> datagram,
            std::uint8_t* reply, std::size_t* length, AgentSession& request) {
  SetPeer(peer, &request.transport);
  LOG_TRACE("Received Packet from %s : at %d", request.transport.peerAddress.c_str(),
            request.transport.peerPort);
  int result = ProcessSnmpMessage(datagram.data(), datagram.size(), reply, length, request);
  if (result != kMessageReply) {
    if (result != kMessageConsumed) LOG_ERROR("ProcessSnmpPDU() is failed. ");
    return false;
  }
  if (*length == 0) return false;
  LOG_TRACE("The length of the pkt to send is %zu", *length);
  return true;
}

// Answers what a ready agent socket holds: one batch in, one batch out. One batch per wake-up,
// so that one busy agent cannot starve the others of its shard.
void ServeAgentSocket(int descriptor, ThreadState& state) {
  std::shared_ptr<const AgentSocket> agent = FindAgentSocket(descriptor);
  if (!agent) return;
  UdpBatch& batch = state.batch;
  std::size_t count = batch.Receive(agent->Descriptor());
  if (count == 0) return;
  state.request = agent->Session();
  for (std::size_t i = 0; i < count; ++i) {
    std::size_t length = batch.ReplyCapacity();
    if (Answer(batch.Peer(i), batch.Datagram(i), batch.ReplyBuffer(i), &length, state.request))
      batch.QueueReply(i, length);
  }
  batch.SendQueued(agent->Descriptor());
}

// Answers one request from each of many ready agent sockets with two system calls in all.
void ServeAgentSockets(std::span<const int> descriptors, ThreadState& state) {
  std::array<std::shared_ptr<const AgentSocket>, SocketBatch::kSize> agents;
  std::array<int, SocketBatch::kSize> sockets;
  std::size_t count = 0;
  for (int descriptor : descriptors) {
    if (count == SocketBatch::kSize) break;
    if (std::shared_ptr<const AgentSocket> agent = FindAgentSocket(descriptor)) {
      sockets[count] = agent->Descriptor();
      agents[count++] = std::move(agent);
    }
  }
  SocketBatch& batch = *state.spread;
  std::size_t received = batch.Receive(std::span<const int>(sockets.data(), count));
  if (received > 0) TheService().socketBatches.fetch_add(1, std::memory_order_relaxed);
  for (std::size_t i = 0; i < received; ++i) {
    const AgentSocket& agent = *agents[batch.Source(i)];
    state.request = agent.Session();
    std::size_t length = batch.ReplyCapacity();
    if (Answer(batch.Peer(i), batch.Datagram(i), batch.ReplyBuffer(i), &length, state.request))
      batch.QueueReply(i, length);
  }
  batch.SendQueued();
  if (batch.Broken()) state.spread.reset();
}

// Answers from the agent's address through the wildcard socket, if it is still open.
void ReplyViaWildcard(const AgentSession& agent, const std::uint8_t* data, std::size_t length) {
  thread_local std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t replyLength = reply.size();
  int result = ProcessSnmpMessage(data, length, reply.data(), &replyLength, agent);
  if (result != kMessageReply) {
    if (result != kMessageConsumed) LOG_ERROR("ProcessSnmpPDU() is failed. ");
    return;
  }
  if (replyLength == 0) return;
  SendViaWildcard(static_cast<int>(agent.socket), agent.transport, reply.data(), replyLength);
}

// A datagram for any registered agent, which need not have a socket of its own: answered from
// the address it was sent to.
void ServeWildcardSocket(int socket, ThreadState& state) {
  for (int batch = 0; batch < 32; ++batch) {
    TransportDomainInfo received;
    std::size_t length = 0;
    if (!ReadWildcard(socket, state.buffer.data(), state.buffer.size(), &length, &received)) return;
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
    ReplyViaWildcard(*agent, state.buffer.data(), length);
  }
}

// Runs serve; a failed allocation drops what it was answering, never the thread.
template <typename Serve>
void Guarded(Serve serve) {
  try {
    serve();
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate buffer !!! \n");
  }
}

// Serves the agent sockets that one wake-up found ready: one by one when they are few, or else
// together in one io_uring batch where there is one.
void ServeReadySockets(std::span<const int> descriptors, ThreadState& state) {
  if (descriptors.size() > kFewSockets) {
    TheService().manySocketWakeups.fetch_add(1, std::memory_order_relaxed);
    if (state.spread) {
      Guarded([&] { ServeAgentSockets(descriptors, state); });
      return;
    }
  }
  for (int descriptor : descriptors) Guarded([&] { ServeAgentSocket(descriptor, state); });
}

// Waits on the shard's epoll until the stop event; serves each ready socket on this thread.
void ServiceThread(int epoll) {
  auto state = std::make_unique<ThreadState>();
  std::array<epoll_event, SocketBatch::kSize> events;
  std::vector<int> agentSockets;
  agentSockets.reserve(events.size());
  for (bool running = true; running;) {
    int ready = epoll_wait(epoll, events.data(), static_cast<int>(events.size()), -1);
    if (ready < 0 && errno != EINTR) {
      // Only an epoll descriptor that is no longer one fails here, and it stays so: waiting on
      // it again would spin. The thread ends; the stop joins it as any other.
      LOG_ERROR("Error in response select %d, the service thread ends", errno);
      break;
    }
    agentSockets.clear();
    for (int i = 0; i < ready; ++i) {
      std::uint64_t tag = events[static_cast<std::size_t>(i)].data.u64;
      auto descriptor = static_cast<int>(tag & kDescriptorMask);
      if (tag == (kStopTag | static_cast<std::uint64_t>(TheService().stopEvent))) {
        running = false;
      } else if ((tag & ~kDescriptorMask) == kWildcardTag) {
        Guarded([&] { ServeWildcardSocket(descriptor, *state); });
      } else {
        agentSockets.push_back(descriptor);
      }
    }
    ServeReadySockets(agentSockets, *state);
  }
  TheService().liveThreads.fetch_sub(1);
}

bool StartThreads(Service& service) {
  int shards = AgentSocketShards();
  for (int shard = 0; shard < shards; ++shard) {
    int epoll = AgentSocketsEpoll(shard);
    if (epoll < 0 || !Readable(epoll, service.stopEvent, kStopTag)) return false;
  }
  LOG_TRACE("InitThreads with %d", shards);
  service.liveThreads = shards;
  for (int shard = 0; shard < shards; ++shard)
    service.threads.emplace_back(ServiceThread, AgentSocketsEpoll(shard));
  return true;
}

}  // namespace

void InitSnmpParams() { InstallSessionTransport(OpenAgentSocket, CloseAgentSocket); }

bool InitSnmpGeneralServices() {
  LOG_TRACE("\n\t@@@@@ Inside InitSnmpGeneralServices() @@@@@ \n");
  Service& service = TheService();
  if (!service.threads.empty()) return true;
  // Agent uptimes and the SNMPv3 engine time count from here.
  SetClockBase();
  service.stopEvent = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  service.wildcardEpoll = AgentSocketsEpoll(0);
  if (service.stopEvent < 0 || service.wildcardEpoll < 0) {
    LOG_ERROR("Unable to create Thread");
    StopSnmpGeneralServices();
    return false;
  }
  StartSnmpAgentService(service);
  if (!StartThreads(service)) {
    LOG_ERROR("Unable to create Thread");
    StopSnmpGeneralServices();
    return false;
  }
  return true;
}

void StopSnmpGeneralServices() {
  Service& service = TheService();
  if (service.stopEvent >= 0) {
    std::uint64_t one = 1;
    if (write(service.stopEvent, &one, sizeof one) < 0)
      LOG_ERROR("Unable to wake the service threads");
  }
  for (std::thread& thread : service.threads) thread.join();
  service.threads.clear();
  CloseWildcardSockets();
  if (service.stopEvent >= 0) {
    for (int shard = 0; shard < AgentSocketShards(); ++shard)
      epoll_ctl(AgentSocketsEpoll(shard), EPOLL_CTL_DEL, service.stopEvent, nullptr);
    close(service.stopEvent);
  }
  service.stopEvent = -1;
  service.wildcardEpoll = -1;
}

int LiveServiceThreads() { return TheService().liveThreads.load(); }

ServiceReadCounts ServiceReads() {
  const Service& service = TheService();
  return {service.manySocketWakeups.load(), service.socketBatches.load()};
}

}  // namespace tessel
