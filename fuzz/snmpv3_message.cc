// Fuzzes the SNMPv3 path of an agent: message header, USM security parameters, the security
// checks and Reports, decryption and the scoped PDU, with one user per security level, over a
// MIB that holds the engine's own objects.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "snmp/handlers.h"
#include "snmp/message.h"
#include "snmp/mib_tree.h"
#include "snmpv3/engine_objects.h"
#include "snmpv3/v3_config.h"
#include "snmpv3/vacm.h"
#include "support/memory_host.h"

namespace {

using namespace tessel;

AgentSession* SetUpAgent() {
  static MemoryHost host;
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                         TableProcessWriteReq);
  InstallHost(&host);
  TreeCellRegistration system;
  system.label = "system", system.versionText = "V2", system.oidText = "1.3.6.1.2.1.1.1";
  system.subIds = {"1", "5"}, system.dataTypes = {"4", "4"}, system.access = {"43706", "43706"};
  CreateAndRegisterCell(system);
  RegisterEngineObjects();
  StoreTreeCellsRefInArray();
  host.SetValue("1.3.6.1.2.1.1.1.0", "fuzz");
  host.SetValue("1.3.6.1.2.1.1.5.0", "name");
  AddUsmUserFromHost("plain", "NO_AUTH", "", "NO_PRIV", "", 1);
  AddUsmUserFromHost("md5", "MD5_AUTH", "md5password", "NO_PRIV", "", 1);
  AddUsmUserFromHost("shaaes", "SHA_AUTH", "shapassword", "CFB_AES_128", "aespassword", 1);
  AddUsmUserFromHost("md5des", "MD5_AUTH", "md5password", "CBC_DES", "despassword", 1);
  CreateAndAddSnmpVacmContextTableEntry("");
  for (const char* user : {"plain", "md5", "shaaes", "md5des"})
    CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, user, "all", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("all", "", 3, 0, 1, "all", "all", "all", 3);
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("all", "1.3", "", 1, 3);
  CreateLCDVacmAccessTable();
  CreateLCDVacmViewTreeFamilyTable();
  static AgentSession agent = LocalAgent(1);
  agent.agentInfo->engineBoots = 1;
  return &agent;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static AgentSession* agent = SetUpAgent();
  static std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t replyLength = reply.size();
  int result = ProcessSnmpMessage(data, size, reply.data(), &replyLength, *agent);
  if (result == kMessageReply && (replyLength == 0 || replyLength > reply.size())) std::abort();
  return 0;
}
