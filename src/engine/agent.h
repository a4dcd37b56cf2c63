// The records of one simulated SNMP agent: its transport (addresses, ports, socket), its
// configuration and identity (AgentInfo, shared by every copy of the session) and the session
// that pairs them. A request carries its own copy of the session (with the peer of that
// datagram); the AgentInfo is shared and outlives every copy that refers to it.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "transport/transport_domain.h"

namespace tessel {

class CommunityList {
 public:
  void Append(std::string community) {
    std::lock_guard<std::mutex> lock(mutex_);
    communities_.push_back(std::move(community));
  }
  bool Contains(std::string_view community) const {
    std::lock_guard<std::mutex> lock(mutex_);
    for (const std::string& known : communities_) {
      if (known == community) return true;
    }
    return false;
  }
  std::vector<std::string> Snapshot() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return communities_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> communities_;
};

struct AgentInfo {
  std::string databaseName;
  std::string tableName;
  std::atomic<std::uint8_t> started{0};
  CommunityList readCommunities;
  CommunityList writeCommunities;
  std::int32_t agentId = 0;
  std::atomic<std::uint32_t> engineTime{0};
  std::string agentKey;  // AgentKey of its address and configured port
  std::atomic<std::uint32_t> engineBoots{0};
  std::uint32_t startTime = 0;  // monotonic seconds at registration: the base of its uptime
};

struct AgentSession {
  std::int64_t socket = kNoSocket;
  TransportDomainInfo transport;
  std::shared_ptr<AgentInfo> agentInfo;
};

// The port an agent was configured with.
inline std::uint16_t ConfiguredPort(const TransportDomainInfo& transport) {
  return static_cast<std::uint16_t>(transport.configuredPortMinusOne + 1u);
}

// "address#port", the name of an agent (also its default SNMPv3 engine ID, cut to size there).
inline std::string AgentKey(const std::string& address, std::uint16_t port) {
  return address + "#" + std::to_string(port);
}

// A session copy for one request or for the address table: own transport, shared AgentInfo.
inline AgentSession CopyAgentSession(const AgentSession& session) { return session; }

// Splits a comma-separated community list into count+1 tokens, untrimmed.
std::vector<std::string> SplitCommunities(const std::string& list);

}  // namespace tessel
