#include "micro_agent.h"

#include <array>
#include <cstdlib>

#include "snmp/handlers.h"
#include "snmp/mib_tree.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

constexpr const char* kReadOnly = "43690";

void Register(const std::string& label, const std::string& oid, bool isTable,
              const std::vector<std::array<std::string, 2>>& columns) {
  TreeCellRegistration cell;
  cell.label = label;
  cell.versionText = "V2";
  cell.oidText = oid;
  cell.isTable = isTable;
  for (const auto& [subId, type] : columns) {
    cell.subIds.push_back(subId);
    cell.dataTypes.push_back(type);
    cell.access.push_back(kReadOnly);
  }
  // A benchmark on a half-registered MIB would measure error paths: refuse to run.
  if (!CreateAndRegisterCell(cell)) std::abort();
}

}  // namespace

MicroAgent::MicroAgent(int extraGroups) {
  FreeTreeCells();
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                         TableProcessWriteReq);
  InstallHost(&host_);
  Register("system", "1.3.6.1.2.1.1.1", false,
           {{{"1", "4"}},
            {{"2", "6"}},
            {{"3", "67"}},
            {{"4", "4"}},
            {{"5", "4"}},
            {{"6", "4"}},
            {{"7", "2"}}});
  Register("ifEntry", "1.3.6.1.2.1.2.2.1", true, {{{"1", "2"}}, {{"2", "4"}}, {{"10", "65"}}});
  for (int group = 1; group <= extraGroups; ++group) {
    const std::string n = std::to_string(group);
    Register("enterprise" + n, "1.3.6.1.4.1.99999." + n + ".1", false,
             {{{"1", "4"}}, {{"2", "2"}}});
  }
  StoreTreeCellsRefInArray();
  constexpr std::array<std::array<const char*, 2>, 7> kSystem{{{"1", "Tessel router"},
                                                               {"2", ".1.3.6.1.4.1.99999"},
                                                               {"3", "12345"},
                                                               {"4", "ops"},
                                                               {"5", "r1"},
                                                               {"6", "lab"},
                                                               {"7", "72"}}};
  for (const auto& [column, value] : kSystem)
    host_.SetValue(std::string("1.3.6.1.2.1.1.") + column + ".0", value);
  for (int i = 1; i <= 4; ++i) {
    const std::string n = std::to_string(i);
    host_.SetValue("1.3.6.1.2.1.2.2.1.1." + n, n);
    host_.SetValue("1.3.6.1.2.1.2.2.1.2." + n, "eth" + n);
    host_.SetValue("1.3.6.1.2.1.2.2.1.10." + n, std::to_string(1000 * i));
  }
  session_ = LocalAgent(1);
  session_.transport.peerAddress = "127.0.0.2";
}

MicroAgent::~MicroAgent() {
  InstallHost(nullptr);
  FreeTreeCells();
}

std::vector<std::uint8_t> EncodeMicroRequest(std::uint8_t pduType, const std::string& oid,
                                             int maxRepetitions) {
  std::vector<std::uint32_t> ids;
  RequestTemplate request;
  if (!ParseOid(oid, &ids) ||
      !EncodeRequestTemplate(1, "public", pduType, ids, 0, maxRepetitions, &request)) {
    std::abort();
  }
  PatchRequestId(request.bytes.data(), request, 1u << 24);
  return request.bytes;
}

}  // namespace tessel::bench
