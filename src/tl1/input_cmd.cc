#include "tl1/input_cmd.h"

#include <algorithm>
#include <array>
#include <limits>

#include "base/log.h"

namespace tessel {
namespace {

constexpr std::size_t kMaxCommandCodeLength = 512;
constexpr std::size_t kMaxTidLength = 20;
constexpr std::size_t kMaxCtagLength = 6;
constexpr std::size_t kMaxRetrieveIndicatorLength = 512;
constexpr std::size_t kMaxPayloadBlockLength = 5000;

// Letters and digits are ASCII only: bytes from 0x80 up belong to no class here.
bool IsLetter(char c) { return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z'); }
bool IsDigit(char c) { return c >= '0' && c <= '9'; }
bool IsLetterOrDigit(char c) { return IsLetter(c) || IsDigit(c); }
char ToUpper(char c) { return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c; }

bool Fail(int* errorNumber, int number) {
  *errorNumber = number;
  return false;
}

// A letter first, then letters, digits and '-', every '-' followed by a letter.
bool IsHyphenatedWord(std::string_view text) {
  if (text.empty() || !IsLetter(text[0])) return false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '-') {
      if (i + 1 == text.size() || !IsLetter(text[i + 1])) return false;
    } else if (!IsLetterOrDigit(text[i])) {
      return false;
    }
  }
  return true;
}

std::vector<std::string> SplitAll(std::string_view text, std::string_view delimiter) {
  std::vector<std::string> tokens;
  std::size_t position = 0;
  while (auto token = NextToken(text, delimiter, &position)) tokens.push_back(std::move(*token));
  return tokens;
}

// Appends parts, each after the separator that joins it to the part before (if there is one).
void AppendAidParts(Tl1InputCmd* cmd, const std::vector<std::string>& parts,
                    std::string_view separator) {
  for (const std::string& part : parts) {
    if (!cmd->aidParts.empty()) cmd->aidSeparators.emplace_back(separator);
    cmd->aidParts.push_back(part);
  }
}

// A list of groups joined by ',', each group possibly a '-' chain: at most two groups.
bool SplitAidGroups(Tl1InputCmd* cmd, std::string_view text) {
  if (text.find('&') != std::string_view::npos) return false;
  std::vector<std::string> groups = SplitAll(text, ",");
  if (text.find('-') == std::string_view::npos) {
    if (groups.size() > 2) return false;
    AppendAidParts(cmd, groups, ",");
    return true;
  }
  if (std::count(text.begin(), text.end(), ',') > 1) return false;
  for (const std::string& group : groups) {
    std::vector<std::string> parts = SplitAll(group, "-");
    for (std::size_t i = 0; i < parts.size(); ++i) {
      if (!cmd->aidParts.empty()) cmd->aidSeparators.emplace_back(i == 0 ? "," : "-");
      cmd->aidParts.push_back(parts[i]);
    }
  }
  return true;
}

// A '-' chain, optionally ending in a range (&&-) or continued by a list (&-).
bool SplitAidChain(Tl1InputCmd* cmd, std::string_view text) {
  std::size_t range = text.find("&&-");
  if (range != std::string_view::npos) {
    if (text.find("&&-", range + 3) != std::string_view::npos) return false;
    AppendAidParts(cmd, SplitAll(text.substr(0, range), "-"), "-");
    AppendAidParts(cmd, {std::string(text.substr(range + 3))}, "&&-");
    return true;
  }
  std::size_t list = text.find("&-");
  if (list != std::string_view::npos) {
    AppendAidParts(cmd, SplitAll(text.substr(0, list), "-"), "-");
    AppendAidParts(cmd, SplitAll(text.substr(list + 2), "&-"), "&-");
    return true;
  }
  if (text.find('&') != std::string_view::npos) return false;
  AppendAidParts(cmd, SplitAll(text, "-"), "-");
  return true;
}

// Parts joined by '&' (a list) or '&&' (a range).
void SplitAidAmpersands(Tl1InputCmd* cmd, std::string_view text) {
  std::string part;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '&') {
      part += text[i];
      continue;
    }
    bool doubled = i + 1 < text.size() && text[i + 1] == '&';
    cmd->aidParts.push_back(std::move(part));
    cmd->aidSeparators.emplace_back(doubled ? "&&" : "&");
    part.clear();
    if (doubled) ++i;
  }
  cmd->aidParts.push_back(std::move(part));
}

