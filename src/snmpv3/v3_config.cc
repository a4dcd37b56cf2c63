#include "snmpv3/v3_config.h"

#include "engine/engine_state.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/engine_objects.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/v3_message.h"
#include "snmpv3/vacm.h"

namespace tessel {

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
  RegisterEngineObjects();
}

void FreeSnmpV3Resources() {
  FreeUsmUsers();
  FreeVacmTables();
  ClearEngineId();
  gv_snmpv3Configured = false;
}

}  // namespace tessel
