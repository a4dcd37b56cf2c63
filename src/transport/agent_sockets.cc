#include "transport/agent_sockets.h"

#include <sys/epoll.h>
#include <unistd.h>

#include <cerrno>
#include <mutex>
#include <shared_mutex>
#include <unordered_map>

#include "engine/log.h"
#include "transport/udp.h"

namespace tessel {
namespace {

struct AgentSockets {
  std::shared_mutex mutex;  // shared: reading a socket; exclusive: opening or closing one
  int epoll = -1;
  std::unordered_map<int, AgentSession> sessions;
  std::function<bool(std::uint16_t)> releaser;
};

AgentSockets& Sockets() {
  static AgentSockets sockets;
  return sockets;
}

int EpollLocked(AgentSockets& sockets) {
  if (sockets.epoll < 0) sockets.epoll = epoll_create1(EPOLL_CLOEXEC);
  return sockets.epoll;
}

int BindAgent(const AgentSession& session, std::uint16_t port, int* error) {
  const TransportDomainInfo& transport = session.transport;
  return OpenUdpSocket(transport.localAddress, port, transport.isIPv6 != 0, UdpBindOptions{},
                       error);
}

}  // namespace

std::int64_t OpenAgentSocket(AgentSession& session) {
  // Agents keep their configured port minus one; each binds its own configured port.
  auto port = static_cast<std::uint16_t>(session.transport.localPort + 1u);
  int error = 0;
  int socket = BindAgent(session, port, &error);
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  if (socket < 0 && error == EADDRINUSE && sockets.releaser) {
    lock.unlock();
    if (sockets.releaser(port)) socket = BindAgent(session, port, &error);
    lock.lock();
  }
  if (socket < 0) return 0;
  int epoll = EpollLocked(sockets);
  epoll_event event{};
  event.events = EPOLLIN;
  event.data.fd = socket;
  if (epoll < 0 || epoll_ctl(epoll, EPOLL_CTL_ADD, socket, &event) != 0) {
    LOG_ERROR("Unable to watch the socket of %s", session.transport.localAddress.c_str());
    CloseUdpSocket(socket);
    return 0;
  }
  AgentSession copy = session;
  copy.socket = socket;
  copy.transport.socket = socket;
  sockets.sessions[socket] = std::move(copy);
  return socket;
}

void CloseAgentSocket(std::int64_t socket) {
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  auto found = sockets.sessions.find(static_cast<int>(socket));
  if (found == sockets.sessions.end()) return;
  if (sockets.epoll >= 0) epoll_ctl(sockets.epoll, EPOLL_CTL_DEL, found->first, nullptr);
  CloseUdpSocket(found->first);
  sockets.sessions.erase(found);
}

int AgentSocketsEpoll() {
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  return EpollLocked(sockets);
}

bool ReadAgentDatagram(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                       AgentSession* session) {
  AgentSockets& sockets = Sockets();
  std::shared_lock<std::shared_mutex> lock(sockets.mutex);
  auto found = sockets.sessions.find(socket);
  if (found == sockets.sessions.end()) return false;
  TransportDomainInfo peer;
  if (!ReadUdpPacket(socket, buffer, capacity, length, &peer)) return false;
  *session = found->second;
  session->transport.peerAddress = std::move(peer.peerAddress);
  session->transport.peerPort = peer.peerPort;
  session->transport.peerSockAddr = peer.peerSockAddr;
  return true;
}

void SetPortReleaser(std::function<bool(std::uint16_t port)> releaser) {
  AgentSockets& sockets = Sockets();
  std::unique_lock<std::shared_mutex> lock(sockets.mutex);
  sockets.releaser = std::move(releaser);
}

}  // namespace tessel