// Up to five decimal digits that fit 16 bits.
std::optional<std::uint16_t> ReadNumber16(std::string_view text) {
  if (text.empty() || text.size() > 5) return std::nullopt;
  std::uint32_t value = 0;
  for (char c : text) {
    if (!IsDigit(c)) return std::nullopt;
    value = value * 10 + static_cast<std::uint32_t>(c - '0');
  }
  if (value > std::numeric_limits<std::uint16_t>::max()) return std::nullopt;
  return static_cast<std::uint16_t>(value);
}

// "N-N-N": a date (year, month, day) or a time (hour, minute, second).
std::optional<Tl1DateOrTime> ReadTriple(std::string_view text) {
  std::vector<std::string> pieces = SplitAll(text, "-");
  if (pieces.size() != 3 || text.back() == '-') return std::nullopt;
  Tl1DateOrTime triple{};
  for (std::size_t i = 0; i < 3; ++i) {
    std::optional<std::uint16_t> number = ReadNumber16(pieces[i]);
    if (!number) return std::nullopt;
    triple[i] = *number;
  }
  return triple;
}

Tl1GeneralBlock& GeneralBlockOf(Tl1InputCmd* cmd) {
  if (!cmd->generalBlock) cmd->generalBlock.emplace();
  return *cmd->generalBlock;
}

bool ApplyOn(Tl1InputCmd* cmd, std::string_view value, int* errorNumber) {
  Tl1GeneralBlock& block = GeneralBlockOf(cmd);
  if (value.empty() || value.size() > 10) return Fail(errorNumber, kErrorIdnv);
  std::uint64_t on = 0;
  for (char c : value) {
    if (!IsDigit(c)) return Fail(errorNumber, kErrorIdnv);
    on = on * 10 + static_cast<std::uint64_t>(c - '0');
  }
  if (on > static_cast<std::uint64_t>(std::numeric_limits<std::int32_t>::max())) {
    return Fail(errorNumber, kErrorIdnv);
  }
  block.on = static_cast<std::int32_t>(on);
  return true;
}

bool ApplyDateOrTime(std::optional<Tl1DateOrTime>* slot, std::string_view value) {
  if (value.empty()) return true;
  *slot = ReadTriple(value);
  return slot->has_value();
}

// One general-block element: ON, DATE, TIME, CF or RTRVIND with its value.
bool ApplyGeneralElement(Tl1InputCmd* cmd, std::string_view keyword, std::string_view value,
                         int* errorNumber) {
  bool valid = true;
  if (keyword == "ON") return ApplyOn(cmd, value, errorNumber);
  if (keyword == "DATE") {
    valid = ApplyDateOrTime(&GeneralBlockOf(cmd).date, value);
  } else if (keyword == "TIME") {
    valid = ApplyDateOrTime(&GeneralBlockOf(cmd).time, value);
  } else if (keyword == "CF") {
    std::optional<std::uint16_t> flag = ReadNumber16(value);
    valid = flag && *flag <= 1;
    if (valid) cmd->contingencyFlag = *flag;
  } else if (keyword == "RTRVIND") {
    valid = value.size() <= kMaxRetrieveIndicatorLength && IsHyphenatedWord(value);
    if (valid) cmd->retrieveIndicator = std::string(value);
  } else {
    valid = false;
  }
  return valid || Fail(errorNumber, kErrorIicm);
}

// Name-defined when the last separator is '=' and no two ',' follow each other without an '='
// between them; otherwise the block gives its values by position.
bool IsNameDefined(std::string_view field) {
  bool commaPending = false;
  bool sawEquals = false;
  for (char c : field) {
    if (c == ',') {
      if (commaPending) return false;
      commaPending = true;
    } else if (c == '=') {
      commaPending = false;
      sawEquals = true;
    }
  }
  return sawEquals && !commaPending;
}

bool ParsePositionalBlock(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  static constexpr std::array<std::string_view, 5> kPositions{"ON", "DATE", "TIME", "CF",
                                                              "RTRVIND"};
  auto commas = std::count(field.begin(), field.end(), ',');
  if (commas != 3 && commas != 4) return Fail(errorNumber, kErrorIicm);
  std::vector<std::string> values = SplitAll(field, ",");
  for (std::size_t i = 0; i < values.size(); ++i) {
    if (values[i].empty()) continue;
    if (!ApplyGeneralElement(cmd, kPositions[i], values[i], errorNumber)) return false;
  }
  return true;
}

bool ParseNamedBlock(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  for (const std::string& element : SplitAll(field, ",")) {
    std::size_t equals = element.find('=');
    std::string_view text(element);
    std::string_view keyword = text.substr(0, equals);
    std::string_view value = equals == std::string::npos ? "" : text.substr(equals + 1);
    if (!ApplyGeneralElement(cmd, keyword, value, errorNumber)) return false;
  }
  return true;
}

