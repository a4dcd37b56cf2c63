#include "engine/agent_registry.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <unordered_map>
#include <utility>

#include "base/clock.h"
#include "base/conversions.h"
#include "engine/engine_state.h"
#include "engine/log.h"
#include "notify/standard_traps.h"
#include "notify/trap_pdu.h"

namespace tessel {
namespace {

// One mutex guards the ordered session list and the address table. The transport's opener and
// closer run under it, so they must not call back into the registry.
// Two indexes into the list keep lookups by endpoint and by agentId constant in the number of
// agents (a notification looks its device up twice); each holds the sessions of one key in
// registration order.
struct Registry {
  std::mutex mutex;
  std::vector<std::unique_ptr<AgentSession>> sessions;  // registration order
  std::unordered_map<std::string, AgentSession> addressTable;
  std::unordered_map<std::string, std::vector<AgentSession*>> byEndpoint;
  std::unordered_map<std::int32_t, std::vector<AgentSession*>> byAgentId;
  SessionOpener opener;
  SessionCloser closer;
};

Registry& TheRegistry() {
  static Registry registry;
  return registry;
}

std::uint16_t StoredPort(std::int32_t configuredPort) {
  return static_cast<std::uint16_t>(static_cast<std::uint32_t>(configuredPort) - 1u);
}

// The notification socket must never share the port of an agent.
void ApplyTrapPortRule(std::uint16_t port) {
  std::uint16_t trapPort = gv_trapPort.load();
  if (trapPort == port || trapPort == 0) gv_trapPort = static_cast<std::uint16_t>(port + 1u);
}

// An agent socket never sits on a standard descriptor, so an opener's 0 is a failure too.
std::int64_t OpenSessionLocked(Registry& registry, AgentSession& session) {
  std::int64_t socket = registry.opener ? registry.opener(session) : kNoSocket;
  return socket > STDERR_FILENO ? socket : kNoSocket;
}

void CloseSocketLocked(Registry& registry, std::int64_t socket) {
  if (socket != kNoSocket && registry.closer) registry.closer(socket);
}

// The session now holds socket (kNoSocket: none) and is started exactly when it holds one.
void HoldSocket(AgentSession& session, std::int64_t socket) {
  session.socket = socket;
  session.transport.socket = socket;
  session.agentInfo->started = socket != kNoSocket ? 1 : 0;
}

std::string EndpointKey(const std::string& address, std::uint16_t storedPort) {
  return address + '/' + std::to_string(storedPort);
}

std::string EndpointKey(const AgentSession& session) {
  return EndpointKey(session.transport.localAddress, session.transport.configuredPortMinusOne);
}

// Makes room for one more session in the list and its indexes: the one step of keeping a
// session that can throw (an index may be left with an empty entry).
void ReserveSessionLocked(Registry& registry, const AgentSession& session) {
  registry.sessions.reserve(registry.sessions.size() + 1);
  std::vector<AgentSession*>& endpoint = registry.byEndpoint[EndpointKey(session)];
  endpoint.reserve(endpoint.size() + 1);
  std::vector<AgentSession*>& agentId = registry.byAgentId[session.agentInfo->agentId];
  agentId.reserve(agentId.size() + 1);
}

// Appends a session to the list and its indexes; cannot throw after ReserveSessionLocked.
void KeepSessionLocked(Registry& registry, std::unique_ptr<AgentSession> session) {
  registry.byEndpoint.find(EndpointKey(*session))->second.push_back(session.get());
  registry.byAgentId.find(session->agentInfo->agentId)->second.push_back(session.get());
  registry.sessions.push_back(std::move(session));
}

template <typename Index, typename Key>
void Unindex(Index& index, const Key& key, const AgentSession* session) {
  auto entry = index.find(key);
  if (entry == index.end()) return;
  std::erase(entry->second, session);
  if (entry->second.empty()) index.erase(entry);
}

// Removes a session from the list and its indexes.
void EraseSessionLocked(Registry& registry, const AgentSession* session) {
  Unindex(registry.byEndpoint, EndpointKey(*session), session);
  Unindex(registry.byAgentId, session->agentInfo->agentId, session);
  std::erase_if(registry.sessions, [session](const std::unique_ptr<AgentSession>& kept) {
    return kept.get() == session;
  });
}

// Drops the address entry of a session that leaves the registry, if the entry is its own: the
// latest remaining registration on that address takes it over, else it goes.
void ForgetAddressLocked(Registry& registry, const AgentSession& leaving) {
  const std::string& address = leaving.transport.localAddress;
  auto entry = registry.addressTable.find(address);
  if (entry == registry.addressTable.end() || entry->second.agentInfo != leaving.agentInfo) return;
  for (auto it = registry.sessions.rbegin(); it != registry.sessions.rend(); ++it) {
    if (it->get() != &leaving && (*it)->transport.localAddress == address) {
      entry->second = CopyAgentSession(**it);
      return;
    }
  }
  registry.addressTable.erase(entry);
}

// The first registered agent with this address and configured port; nullptr when none.
AgentSession* FindSessionLocked(Registry& registry, const std::string& address, std::int32_t port) {
  auto entry = registry.byEndpoint.find(EndpointKey(address, StoredPort(port)));
  return entry == registry.byEndpoint.end() || entry->second.empty() ? nullptr
                                                                     : entry->second.front();
}

// The records shared by both ways of registering an agent; communities are left to the caller.
std::unique_ptr<AgentSession> NewSession(const AgentRegistration& registration) {
  auto session = std::make_unique<AgentSession>();
  session->transport.isIPv6 = registration.ipv6Flag;
  session->transport.localAddress = registration.address;
  ApplyTrapPortRule(registration.port);
  session->transport.configuredPortMinusOne = StoredPort(registration.port);
  gv_snmpPort = registration.port;
  auto info = std::make_shared<AgentInfo>();
  info->databaseName = registration.databaseName;
  info->tableName = registration.tableName;
  info->agentId = registration.agentId;
  info->startTime = GetCurrentSeconds();
  info->agentKey = AgentKey(registration.address, registration.port);
  session->agentInfo = std::move(info);
  return session;
}

void AppendSplit(CommunityList& list, const std::vector<std::string>& lists) {
  for (const std::string& text : lists) {
    for (std::string& token : SplitCommunities(text)) list.Append(std::move(token));
  }
}

void AppendEach(CommunityList& list, const std::vector<std::string>& communities) {
  for (const std::string& community : communities) list.Append(community);
}

std::string StartedText(std::uint16_t port, const std::string& address) {
  char line[512];
  std::snprintf(line, sizeof line, "Snmp Agent Started at port : %d and at IPAddress : %s", port,
                address.c_str());
  return line;
}

std::string NotStartedText(std::int32_t port, const std::string& address) {
  char line[512];
  std::snprintf(line, sizeof line, "Unable to start SNMP Agent at Port : %d and at IpAddress : %s ",
                port, address.c_str());
  return line;
}

// Opens the session's socket and, when it opened, keeps and publishes the session; returns the
// socket (kNoSocket: not opened, and nothing changed).
std::int64_t OpenAndKeepLocked(Registry& registry, std::unique_ptr<AgentSession> session) {
  std::int64_t socket = OpenSessionLocked(registry, *session);
  if (socket == kNoSocket) return kNoSocket;
  HoldSocket(*session, socket);
  try {
    ReserveSessionLocked(registry, *session);
    registry.addressTable.insert_or_assign(session->transport.localAddress,
                                           CopyAgentSession(*session));
  } catch (const std::bad_alloc&) {
    CloseSocketLocked(registry, socket);  // the agent is not kept: neither is its socket
    throw;
  }
  KeepSessionLocked(registry, std::move(session));
  return socket;
}

}  // namespace

std::vector<std::string> SplitCommunities(const std::string& list) {
  std::vector<std::string> tokens;
  std::size_t begin = 0;
  for (;;) {
    std::size_t comma = list.find(',', begin);
    tokens.push_back(
        list.substr(begin, comma == std::string::npos ? std::string::npos : comma - begin));
    if (comma == std::string::npos) return tokens;
    begin = comma + 1;
  }
}

void InstallSessionTransport(SessionOpener opener, SessionCloser closer) {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  registry.opener = std::move(opener);
  registry.closer = std::move(closer);
}

std::int64_t FillAgentInfoAndStartAgent(const AgentRegistration& registration) {
  LOG_TRACE("\n\t@@@@@ Inside FillAgentInfoAndStartAgent() @@@@@ \n");
  std::int64_t socket = kNoSocket;
  std::optional<AgentSession> started;
  try {
    std::unique_ptr<AgentSession> session = NewSession(registration);
    AgentInfo& info = *session->agentInfo;
    AppendSplit(info.readCommunities, registration.readCommunities);
    AppendSplit(info.writeCommunities, registration.writeCommunities);
    info.engineBoots = registration.engineBoots;
    Registry& registry = TheRegistry();
    std::lock_guard<std::mutex> lock(registry.mutex);
    socket = OpenAndKeepLocked(registry, std::move(session));
    if (socket != kNoSocket) started = CopyAgentSession(*registry.sessions.back());
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Memory allocation failure ...\n");
    return kOutOfMemory;
  }
  if (started) RaiseStandardTrap(*started, kColdStart);
  PrintStatus(socket != kNoSocket ? StartedText(registration.port, registration.address)
                                  : NotStartedText(registration.port, registration.address));
  return socket;
}

std::int32_t RegisterAgentInfo(const AgentRegistration& registration) {
  LOG_TRACE("### Inside nativePassOneAgentInfo \n");
  try {
    std::unique_ptr<AgentSession> session = NewSession(registration);
    AppendEach(session->agentInfo->readCommunities, registration.readCommunities);
    AppendEach(session->agentInfo->writeCommunities, registration.writeCommunities);
    Registry& registry = TheRegistry();
    std::lock_guard<std::mutex> lock(registry.mutex);
    ReserveSessionLocked(registry, *session);
    registry.addressTable.insert_or_assign(registration.address, CopyAgentSession(*session));
    KeepSessionLocked(registry, std::move(session));
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Memory allocation failure ...\n");
    return -1;
  }
  return registration.agentId;
}

namespace {

// The agent a start or stop names; applies the trap-port rule on the way, as every start and
// stop does. registry.sessions.end() when there is none.
AgentSession* FindForStartOrStop(Registry& registry, const std::string& address,
                                 std::int32_t port) {
  if (registry.sessions.empty()) return nullptr;
  ApplyTrapPortRule(static_cast<std::uint16_t>(port));
  return FindSessionLocked(registry, address, port);
}

}  // namespace

bool StartAgent(const std::string& address, std::int32_t port, std::uint32_t engineBoots) {
  LOG_TRACE("\n\t@@@@@ Inside StartAgent() @@@@@ \n");
  Registry& registry = TheRegistry();
  {
    std::unique_lock<std::mutex> lock(registry.mutex);
    AgentSession* found = FindForStartOrStop(registry, address, port);
    if (found == nullptr) {
      LOG_TRACE("The td Info cannot be obtained for %s\n", address.c_str());
      return false;
    }
    AgentSession& session = *found;
    // A running agent stays on its socket: a second bind of its port could only fail.
    bool wasRunning = session.agentInfo->started.load() != 0;
    if (!wasRunning) HoldSocket(session, OpenSessionLocked(registry, session));
    if (session.agentInfo->started.load()) {
      session.agentInfo->engineBoots = engineBoots;
      LOG_TRACE("The engine boot count value @ start is : %ld\n", static_cast<long>(engineBoots));
      AgentSession started = CopyAgentSession(session);
      lock.unlock();
      if (!wasRunning) RaiseStandardTrap(started, kColdStart);
      return true;
    }
    ForgetAddressLocked(registry, session);
    EraseSessionLocked(registry, found);
  }
  PrintStatus(NotStartedText(port, address));
  return false;
}

bool StopAgent(const std::string& address, std::int32_t port) {
  LOG_TRACE("\n\t@@@@@ Inside StopAgent() @@@@@ \n");
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  AgentSession* found = FindForStartOrStop(registry, address, port);
  if (found == nullptr) {
    LOG_ERROR("The tdInfo cannot be obtained for %s while stop agent\n", address.c_str());
    return false;
  }
  if (found->agentInfo->started.load()) {
    CloseSocketLocked(registry, found->socket);
    HoldSocket(*found, kNoSocket);
    EraseSessionLocked(registry, found);
  }
  registry.addressTable.erase(address);
  return true;
}

bool RestartAgent(std::int32_t index) {
  LOG_TRACE("\n\t@@@@@ Inside RestartAgent() @@@@@ \n");
  Registry& registry = TheRegistry();
  std::unique_lock<std::mutex> lock(registry.mutex);
  if (index < 0 || static_cast<std::size_t>(index) >= registry.sessions.size()) return false;
  AgentSession& session = *registry.sessions[static_cast<std::size_t>(index)];
  if (session.agentInfo->started.load()) return true;
  HoldSocket(session, OpenSessionLocked(registry, session));
  if (!session.agentInfo->started.load()) return true;
  AgentSession started = CopyAgentSession(session);
  lock.unlock();
  RaiseStandardTrap(started, kColdStart);
  return true;
}

void SetCommunitiesValue(const std::string& address, const std::vector<std::string>& read,
                         const std::vector<std::string>& write, std::int32_t mode) {
  LOG_TRACE("\n\t@@@@@ Inside setCommunitiesValue() @@@@@ \n");
  std::shared_ptr<AgentInfo> info;
  {
    Registry& registry = TheRegistry();
    std::lock_guard<std::mutex> lock(registry.mutex);
    auto found = registry.addressTable.find(address);
    if (found == registry.addressTable.end()) return;
    info = found->second.agentInfo;
  }
  try {
    if (mode == 1 || mode == 3) AppendSplit(info->readCommunities, read);
    if (mode == 2 || mode == 3) AppendSplit(info->writeCommunities, write);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to assign the readCommunity ...\n");
  }
}

std::optional<AgentSession> LookupAgentByAddress(const std::string& address) {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  auto found = registry.addressTable.find(address);
  if (found == registry.addressTable.end()) return std::nullopt;
  return CopyAgentSession(found->second);
}

std::optional<AgentSession> FindAgentSession(const std::string& address, std::int32_t port) {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  AgentSession* found = FindSessionLocked(registry, address, port);
  if (found == nullptr) return std::nullopt;
  return CopyAgentSession(*found);
}

std::optional<AgentSession> FindStartedAgentById(std::int32_t agentId) {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  auto entry = registry.byAgentId.find(agentId);
  if (entry == registry.byAgentId.end()) return std::nullopt;
  for (const AgentSession* session : entry->second) {
    if (session->socket != kNoSocket) return CopyAgentSession(*session);
  }
  return std::nullopt;
}

std::int32_t RegisteredAgentCount() {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  return static_cast<std::int32_t>(registry.sessions.size());
}

std::vector<AgentSession> RegisteredAgents() {
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  std::vector<AgentSession> copies;
  copies.reserve(registry.sessions.size());
  for (const auto& session : registry.sessions) copies.push_back(CopyAgentSession(*session));
  return copies;
}

std::optional<std::string> GetModeInfo(const std::string& address, const std::string& port) {
  std::optional<AgentSession> session = LookupAgentByAddress(address);
  if (!session || session->transport.localAddress != address ||
      session->transport.configuredPortMinusOne != StoredPort(TextToInt(port))) {
    return std::nullopt;
  }
  return session->agentInfo->databaseName + ":" + session->agentInfo->tableName;
}

std::int32_t GetAgentID(const std::string& address) {
  std::optional<AgentSession> session = LookupAgentByAddress(address);
  return session ? session->agentInfo->agentId : -1;
}

void FreeSimulatorResources() {
  LOG_TRACE("\n\t@@@@@ Inside FreeSimulatorResources() @@@@@ \n");
  Registry& registry = TheRegistry();
  std::lock_guard<std::mutex> lock(registry.mutex);
  for (const auto& session : registry.sessions) {
    if (session->agentInfo->started.load()) {
      CloseSocketLocked(registry, session->socket);
      HoldSocket(*session, kNoSocket);
    }
  }
  registry.sessions.clear();
  registry.byEndpoint.clear();
  registry.byAgentId.clear();
  registry.addressTable.clear();
}

}  // namespace tessel
