// The engine's wildcard sockets: IPv4 and IPv6 on the SNMP port, which receive for every
// registered agent (the address a datagram was sent to names the agent), and the notification
// socket on the trap port. An agent that binds the SNMP port on its own address takes the port
// from them: they close while it binds, and come back when the bind fails after all. Every
// operation holds one lock, so a descriptor is never read or written after it was closed (by then
// it may belong to an agent's socket). Safe from any thread.
#pragma once

#include <cstddef>
#include <cstdint>

#include "transport/udp.h"

namespace tessel {

// Where the SNMP-port sockets are watched: readable events carry tag | descriptor in data.u64.
struct WildcardWatch {
  int epoll = -1;
  std::uint64_t tag = 0;
};

// Opens the sockets (after closing those of another port); nothing when they serve this port
// already, even if an agent has taken it. The number of sockets that could not be bound: the
// engine carries on without them.
int OpenWildcardSockets(std::uint16_t port, std::uint16_t trapPort, WildcardWatch watch);
// Closes them all and forgets the port.
void CloseWildcardSockets();

// Closes the SNMP-port sockets when they serve this port, so that an agent can bind it; true when
// it did. The caller then binds, and calls RestoreWildcardPort if its bind fails.
bool ReleaseWildcardPort(std::uint16_t port);
// Reopens the SNMP-port sockets that ReleaseWildcardPort closed for this port.
void RestoreWildcardPort(std::uint16_t port);

// Reads one datagram from a wildcard socket, unless it has meanwhile been closed.
bool ReadWildcard(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                  TransportDomainInfo* received);
// Sends to the transport's peer from its localAddress through a wildcard socket that is still
// open; false otherwise.
bool SendViaWildcard(int socket, const TransportDomainInfo& transport, const std::uint8_t* bytes,
                     std::size_t length);

}  // namespace tessel