bool DateAndTimeInRange(const Tl1GeneralBlock& block) {
  if (block.date) {
    auto [year, month, day] = *block.date;
    if (year > 99 || month < 1 || month > 12 || day < 1 || day > 31) return false;
  }
  if (block.time) {
    auto [hour, minute, second] = *block.time;
    if (hour > 23 || minute > 59 || second > 59) return false;
  }
  return true;
}

// The parameters of one payload block, cut at ','. A parameter that opens with '"' runs to the
// next '"' (commas inside it are kept); one that opens with '(' must close with ')'.
bool ParsePayloadParams(std::string_view block, Tl1PayloadBlock* out) {
  std::size_t position = 0;
  while (position < block.size()) {
    if (block[position] == '"') {
      std::size_t close = block.find('"', position + 1);
      if (close == std::string_view::npos) return false;
      out->params.emplace_back(block.substr(position + 1, close - position - 1));
      position = close + 1;
      if (position < block.size() && block[position] != ',') return false;
    } else {
      std::size_t end = std::min(block.find(',', position), block.size());
      std::string_view raw = block.substr(position, end - position);
      position = end;
      if (raw.empty()) {
        out->params.emplace_back(std::nullopt);
      } else if (raw[0] == '(') {
        if (raw.size() < 2 || raw.back() != ')') return false;
        out->params.emplace_back(raw.substr(1, raw.size() - 2));
      } else {
        out->params.emplace_back(raw);
      }
    }
    if (position < block.size()) ++position;  // the ','
  }
  return true;
}

// The payload cut into blocks at ':' outside double quotes; nullopt when a space stands outside
// them. A ':' at the very end opens no further block.
std::optional<std::vector<std::string_view>> SplitPayloadBlocks(std::string_view remainder) {
  std::vector<std::string_view> blocks;
  bool inQuotes = false;
  std::size_t start = 0;
  for (std::size_t i = 0; i < remainder.size(); ++i) {
    char c = remainder[i];
    if (c == '"') inQuotes = !inQuotes;
    if (inQuotes) continue;
    if (c == ' ') return std::nullopt;
    if (c == ':') {
      blocks.push_back(remainder.substr(start, i - start));
      start = i + 1;
    }
  }
  if (start < remainder.size()) blocks.push_back(remainder.substr(start));
  return blocks;
}

using FieldParser = bool (*)(Tl1InputCmd*, std::string_view, int*);
constexpr std::array<FieldParser, 5> kFieldParsers{CmdParser, TIDParser, AIDParser, CtagParser,
                                                   GenBlockParser};
constexpr int kCtagField = 3;
constexpr int kPayloadField = 5;

}  // namespace

int PrepareTL1Message(std::string* text) {
  bool inQuotes = false;
  std::size_t terminator = std::string::npos;
  for (std::size_t i = 0; i < text->size() && terminator == std::string::npos; ++i) {
    if ((*text)[i] == '"') inQuotes = !inQuotes;
    if ((*text)[i] == ';' && !inQuotes) terminator = i;
  }
  if (terminator == std::string::npos) return kAckNoTerminator;
  text->resize(terminator);
  std::string cleaned;
  cleaned.reserve(text->size());
  for (char c : *text) {
    auto byte = static_cast<unsigned char>(c);
    if (byte == 0x18) return kAckCancelled;
    bool control = byte < 0x09 || (byte > 0x0D && byte < 0x20) || byte == 0x7F;
    if (!control) cleaned += c;
  }
  *text = std::move(cleaned);
  return 0;
}

std::optional<std::string> NextToken(std::string_view text, std::string_view delimiter,
                                     std::size_t* position) {
  if (*position >= text.size()) return std::nullopt;
  std::size_t found = text.find(delimiter, *position);
  std::size_t end = found == std::string_view::npos ? text.size() : found;
  std::string token(text.substr(*position, end - *position));
  *position = found == std::string_view::npos ? text.size() : found + delimiter.size();
  return token;
}

bool CmdParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  if (field.empty() || field.size() > kMaxCommandCodeLength || !IsLetter(field[0])) {
    return Fail(errorNumber, kErrorIicm);
  }
  std::array<std::string, 3> parts;
  std::size_t part = 0;
  for (std::size_t i = 0; i < field.size(); ++i) {
    char c = field[i];
    bool separator = c == '-' || (c == '#' && part == 1);
    if (IsLetterOrDigit(c) || c == '#') {
      if (!separator) parts[part] += ToUpper(c);
    } else if (c != '-') {
      return Fail(errorNumber, kErrorIicm);
    }
    if (!separator) continue;
    if (i + 1 == field.size() || !IsLetter(field[i + 1]) || part == 2) {
      return Fail(errorNumber, kErrorIicm);
    }
    ++part;
  }
  cmd->verb = parts[0];
  if (part >= 1) cmd->modifier1 = parts[1];
  if (part >= 2) cmd->modifier2 = parts[2];
  return true;
}

