// Fuzzes the whole request path of an agent: message parsing, PDU processing against a small
// MIB served by the in-memory host, and reply encoding.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "snmp/handlers.h"
#include "snmp/message.h"
#include "snmp/mib_tree.h"
#include "support/memory_host.h"

namespace {

using namespace tessel;

AgentSession* SetUpAgent() {
  static MemoryHost host;
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                         TableProcessWriteReq);
  InstallHost(&host);
  TreeCellRegistration system, ifEntry;
  system.label = "system", system.oidText = "1.3.6.1.2.1.1.1";
  system.subIds = {"1", "2", "3", "5"}, system.dataTypes = {"4", "6", "67", "4"};
  ifEntry.label = "ifEntry", ifEntry.oidText = "1.3.6.1.2.1.2.2.1", ifEntry.isTable = true;
  ifEntry.subIds = {"1", "2", "6", "10"}, ifEntry.dataTypes = {"2", "4", "64", "70"};
  for (TreeCellRegistration* cell : {&system, &ifEntry}) {
    cell->versionText = "V2";
    cell->access.assign(4, "43706");  // read-write
    CreateAndRegisterCell(*cell);
  }
  StoreTreeCellsRefInArray();
  host.SetValue("1.3.6.1.2.1.1.1.0", "fuzz");
  host.SetValue("1.3.6.1.2.1.1.2.0", ".1.3.6.1.4.1.1");
  host.SetValue("1.3.6.1.2.1.1.3.0", "1");
  host.SetValue("1.3.6.1.2.1.1.5.0", "'00ff'h");
  for (std::string row : {"1", "2", "10.0.0.1"}) {
    for (auto [column, value] :
         {std::pair{"1.", "1"}, {"2.", "eth"}, {"6.", "10.0.0.1"}, {"10.", "18446744073709551615"}})
      host.SetValue("1.3.6.1.2.1.2.2.1." + (column + row), value);
  }
  static AgentSession agent = LocalAgent(1);
  return &agent;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static AgentSession* agent = SetUpAgent();
  static std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t replyLength = reply.size();
  int result = ProcessSnmpMessage(data, size, reply.data(), &replyLength, *agent);
  if (result == kMessageReply) {
    if (replyLength == 0 || replyLength > reply.size()) std::abort();
    SnmpPdu parsed;
    if (ParseSnmpMessage(reply.data(), replyLength, &parsed) != 1)
      std::abort();  // replies must parse
  }
  return 0;
}
