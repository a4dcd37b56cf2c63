// The transport record of one endpoint: its local address and configured port, its socket and
// the peer of the datagram being answered. Plain data; copies are independent.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <cstdint>
#include <string>

namespace tessel {

// A peer's socket address, IPv4 or IPv6 (family in any.sa_family). Smaller than a
// sockaddr_storage by a hundred bytes, which every stored session would carry.
union PeerSocketAddress {
  sockaddr any;
  sockaddr_in v4;
  sockaddr_in6 v6;
};

// The socket of an agent that has none.
inline constexpr std::int64_t kNoSocket = -1;

struct TransportDomainInfo {
  // Agents keep their configured port minus one here (the host's Set calls are given it as kept).
  std::uint16_t configuredPortMinusOne = 0;
  std::uint16_t peerPort = 0;
  std::int64_t socket = kNoSocket;
  std::int32_t isIPv6 = 0;
  std::string localAddress;
  std::string peerAddress;
  std::int32_t ipv6SocketCreated = 0;
  std::int32_t ipv6Bound = 0;
  std::int32_t lastBindError = 0;
  PeerSocketAddress peerSockAddr{};
};

}  // namespace tessel
