// The MIB tree: the process-wide registry of the scalar groups and tables (TreeCells) that every
// simulated agent answers for, kept in ascending OID order, and the lookup that finds the cell
// answering a Get, GetNext or Set. Values are never stored here; cells only say which columns
// exist, their access and data types, and which handlers read and write them.
// Lookups run concurrently with each other; registration takes the tree exclusively (hold a
// MibTreeReadLock across a request that keeps TreeCell pointers).
#pragma once

#include <cstdint>
#include <optional>
#include <shared_mutex>
#include <span>
#include <string>
#include <vector>

#include "base/conversions.h"
#include "snmp/var_value.h"

namespace tessel {

struct TreeCell;
struct AgentSession;

// What every handler is given: the agent the request is for and the cell that answers.
struct TesselStruct {
  const AgentSession* agent = nullptr;
  const TreeCell* cell = nullptr;
};

// A read handler answers a Get or GetNext for *oid (a GetNext handler writes the OID it answered
// back into *oid). No value means *errorCode says why.
using ReadHandler = std::optional<VarValue> (*)(std::uint8_t pduType, Oid* oid,
                                                std::uint8_t* errorCode,
                                                const TesselStruct& target);
// A write handler sets *oid to value and answers the value for the response.
using WriteHandler = std::optional<VarValue> (*)(const Oid& oid, const VarValue& value,
                                                 std::uint8_t* errorCode,
                                                 const TesselStruct& target);

// Column access codes.
inline constexpr std::uint8_t kAccessNotAccessible = 0;
inline constexpr std::uint8_t kAccessReadOnly = 1;
inline constexpr std::uint8_t kAccessReadWrite = 2;
inline constexpr std::uint8_t kAccessReadCreate = 4;
inline constexpr std::uint8_t kAccessNone = 5;

struct TreeCell {
  std::string label;
  std::int8_t smiVersion = 0;  // 0 V1, 1 V2, 2 V3, -4 unknown
  Oid oid;                     // table: the table OID; scalar group: the OID of one scalar
  bool isTable = false;
  std::vector<std::uint32_t> subIds;  // ascending
  std::vector<std::uint8_t> access;
  std::vector<std::uint8_t> dataTypes;
  std::int32_t rowStatusColumn = 0;
  std::vector<std::string> syntaxes;  // empty when the host gave none
  bool hasSyntaxes = false;
  ReadHandler readHandler = nullptr;
  WriteHandler writeHandler = nullptr;
  ReadHandler engineRead = nullptr;  // set: the engine answers the cell itself (read-only)
  TreeCell* prev = nullptr;
  TreeCell* next = nullptr;

  // The cell OID for a table, the cell OID without its last sub-identifier for a scalar group.
  std::span<const std::uint32_t> Base() const {
    return isTable ? std::span<const std::uint32_t>(oid)
                   : std::span<const std::uint32_t>(oid.data(), oid.empty() ? 0 : oid.size() - 1);
  }
  // Position of a sub-identifier among the columns, -1 when it is not registered.
  int ColumnPosition(std::uint32_t subId) const {
    for (std::size_t i = 0; i < subIds.size(); ++i) {
      if (subIds[i] == subId) return static_cast<int>(i);
    }
    return -1;
  }
};

// The texts the host registers a cell with.
struct TreeCellRegistration {
  std::string label;
  std::string versionText;
  std::string oidText;  // a table's entry OID text (its last component is cut off)
  std::vector<std::string> subIds;
  std::vector<std::string> dataTypes;
  std::vector<std::string> access;
  bool isTable = false;
  std::int32_t rowStatusColumn = 0;
  std::optional<std::vector<std::string>> syntaxes;
  // Objects the engine answers itself keep this read handler and have no write handler; every
  // other cell takes the default handlers.
  ReadHandler engineRead = nullptr;
};

bool CreateAndRegisterCell(const TreeCellRegistration& registration);
// The handlers registration gives new scalar groups and tables (also applied to the cells already
// registered); none until set at engine start-up.
void SetDefaultCellHandlers(ReadHandler scalarRead, WriteHandler scalarWrite, ReadHandler tableRead,
                            WriteHandler tableWrite);
// Rebuilds the search array from the ordered list; returns the cell count.
int StoreTreeCellsRefInArray();
// Releases every cell and empties the tree.
void FreeTreeCells();
int RegisteredCellCount();

// The cell that answers oid for the PDU type, or nullptr with *errorCode set (noSuchInstance when
// there is no search array yet; 0 when an unregistered cell ends the search).
TreeCell* GetTreeCell(std::uint8_t pduType, std::span<const std::uint32_t> oid,
                      std::uint8_t* errorCode);
bool CompareSubIdLists(std::uint8_t pduType, const TreeCell& cell,
                       std::span<const std::uint32_t> oid, std::uint8_t* errorCode);
TreeCell* GetTreeCellByName(const std::string& label);
// The OID text of the cell after the one that answers a GetNext of oidText (".1" appended for a
// table), or nothing. Takes the tree itself: not for a thread that holds a MibTreeReadLock (nor
// GetTreeCellByName and RegisteredCellCount); GetTreeCell and CompareSubIdLists expect one held.
std::optional<std::string> GetNextGroupOid(const std::string& oidText);

// Shared access to the tree for the span of one request.
class MibTreeReadLock {
 public:
  MibTreeReadLock();
  ~MibTreeReadLock();
  MibTreeReadLock(const MibTreeReadLock&) = delete;
  MibTreeReadLock& operator=(const MibTreeReadLock&) = delete;
};

}  // namespace tessel