bool TIDParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  bool valid;
  if (field.empty()) {
    valid = false;
  } else if (field[0] == '"') {
    std::size_t close = field.find('"', 1);
    valid = close != std::string_view::npos && close <= kMaxTidLength && close + 1 == field.size();
  } else {
    valid = field.size() <= kMaxTidLength && IsHyphenatedWord(field);
  }
  if (!valid) return Fail(errorNumber, kErrorIita);
  cmd->tid = std::string(field);
  return true;
}

bool AIDParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  cmd->aidText = std::string(field);
  bool valid = true;
  if (field.find(',') != std::string_view::npos) {
    valid = SplitAidGroups(cmd, field);
  } else if (field.find('-') != std::string_view::npos) {
    valid = SplitAidChain(cmd, field);
  } else if (field.find('&') != std::string_view::npos) {
    SplitAidAmpersands(cmd, field);
  } else {
    cmd->aidParts.emplace_back(field);
  }
  // Separators with nothing around them ("&-", ",") name no entity.
  valid = valid && !cmd->aidParts.empty();
  return valid || Fail(errorNumber, kErrorIiac);
}

bool CtagParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  bool decimalPrefix = field.starts_with("D'");
  bool valid = !field.empty() && field.size() <= kMaxCtagLength;
  if (valid && IsLetter(field[0]) && !decimalPrefix) {
    valid = std::all_of(field.begin(), field.end(), IsLetterOrDigit);
  } else if (valid) {
    std::string_view digits = decimalPrefix ? field.substr(2) : field;
    valid =
        !digits.empty() && field.back() != '.' &&
        std::all_of(digits.begin(), digits.end(), [](char c) { return IsDigit(c) || c == '.'; }) &&
        std::count(digits.begin(), digits.end(), '.') <= 1;
  }
  if (!valid) return Fail(errorNumber, kErrorIict);
  cmd->ctag = std::string(field);
  return true;
}

bool GenBlockParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber) {
  bool parsed = IsNameDefined(field) ? ParseNamedBlock(cmd, field, errorNumber)
                                     : ParsePositionalBlock(cmd, field, errorNumber);
  if (!parsed) return false;
  if (cmd->generalBlock && !DateAndTimeInRange(*cmd->generalBlock)) {
    return Fail(errorNumber, kErrorAidt);
  }
  return true;
}

bool MesgPayLoadParser(Tl1InputCmd* cmd, std::string_view remainder, int* errorNumber) {
  std::optional<std::vector<std::string_view>> blocks = SplitPayloadBlocks(remainder);
  if (!blocks) return Fail(errorNumber, kErrorIidt);
  for (std::string_view block : *blocks) {
    Tl1PayloadBlock parsed;
    if (block.size() > kMaxPayloadBlockLength || !ParsePayloadParams(block, &parsed)) {
      return Fail(errorNumber, kErrorIidt);
    }
    cmd->payloadBlocks.push_back(std::move(parsed));
  }
  return true;
}

bool InputCmdParser(Tl1InputCmd* cmd, std::string_view text, int* errorNumber) {
  *errorNumber = kErrorIicm;
  std::size_t position = 0;
  int field = 0;
  for (; field < kPayloadField; ++field) {
    std::optional<std::string> token = NextToken(text, ":", &position);
    if (!token) break;
    if (token->empty()) {
      // Without a command code or a CTAG there is nothing to answer to.
      if (field == 0 || field == kCtagField) {
        LOG_TRACE("\n\tTL1 input: %s missing\n", field == 0 ? "command code" : "CTAG");
        return Fail(errorNumber, kErrorIicm);
      }
      continue;
    }
    if (!kFieldParsers[field](cmd, *token, errorNumber)) return false;
  }
  if (field == kPayloadField) return MesgPayLoadParser(cmd, text.substr(position), errorNumber);
  if (field > kCtagField) return true;
  LOG_TRACE("\n\tTL1 input: CTAG missing\n");
  return Fail(errorNumber, kErrorIicm);
}

std::string CommandCodeOf(const Tl1InputCmd& cmd) {
  std::string code = cmd.verb;
  if (cmd.modifier1) code += "-" + *cmd.modifier1;
  if (cmd.modifier2) code += "-" + *cmd.modifier2;
  return code;
}

}  // namespace tessel
