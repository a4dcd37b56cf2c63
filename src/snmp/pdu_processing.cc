#include "snmp/pdu_processing.h"

#include <algorithm>
#include <array>
#include <climits>

#include "engine/log.h"
#include "snmp/ber.h"
#include "snmp/scrambler.h"
#include "snmp/value_text.h"

namespace tessel {
namespace {

// What every binding of one request is answered under.
struct Context {
  std::uint8_t pduType;  // kGetRequest, kGetNextRequest or kSetRequest
  std::int32_t version;
  const AgentSession& agent;
  const SecurityAccess* access = nullptr;
  std::string* viewCache = nullptr;  // the view chosen for this request (SNMPv3)
};

// The SNMPv3 view check for one object: 1 allowed, else the error status.
std::int32_t CheckAccess(const Context& context, std::uint8_t pduType, const Oid& oid) {
  if (context.access == nullptr || context.access->isAccessAllowed == nullptr) return 1;
  int result = context.access->isAccessAllowed(*context.access, pduType, oid, context.viewCache);
  if (result == 1) return 1;
  LOG_TRACE("Access is denied in VACM !!!\n");
  return result == kAuthorizationError ? kAuthorizationError : kGenErr;
}

// A binding's outcome: an answer, or an error status for the whole request.
struct Answer {
  std::int32_t error = kNoError;
  VarBind binding;
};

Answer Failed(std::int32_t error) { return Answer{error, {}}; }

Answer Answered(Oid name, VarValue value) {
  Answer answer;
  answer.binding.name = std::move(name);
  answer.binding.value = std::move(value);
  answer.binding.state = kVarBindAnswered;
  return answer;
}

// The bindings that one tree cell answers, in request order.
struct Holder {
  const TreeCell* cell = nullptr;
  std::uint8_t cellError = 0;  // why no cell answers
  std::vector<std::size_t> members;
};

bool IsV1(const Context& context) { return context.version == kSnmpV1; }

// SNMPv1 cannot carry Counter64: such instances do not exist for a v1 manager.
bool HiddenFromV1(const Context& context, const VarValue& value) {
  return IsV1(context) && value.type == kAsnCounter64;
}

// Points oid at the first instance of the column: base.1.column (table) or base.column.0.
void SetColumn(const TreeCell& cell, std::uint32_t subId, Oid* oid) {
  std::span<const std::uint32_t> base = cell.Base();
  oid->assign(base.begin(), base.end());
  if (cell.isTable) {
    oid->push_back(1);
    oid->push_back(subId);
  } else {
    oid->push_back(subId);
    oid->push_back(0);
  }
}

// Position of the first registered column at or after oid's column, rewriting oid when the
// column is not registered; -1 when no column follows.
int ColumnAtOrAfter(const TreeCell& cell, Oid* oid) {
  std::size_t at = cell.Base().size() + (cell.isTable ? 1 : 0);
  std::uint32_t column = at < oid->size() ? (*oid)[at] : 0;
  for (std::size_t i = 0; i < cell.subIds.size(); ++i) {
    if (cell.subIds[i] == column) return static_cast<int>(i);
    if (cell.subIds[i] > column) {
      LOG_TRACE("New oid is \n");
      SetColumn(cell, cell.subIds[i], oid);
      return static_cast<int>(i);
    }
  }
  return -1;
}

bool Readable(std::uint8_t access) {
  return access != kAccessNotAccessible && access != kAccessNone;
}

TesselStruct Target(const TreeCell& cell, const Context& context) {
  return TesselStruct{&context.agent, &cell};
}

// The next cell of the tree with oid at its base, or nullptr at the end of the MIB.
const TreeCell* EnterNextCell(const TreeCell* cell, Oid* oid) {
  const TreeCell* next = cell->next;
  if (next) {
    std::span<const std::uint32_t> base = next->Base();
    oid->assign(base.begin(), base.end());
  }
  return next;
}

// The end of the walk: endOfMibView, or noSuchName for an SNMPv1 manager.
Answer EndOfMib(const Context& context, const Oid& requested) {
  LOG_TRACE("End Of Mib View is reached.\n");
  if (IsV1(context)) return Failed(kNoSuchName);
  return Answered(requested, VarValue::Empty(kEndOfMibView));
}

// kAgain: the object answered lies outside the manager's view; the walk goes on after it in the
// same column.
enum class Step { kAnswered, kMoveOn, kAgain, kFailed };

// Reads one column for a GetNext: the answer, a reason to move to the next column, or an error.
Step ReadNextInColumn(const TreeCell& cell, int position, Oid* oid, const Context& context,
                      Answer* answer) {
  if (!Readable(cell.access[static_cast<std::size_t>(position)])) {
    LOG_TRACE("Access is denied for this oid !!!\n");
    return Step::kMoveOn;
  }
  std::uint8_t error = 0;
  std::optional<VarValue> value =
      cell.readHandler(kGetNextRequest, oid, &error, Target(cell, context));
  if (value) {
    if (HiddenFromV1(context, *value)) return Step::kMoveOn;
    if (CheckAccess(context, kGetNextRequest, *oid) != 1)
      return cell.isTable ? Step::kAgain : Step::kMoveOn;
    *answer = Answered(*oid, std::move(*value));
    return Step::kAnswered;
  }
  if (error == 0 || IsExceptionType(error) || error == kNoAccess) return Step::kMoveOn;
  *answer = Failed(error);
  return Step::kFailed;
}

// GetNext: the first object after `requested`, starting the walk at cell.
Answer WalkNext(const TreeCell* cell, const Oid& requested, const Context& context) {
  Oid oid = requested;
  while (cell) {
    int position = -1;
    if (cell->readHandler && GetNextOid(*cell, &oid)) position = ColumnAtOrAfter(*cell, &oid);
    while (position >= 0) {
      Answer answer;
      Step step = ReadNextInColumn(*cell, position, &oid, context, &answer);
      if (step == Step::kAgain) continue;
      if (step != Step::kMoveOn) return answer;
      if (static_cast<std::size_t>(++position) == cell->subIds.size()) break;
      SetColumn(*cell, cell->subIds[static_cast<std::size_t>(position)], &oid);
    }
    cell = EnterNextCell(cell, &oid);
  }
  return EndOfMib(context, requested);
}

// RowStatus answers repeat what the manager asked for, not the state the row reached.
void ApplyRowStatusIntent(const TreeCell& cell, std::uint32_t column, const VarValue& request,
                          VarValue* response) {
  if (!cell.isTable || cell.smiVersion != 1 || cell.rowStatusColumn <= 0 ||
      column != static_cast<std::uint32_t>(cell.rowStatusColumn) || response->type != kAsnInteger) {
    return;
  }
  std::int32_t asked = request.type == kAsnInteger ? request.AsInt32() : 0;
  std::int32_t reached = response->AsInt32();
  if (reached == 0) *response = VarValue::Integer(6);
  if (asked == 4 && reached == 1) *response = VarValue::Integer(4);
  if (asked == 5 && reached == 2) *response = VarValue::Integer(5);
}

Answer WriteExact(const TreeCell& cell, int position, const VarBind& binding,
                  const Context& context) {
  std::uint8_t error = 0;
  std::optional<VarValue> value =
      cell.writeHandler(binding.name, binding.value, &error, Target(cell, context));
  if (value) {
    ApplyRowStatusIntent(cell, cell.subIds[static_cast<std::size_t>(position)], binding.value,
                         &*value);
    return Answered(binding.name, std::move(*value));
  }
  LOG_ERROR("Bad value, not able to perform set operation !!!\n");
  if (IsExceptionType(error)) return Failed(kCommitFailed);
  return Failed(error == 0 ? kGenErr : error);
}

Answer ReadExact(const TreeCell& cell, const VarBind& binding, const Context& context) {
  Oid oid = binding.name;
  std::uint8_t error = 0;
  std::optional<VarValue> value =
      cell.readHandler(kGetRequest, &oid, &error, Target(cell, context));
  if (value) {
    if (HiddenFromV1(context, *value)) return Failed(kNoSuchName);
    return Answered(binding.name, std::move(*value));
  }
  if (IsExceptionType(error)) {
    if (IsV1(context)) return Failed(kNoSuchName);
    return Answered(binding.name, VarValue::Empty(error));
  }
  return Failed(error == 0 ? kGenErr : error);
}

// Position of the column that exactly the named instance lies in, -1 when none of the cell's.
int ExactColumn(const TreeCell* cell, const Oid& name) {
  if (cell == nullptr) return -1;
  std::size_t at = cell->Base().size() + (cell->isTable ? 1 : 0);
  return at < name.size() ? cell->ColumnPosition(name[at]) : -1;
}

// Get of exactly the named instance.
Answer AnswerExact(const Holder& holder, const VarBind& binding, const Context& context) {
  if (std::int32_t allowed = CheckAccess(context, context.pduType, binding.name); allowed != 1) {
    return Failed(allowed);
  }
  const TreeCell* cell = holder.cell;
  int position = ExactColumn(cell, binding.name);
  if (position < 0 || cell->readHandler == nullptr) {
    LOG_TRACE("The tree don't have the cell for the requested oid\n");
    if (IsV1(context)) return Failed(kNoSuchName);
    std::uint8_t exception = IsExceptionType(holder.cellError) ? holder.cellError : kNoSuchObject;
    return Answered(binding.name, VarValue::Empty(exception));
  }
  if (!Readable(cell->access[static_cast<std::size_t>(position)])) {
    LOG_TRACE("Access is denied for this oid !!!\n");
    return Failed(kNoAccess);
  }
  return ReadExact(*cell, binding, context);
}

// What a Set binding is checked against before anything is written: the manager's view, a
// writable column, and a value of the column's type. kNoError with *position set to the column,
// or the binding's error status.
std::int32_t CheckWrite(const TreeCell* cell, const VarBind& binding, const Context& context,
                        int* position) {
  if (std::int32_t allowed = CheckAccess(context, kSetRequest, binding.name); allowed != 1) {
    return allowed;
  }
  *position = ExactColumn(cell, binding.name);
  if (*position < 0 || cell->writeHandler == nullptr) {
    LOG_TRACE("The tree don't have the cell for the requested oid\n");
    return kNotWritable;
  }
  auto column = static_cast<std::size_t>(*position);
  if (!Readable(cell->access[column])) {
    LOG_TRACE("Access is denied for this oid !!!\n");
    return kNoAccess;
  }
  if (cell->access[column] == kAccessReadOnly) {
    LOG_TRACE("Trying to set to RONLY variable !!!\n");
    return kNotWritable;
  }
  std::uint8_t error = 0;
  std::string syntax = column < cell->syntaxes.size() ? cell->syntaxes[column] : std::string();
  std::uint8_t dataType = column < cell->dataTypes.size() ? cell->dataTypes[column] : 0;
  if (!SetValueText(dataType, syntax, binding.value, &error)) return error;
  return kNoError;
}

// A Set binding that passed its checks, and what its object held before the Set.
struct PlannedWrite {
  std::size_t index;
  const TreeCell* cell;
  int position;
  std::optional<VarValue> before;
};

std::optional<VarValue> ReadBefore(const PlannedWrite& write, const Oid& name,
                                   const Context& context) {
  if (write.cell->readHandler == nullptr) return std::nullopt;
  Oid oid = name;
  std::uint8_t error = 0;
  return write.cell->readHandler(kGetRequest, &oid, &error, Target(*write.cell, context));
}

// Writes back what the objects held before, latest first; false when one could not be.
bool Restore(std::span<const PlannedWrite> made, const VarBindList& bindings,
             const Context& context) {
  bool restored = true;
  for (auto write = made.rbegin(); write != made.rend(); ++write) {
    std::uint8_t error = 0;
    if (!write->before || !write->cell->writeHandler(bindings[write->index].name, *write->before,
                                                     &error, Target(*write->cell, context))) {
      LOG_ERROR("Could not write back the value of %s\n",
                OidToText(bindings[write->index].name).c_str());
      restored = false;
    }
  }
  return restored;
}

// The failing binding with the lowest index, which the reply reports.
struct FirstFailure {
  std::size_t index = SIZE_MAX;
  std::int32_t status = kNoError;

