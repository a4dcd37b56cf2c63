// A test agent without sockets: a small MIB (system group, ifTable, a Counter64 column),
// values in the in-memory host, and helpers that encode requests and decode replies.
#pragma once

#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "engine/agent.h"
#include "snmp/pdu.h"
#include "support/memory_host.h"

namespace tessel {

struct Request {
  std::int32_t version = kSnmpV2c;
  std::string community = "public";
  std::uint8_t type = kGetRequest;
  std::int32_t requestId = 42;
  std::int32_t field1 = 0;  // error-status, or non-repeaters
  std::int32_t field2 = 0;  // error-index, or max-repetitions
  std::vector<std::pair<Oid, VarValue>> bindings;
  std::vector<std::vector<std::uint8_t>> rawBindings;  // appended as they are
};

std::vector<std::uint8_t> EncodeRequest(const Request& request);
Oid O(const std::string& dotted);
// A request of the given type that names each OID with a NULL value.
Request GetOf(const std::vector<std::string>& oids, std::uint8_t type = kGetRequest,
              std::int32_t version = kSnmpV2c);
// Registers a cell (SMIv2); columns as {sub-identifier, data type, access}.
void RegisterCell(const std::string& label, const std::string& oid, bool isTable,
                  std::vector<std::array<std::string, 3>> columns);

class SnmpAgentTest : public ::testing::Test {
 protected:
  void SetUp() override;
  void TearDown() override;

  // Processes one datagram; the decoded reply, or nothing when it was dropped.
  std::optional<SnmpPdu> Exchange(const std::vector<std::uint8_t>& datagram);
  std::optional<SnmpPdu> Send(const Request& request) { return Exchange(EncodeRequest(request)); }
  std::vector<std::uint8_t> lastReply_;

  MemoryHost host_;
  AgentSession agent_;
};

}  // namespace tessel
