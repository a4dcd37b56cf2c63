#include "support/snmp_agent_fixture.h"

#include <algorithm>
#include <array>

#include "snmp/ber.h"
#include "snmp/handlers.h"
#include "snmp/message.h"
#include "snmp/mib_tree.h"
#include "snmp/statistics.h"

namespace tessel {

constexpr const char* kRo = "43690";  // read-only
constexpr const char* kRw = "43706";  // read-write

void RegisterCell(const std::string& label, const std::string& oid, bool isTable,
                  std::vector<std::array<std::string, 3>> columns) {
  TreeCellRegistration cell;
  cell.label = label;
  cell.versionText = "V2";
  cell.oidText = oid;
  cell.isTable = isTable;
  for (auto& [subId, type, access] : columns) {
    cell.subIds.push_back(subId);
    cell.dataTypes.push_back(type);
    cell.access.push_back(access);
  }
  ASSERT_TRUE(CreateAndRegisterCell(cell));
}

Oid O(const std::string& dotted) {
  Oid oid;
  ParseDottedText(&oid, dotted[0] == '.' ? dotted : "." + dotted, false);
  return oid;
}

Request GetOf(const std::vector<std::string>& oids, std::uint8_t type, std::int32_t version) {
  Request request;
  request.version = version;
  request.type = type;
  for (const std::string& oid : oids) request.bindings.push_back({O(oid), VarValue::Empty(kAsnNull)});
  return request;
}

std::vector<std::uint8_t> EncodeRequest(const Request& request) {
  std::vector<std::uint8_t> buffer(65536);
  std::int32_t remaining = static_cast<std::int32_t>(buffer.size());
  std::uint8_t* start = buffer.data();
  std::uint8_t* cursor = AsnBuildSequence(start, &remaining, kAsnSequence, 0);
  cursor = AsnBuildInt(cursor, &remaining, kAsnInteger, request.version);
  cursor = AsnBuildString(cursor, &remaining, kAsnOctetString,
                          reinterpret_cast<const std::uint8_t*>(request.community.data()),
                          request.community.size());
  std::uint8_t* pdu = cursor;
  cursor = AsnBuildSequence(cursor, &remaining, request.type, 0);
  cursor = AsnBuildInt(cursor, &remaining, kAsnInteger, request.requestId);
  cursor = AsnBuildInt(cursor, &remaining, kAsnInteger, request.field1);
  cursor = AsnBuildInt(cursor, &remaining, kAsnInteger, request.field2);
  std::uint8_t* list = cursor;
  cursor = AsnBuildSequence(cursor, &remaining, kAsnSequence, 0);
  for (const auto& [name, value] : request.bindings) {
    cursor = BuildVarOp(cursor, name.data(), name.size(), value, &remaining);
  }
  for (const std::vector<std::uint8_t>& raw : request.rawBindings) {
    std::copy(raw.begin(), raw.end(), cursor);
    cursor += raw.size();
  }
  std::size_t total = static_cast<std::size_t>(cursor - start);
  for (std::uint8_t* header : {list, pdu, start}) {
    std::int32_t space = 4;
    AsnBuildSequence(header, &space, header[0], static_cast<std::size_t>(cursor - header) - 4);
  }
  buffer.resize(total);
  return buffer;
}

void SnmpAgentTest::SetUp() {
  FreeTreeCells();
  ResetSnmpStatistics();
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                         TableProcessWriteReq);
  InstallHost(&host_);
  RegisterCell("system", "1.3.6.1.2.1.1.1", false,
               {{"1", "4", kRo},
                {"2", "6", kRo},
                {"3", "67", kRo},
                {"4", "4", kRw},
                {"5", "4", kRw},
                {"6", "4", kRw},
                {"7", "2", kRo}});
  RegisterCell("ifEntry", "1.3.6.1.2.1.2.2.1", true,
               {{"1", "2", kRo}, {"2", "4", kRo}, {"10", "65", kRo}});
  RegisterCell("ifXEntry", "1.3.6.1.2.1.31.1.1.1", true, {{"1", "4", kRw}, {"6", "70", kRo}});
  StoreTreeCellsRefInArray();
  const char* system[] = {"Tessel router", ".1.3.6.1.4.1.99999", "12345", "ops", "r1", "lab", "72"};
  for (int i = 1; i <= 7; ++i)
    host_.SetValue("1.3.6.1.2.1.1." + std::to_string(i) + ".0", system[i - 1]);
  for (std::string n : {"1", "2"}) {
    host_.SetValue("1.3.6.1.2.1.2.2.1.1." + n, n);
    host_.SetValue("1.3.6.1.2.1.2.2.1.2." + n, "eth" + n);
    host_.SetValue("1.3.6.1.2.1.2.2.1.10." + n, n + "000");
    host_.SetValue("1.3.6.1.2.1.31.1.1.1.1." + n, "eth" + n);
    host_.SetValue("1.3.6.1.2.1.31.1.1.1.6." + n, "4294967296");
  }
  agent_ = LocalAgent(7);
  agent_.transport.peerAddress = "127.0.0.9";
}

void SnmpAgentTest::TearDown() {
  InstallHost(nullptr);
  FreeTreeCells();
}

std::optional<SnmpPdu> SnmpAgentTest::Exchange(const std::vector<std::uint8_t>& datagram) {
  lastReply_.assign(kMaxSnmpMessage, 0);
  std::size_t length = lastReply_.size();
  int result =
      ProcessSnmpMessage(datagram.data(), datagram.size(), lastReply_.data(), &length, agent_);
  if (result != kMessageReply) return std::nullopt;
  lastReply_.resize(length);
  SnmpPdu reply;
  EXPECT_EQ(ParseSnmpMessage(lastReply_.data(), length, &reply), 1);
  return reply;
}

}  // namespace tessel
