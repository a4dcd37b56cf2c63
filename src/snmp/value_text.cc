#include "snmp/value_text.h"

#include <array>
#include <cstddef>
#include <cstdio>
#include <limits>
#include <string_view>

#include "engine/log.h"
#include "snmp/pdu.h"

namespace tessel {
namespace {

// Hosts may register a DateAndTime column under this private type instead of naming the syntax.
constexpr std::uint8_t kDateAndTimeType = 0x99;
constexpr char kDateAndTimeSyntax[] = "DateAndTime";
constexpr char kMacAddressSyntax[] = "MacAddress";

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
  std::optional<std::uint64_t> magnitude = ParseDecimal(text, limit);
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
        ParseDecimal(rest_.substr(0, digits), std::numeric_limits<std::int32_t>::max());
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

}  // namespace

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
      std::optional<std::uint64_t> number = ParseDecimal(text);
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

std::optional<std::string> SetValueText(std::uint8_t dataType, const std::string& syntax,
                                        const VarValue& value, std::uint8_t* errorCode) {
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

}  // namespace tessel
