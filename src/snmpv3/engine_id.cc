#include "snmpv3/engine_id.h"

#include <cstdio>
#include <mutex>

#include "base/clock.h"
#include "engine/log.h"

namespace tessel {
namespace {

constexpr const char* kDefaultAgentAddress = "192.168.1.161";
constexpr int kDefaultAgentPort = 8001;

struct Identity {
  std::mutex mutex;
  std::string engineId;
};

Identity& TheIdentity() {
  static Identity identity;
  return identity;
}

std::string ReadEngineIdFile(const std::string& path) {
  std::FILE* file = std::fopen(path.c_str(), "r");
  if (file == nullptr) {
    LOG_TRACE("Unable to Open file for reading\n");
    return {};
  }
  std::string id;
  for (int c = std::fgetc(file); c != EOF; c = std::fgetc(file)) {
    if (c == ' ' || c == '\n') continue;
    if (id.size() == kMaxEngineIdLength) {
      LOG_ERROR("Exceeding MAX_ENGINE_ID_LEN. Truncating the engineid.\n");
      break;
    }
    id.push_back(static_cast<char>(c));
  }
  std::fclose(file);
  return id.size() >= 5 ? id : std::string();
}

std::string GenerateEngineId() {
  return std::string(kDefaultAgentAddress) + "#" + std::to_string(kDefaultAgentPort);
}

}  // namespace

bool ReadFromSnmpV3ConfFile(const std::string& baseDirectory) {
  Identity& identity = TheIdentity();
  std::lock_guard<std::mutex> lock(identity.mutex);
  if (!identity.engineId.empty()) return true;
  identity.engineId = ReadEngineIdFile(baseDirectory + "conf/snmp/snmpv3.txt");
  if (identity.engineId.empty()) identity.engineId = GenerateEngineId();
  return true;
}

std::string EngineId() {
  Identity& identity = TheIdentity();
  std::lock_guard<std::mutex> lock(identity.mutex);
  return identity.engineId;
}

void ClearEngineId() {
  Identity& identity = TheIdentity();
  std::lock_guard<std::mutex> lock(identity.mutex);
  identity.engineId.clear();
}

std::string AgentEngineId(const AgentSession& agent) {
  std::string id = AgentKey(agent.transport.localAddress, ConfiguredPort(agent.transport));
  if (id.size() > kMaxEngineIdLength) id.erase(0, id.size() - kMaxEngineIdLength);
  return id;
}

std::uint32_t AgentEngineTime(const AgentSession& agent) {
  std::uint32_t start = agent.agentInfo ? agent.agentInfo->startTime : 0;
  std::uint32_t seconds = UptimeSince(start, false);
  return seconds > 0x7FFFFFFFu ? seconds - 0x7FFFFFFFu : seconds;
}

}  // namespace tessel
