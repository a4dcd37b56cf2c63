// The MIB tree: registration keeps one ordered list of cells shared by every agent; lookups binary
// search a snapshot array of that list, so a request never walks the list and registrations made
// after the snapshot become visible only when it is rebuilt.
#include "snmp/mib_tree.h"

#include <algorithm>
#include <memory>
#include <mutex>
#include <string_view>
#include <utility>

#include "engine/log.h"
#include "snmp/pdu.h"

namespace tessel {
namespace {

struct DefaultHandlers {
  ReadHandler scalarRead = nullptr;
  WriteHandler scalarWrite = nullptr;
  ReadHandler tableRead = nullptr;
  WriteHandler tableWrite = nullptr;
};

struct MibTree {
  std::shared_mutex mutex;
  std::vector<std::unique_ptr<TreeCell>> registered;  // owns every cell of the list
  TreeCell* head = nullptr;
  TreeCell* tail = nullptr;
  std::vector<TreeCell*> searchArray;
  DefaultHandlers handlers;
};

MibTree& Tree() {
  static MibTree tree;
  return tree;
}

// One column of a cell, used while merging two definitions of the same cell.
struct Column {
  std::uint32_t subId = 0;
  std::uint8_t access = 0;
  std::uint8_t dataType = 0;
  std::string syntax;
};

// ---- Parsing the host's texts ----

// Host OID texts come with or without the leading dot.
bool ParseOidText(std::string_view text, Oid* out) {
  std::string dotted =
      (!text.empty() && text.front() == '.') ? std::string(text) : "." + std::string(text);
  return ParseDottedText(out, dotted, false) > 0 && out->size() <= kMaxOidLength;
}

bool ParseUnsignedText(const std::string& text, std::uint32_t* out) {
  Oid value;
  if (ParseDottedText(&value, "." + text, false) != 1) return false;
  *out = value[0];
  return true;
}

std::int8_t SmiVersionFromText(const std::string& text) {
  if (text.find("V1") != std::string::npos) return 0;
  if (text.find("V2") != std::string::npos) return 1;
  if (text.find("V3") != std::string::npos) return 2;
  return -4;
}

std::uint8_t AccessFromHostCode(const std::string& code) {
  if (code == "0") return kAccessNotAccessible;
  if (code == "1") return kAccessNone;  // the host's own meaning is unknown; treated as no access
  if (code == "43690") return kAccessReadOnly;
  if (code == "43706") return kAccessReadWrite;
  if (code == "43708") return kAccessReadCreate;
  LOG_ERROR(" unable to register for access:%s \n", code.c_str());
  return kAccessNotAccessible;
}

// The cell OID: a table's entry OID loses its last component. Empty when the text is unusable.
Oid CellOidFromText(const TreeCellRegistration& registration) {
  Oid oid;
  if (!ParseOidText(registration.oidText, &oid)) return {};
  if (registration.isTable) oid.pop_back();
  return oid;
}

bool ParseColumns(const TreeCellRegistration& registration, TreeCell* cell) {
  std::size_t count = registration.subIds.size();
  if (registration.dataTypes.size() != count || registration.access.size() != count ||
      (registration.syntaxes && registration.syntaxes->size() != count)) {
    LOG_ERROR("column lists of %s differ in length\n", registration.label.c_str());
    return false;
  }
  for (std::size_t i = 0; i < count; ++i) {
    std::uint32_t subId = 0;
    std::uint32_t dataType = 0;
    if (!ParseUnsignedText(registration.subIds[i], &subId) ||
        !ParseUnsignedText(registration.dataTypes[i], &dataType) || dataType > 0xFF) {
      LOG_ERROR("malformed column %s of %s\n", registration.subIds[i].c_str(),
                registration.label.c_str());
      return false;
    }
    cell->subIds.push_back(subId);
    cell->dataTypes.push_back(static_cast<std::uint8_t>(dataType));
    cell->access.push_back(AccessFromHostCode(registration.access[i]));
  }
  cell->hasSyntaxes = registration.syntaxes.has_value();
  if (cell->hasSyntaxes) cell->syntaxes = *registration.syntaxes;
  return true;
}

std::unique_ptr<TreeCell> BuildCell(const TreeCellRegistration& registration) {
  auto cell = std::make_unique<TreeCell>();
  cell->label = registration.label;
  cell->smiVersion = SmiVersionFromText(registration.versionText);
  cell->isTable = registration.isTable;
  cell->rowStatusColumn = registration.rowStatusColumn;
  cell->engineRead = registration.engineRead;
  cell->oid = CellOidFromText(registration);
  if (cell->oid.empty()) {
    LOG_ERROR("unable to register %s: malformed OID %s\n", registration.label.c_str(),
              registration.oidText.c_str());
    return nullptr;
  }
  if (!ParseColumns(registration, cell.get())) return nullptr;
  return cell;
}

// ---- Merging a second definition of a registered cell ----

std::vector<Column> ColumnsOf(const TreeCell& cell) {
  std::vector<Column> columns(cell.subIds.size());
  for (std::size_t i = 0; i < columns.size(); ++i) {
    columns[i] = {cell.subIds[i], cell.access[i], cell.dataTypes[i],
                  cell.hasSyntaxes ? cell.syntaxes[i] : ""};
  }
  return columns;
}

// Keeps the syntax list aligned with the columns: a column without a syntax gets an empty text.
void SetColumns(TreeCell* cell, const std::vector<Column>& columns, bool hasSyntaxes) {
  cell->subIds.clear();
  cell->access.clear();
  cell->dataTypes.clear();
  cell->syntaxes.clear();
  for (const Column& column : columns) {
    cell->subIds.push_back(column.subId);
    cell->access.push_back(column.access);
    cell->dataTypes.push_back(column.dataType);
    if (hasSyntaxes) cell->syntaxes.push_back(column.syntax);
  }
  cell->hasSyntaxes = hasSyntaxes;
}

bool SameColumn(const TreeCell& a, std::size_t i, const TreeCell& b, std::size_t j) {
  return a.subIds[i] == b.subIds[j] && a.access[i] == b.access[j] &&
         a.dataTypes[i] == b.dataTypes[j];
}

bool SameCountAndEnds(const TreeCell& existing, const TreeCell& incoming) {
  std::size_t count = existing.subIds.size();
  if (incoming.subIds.size() != count) return false;
  return count == 0 || (SameColumn(existing, 0, incoming, 0) &&
                        SameColumn(existing, count - 1, incoming, count - 1));
}

bool EveryColumnIn(const TreeCell& existing, const TreeCell& incoming) {
  for (std::size_t i = 0; i < existing.subIds.size(); ++i) {
    int j = incoming.ColumnPosition(existing.subIds[i]);
    if (j < 0 || !SameColumn(existing, i, incoming, static_cast<std::size_t>(j))) return false;
  }
  return true;
}

// The existing cell takes the new column lists; a column the new definition gives no syntax for
// keeps the one it had.
void TakeColumns(TreeCell* existing, const TreeCell& incoming) {
  std::vector<Column> columns = ColumnsOf(incoming);
  if (!incoming.hasSyntaxes && existing->hasSyntaxes) {
    for (Column& column : columns) {
      int old = existing->ColumnPosition(column.subId);
      if (old >= 0) column.syntax = existing->syntaxes[static_cast<std::size_t>(old)];
    }
  }
  SetColumns(existing, columns, existing->hasSyntaxes || incoming.hasSyntaxes);
}

void AddUniqueSorted(std::vector<Column>* merged, const std::vector<Column>& columns) {
  for (const Column& column : columns) {
    auto at =
        std::lower_bound(merged->begin(), merged->end(), column.subId,
                         [](const Column& c, std::uint32_t subId) { return c.subId < subId; });
    if (at == merged->end() || at->subId != column.subId) merged->insert(at, column);
  }
}

// The union of both definitions in ascending sub-identifier order; the new definition wins for
// a column both have. A column both define with another access or type refuses the merge.
void RegisterConsolidatedTreeCell(TreeCell* existing, const TreeCell& incoming) {
  for (std::size_t i = 0; i < existing->subIds.size(); ++i) {
    int j = incoming.ColumnPosition(existing->subIds[i]);
    if (j >= 0 && !SameColumn(*existing, i, incoming, static_cast<std::size_t>(j))) {
      LOG_ERROR(
          "Incompatible Types cannot be registered. OID types mismatch on different definitions\n");
      return;
    }
  }
  std::vector<Column> merged;
  AddUniqueSorted(&merged, ColumnsOf(incoming));
  AddUniqueSorted(&merged, ColumnsOf(*existing));
  SetColumns(existing, merged, existing->hasSyntaxes || incoming.hasSyntaxes);
}

void MergeIntoExisting(TreeCell* existing, const TreeCell& incoming) {
  if (!existing->isTable || SameCountAndEnds(*existing, incoming)) return;
  if (EveryColumnIn(*existing, incoming)) {
    TakeColumns(existing, incoming);
  } else {
    RegisterConsolidatedTreeCell(existing, incoming);
  }
}

// ---- The ordered list ----

void LinkBefore(MibTree& tree, TreeCell* cell, TreeCell* successor) {
  cell->next = successor;
  cell->prev = successor ? successor->prev : tree.tail;
  (cell->prev ? cell->prev->next : tree.head) = cell;
  (successor ? successor->prev : tree.tail) = cell;
}

// True when the cell became a new list element; a cell with a registered OID is merged into the
// registered one instead.
bool AddTreeCell(MibTree& tree, TreeCell* cell) {
  // The host registers mostly in OID order: appending needs no walk.
  if (tree.tail == nullptr || CompareOid(cell->oid, tree.tail->oid) > 0) {
    LinkBefore(tree, cell, nullptr);
    return true;
  }
  for (TreeCell* other = tree.head; other != nullptr; other = other->next) {
    int order = CompareOid(cell->oid, other->oid);
    if (order == 0) {
      MergeIntoExisting(other, *cell);
      return false;
    }
    if (order < 0) {
      LinkBefore(tree, cell, other);
      return true;
    }
  }
  return false;  // not reached: the cell is below the tail
}

void PrintTreeCell(const TreeCell& cell) {
  if (!LogEnabled(kLogTrace)) return;
  LogWrite("%s %s\n Is Table Oid ?:%c\n", cell.label.c_str(), OidToText(cell.oid).c_str(),
           cell.isTable ? 'Y' : 'N');
  LogWrite("\nsubId\taccess\ttype\n");
  for (std::size_t i = 0; i < cell.subIds.size(); ++i) {
    LogWrite("%ld\t%d\t%d\n", static_cast<long>(cell.subIds[i]), cell.access[i], cell.dataTypes[i]);
  }
}

void SetHandlers(const DefaultHandlers& handlers, TreeCell* cell) {
  if (cell->engineRead != nullptr) {
    cell->readHandler = cell->engineRead;
    return;
  }
  cell->readHandler = cell->isTable ? handlers.tableRead : handlers.scalarRead;
  cell->writeHandler = cell->isTable ? handlers.tableWrite : handlers.scalarWrite;
}

// Caller holds the tree exclusively.
void RegisterOID(MibTree& tree, std::unique_ptr<TreeCell> cell) {
  SetHandlers(tree.handlers, cell.get());
  cell->prev = cell->next = nullptr;
  if (!AddTreeCell(tree, cell.get())) return;
  PrintTreeCell(*cell);
  tree.registered.push_back(std::move(cell));
}

std::unique_ptr<TreeCell> SliceCell(const TreeCell& cell, std::size_t begin, std::size_t end) {
  auto part = std::make_unique<TreeCell>();
  part->label = cell.label;
  part->smiVersion = cell.smiVersion;
  part->oid = cell.oid;
  part->isTable = cell.isTable;
  part->rowStatusColumn = cell.rowStatusColumn;
  part->engineRead = cell.engineRead;
  std::vector<Column> columns = ColumnsOf(cell);
  SetColumns(part.get(),
             std::vector<Column>(columns.begin() + static_cast<std::ptrdiff_t>(begin),
                                 columns.begin() + static_cast<std::ptrdiff_t>(end)),
             cell.hasSyntaxes);
  return part;
}

// The index of the last column before the first break in the sequence, or the column count.
std::size_t FirstGap(const std::vector<std::uint32_t>& subIds) {
  for (std::size_t k = 0; k + 1 < subIds.size(); ++k) {
    if (std::uint64_t{subIds[k + 1]} != std::uint64_t{subIds[k]} + 1) return k;
  }
  return subIds.size();
}

// A scalar group whose scalars are not consecutive becomes one cell per consecutive run. Each
// run's cell OID is the OID of its last scalar, so that the runs order among themselves and the
// other cells whichever scalar of the group the host named.
void RegisterScalarRuns(MibTree& tree, std::unique_ptr<TreeCell> group) {
  bool split = false;
  for (std::size_t k = FirstGap(group->subIds); k < group->subIds.size();
       k = FirstGap(group->subIds)) {
    std::unique_ptr<TreeCell> run = SliceCell(*group, 0, k + 1);
    run->oid.back() = group->subIds[k];
    RegisterOID(tree, std::move(run));
    group = SliceCell(*group, k + 1, group->subIds.size());
    split = true;
  }
  if (split) group->oid.back() = group->subIds.back();
  RegisterOID(tree, std::move(group));
}

// ---- Lookup ----

// A Set is looked up like a Get, a GetBulk like a GetNext; anything else like a Get.
bool IsNextLookup(std::uint8_t pduType) {
  return pduType == kGetNextRequest || pduType == kGetBulkRequest;
}

void AppendCandidate(const TreeCell& cell, std::uint32_t subId, bool next, Oid* candidate) {
  if (cell.isTable) candidate->push_back(1);
  candidate->push_back(subId);
  if (!cell.isTable && !next) candidate->push_back(0);
}

// Whether oid lies under one of the cell's objects (a scalar, or a column of the table).
bool NamesObjectOf(const TreeCell& cell, std::span<const std::uint32_t> oid) {
  std::span<const std::uint32_t> base = cell.Base();
  std::size_t at = base.size() + (cell.isTable ? 1 : 0);
  if (oid.size() <= at || !std::equal(base.begin(), base.end(), oid.begin())) return false;
  if (cell.isTable && oid[base.size()] != 1) return false;
  return cell.ColumnPosition(oid[at]) >= 0;
}

// A Get met a candidate that is not below the requested OID (order is CompareOid(oid, candidate)).
bool AnswersGet(const TreeCell& cell, int order, std::uint8_t* errorCode) {
  if (order == 0 && !cell.isTable) {
    LOG_TRACE("\nThe GET element is %s\n", cell.label.c_str());
    return true;
  }
  if (order == 2 && cell.isTable) return true;  // the rest of the OID is the row instance
  if (order == 0) {
    LOG_TRACE("1. The specified oid is not found !!!\n");
    *errorCode = kNoSuchInstance;
  } else if (order == 2) {
    LOG_TRACE("3. The specified oid is not found !!!\n");
    *errorCode = kNoSuchInstance;
  } else {
    LOG_TRACE("2. The specified oid is not found !!!\n");
    *errorCode = cell.isTable ? kNoSuchObject : kNoSuchInstance;
  }
  return false;
}

}  // namespace

bool CreateAndRegisterCell(const TreeCellRegistration& registration) {
  std::unique_ptr<TreeCell> cell = BuildCell(registration);
  if (!cell) return false;
  MibTree& tree = Tree();
  std::unique_lock lock(tree.mutex);
  if (!cell->isTable && cell->hasSyntaxes) {
    RegisterScalarRuns(tree, std::move(cell));
  } else {
    RegisterOID(tree, std::move(cell));
  }
  return true;
}

void SetDefaultCellHandlers(ReadHandler scalarRead, WriteHandler scalarWrite, ReadHandler tableRead,
                            WriteHandler tableWrite) {
  MibTree& tree = Tree();
  std::unique_lock lock(tree.mutex);
  tree.handlers = {scalarRead, scalarWrite, tableRead, tableWrite};
  for (const auto& cell : tree.registered) SetHandlers(tree.handlers, cell.get());
}

int StoreTreeCellsRefInArray() {
  MibTree& tree = Tree();
  std::unique_lock lock(tree.mutex);
  tree.searchArray.clear();
  tree.searchArray.reserve(tree.registered.size());
  for (TreeCell* cell = tree.head;
       cell != nullptr && tree.searchArray.size() < tree.registered.size(); cell = cell->next) {
    tree.searchArray.push_back(cell);
  }
  return static_cast<int>(tree.searchArray.size());
}

void FreeTreeCells() {
  MibTree& tree = Tree();
  std::unique_lock lock(tree.mutex);
  tree.searchArray.clear();
  tree.head = tree.tail = nullptr;
  tree.registered.clear();
}

int RegisteredCellCount() {
  MibTree& tree = Tree();
  std::shared_lock lock(tree.mutex);
  return static_cast<int>(tree.registered.size());
}

// Candidates are the cell's column OIDs in the form a request names them: base.subId.0 for a Get
// of a scalar, base.subId for a GetNext of one, base.1.subId (the entry's column) for a table.
bool CompareSubIdLists(std::uint8_t pduType, const TreeCell& cell,
                       std::span<const std::uint32_t> oid, std::uint8_t* errorCode) {
  bool next = IsNextLookup(pduType);
  std::span<const std::uint32_t> base = cell.Base();
  Oid candidate(base.begin(), base.end());
  candidate.reserve(base.size() + 2);
  for (std::uint32_t subId : cell.subIds) {
    candidate.resize(base.size());
    AppendCandidate(cell, subId, next, &candidate);
    int order = CompareOid(oid, candidate);
    if (order == 1) continue;  // the requested OID lies beyond this column
    if (!next) return AnswersGet(cell, order, errorCode);
    LOG_TRACE("The GET-NEXT element is : %s\n", OidToText(candidate).c_str());
    return true;
  }
  return false;
}

// Callers hold a MibTreeReadLock. The search ends between a start cell (the last whose OID is
// below the request, else the first) and its successor; one of the two answers.
TreeCell* GetTreeCell(std::uint8_t pduType, std::span<const std::uint32_t> oid,
                      std::uint8_t* errorCode) {
  std::uint8_t ignored = 0;
  if (errorCode == nullptr) errorCode = &ignored;
  *errorCode = 0;
  const std::vector<TreeCell*>& cells = Tree().searchArray;
  if (cells.empty()) {
    *errorCode = kNoSuchInstance;
    return nullptr;
  }
  std::size_t lo = 0;
  std::size_t hi = cells.size();
  TreeCell* start = cells[0];
  if (start == nullptr || start->oid.empty()) {
    LOG_ERROR("!!! The cells are not yet registered. Query after some time\n");
    return nullptr;
  }
  TreeCell* end = nullptr;
  while (hi - lo != 1) {
    std::size_t mid = lo + (hi - lo + 1) / 2;
    TreeCell* cell = cells[mid];
    if (cell == nullptr || cell->oid.empty()) {
      LOG_ERROR("!!! The cells are not yet registered. Query after some time\n");
      return nullptr;
    }
    int order = CompareOid(oid, cell->oid);
    if (order == 0) {
      if (IsNextLookup(pduType)) return cell;
      *errorCode = kNoSuchInstance;
      return nullptr;
    }
    if (order > 0) {
      lo = mid;
      start = cell;
    } else {
      hi = mid;
      end = cell;
    }
  }
  std::uint8_t startCode = 0;
  if (CompareSubIdLists(pduType, *start, oid, &startCode)) return start;
  std::uint8_t endCode = 0;
  if (end != nullptr && CompareSubIdLists(pduType, *end, oid, &endCode)) return end;
  // An object that exists without the requested instance is noSuchInstance; an OID under no
  // registered object is noSuchObject, whichever neighbour cell was asked.
  bool objectExists = NamesObjectOf(*start, oid) || (end != nullptr && NamesObjectOf(*end, oid));
  *errorCode = objectExists ? kNoSuchInstance : kNoSuchObject;
  return nullptr;
}

TreeCell* GetTreeCellByName(const std::string& label) {
  MibTree& tree = Tree();
  std::shared_lock lock(tree.mutex);
  for (TreeCell* cell = tree.head; cell != nullptr; cell = cell->next) {
    if (cell->label == label) return cell;
  }
  return nullptr;
}

std::optional<std::string> GetNextGroupOid(const std::string& oidText) {
  Oid oid;
  if (!ParseOidText(oidText, &oid)) return std::nullopt;
  MibTree& tree = Tree();
  std::shared_lock lock(tree.mutex);
  std::uint8_t errorCode = 0;
  const TreeCell* cell = GetTreeCell(kGetNextRequest, oid, &errorCode);
  if (cell == nullptr || cell->next == nullptr) return std::nullopt;
  std::string text = OidToText(cell->next->oid);
  if (cell->next->isTable) text += ".1";
  return text;
}

MibTreeReadLock::MibTreeReadLock() { Tree().mutex.lock_shared(); }
MibTreeReadLock::~MibTreeReadLock() { Tree().mutex.unlock_shared(); }

}  // namespace tessel
