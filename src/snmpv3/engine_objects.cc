#include "snmpv3/engine_objects.h"

#include <algorithm>
#include <optional>
#include <string>
#include <vector>

#include "engine/agent.h"
#include "engine/log.h"
#include "snmp/mib_tree.h"
#include "snmp/pdu.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/v3_message.h"

namespace tessel {
namespace {

constexpr const char* kReadOnly = "43690";

// The value of one scalar of a group, by its sub-identifier; nothing for an unknown one.
using ScalarValue = std::optional<VarValue> (*)(std::uint32_t subId, const AgentSession& agent);

std::optional<VarValue> SnmpEngineValue(std::uint32_t subId, const AgentSession& agent) {
  switch (subId) {
    case 1:
      return VarValue::Octets(kAsnOctetString, AgentEngineId(agent));
    case 2: {
      std::uint32_t boots = agent.agentInfo ? agent.agentInfo->engineBoots.load() : 0;
      return VarValue::Integer(static_cast<std::int32_t>(std::min(boots, 0x7FFFFFFFu)));
    }
    case 3:
      return VarValue::Integer(static_cast<std::int32_t>(AgentEngineTime(agent)));
    case 4:  // a request of kMaxRequestSize octets or more is refused
      return VarValue::Integer(static_cast<std::int32_t>(kMaxRequestSize - 1));
  }
  return std::nullopt;
}

std::optional<VarValue> CounterValue(V3Counter first, std::uint32_t last, std::uint32_t subId) {
  if (subId < 1 || subId > last) return std::nullopt;
  auto counter = static_cast<V3Counter>(static_cast<std::uint32_t>(first) + subId - 1);
  return VarValue::Unsigned(kAsnCounter, V3Count(counter));
}

// Each group's counters are consecutive in V3Counter, in the order of the group's scalars.
constexpr int Position(V3Counter counter) { return static_cast<int>(counter); }
static_assert(Position(V3Counter::kDecryptionErrors) ==
              Position(V3Counter::kUnsupportedSecLevels) + 5);
static_assert(Position(V3Counter::kUnknownPduHandlers) ==
              Position(V3Counter::kUnknownSecurityModels) + 2);

// snmpUnknownSecurityModels, snmpInvalidMsgs, snmpUnknownPDUHandlers.
std::optional<VarValue> MpdStatsValue(std::uint32_t subId, const AgentSession&) {
  return CounterValue(V3Counter::kUnknownSecurityModels, 3, subId);
}

// usmStatsUnsupportedSecLevels to usmStatsDecryptionErrors, in the counters' order.
std::optional<VarValue> UsmStatsValue(std::uint32_t subId, const AgentSession&) {
  return CounterValue(V3Counter::kUnsupportedSecLevels, 6, subId);
}

// A Get names group.subId.0; a GetNext arrives already moved to the instance it answers.
template <ScalarValue valueOf>
std::optional<VarValue> ReadScalar(std::uint8_t, Oid* oid, std::uint8_t* errorCode,
                                   const TesselStruct& target) {
  std::span<const std::uint32_t> base = target.cell->Base();
  bool instance = oid->size() == base.size() + 2 && oid->back() == 0 &&
                  std::equal(base.begin(), base.end(), oid->begin());
  std::optional<VarValue> value;
  if (instance && target.agent != nullptr) value = valueOf((*oid)[base.size()], *target.agent);
  if (!value) *errorCode = kNoSuchInstance;
  return value;
}

struct Group {
  const char* label;
  const char* firstScalar;
  std::vector<std::string> dataTypes;
  ReadHandler read;
};

void Register(const Group& group) {
  TreeCellRegistration cell;
  cell.label = group.label;
  cell.versionText = "V2";
  cell.oidText = group.firstScalar;
  for (std::size_t i = 0; i < group.dataTypes.size(); ++i) {
    cell.subIds.push_back(std::to_string(i + 1));
    cell.access.push_back(kReadOnly);
  }
  cell.dataTypes = group.dataTypes;
  cell.engineRead = group.read;
  if (!CreateAndRegisterCell(cell))
    LOG_ERROR("Unable to register for the module %s\n", group.label);
}

}  // namespace

void RegisterEngineObjects() {
  const std::string counter = "65";
  Register(
      {"snmpEngine", "1.3.6.1.6.3.10.2.1.1", {"4", "2", "2", "2"}, ReadScalar<SnmpEngineValue>});
  Register({"snmpMPDParams", "1.3.6.1.6.3.11.2.1.1", std::vector<std::string>(3, counter),
            ReadScalar<MpdStatsValue>});
  Register({"usmStats", "1.3.6.1.6.3.15.1.1.1", std::vector<std::string>(6, counter),
            ReadScalar<UsmStatsValue>});
}

}  // namespace tessel
