#include "snmp/handlers.h"

#include <array>
#include <cstddef>
#include <cstdio>
#include <limits>
#include <string_view>

#include "engine/agent.h"
#include "engine/log.h"
#include "snmp/pdu.h"
#include "snmp/value_adapters.h"

namespace tessel {
namespace {

constexpr std::uint8_t kWrongType = 7;
// Hosts may register a DateAndTime column under this private type instead of naming the syntax.
constexpr std::uint8_t kDateAndTimeType = 0x99;
constexpr char kDateAndTimeSyntax[] = "DateAndTime";
constexpr char kMacAddressSyntax[] = "MacAddress";

// ---------------------------------------------------------------------------------------------
// Value texts and values.

// How a value of a type is held in a VarValue; a Set value must have the form of its column.
enum class ValueForm { kNone, kNumber, kNumber64, kOctets, kObjectId, kIpAddress };

ValueForm FormOf(std::uint8_t type) {
  switch (type) {
    case 0x01:
    case kAsnInteger:
    case kAsnCounter:
    case kAsnGauge:
    case kAsnTimeTicks:
    case kAsnUInteger32:
      return ValueForm::kNumber;
    case kAsnCounter64:
      return ValueForm::kNumber64;
    case kAsnOctetString:
    case kAsnOpaque:
    case kAsnNsapAddress:
    case kAsnBitString:
      return ValueForm::kOctets;
    case kAsnObjectId:
      return ValueForm::kObjectId;
    case kAsnIpAddress:
      return ValueForm::kIpAddress;
    default:
      return ValueForm::kNone;
  }
}

bool IsDateAndTime(std::uint8_t dataType, const std::string& syntax) {
  return syntax == kDateAndTimeSyntax || dataType == kDateAndTimeType;
}

bool IsDigit(char c) { return c >= '0' && c <= '9'; }

// Unsigned decimal digits only, at most limit; nothing otherwise.
std::optional<std::uint64_t> ParseUnsigned(std::string_view text, std::uint64_t limit) {
  if (text.empty()) return std::nullopt;
  std::uint64_t value = 0;
  for (char c : text) {
    if (!IsDigit(c)) return std::nullopt;
    auto digit = static_cast<std::uint64_t>(c - '0');
    if (value > (limit - digit) / 10) return std::nullopt;
    value = value * 10 + digit;
  }
  return value;
}

// A 32-bit number as the host writes it: optional sign, decimal. A text that is no number reads
// as -1 (hosts use that for "unknown"); a number that does not fit in 32 bits is refused.
// INTEGER takes the signed range; the unsigned types also take their full unsigned range.
std::optional<std::uint32_t> ParseNumber32(std::string_view text, bool isSigned) {
  bool negative = !text.empty() && text[0] == '-';
  if (!text.empty() && (text[0] == '-' || text[0] == '+')) text.remove_prefix(1);
  if (text.empty() || text.find_first_not_of("0123456789") != std::string_view::npos) {
    return 0xFFFFFFFFu;
  }
  constexpr std::uint64_t kSignedMax = std::numeric_limits<std::int32_t>::max();
  std::uint64_t limit = negative ? kSignedMax + 1 : (isSigned ? kSignedMax : 0xFFFFFFFFull);
  std::optional<std::uint64_t> magnitude = ParseUnsigned(text, limit);
  if (!magnitude) return std::nullopt;
  auto low = static_cast<std::uint32_t>(*magnitude);
  return negative ? 0u - low : low;
}

// 'hex'h or 'hex'H, in which a host sends octets that are not printable.
bool HasHexForm(std::string_view text) {
  return text.size() >= 3 && text.front() == '\'' && text[text.size() - 2] == '\'' &&
         (text.back() == 'h' || text.back() == 'H');
}

// The octets of a 'hex'h text; an odd last digit forms an octet alone.
std::optional<std::string> ParseHexForm(std::string_view text) {
  if (!HasHexForm(text)) return std::nullopt;
  std::string_view digits = text.substr(1, text.size() - 3);
  std::string octets;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    int value = 0;
    for (std::size_t j = i; j < i + 2 && j < digits.size(); ++j) {
      int digit = HexDigitValue(digits[j]);
      if (digit < 0) return std::nullopt;
      value = value * 16 + digit;
    }
    octets.push_back(static_cast<char>(value));
  }
  return octets;
}

// Six ':'-separated pairs of hex digits (a MAC address) as 6 octets.
std::optional<std::string> ParseMacForm(std::string_view text) {
  constexpr std::size_t kMacTextLength = 17;
  if (text.size() != kMacTextLength) return std::nullopt;
  std::string octets;
  for (std::size_t i = 0; i < kMacTextLength; i += 3) {
    int high = HexDigitValue(text[i]);
    int low = HexDigitValue(text[i + 1]);
    if (high < 0 || low < 0 || (i + 2 < kMacTextLength && text[i + 2] != ':')) return std::nullopt;
    octets.push_back(static_cast<char>(high * 16 + low));
  }
  return octets;
}

std::string OctetsAsText(std::uint8_t dataType, const std::string& text) {
  if (std::optional<std::string> octets = ParseHexForm(text)) return *octets;
  if (dataType == kAsnOctetString) {
    if (std::optional<std::string> octets = ParseMacForm(text)) return *octets;
  }
  return text;
}

std::optional<VarValue> ParseIpAddress(const std::string& text) {
  Oid parts;
  if (ParseDottedText(&parts, text, true) != 4) return std::nullopt;
  std::string octets;
  for (std::uint32_t part : parts) {
    if (part > 255) return std::nullopt;
    octets.push_back(static_cast<char>(part));
  }
  return VarValue::Octets(kAsnIpAddress, std::move(octets));
}

std::optional<VarValue> ParseObjectId(const std::string& text) {
  Oid oid;
  std::string dotted = !text.empty() && text[0] == '.' ? text : "." + text;
  if (ParseDottedText(&oid, dotted, false) <= 0 || oid.size() > kMaxOidLength) return std::nullopt;
  return VarValue::ObjectId(std::move(oid));
}

// Reads "%d-%d-%d,%d:%d:%d.%d,%c%d:%d" field by field, the way a scanf would: the number of
// fields read before the first mismatch. numbers gets the nine numbers, direction the sign.
class DateAndTimeScanner {
 public:
  explicit DateAndTimeScanner(std::string_view text) : rest_(text) {}

