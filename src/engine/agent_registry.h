// The registry of simulated SNMP agents and their lifecycle: registration (with or without
// opening the agent's socket), lookup by address and port, start, stop, restart, and release.
// Agents keep their registration order (restartAgent addresses them by position). The address
// table maps an agent's IP address text to a copy of its session (two agents on one address
// share one entry: the later registration wins). All operations are safe from any thread;
// start and stop are expected from one host thread at a time.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "engine/agent.h"

namespace tessel {

struct AgentRegistration {
  std::int32_t agentId = 0;
  std::string address;
  std::uint16_t port = 0;
  std::vector<std::string> readCommunities;
  std::vector<std::string> writeCommunities;
  std::uint32_t engineBoots = 0;
  std::string databaseName;
  std::string tableName;
  std::int32_t ipv6Flag = 0;
};

// Opens the UDP socket of a session; returns the socket, kNoSocket when it cannot be opened (an
// agent socket is never a standard descriptor 0..2, so 0 also tells a failure). The transport
// installs the real opener; without one no socket is opened.
// A failed start, stop or release never leaves an opened socket behind: the closer gets each
// socket an agent gives up.
using SessionOpener = std::function<std::int64_t(AgentSession&)>;
using SessionCloser = std::function<void(std::int64_t socket)>;
void InstallSessionTransport(SessionOpener opener, SessionCloser closer);

inline constexpr std::int64_t kOutOfMemory = -2;

// Registers an agent and opens its socket. Returns the socket; kNoSocket when it could not be
// opened (the agent is then discarded, nothing of other agents changes, and the host is told);
// kOutOfMemory.
std::int64_t FillAgentInfoAndStartAgent(const AgentRegistration& registration);
// Registers an agent without opening its socket; returns its agentId, -1 when memory ran out.
std::int32_t RegisterAgentInfo(const AgentRegistration& registration);
// Opens a registered agent's socket, or, when it runs, keeps it on its socket; either way it
// takes engineBoots. An agent that cannot be opened is dropped (and the host told); its address
// entry goes to the latest other agent registered on that address.
bool StartAgent(const std::string& address, std::int32_t port, std::uint32_t engineBoots);
bool StopAgent(const std::string& address, std::int32_t port);
bool RestartAgent(std::int32_t index);
// Appends communities (split at ',') to the agent on address: mode 1 read, 2 write, 3 both.
void SetCommunitiesValue(const std::string& address, const std::vector<std::string>& read,
                         const std::vector<std::string>& write, std::int32_t mode);

// The address table's copy of the agent on address.
std::optional<AgentSession> LookupAgentByAddress(const std::string& address);
// The first registered agent with this address and configured port.
std::optional<AgentSession> FindAgentSession(const std::string& address, std::int32_t port);
// The first registered agent with this agentId that holds its socket.
std::optional<AgentSession> FindStartedAgentById(std::int32_t agentId);
std::int32_t RegisteredAgentCount();
// Copies of every registered session, in registration order.
std::vector<AgentSession> RegisteredAgents();

// "database:table" of the agent on address when its configured port is port; else nothing.
std::optional<std::string> GetModeInfo(const std::string& address, const std::string& port);
// The agentId of the agent on address (port not compared); -1 when unknown.
std::int32_t GetAgentID(const std::string& address);

// Closes every started agent's socket and empties the registry.
void FreeSimulatorResources();

}  // namespace tessel
