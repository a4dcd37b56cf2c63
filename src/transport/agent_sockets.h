// The UDP sockets of started agents, all watched by one epoll instance, each mapped to a copy of
// its agent's session. Opening binds the agent's own address and configured port, exclusively:
// a port that another socket already serves on that address is refused (the only sharing
// allowed is with the engine's own wildcard sockets, which give way to an agent). Safe from any
// thread; a socket is never read while it is being closed.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>

#include "engine/agent.h"

namespace tessel {

// Opens and registers the session's socket; the socket handle, or 0 when it cannot be bound.
std::int64_t OpenAgentSocket(AgentSession& session);
void CloseAgentSocket(std::int64_t socket);

// The epoll instance that reports readable agent sockets (data.fd is the socket).
int AgentSocketsEpoll();

// Reads one datagram from a ready agent socket. *session becomes a copy of the agent's session
// carrying this datagram's peer. False when the socket is not an agent's or nothing was read.
bool ReadAgentDatagram(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                       AgentSession* session);

// Called when an agent's bind finds the port taken: releases the engine's own wildcard sockets
// on that port, if any; true when it did (the bind is then tried again).
void SetPortReleaser(std::function<bool(std::uint16_t port)> releaser);

}  // namespace tessel