  int Scan(std::array<std::int64_t, 9>* numbers, char* direction) {
    static constexpr char kSeparators[] = "--,::.";
    int count = 0;
    for (std::size_t i = 0; i < 7; ++i, ++count) {
      if ((i > 0 && !Literal(kSeparators[i - 1])) || !Number(&(*numbers)[i])) return count;
    }
    if (!Literal(',') || rest_.empty()) return count;
    *direction = rest_.front();
    rest_.remove_prefix(1);
    ++count;
    if (!Number(&(*numbers)[7])) return count;
    ++count;
    if (!Literal(':') || !Number(&(*numbers)[8])) return count;
    return count + 1;
  }

 private:
  bool Literal(char c) {
    if (rest_.empty() || rest_.front() != c) return false;
    rest_.remove_prefix(1);
    return true;
  }
  // Optional blanks, optional sign, decimal digits that fit in an int.
  bool Number(std::int64_t* out) {
    while (!rest_.empty() && (rest_.front() == ' ' || rest_.front() == '\t'))
      rest_.remove_prefix(1);
    bool negative = !rest_.empty() && rest_.front() == '-';
    if (!rest_.empty() && (rest_.front() == '-' || rest_.front() == '+')) rest_.remove_prefix(1);
    std::size_t digits = 0;
    while (digits < rest_.size() && IsDigit(rest_[digits])) ++digits;
    std::optional<std::uint64_t> value =
        ParseUnsigned(rest_.substr(0, digits), std::numeric_limits<std::int32_t>::max());
    if (!value) return false;
    rest_.remove_prefix(digits);
    *out = negative ? -static_cast<std::int64_t>(*value) : static_cast<std::int64_t>(*value);
    return true;
  }

