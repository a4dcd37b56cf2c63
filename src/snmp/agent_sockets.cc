#include "snmp/agent_sockets.h"

#include <sched.h>
#include <sys/epoll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <mutex>
#include <new>
#include <shared_mutex>
#include <vector>

#include "base/log.h"
#include "transport/udp.h"
#include "transport/wildcard_sockets.h"

namespace tessel {
namespace {

struct AgentSockets {
  std::shared_mutex mutex;  // shared: finding a socket; exclusive: opening or closing one
  std::array<int, kMaxAgentShards> epolls;
  // Indexed by descriptor: descriptors are small and dense, and the lookup is on every request.
  std::vector<std::shared_ptr<const AgentSocket>> sockets;
  std::uint32_t nextShard = 0;
  AgentSockets() { epolls.fill(-1); }
};

AgentSockets& Sockets() {
  static AgentSockets sockets;
  return sockets;
}

int EpollLocked(AgentSockets& sockets, int shard) {
  int& epoll = sockets.epolls[static_cast<std::size_t>(shard)];
  if (epoll < 0) epoll = epoll_create1(EPOLL_CLOEXEC);
  return epoll;
}

int CpusAvailable() {
  cpu_set_t cpus;
  if (sched_getaffinity(0, sizeof cpus, &cpus) != 0) return 1;
  return CPU_COUNT(&cpus);
}

int BindAgent(const AgentSession& session, std::uint16_t port, int* error) {
  const TransportDomainInfo& transport = session.transport;
  return OpenUdpSocket(transport.localAddress, port, transport.isIPv6 != 0, UdpBindOptions{},
                       error);
}

// Binds the agent's port; when the engine's wildcard sockets hold it, they give way, and come
// back if the port is taken by someone else as well.
int BindTakingWildcardPort(const AgentSession& session, std::uint16_t port) {
  int error = 0;
  int socket = BindAgent(session, port, &error);
  if (socket >= 0 || error != EADDRINUSE || !ReleaseWildcardPort(port)) return socket;
  socket = BindAgent(session, port, &error);
  if (socket >= 0) {
    LOG_ERROR("The wildcard sockets of port %d give way to an agent", port);
  } else {
    RestoreWildcardPort(port);
  }
  return socket;
}

}  // namespace

AgentSocket::AgentSocket(int descriptor, int shard, AgentSession session)
    : descriptor_(descriptor), shard_(shard), session_(std::move(session)) {}

AgentSocket::~AgentSocket() { CloseUdpSocket(descriptor_); }

int AgentSocketShards() {
  static const int shards = std::clamp(CpusAvailable(), 1, kMaxAgentShards);
  return shards;
}

std::int64_t OpenAgentSocket(AgentSession& session) {
  // Agents keep their configured port minus one; each binds its own configured port.
  auto port = static_cast<std::uint16_t>(session.transport.configuredPortMinusOne + 1u);
  int socket = BindTakingWildcardPort(session, port);
  if (socket < 0) return kNoSocket;
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  int shard =
      static_cast<int>(sockets.nextShard++ % static_cast<std::uint32_t>(AgentSocketShards()));
  std::shared_ptr<const AgentSocket> agent;
  try {
    AgentSession copy = session;
    copy.socket = socket;
    copy.transport.socket = socket;
    agent = std::make_shared<const AgentSocket>(socket, shard, std::move(copy));
  } catch (const std::bad_alloc&) {
    CloseUdpSocket(socket);
    throw;
  }
  // From here on the record owns the descriptor: any way out without keeping it closes it.
  auto index = static_cast<std::size_t>(socket);
  if (index >= sockets.sockets.size()) sockets.sockets.resize(index + 1);
  int epoll = EpollLocked(sockets, shard);
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.u64 = static_cast<std::uint64_t>(socket);
  if (epoll < 0 || epoll_ctl(epoll, EPOLL_CTL_ADD, socket, &event) != 0) {
    LOG_ERROR("Unable to watch the socket of %s", session.transport.localAddress.c_str());
    return kNoSocket;
  }
  sockets.sockets[index] = std::move(agent);
  return socket;
}

void CloseAgentSocket(std::int64_t socket) {
  std::shared_ptr<const AgentSocket> closing;
  AgentSockets& sockets = Sockets();
  {
    std::unique_lock<std::shared_mutex> lock(sockets.mutex);
    if (socket < 0 || static_cast<std::size_t>(socket) >= sockets.sockets.size()) return;
    closing = std::move(sockets.sockets[static_cast<std::size_t>(socket)]);
    if (!closing) return;
    // Closing the descriptor takes it out of its epoll; while a service thread still answers
    // it, it must leave the epoll now. (No new holder can appear once it left the table.)
    int epoll = sockets.epolls[static_cast<std::size_t>(closing->Shard())];
    if (closing.use_count() > 1 && epoll >= 0)
      epoll_ctl(epoll, EPOLL_CTL_DEL, closing->Descriptor(), nullptr);
  }
  // The descriptor closes here, or when the service thread answering it lets go.
}

int AgentSocketsEpoll(int shard) {
  if (shard < 0 || shard >= AgentSocketShards()) return -1;
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  return EpollLocked(sockets, shard);
}

std::shared_ptr<const AgentSocket> FindAgentSocket(int socket) {
  AgentSockets& sockets = Sockets();
  std::shared_lock<std::shared_mutex> lock(sockets.mutex);
  if (socket < 0 || static_cast<std::size_t>(socket) >= sockets.sockets.size()) return nullptr;
  return sockets.sockets[static_cast<std::size_t>(socket)];
}

}  // namespace tessel