  void Note(std::size_t at, std::int32_t error) {
    if (at < index) {
      index = at;
      status = error;
    }
  }
  std::int32_t ErrorIndex() const {
    return status == kNoError ? 0 : static_cast<std::int32_t>(index + 1);
  }
};

// Groups the bindings by the cell that answers each, in order of first appearance.
std::vector<Holder> CreateHolders(const VarBindList& bindings, const Context& context) {
  std::vector<Holder> holders;
  for (std::size_t i = 0; i < bindings.size(); ++i) {
    std::uint8_t error = 0;
    TreeCell* cell = GetTreeCell(context.pduType, bindings[i].name, &error);
    auto same = std::find_if(holders.begin(), holders.end(),
                             [cell](const Holder& holder) { return cell && holder.cell == cell; });
    if (same == holders.end()) {
      holders.push_back(Holder{cell, error, {}});
      same = holders.end() - 1;
    }
    same->members.push_back(i);
  }
  return holders;
}

// Answers every binding of a Get or GetNext (answers aligned with bindings). Returns the error
// status of the binding with the lowest index that failed, and that index (1-based) in
// *errorIndex; bindings after a failed one are not processed.
std::int32_t ProcessVarBinds(const VarBindList& bindings, const Context& context,
                             VarBindList* answers, std::int32_t* errorIndex) {
  answers->assign(bindings.size(), VarBind{});
  FirstFailure failure;
  for (const Holder& holder : CreateHolders(bindings, context)) {
    for (std::size_t i : holder.members) {
      if (i > failure.index) continue;
      Answer answer = context.pduType == kGetNextRequest
                          ? WalkNext(holder.cell, bindings[i].name, context)
                          : AnswerExact(holder, bindings[i], context);
      if (answer.error != kNoError) {
        failure.Note(i, answer.error);
        continue;
      }
      answer.binding.index = static_cast<std::uint32_t>(i + 1);
      (*answers)[i] = std::move(answer.binding);
    }
  }
  *errorIndex = failure.ErrorIndex();
  return failure.status;
}

// A Set changes every object it names or none: every binding is checked before the first write,
// and when the host still refuses a write, the objects already written get their earlier values
// back. When one of those cannot be written back the Set ends with undoFailed and index 0.
std::int32_t ProcessSetVarBinds(const VarBindList& bindings, const Context& context,
                                VarBindList* answers, std::int32_t* errorIndex) {
  answers->assign(bindings.size(), VarBind{});
  FirstFailure failure;
  std::vector<PlannedWrite> writes;
  for (const Holder& holder : CreateHolders(bindings, context)) {
    for (std::size_t i : holder.members) {
      int position = -1;
      std::int32_t error = CheckWrite(holder.cell, bindings[i], context, &position);
      if (error != kNoError) {
        failure.Note(i, error);
      } else {
        writes.push_back(PlannedWrite{i, holder.cell, position, {}});
      }
    }
  }
  *errorIndex = failure.ErrorIndex();
  if (failure.status != kNoError) return failure.status;
  for (PlannedWrite& write : writes)
    write.before = ReadBefore(write, bindings[write.index].name, context);
  for (std::size_t made = 0; made < writes.size(); ++made) {
    const PlannedWrite& write = writes[made];
    Answer answer = WriteExact(*write.cell, write.position, bindings[write.index], context);
    if (answer.error != kNoError) {
      bool restored = Restore(std::span(writes).first(made), bindings, context);
      *errorIndex = restored ? static_cast<std::int32_t>(write.index + 1) : 0;
      return restored ? answer.error : kUndoFailed;
    }
    answer.binding.index = static_cast<std::uint32_t>(write.index + 1);
    (*answers)[write.index] = std::move(answer.binding);
  }
  return kNoError;
}

// The octets the bindings take in a reply.
std::size_t EncodedSize(const VarBindList& bindings, std::size_t from) {
  thread_local std::array<std::uint8_t, kMaxSnmpMessage> scratch;
  std::size_t total = 0;
  for (std::size_t i = from; i < bindings.size(); ++i) {
    std::int32_t remaining = static_cast<std::int32_t>(scratch.size());
    const VarBind& binding = bindings[i];
    std::uint8_t* end = BuildVarOp(scratch.data(), binding.name.data(), binding.name.size(),
                                   binding.value, &remaining);
    total += end ? static_cast<std::size_t>(end - scratch.data()) : scratch.size();
  }
  return total;
}

bool AllEndOfMib(const VarBindList& bindings) {
  return std::all_of(bindings.begin(), bindings.end(),
                     [](const VarBind& binding) { return binding.value.type == kEndOfMibView; });
}

}  // namespace

bool GetNextOid(const TreeCell& cell, Oid* oid) {
  if (cell.subIds.empty()) return false;
  std::span<const std::uint32_t> base = cell.Base();
  std::size_t common = std::min(oid->size(), base.size());
  int order = CompareOid(std::span<const std::uint32_t>(oid->data(), common), base.first(common));
  if (order > 0) return false;
  if (order < 0 || oid->size() <= base.size()) {
    SetColumn(cell, cell.subIds.front(), oid);
    return true;
  }
  std::uint32_t below = (*oid)[base.size()];
  if (cell.isTable) {
    if (below > 1) return false;
    if (below < 1 || oid->size() == base.size() + 1) SetColumn(cell, cell.subIds.front(), oid);
    return true;
  }
  if (oid->size() == base.size() + 1) {
    oid->push_back(0);
    return true;
  }
  auto next = std::upper_bound(cell.subIds.begin(), cell.subIds.end(), below);
  if (next == cell.subIds.end()) return false;
  SetColumn(cell, *next, oid);
  return true;
}

std::int32_t ProcessPDU(SnmpPdu* pdu, const AgentSession& agent, const SecurityAccess* access) {
  ScrambleIfOn(pdu, agent, false);
  pdu->errorStatus = kNoError;
  pdu->errorIndex = 0;
  MibTreeReadLock tree;
  std::string viewCache;
  Context context{pdu->type, pdu->version, agent, access, &viewCache};
  VarBindList answers;
  auto process = pdu->type == kSetRequest ? ProcessSetVarBinds : ProcessVarBinds;
  pdu->errorStatus = process(pdu->requestVarBinds, context, &answers, &pdu->errorIndex);
  if (pdu->errorStatus == kNoError) pdu->responseVarBinds = std::move(answers);
  return pdu->errorStatus;
}

std::int32_t ProcessGetBulkVarBinds(SnmpPdu* pdu, const AgentSession& agent,
                                    const SecurityAccess* access) {
  ScrambleIfOn(pdu, agent, false);
  std::size_t count = pdu->requestVarBinds.size();
  std::size_t nonRepeaters =
      std::min<std::size_t>(static_cast<std::size_t>(std::max(pdu->errorStatus, 0)), count);
  std::int64_t maxRepetitions = std::max(pdu->errorIndex, 0);
  pdu->errorStatus = kNoError;
  pdu->errorIndex = 0;
  MibTreeReadLock tree;
  std::string viewCache;
  Context context{kGetNextRequest, pdu->version, agent, access, &viewCache};
  VarBindList request = pdu->requestVarBinds;
  if (maxRepetitions == 0) request.resize(nonRepeaters);
  std::size_t repeaters = request.size() - nonRepeaters;

  VarBindList answers;
  std::int32_t failedIndex = 0;
  if (ProcessVarBinds(request, context, &answers, &failedIndex) != kNoError) {
    pdu->errorStatus = kGenErr;
    pdu->errorIndex = failedIndex;
    return kGenErr;
  }
  pdu->responseVarBinds = std::move(answers);
  std::size_t budget = kMaxSnmpMessage;
  std::size_t used = EncodedSize(pdu->responseVarBinds, 0);
  for (std::int64_t pass = 1; pass < maxRepetitions && repeaters > 0 && used < budget; ++pass) {
    VarBindList& all = pdu->responseVarBinds;
    VarBindList next(all.end() - static_cast<std::ptrdiff_t>(repeaters), all.end());
    if (AllEndOfMib(next)) break;
    if (ProcessVarBinds(next, context, &answers, &failedIndex) != kNoError) {
      pdu->errorStatus = kGenErr;
      pdu->errorIndex = failedIndex;
      return kGenErr;
    }
    used += EncodedSize(answers, 0);
    all.insert(all.end(), std::make_move_iterator(answers.begin()),
               std::make_move_iterator(answers.end()));
  }
  return kNoError;
}

}  // namespace tessel