  std::string_view rest_;
};

// The octets of a DateAndTime text: 8 without the UTC offset, 11 with it.
std::optional<VarValue> ParseDateAndTime(const std::string& text) {
  std::array<std::int64_t, 9> numbers{};
  char direction = 0;
  int fields = DateAndTimeScanner(text).Scan(&numbers, &direction);
  if (fields != 7 && fields != 10) return std::nullopt;
  auto octet = [](std::int64_t value) {
    return static_cast<char>(static_cast<std::uint64_t>(value) & 0xFF);
  };
  std::string octets{octet(numbers[0] >> 8), octet(numbers[0])};
  for (std::size_t i = 1; i < 7; ++i) octets.push_back(octet(numbers[i]));
  if (fields == 10) octets += {direction, octet(numbers[7]), octet(numbers[8])};
  return VarValue::Octets(kAsnOctetString, std::move(octets));
}

// Octets the host can take as they are: no NUL, nothing above 127, and not readable as hex.
std::string OctetsToText(const std::string& octets) {
  for (char c : octets) {
    auto octet = static_cast<unsigned char>(c);
    if (octet == 0 || octet > 127) return "'" + BytesToHex(octets) + "'h";
  }
  if (HasHexForm(octets)) return "'" + BytesToHex(octets) + "'h";
  LOG_TRACE("Convert to OctetString - retval is %s\n", octets.c_str());
  return octets;
}

std::optional<std::string> IpAddressToText(const std::string& octets) {
  if (octets.size() != 4) return std::nullopt;
  std::string text;
  for (char c : octets) {
    if (!text.empty()) text.push_back('.');
    text += std::to_string(static_cast<unsigned char>(c));
  }
  return text;
}

std::string MacAddressToText(const std::string& octets) {
  std::string hex = BytesToHex(octets);
  std::string text;
  for (std::size_t i = 0; i < hex.size(); i += 2) {
    if (i > 0) text.push_back(':');
    text.append(hex, i, 2);
  }
  return text;
}

// ---------------------------------------------------------------------------------------------
// What the host is asked.

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

// The text the host is given for a Set, or nothing with *errorCode set.
std::optional<std::string> SetValueText(const HostValueQuery& query, const VarValue& value,
                                        std::uint8_t* errorCode) {
  auto dataType = static_cast<std::uint8_t>(query.dataType);
  std::string syntax = query.syntax.value_or("");
  bool dateAndTime = IsDateAndTime(dataType, syntax);
  ValueForm columnForm =
      dateAndTime || syntax == kMacAddressSyntax ? ValueForm::kOctets : FormOf(dataType);
  if (columnForm != ValueForm::kNone && FormOf(value.type) != columnForm) {
    LOG_ERROR("Set value of type %d does not fit column type %d\n", value.type, dataType);
    *errorCode = kWrongType;
    return std::nullopt;
  }
  std::optional<std::string> text;
  if (dateAndTime) {
    text = DateAndTimeToText(value.octets);
    if (!text) *errorCode = kBadValue;
    return text;
  }
  text = syntax == kMacAddressSyntax ? MacAddressToText(value.octets)
                                     : VarValueToText(dataType, value);
  if (!text) {
    LOG_ERROR("In set varVal err in ToString ..\n");
    *errorCode = kGenErr;
  }
  return text;
}

using SetAdapter = std::optional<std::string> (*)(const HostValueQuery&, std::uint8_t*);

// Sends a Set to the host; the response repeats the value set.
std::optional<VarValue> StoreValue(SetAdapter adapter, HostValueQuery query, const VarValue& value,
                                   std::uint8_t* errorCode) {
  std::optional<std::string> text = SetValueText(query, value, errorCode);
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

// ---------------------------------------------------------------------------------------------
// Conversions.

std::optional<VarValue> TextToVarValue(std::uint8_t dataType, const std::string& syntax,
                                       const std::string& text) {
  if (IsDateAndTime(dataType, syntax)) return ParseDateAndTime(text);
  switch (dataType) {
    case kAsnInteger:
    case kAsnCounter:
    case kAsnGauge:
    case kAsnTimeTicks:
    case kAsnUInteger32: {
      std::optional<std::uint32_t> number = ParseNumber32(text, dataType == kAsnInteger);
      if (!number) return std::nullopt;
      return VarValue::Unsigned(dataType, *number);
    }
    case kAsnOctetString:
    case kAsnOpaque:
    case kAsnNsapAddress:
      return VarValue::Octets(dataType, OctetsAsText(dataType, text));
    case kAsnBitString: {
      // The contents as sent: the count of unused bits (0-7), then the bits.
      std::string bits = OctetsAsText(dataType, text);
      if (bits.empty() || static_cast<unsigned char>(bits[0]) >= 8) return std::nullopt;
      return VarValue::Octets(kAsnBitString, std::move(bits));
    }
    case kAsnObjectId:
      return ParseObjectId(text);
    case kAsnIpAddress:
      return ParseIpAddress(text);
    case kAsnCounter64: {
      std::optional<std::uint64_t> number =
          ParseUnsigned(text, std::numeric_limits<std::uint64_t>::max());
      if (!number) return std::nullopt;
      return VarValue::Unsigned(kAsnCounter64, *number);
    }
    case kAsnNull:
      return VarValue::Empty(kAsnNull);
    default:
      LOG_ERROR(" type %d  not handled \n", dataType);
      return std::nullopt;
  }
}

std::optional<std::string> VarValueToText(std::uint8_t dataType, const VarValue& value) {
  ValueForm form = FormOf(dataType);
  if (form == ValueForm::kNone || FormOf(value.type) != form) {
    LOG_ERROR("Data type %d not supported \n", dataType);
    return std::nullopt;
  }
  switch (dataType) {
    case 0x01:
    case kAsnInteger:
      return IntToText(value.AsInt32());
    case kAsnOctetString:
    case kAsnOpaque:
    case kAsnNsapAddress:
    case kAsnBitString:
      return OctetsToText(value.octets);
    case kAsnObjectId:
      return OidToText(value.oid);
    case kAsnIpAddress:
      return IpAddressToText(value.octets);
    case kAsnCounter64:
      return std::to_string(value.number);
    default:
      return UIntToText(static_cast<std::uint32_t>(value.number));
  }
}

std::optional<std::string> DateAndTimeToText(const std::string& octets) {
  if (octets.size() != 8 && octets.size() != 11) {
    LOG_ERROR("Length is not proper\n");
    return std::nullopt;
  }
  auto at = [&octets](std::size_t i) {
    return static_cast<unsigned>(static_cast<unsigned char>(octets[i]));
  };
  struct Check {
    std::size_t index;
    unsigned low;
    unsigned high;
    const char* message;
  };
  static constexpr Check kChecks[] = {{2, 1, 12, "Month value is not proper\n"},
                                      {3, 1, 31, "Day value is not proper\n"},
                                      {4, 0, 23, "Hour value is not proper\n"},
                                      {5, 0, 59, "Minute value is not proper\n"},
                                      {6, 0, 60, "Second value is not proper\n "},
                                      {7, 0, 9, "Decisecond  value is not proper\n "},
                                      {9, 0, 11, " UTC hour value is not proper\n "},
                                      {10, 0, 59, " UTC minute value is not proper\n"}};
  for (const Check& check : kChecks) {
    if (check.index < octets.size() &&
        (at(check.index) < check.low || at(check.index) > check.high)) {
      LOG_ERROR("%s", check.message);
      return std::nullopt;
    }
  }
  char text[64];
  int length = std::snprintf(text, sizeof text, "%u-%u-%u,%u:%u:%u.%u", at(0) * 256 + at(1), at(2),
                             at(3), at(4), at(5), at(6), at(7));
  if (octets.size() == 8) return std::string(text, static_cast<std::size_t>(length));
  if (octets[8] != '+' && octets[8] != '-') {
    LOG_ERROR("sign  value is not proper\n ");
    return std::nullopt;
  }
  return std::string(text, static_cast<std::size_t>(length)) + "," + octets[8] +
         std::to_string(at(9)) + ":" + std::to_string(at(10));
}

// ---------------------------------------------------------------------------------------------
// Handlers.

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
