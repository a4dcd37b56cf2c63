// UDP sockets of the agents and the engine: opening and binding (IPv4 and IPv6, the latter
// IPv6-only), reading one datagram with its peer and the address it was sent to, and sending a
// reply from a chosen local address. Sockets are non-blocking. Stateless; safe from any thread.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "transport/transport_domain.h"

namespace tessel {

inline constexpr std::size_t kUdpReceiveBuffer = 20000;
// The kernel receive queue every socket asks for (the system's net.core.rmem_max may cap it):
// room for a manager's burst, or for the Responses to a thousand informs a device has out.
inline constexpr int kUdpSocketReceiveQueue = 1 << 20;

struct UdpBindOptions {
  bool shareWithOwnSockets = false;  // SO_REUSEADDR: the engine's own wildcard sockets only
  bool wantDestination = false;      // IP_PKTINFO / IPV6_RECVPKTINFO
};

// A socket bound to address:port (never on descriptors 0..2), or -1 with *error set to the errno
// of the failing step.
int OpenUdpSocket(const std::string& address, std::uint16_t port, bool ipv6,
                  const UdpBindOptions& options, int* error);
void CloseUdpSocket(int socket);

// Reads one datagram into buffer. Fills the transport's peer (address text, port, socket
// address) and, when the socket reports it, its localAddress with the datagram's destination.
// A datagram longer than the buffer is reported with *length = capacity. False when nothing
// could be read.
bool ReadUdpPacket(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                   TransportDomainInfo* transport);

// The length of a socket address of this family (IPv6, else IPv4).
inline socklen_t SocketAddressLength(sa_family_t family) {
  return family == AF_INET6 ? sizeof(sockaddr_in6) : sizeof(sockaddr_in);
}

// Makes peer the transport's peer: its socket address, address text and port.
void SetPeer(const sockaddr_storage& peer, TransportDomainInfo* transport);

// Sends to the transport's peer. With fromLocalAddress the datagram leaves from the transport's
// localAddress even on a wildcard socket. Tries three times.
bool SendUdpPacket(const TransportDomainInfo& transport, int socket, const std::uint8_t* bytes,
                   std::size_t length, bool fromLocalAddress);

}  // namespace tessel
