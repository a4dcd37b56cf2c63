#include "transport/udp.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/log.h"

namespace tessel {
namespace {

bool FillAddress(const std::string& address, std::uint16_t port, bool ipv6, sockaddr_storage* out,
                 socklen_t* length) {
  std::memset(out, 0, sizeof *out);
  if (ipv6) {
    auto* v6 = reinterpret_cast<sockaddr_in6*>(out);
    v6->sin6_family = AF_INET6;
    v6->sin6_port = htons(port);
    *length = sizeof *v6;
    if (address.empty() || address == "::") {
      v6->sin6_addr = in6addr_any;
      return true;
    }
    return inet_pton(AF_INET6, address.c_str(), &v6->sin6_addr) == 1;
  }
  auto* v4 = reinterpret_cast<sockaddr_in*>(out);
  v4->sin_family = AF_INET;
  v4->sin_port = htons(port);
  *length = sizeof *v4;
  if (address.empty() || address == "0.0.0.0") {
    v4->sin_addr.s_addr = htonl(INADDR_ANY);
    return true;
  }
  return inet_pton(AF_INET, address.c_str(), &v4->sin_addr) == 1;
}

bool SetOption(int socket, int level, int name) {
  int on = 1;
  if (setsockopt(socket, level, name, &on, sizeof on) == 0) return true;
  LOG_TRACE("The error in setsockopt is %d", errno);
  LOG_ERROR("Server Unable to set the Options:");
  return false;
}

bool ConfigureSocket(int socket, bool ipv6, const UdpBindOptions& options) {
  if (ipv6 && !SetOption(socket, IPPROTO_IPV6, IPV6_V6ONLY)) return false;
  // Best effort: a smaller queue only drops more of a burst.
  int queue = kUdpSocketReceiveQueue;
  if (setsockopt(socket, SOL_SOCKET, SO_RCVBUF, &queue, sizeof queue) != 0)
    LOG_TRACE("The receive queue stays at the system's default: errno %d\n", errno);
  if (options.shareWithOwnSockets && !SetOption(socket, SOL_SOCKET, SO_REUSEADDR)) return false;
  if (options.wantDestination) {
    if (!SetOption(socket, ipv6 ? IPPROTO_IPV6 : IPPROTO_IP, ipv6 ? IPV6_RECVPKTINFO : IP_PKTINFO))
      return false;
  }
  return fcntl(socket, F_SETFL, fcntl(socket, F_GETFL) | O_NONBLOCK) == 0;
}

std::string AddressText(const PeerSocketAddress& address, std::uint16_t* port) {
  char text[INET6_ADDRSTRLEN] = {};
  if (address.any.sa_family == AF_INET6) {
    inet_ntop(AF_INET6, &address.v6.sin6_addr, text, sizeof text);
    *port = ntohs(address.v6.sin6_port);
  } else {
    inet_ntop(AF_INET, &address.v4.sin_addr, text, sizeof text);
    *port = ntohs(address.v4.sin_port);
  }
  return text;
}

socklen_t AddressLength(const PeerSocketAddress& address) {
  return SocketAddressLength(address.any.sa_family);
}

// The destination address that IP_PKTINFO / IPV6_PKTINFO reported, if any.
void ReadDestination(msghdr& message, TransportDomainInfo* transport) {
  char text[INET6_ADDRSTRLEN] = {};
  for (cmsghdr* control = CMSG_FIRSTHDR(&message); control;
       control = CMSG_NXTHDR(&message, control)) {
    if (control->cmsg_level == IPPROTO_IP && control->cmsg_type == IP_PKTINFO) {
      in_pktinfo info;
      std::memcpy(&info, CMSG_DATA(control), sizeof info);
      inet_ntop(AF_INET, &info.ipi_addr, text, sizeof text);
      transport->localAddress = text;
    } else if (control->cmsg_level == IPPROTO_IPV6 && control->cmsg_type == IPV6_PKTINFO) {
      in6_pktinfo info;
      std::memcpy(&info, CMSG_DATA(control), sizeof info);
      inet_ntop(AF_INET6, &info.ipi6_addr, text, sizeof text);
      transport->localAddress = text;
    }
  }
}

// Control data that makes a datagram leave from the given local address.
socklen_t SourceControl(const std::string& address, bool ipv6, char* buffer, std::size_t capacity) {
  std::memset(buffer, 0, capacity);
  msghdr message{};
  message.msg_control = buffer;
  message.msg_controllen = capacity;
  cmsghdr* control = CMSG_FIRSTHDR(&message);
  if (ipv6) {
    in6_pktinfo info{};
    if (inet_pton(AF_INET6, address.c_str(), &info.ipi6_addr) != 1) return 0;
    control->cmsg_level = IPPROTO_IPV6;
    control->cmsg_type = IPV6_PKTINFO;
    control->cmsg_len = CMSG_LEN(sizeof info);
    std::memcpy(CMSG_DATA(control), &info, sizeof info);
    return CMSG_SPACE(sizeof info);
  }
  in_pktinfo info{};
  if (inet_pton(AF_INET, address.c_str(), &info.ipi_spec_dst) != 1) return 0;
  control->cmsg_level = IPPROTO_IP;
  control->cmsg_type = IP_PKTINFO;
  control->cmsg_len = CMSG_LEN(sizeof info);
  std::memcpy(CMSG_DATA(control), &info, sizeof info);
  return CMSG_SPACE(sizeof info);
}

// Moves a socket that took a standard descriptor (0..2, free when the process closed one) above
// them: to the engine a socket is never 0, and never one that stdio may write to.
int AboveStandardDescriptors(int socket) {
  if (socket < 0 || socket > STDERR_FILENO) return socket;
  int moved = fcntl(socket, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  int error = errno;
  ::close(socket);
  errno = error;
  return moved;
}

}  // namespace

int OpenUdpSocket(const std::string& address, std::uint16_t port, bool ipv6,
                  const UdpBindOptions& options, int* error) {
  sockaddr_storage local;
  socklen_t localLength = 0;
  if (!FillAddress(address, port, ipv6, &local, &localLength)) {
    *error = EINVAL;
    return -1;
  }
  int socket = AboveStandardDescriptors(
      ::socket(ipv6 ? AF_INET6 : AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, IPPROTO_UDP));
  if (socket < 0) {
    *error = errno;
    LOG_ERROR("Unable to open socket on port number %d ", port);
    return -1;
  }
  LOG_TRACE("The %s sockfd created is %d", ipv6 ? "IPv6" : "IPv4", socket);
  if (!ConfigureSocket(socket, ipv6, options)) {
    *error = errno;
    ::close(socket);
    return -1;
  }
  if (bind(socket, reinterpret_cast<sockaddr*>(&local), localLength) != 0) {
    *error = errno;
    LOG_TRACE("Bind Failed : udp port %d %s Address %s", port, ipv6 ? "IPv6" : "IPv4",
              address.c_str());
    LOG_ERROR("The error in bind is %d for IP address %s", *error, address.c_str());
    ::close(socket);
    return -1;
  }
  *error = 0;
  return socket;
}

void CloseUdpSocket(int socket) {
  if (socket >= 0) ::close(socket);
}

bool ReadUdpPacket(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                   TransportDomainInfo* transport) {
  iovec data{buffer, capacity};
  alignas(cmsghdr) char control[256];
  msghdr message{};
  message.msg_name = &transport->peerSockAddr;
  message.msg_namelen = sizeof transport->peerSockAddr;
  message.msg_iov = &data;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;
  ssize_t received = recvmsg(socket, &message, MSG_DONTWAIT);
  if (received < 0) {
    if (errno != EAGAIN && errno != EWOULDBLOCK)
      LOG_ERROR("Error while receiving a SNMP messge !!!!");
    return false;
  }
  *length = (message.msg_flags & MSG_TRUNC) ? capacity : static_cast<std::size_t>(received);
  transport->peerAddress = AddressText(transport->peerSockAddr, &transport->peerPort);
  ReadDestination(message, transport);
  LOG_TRACE("Received Packet from %s : at %d", transport->peerAddress.c_str(), transport->peerPort);
  if (LogEnabled(kLogTrace)) {
    LOG_TRACE("Number of bytes received : %zu\n", *length);
    LogBytes(buffer, *length);
  }
  return true;
}

void SetPeer(const sockaddr_storage& peer, TransportDomainInfo* transport) {
  std::memcpy(&transport->peerSockAddr, &peer, SocketAddressLength(peer.ss_family));
  transport->peerAddress = AddressText(transport->peerSockAddr, &transport->peerPort);
}

bool SendUdpPacket(const TransportDomainInfo& transport, int socket, const std::uint8_t* bytes,
                   std::size_t length, bool fromLocalAddress) {
  iovec data{const_cast<std::uint8_t*>(bytes), length};
  alignas(cmsghdr) char control[64];
  msghdr message{};
  message.msg_name = const_cast<PeerSocketAddress*>(&transport.peerSockAddr);
  message.msg_namelen = AddressLength(transport.peerSockAddr);
  message.msg_iov = &data;
  message.msg_iovlen = 1;
  if (fromLocalAddress) {
    bool ipv6 = transport.peerSockAddr.any.sa_family == AF_INET6;
    message.msg_controllen = SourceControl(transport.localAddress, ipv6, control, sizeof control);
    if (message.msg_controllen > 0) message.msg_control = control;
  }
  LOG_TRACE("Sending PDU to : %s at %d", transport.peerAddress.c_str(), transport.peerPort);
  for (int attempt = 0; attempt < 3; ++attempt) {
    if (sendmsg(socket, &message, MSG_DONTWAIT) >= 0) return true;
    LOG_ERROR("The error in sending snmp message !!! is %d to IP address %s and port num %d ",
              errno, transport.peerAddress.c_str(), transport.peerPort);
  }
  return false;
}

}  // namespace tessel
