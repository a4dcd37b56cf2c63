// The listening sockets of the TCP-based servers and the peers of what they accept.
#pragma once

#include <sys/socket.h>

#include <cstdint>
#include <string>

#include "transport/stream_server.h"

namespace tessel {

// A non-blocking listening socket on address:port (numeric IPv4 or IPv6 text, IPv6 only for an
// IPv6 address; "" any IPv4 address), or -1 with *error set to the errno of the failing step
// (EINVAL for an address that is not numeric). Accepted sockets inherit its send buffer size
// (0: the system's).
int OpenListeningSocket(const std::string& address, std::uint16_t port, int sendBuffer,
                        int* error);

// The numeric address and port of address.
TcpPeer PeerOf(const sockaddr_storage& address);

}  // namespace tessel
