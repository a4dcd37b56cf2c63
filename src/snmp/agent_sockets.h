// The UDP sockets of started agents, each mapped to its agent's session and watched by one of a
// fixed number of epoll instances (shards), one per service thread. Opening binds the agent's
// own address and configured port, exclusively: a port that another socket already serves on
// that address is refused (the only sharing allowed is with the engine's own wildcard sockets,
// which give way to an agent, and come back when its bind fails). Safe from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "engine/agent.h"

namespace tessel {

// An open agent socket and the session it serves. The descriptor closes when the last holder
// lets go, so a thread still answering a batch never writes to a descriptor that meanwhile went
// to another agent.
class AgentSocket {
 public:
  AgentSocket(int descriptor, int shard, AgentSession session);
  ~AgentSocket();
  AgentSocket(const AgentSocket&) = delete;
  AgentSocket& operator=(const AgentSocket&) = delete;

  int Descriptor() const { return descriptor_; }
  int Shard() const { return shard_; }
  const AgentSession& Session() const { return session_; }

 private:
  int descriptor_;
  int shard_;
  AgentSession session_;
};

// Opens and registers the session's socket; the socket handle, or kNoSocket when it cannot be
// bound or watched.
std::int64_t OpenAgentSocket(AgentSession& session);
void CloseAgentSocket(std::int64_t socket);

// How many shards there are: one per CPU the process may run on when first asked, at most
// kMaxAgentShards. Fixed for the life of the process.
inline constexpr int kMaxAgentShards = 8;
int AgentSocketShards();
// The epoll instance of a shard, or -1. Its events carry the agent socket in data.u64.
int AgentSocketsEpoll(int shard);

// The open agent socket with that descriptor, or null.
std::shared_ptr<const AgentSocket> FindAgentSocket(int socket);

}  // namespace tessel
