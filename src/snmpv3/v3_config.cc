#include "snmpv3/v3_config.h"

#include <string>
#include <vector>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "snmp/mib_tree.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/v3_message.h"
#include "snmpv3/vacm.h"

namespace tessel {
namespace {

constexpr const char* kReadOnly = "43690";

// Registers one read-only scalar group: its first scalar's OID, sub-identifiers 1..n.
void RegisterScalarGroup(const char* label, const char* firstScalar,
                         const std::vector<std::string>& dataTypes) {
  TreeCellRegistration group;
  group.label = label;
  group.versionText = "V2";
  group.oidText = firstScalar;
  for (std::size_t i = 0; i < dataTypes.size(); ++i) {
    group.subIds.push_back(std::to_string(i + 1));
    group.access.push_back(kReadOnly);
  }
  group.dataTypes = dataTypes;
  if (!CreateAndRegisterCell(group)) LOG_ERROR("Unable to register for the module %s\n", label);
}

}  // namespace

int AddUsmUserFromHost(std::string_view userName, std::string_view authProtocol,
                       std::string_view authPassword, std::string_view privProtocol,
                       std::string_view privPassword, std::int32_t discoveryTimeFlag) {
  if (!ReadFromSnmpV3ConfFile()) return 99;
  gv_snmpv3Configured = true;
  gv_discoveryTimeFlag = discoveryTimeFlag != 0;
  return AddUSMUserEntry(userName, authProtocol, authPassword, privProtocol, privPassword,
                         EngineId());
}

void InitSnmpV3Params() {
  ReadFromSnmpV3ConfFile();
  InitVacmTables();
  ResetV3Statistics();
  RegisterScalarGroup("snmpEngine", "1.3.6.1.6.3.10.2.1.1", {"4", "2", "2", "2"});
  RegisterScalarGroup("snmpMPDParams", "1.3.6.1.6.3.11.2.1.1", {"65", "65", "65"});
  RegisterScalarGroup("usmStats", "1.3.6.1.6.3.15.1.1.1", {"65", "65", "65", "65", "65", "65"});
}

void FreeSnmpV3Resources() {
  FreeUsmUsers();
  FreeVacmTables();
  ClearEngineId();
  gv_snmpv3Configured = false;
}

}  // namespace tessel
