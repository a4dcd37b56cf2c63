#include "snmp/handlers.h"

#include <cstddef>
#include <string_view>

#include "engine/agent.h"
#include "engine/log.h"
#include "snmp/pdu.h"
#include "snmp/value_adapters.h"
#include "snmp/value_text.h"

namespace tessel {
namespace {

struct ColumnData {
  std::uint8_t dataType = 0;
  std::optional<std::string> syntax;
};

ColumnData LookUpColumn(const TreeCell& cell, std::uint32_t subId) {
  int position = cell.ColumnPosition(subId);
  if (position < 0 || static_cast<std::size_t>(position) >= cell.dataTypes.size()) {
    LOG_ERROR(" no column %u found in Oid printed below\n%s\n", subId, OidToText(cell.oid).c_str());
    return {};
  }
  ColumnData data{cell.dataTypes[static_cast<std::size_t>(position)], std::nullopt};
  if (static_cast<std::size_t>(position) < cell.syntaxes.size()) {
    data.syntax = cell.syntaxes[static_cast<std::size_t>(position)];
  }
  return data;
}

// Agents store their configured port minus one; Get-type calls tell the host the configured
// port, Set calls the stored one.
enum class CallKind { kRead, kWrite };

// The fields every value call carries: the cell, the column, and the agent asked.
HostValueQuery BaseQuery(const TesselStruct& target, std::uint32_t subId, CallKind kind) {
  const TreeCell& cell = *target.cell;
  ColumnData column = LookUpColumn(cell, subId);
  HostValueQuery query;
  query.label = cell.label;
  query.subId = UIntToText(subId);
  query.column = static_cast<std::int32_t>(subId);
  query.dataType = column.dataType;
  query.syntax = column.syntax;
  query.rowStatusColumn = cell.rowStatusColumn;
  if (target.agent != nullptr) {
    const AgentSession& agent = *target.agent;
    query.agentAddress = agent.transport.localAddress;
    query.agentPort = static_cast<std::int32_t>(agent.transport.configuredPortMinusOne) +
                      (kind == CallKind::kRead ? 1 : 0);
    if (agent.agentInfo) {
      query.databaseName = agent.agentInfo->databaseName;
      query.tableName = agent.agentInfo->tableName;
      query.agentId = agent.agentInfo->agentId;
    }
  }
  LOG_TRACE("agent %d (%s#%d) db %s table %s\n", query.agentId, query.agentAddress.c_str(),
            query.agentPort, query.databaseName.c_str(), query.tableName.c_str());
  return query;
}

// A scalar OID is group . sub-identifier . instance; the host always gets the instance ".0".
std::optional<HostValueQuery> ScalarQuery(const Oid& oid, const TesselStruct& target,
                                          CallKind kind) {
  if (target.cell == nullptr || oid.size() < 3) {
    LOG_ERROR("Converting OID to String failed \n");
    return std::nullopt;
  }
  HostValueQuery query = BaseQuery(target, oid[oid.size() - 2], kind);
  query.objectOid = OidToText(std::span<const std::uint32_t>(oid.data(), oid.size() - 2));
  query.instance = ".0";
  return query;
}

// A table OID is table . 1 . column . instance; the host gets the entry OID (table . 1), the
// column, and the instance with a dot before each sub-identifier (null when there is none).
std::optional<HostValueQuery> TableQuery(const Oid& oid, const TesselStruct& target,
                                         CallKind kind) {
  std::size_t tableLength = target.cell == nullptr ? 0 : target.cell->oid.size();
  if (target.cell == nullptr || oid.size() < tableLength + 2) {
    LOG_ERROR("Forming Oid  failed \n");
    return std::nullopt;
  }
  HostValueQuery query = BaseQuery(target, oid[tableLength + 1], kind);
  query.objectOid = OidToText(target.cell->oid) + ".1";
  if (oid.size() > tableLength + 2) {
    query.instance = OidToText(std::span<const std::uint32_t>(oid).subspan(tableLength + 2));
    LOG_TRACE("instanceString %s\n", query.instance->c_str());
  }
  LOG_TRACE("Column Number :%s**** \n", query.subId.c_str());
  return query;
}

// The value of a host's answer text; *errorCode is 0 with a value, genErr when the text does
// not convert, and left as the adapter set it when there was no text.
std::optional<VarValue> ConvertAnswer(const std::optional<std::string>& text, std::uint8_t dataType,
                                      const std::optional<std::string>& syntax,
                                      std::uint8_t* errorCode) {
  if (!text) {
    LOG_TRACE("NULL returned\n");
    return std::nullopt;
  }
  std::optional<VarValue> value = TextToVarValue(dataType, syntax.value_or(""), *text);
  if (!value) {
    LOG_ERROR("unable to convert to varVal from String \noidValString =%s\ntype = %d \n",
              text->c_str(), dataType);
    *errorCode = kGenErr;
    return std::nullopt;
  }
  *errorCode = 0;
  return value;
}

using SetAdapter = std::optional<std::string> (*)(const HostValueQuery&, std::uint8_t*);

// Sends a Set to the host; the response repeats the value set.
std::optional<VarValue> StoreValue(SetAdapter adapter, HostValueQuery query, const VarValue& value,
                                   std::uint8_t* errorCode) {
  std::optional<std::string> text = SetValueText(static_cast<std::uint8_t>(query.dataType),
                                                 query.syntax.value_or(""), value, errorCode);
  if (!text) return std::nullopt;
  query.valueText = std::move(*text);
  if (!adapter(query, errorCode)) return std::nullopt;
  *errorCode = 0;
  return value;
}

// The largest registered sub-identifier below subId, 0 when there is none.
std::uint32_t PreviousSubId(const TreeCell& cell, std::uint32_t subId) {
  std::uint32_t previous = 0;
  for (std::uint32_t registered : cell.subIds) {
    if (registered < subId) previous = registered;
  }
  return previous;
}

// The registered column after column and its data type; -1 and 0 after the last.
void NextColumn(const TreeCell& cell, std::uint32_t column, HostValueQuery* query) {
  for (std::size_t i = 0; i < cell.subIds.size(); ++i) {
    if (cell.subIds[i] > column) {
      query->nextColumn = static_cast<std::int32_t>(cell.subIds[i]);
      query->nextDataType = i < cell.dataTypes.size() ? cell.dataTypes[i] : 0;
      return;
    }
  }
  query->nextColumn = -1;
  query->nextDataType = 0;
}

// The OID a table GetNext answered: the entry OID followed by the host's column-and-instance
// text. Refused unless it is well formed, fits an OID, and lies strictly after the requested
// OID: a host that answered the same or an earlier object would make a walk endless.
std::optional<Oid> AnsweredOid(const std::string& entryOid, std::string_view columnAndInstance,
                               const Oid& requested) {
  if (!columnAndInstance.empty() && columnAndInstance.front() == '.')
    columnAndInstance.remove_prefix(1);
  std::string text = entryOid + "." + std::string(columnAndInstance);
  LOG_TRACE("columnAndnextInstance ::::::: %s\n", std::string(columnAndInstance).c_str());
  LOG_TRACE("parentOidAsString :::: %s\n", entryOid.c_str());
  Oid answered;
  if (ParseDottedText(&answered, text, false) <= 0 || answered.size() > kMaxOidLength ||
      CompareOid(answered, requested) <= 0) {
    LOG_ERROR("The host answered the unusable OID %s after %s\n", text.c_str(),
              OidToText(requested).c_str());
    return std::nullopt;
  }
  return answered;
}

std::optional<VarValue> TableProcessGetMsg(const Oid& oid, std::uint8_t* errorCode,
                                           const TesselStruct& target) {
  std::optional<HostValueQuery> query = TableQuery(oid, target, CallKind::kRead);
  if (!query) {
    LOG_ERROR("Forming Oid  failed  in TableProcessGetMsg \n");
    *errorCode = kGenErr;
    return std::nullopt;
  }
  std::optional<std::string> text = AdapterTableGetOidVal(*query, errorCode);
  return ConvertAnswer(text, static_cast<std::uint8_t>(query->dataType), query->syntax, errorCode);
}

std::optional<VarValue> TableProcessGetNextMsg(Oid* oid, std::uint8_t* errorCode,
                                               const TesselStruct& target) {
  std::optional<HostValueQuery> query = TableQuery(*oid, target, CallKind::kRead);
  if (!query) {
    LOG_ERROR("Forming Oid  failed  in TableProcessGetNextMsg \n");
    *errorCode = kGenErr;
    return std::nullopt;
  }
  NextColumn(*target.cell, static_cast<std::uint32_t>(query->column), &*query);
  std::string columnAndInstance;
  std::optional<std::string> text =
      AdapterTableGetNextOidVal(*query, &columnAndInstance, errorCode);
  std::optional<Oid> answered;
  if (text) answered = AnsweredOid(query->objectOid, columnAndInstance, *oid);
  if (!answered) {
    // No value here makes PDU processing move on to the next column.
    *errorCode = kNoSuchInstance;
    return std::nullopt;
  }
  // The host may have answered from another column: convert by the column answered.
  ColumnData column = LookUpColumn(*target.cell, (*answered)[target.cell->oid.size() + 1]);
  std::optional<VarValue> value = ConvertAnswer(text, column.dataType, column.syntax, errorCode);
  if (value) *oid = std::move(*answered);
  return value;
}

}  // namespace

std::optional<VarValue> ScalarProcessReadReq(std::uint8_t pduType, Oid* oid,
                                             std::uint8_t* errorCode, const TesselStruct& target) {
  std::optional<HostValueQuery> query = ScalarQuery(*oid, target, CallKind::kRead);
  if (!query) {
    *errorCode = kGenErr;
    return std::nullopt;
  }
  std::optional<std::string> text;
  if (pduType == kGetRequest) {
    text = AdapterGetOidVal(*query, errorCode);
  } else {
    query->previousSubId =
        UIntToText(PreviousSubId(*target.cell, static_cast<std::uint32_t>(query->column)));
    text = AdapterGetNextOidVal(*query, errorCode);
    if (!text) *errorCode = kNoSuchInstance;
  }
  return ConvertAnswer(text, static_cast<std::uint8_t>(query->dataType), query->syntax, errorCode);
}

std::optional<VarValue> ScalarProcessWriteReq(const Oid& oid, const VarValue& value,
                                              std::uint8_t* errorCode, const TesselStruct& target) {
  std::optional<HostValueQuery> query = ScalarQuery(oid, target, CallKind::kWrite);
  if (!query) {
    LOG_ERROR("Forming query failed \n");
    *errorCode = kGenErr;
    return std::nullopt;
  }
  return StoreValue(&AdapterSetOidVal, std::move(*query), value, errorCode);
}

std::optional<VarValue> TableProcessReadReq(std::uint8_t pduType, Oid* oid, std::uint8_t* errorCode,
                                            const TesselStruct& target) {
  if (pduType == kGetRequest) return TableProcessGetMsg(*oid, errorCode, target);
  if (pduType == kGetNextRequest) return TableProcessGetNextMsg(oid, errorCode, target);
  *errorCode = kGenErr;
  return std::nullopt;
}

std::optional<VarValue> TableProcessWriteReq(const Oid& oid, const VarValue& value,
                                             std::uint8_t* errorCode, const TesselStruct& target) {
  std::optional<HostValueQuery> query = TableQuery(oid, target, CallKind::kWrite);
  if (!query) {
    LOG_ERROR("\nForming Oid  failed  in TableProcessWriteReq \n");
    *errorCode = kGenErr;
    return std::nullopt;
  }
  if (!query->instance) {
    *errorCode = kNoSuchInstance;
    return std::nullopt;
  }
  return StoreValue(&AdapterTableSetOidVal, std::move(*query), value, errorCode);
}

}  // namespace tessel
