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

void RegisterCell(const char* label, const char* oid, bool isTable, std::vector<std::string> subIds,
                  std::vector<std::string> types, const char* access) {
  TreeCellRegistration cell;
  cell.label = label;
  cell.versionText = "V2";
  cell.oidText = oid;
  cell.isTable = isTable;
  cell.subIds = std::move(subIds);
  cell.dataTypes = std::move(types);
  cell.access.assign(cell.subIds.size(), access);
  CreateAndRegisterCell(cell);
}

AgentSession* SetUpAgent() {
  static MemoryHost host;
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                         TableProcessWriteReq);
  InstallHost(&host);
  RegisterCell("system", "1.3.6.1.2.1.1.1", false, {"1", "2", "3", "5"}, {"4", "6", "67", "4"},
               "43706");
  RegisterCell("ifEntry", "1.3.6.1.2.1.2.2.1", true, {"1", "2", "6", "10"}, {"2", "4", "64", "70"},
               "43706");
  StoreTreeCellsRefInArray();
  host.SetValue("1.3.6.1.2.1.1.1.0", "fuzz");
  host.SetValue("1.3.6.1.2.1.1.2.0", ".1.3.6.1.4.1.1");
  host.SetValue("1.3.6.1.2.1.1.3.0", "1");
  host.SetValue("1.3.6.1.2.1.1.5.0", "'00ff'h");
  for (const char* row : {"1", "2", "10.0.0.1"}) {
    host.SetValue(std::string("1.3.6.1.2.1.2.2.1.1.") + row, "1");
    host.SetValue(std::string("1.3.6.1.2.1.2.2.1.2.") + row, "eth");
    host.SetValue(std::string("1.3.6.1.2.1.2.2.1.6.") + row, "10.0.0.1");
    host.SetValue(std::string("1.3.6.1.2.1.2.2.1.10.") + row, "18446744073709551615");
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
