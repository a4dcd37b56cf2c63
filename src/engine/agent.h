// The records of one simulated SNMP agent: its transport (addresses, ports, socket), its
// configuration and identity (AgentInfo, shared by every copy of the session) and the session
// that pairs them. A request carries its own copy of the session (with the peer of that
// datagram); the AgentInfo is shared and outlives every copy that refers to it.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace tessel {

// A peer's socket address, IPv4 or IPv6 (family in any.sa_family). Smaller than a
// sockaddr_storage by a hundred bytes, which every stored session would carry.
union PeerSocketAddress {
  sockaddr any;
  sockaddr_in v4;
  sockaddr_in6 v6;
};

struct TransportDomainInfo {
  std::uint16_t localPort = 0;  // agents: the configured port minus one
  std::uint16_t peerPort = 0;
  std::int64_t socket = 0;
  std::int32_t isIPv6 = 0;
  std::string localAddress;
  std::string peerAddress;
  std::int32_t ipv6SocketCreated = 0;
  std::int32_t ipv6Bound = 0;
  std::int32_t lastBindError = 0;
  PeerSocketAddress peerSockAddr{};
};

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
  std::string agentKey;  // "address#port", at most 47 characters
  std::atomic<std::uint32_t> engineBoots{0};
  std::uint32_t startTime = 0;  // wall-clock seconds at registration: the base of its uptime
};

struct AgentSession {
  std::int64_t socket = 0;
  TransportDomainInfo transport;
  std::shared_ptr<AgentInfo> agentInfo;
};

// A session copy for one request or for the address table: own transport, shared AgentInfo.
inline AgentSession CopyAgentSession(const AgentSession& session) { return session; }

// Splits a comma-separated community list into count+1 tokens, untrimmed.
std::vector<std::string> SplitCommunities(const std::string& list);

}  // namespace tessel
