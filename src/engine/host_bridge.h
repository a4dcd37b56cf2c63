// The engine's one way to the host: value calls for the SNMP objects, status lines and traffic
// logging. The product installs the JNI implementation; unit tests, fuzzers and benchmarks
// install an in-memory host. Methods are called concurrently from many engine threads, so an
// implementation must be thread-safe. Subsystems call this interface, never JNI directly.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace tessel {

// The arguments of one value call. Which fields a method passes is fixed per method (see each
// method); texts that the host may receive as null are optional.
struct HostValueQuery {
  std::string label;                    // the tree cell's label
  std::string objectOid;                // scalar: the group OID; table: the entry OID (.1.3...)
  std::string subId;                    // scalar: the sub-identifier; table: the column, decimal
  std::optional<std::string> instance;  // scalar: ".0"; table: ".5", or null for a first GetNext
  std::string previousSubId;            // scalar GetNext: the registered sub-identifier below
  std::int32_t column = 0;              // table GetNext: the column and the one after it
  std::int32_t nextColumn = -1;
  std::int32_t dataType = 0;  // the column's BER identifier
  std::int32_t nextDataType = 0;
  std::string databaseName;
  std::string tableName;
  std::string valueText;  // Set: the value rendered as text
  std::int32_t agentId = 0;
  std::int32_t rowStatusColumn = 0;
  std::string agentAddress;
  std::int32_t agentPort = 0;
  std::optional<std::string> syntax;
};

// An inform as the host is told of it, answered or dropped. The bindings are given as three texts
// each: the dotted OID, the name of its type and its value.
struct InformReport {
  std::uint32_t informId = 0;
  std::int32_t requestId = 0;
  std::int32_t version = 0;
  std::string community;
  std::string userName;
  std::string contextName;
  std::string managerAddress;
  std::int32_t managerPort = 0;
  std::string deviceAddress;
  std::int32_t errorStatus = 0;  // of the Response
  std::int32_t errorIndex = 0;
  std::vector<std::string> oids;
  std::vector<std::string> types;
  std::vector<std::string> values;
};

// A PDU as the host's scrambler sees it: its header fields, its bindings as texts (a value with no
// text form is null), and the agent it passes through.
struct ScrambleQuery {
  std::int64_t version = 0;
  std::string community;
  std::vector<std::string> oids;
  std::vector<std::optional<std::string>> values;
  std::int64_t requestId = 0;
  std::uint8_t pduType = 0;
  std::int64_t errorStatus = 0;
  std::int64_t errorIndex = 0;
  std::string oidField;  // an SNMPv1 trap's enterprise without its last two sub-identifiers
  std::int32_t timeout = 0;
  std::int32_t retries = 0;
  std::string agentAddress;
  std::int32_t agentPort = 0;  // the configured port minus two
  std::string managerAddress;
  bool isResponse = false;  // the reply on its way out, rather than the PDU received
};

// The fields the host's scrambler replaces; what it leaves empty stays as it was.
struct ScrambleChanges {
  std::optional<std::int32_t> errorStatus;
  std::optional<std::int32_t> errorIndex;
  std::optional<std::int32_t> requestId;
  std::optional<std::uint8_t> pduType;
  std::optional<std::string> community;
  std::optional<std::string> oidField;  // dotted
  std::optional<std::int32_t> timeout;
  std::optional<std::int32_t> retries;
};

// A host's answer: a String[] whose elements may be null, or null altogether.
using HostAnswer = std::optional<std::vector<std::optional<std::string>>>;

// The arguments of a TL1 command the host answers, in the order the host methods take them.
// getAck takes all but agentAddress and agentPort.
struct Tl1HostQuery {
  std::string verb;
  std::optional<std::string> modifier1;
  std::optional<std::string> modifier2;
  std::optional<std::string> aidText;
  std::optional<std::vector<std::optional<std::string>>> parameters;  // the first payload block
  std::int32_t agentId = 0;
  std::int32_t reserved = 0;  // always 0
  std::string agentAddress;
  std::int32_t agentPort = 0;
  std::optional<std::string> hostText1;  // both null unless both are non-empty
  std::optional<std::string> hostText2;
  std::string hostText3;
  std::string hostText2Again;  // the agent's hostText2 as it is
};

// The arguments of a CLI host call: the line (or the line typed so far, for help and
// completion), the session's mode, the agent's host texts and endpoint, and the block the
// session is in ("" for none). Help and completion pass only line, mode, hostText1 and hostText2.
struct CliHostQuery {
  std::string line;
  std::int32_t mode = 0;
  std::string hostText1, hostText2, hostText3, hostText4;
  std::string ipAddress;
  std::int32_t port = 0;
  std::string context;
};

class HostBridge {
 public:
  virtual ~HostBridge() = default;

  virtual void PrintStatus(const std::string& text) = 0;

  // [value, error]
  virtual HostAnswer ScalarGetOidVal(const HostValueQuery& query) = 0;
  virtual HostAnswer ScalarGetNextOidVal(const HostValueQuery& query) = 0;
  virtual HostAnswer SetOidVal(const HostValueQuery& query) = 0;
  virtual HostAnswer TableGetOidVal(const HostValueQuery& query) = 0;
  // [value, column-and-instance relative to the entry OID, error]
  virtual HostAnswer TableGetNextOidVal(const HostValueQuery& query) = 0;
  virtual HostAnswer TableSetOidVal(const HostValueQuery& query) = 0;

  // An inform was acknowledged (with the Response's bindings), or dropped (with its own). A host
  // that does not follow informs leaves them alone.
  virtual void LogResponseMessage(const InformReport& /*report*/) {}
  virtual void StoreDroppedInformMessage(const InformReport& /*report*/) {}

  // The fields to replace in a PDU passing through an agent while scrambling is on; nothing
  // leaves the PDU as it is. A host without a scrambler changes nothing.
  virtual std::optional<ScrambleChanges> ScramblePDU(const ScrambleQuery& /*query*/) {
    return std::nullopt;
  }

  // TL1: the acknowledgment to send before the response (0 none, 1..6 IP, PF, NA, RL, OK, NG),
  // and the response block ([completion code, "T TEXT"...] or ["ErrorCode", code, text]). A host
  // without TL1 acknowledges nothing and answers null (DENY).
  virtual std::int32_t Tl1GetAck(const Tl1HostQuery& /*query*/) { return 0; }
  virtual HostAnswer Tl1GetResponseBlock(const Tl1HostQuery& /*query*/) { return std::nullopt; }

  // CLI: the answer to a line, key/value pairs in order ("response", "level", "context", ...);
  // the help text for '?'; the completed line for TAB. A host without a CLI answers null
  // (nothing to print, no change).
  virtual HostAnswer CliEnterResponse(const CliHostQuery& /*query*/) { return std::nullopt; }
  virtual std::optional<std::string> CliQuestionResponse(const CliHostQuery& /*query*/) {
    return std::nullopt;
  }
  virtual std::optional<std::string> CliTabResponse(const CliHostQuery& /*query*/) {
    return std::nullopt;
  }
};

// The installed host, or nullptr. Installing is not synchronised with calls in flight: install
// before agents serve requests.
HostBridge* InstalledHost();
void InstallHost(HostBridge* host);

}  // namespace tessel
