#include "base/conversions.h"

#include <algorithm>

#include "base/log.h"

namespace tessel {

std::optional<std::uint64_t> ParseDecimal(std::string_view digits, std::uint64_t limit) {
  if (digits.empty()) return std::nullopt;
  std::uint64_t value = 0;
  for (char c : digits) {
    if (c < '0' || c > '9') return std::nullopt;
    auto digit = static_cast<std::uint64_t>(c - '0');
    if (value > (limit - digit) / 10) return std::nullopt;
    value = value * 10 + digit;
  }
  return value;
}

std::int32_t TextToInt(std::string_view text) {
  if (text.empty()) return 0;
  bool negative = text[0] == '-';
  if (text[0] == '-' || text[0] == '+') text.remove_prefix(1);
  constexpr std::uint64_t kMax = 0x7FFFFFFF;
  std::optional<std::uint64_t> magnitude = ParseDecimal(text, negative ? kMax + 1 : kMax);
  if (!magnitude) return -1;
  auto value = static_cast<std::uint32_t>(*magnitude);
  return static_cast<std::int32_t>(negative ? 0u - value : value);
}

int HexDigitValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::int32_t HexTextToInt(std::string_view text) {
  std::uint32_t value = 0;
  for (char c : text) {
    int digit = HexDigitValue(c);
    if (digit < 0) return -1;
    value = value * 16u + static_cast<std::uint32_t>(digit);
  }
  return static_cast<std::int32_t>(value);
}

std::string UIntToText(std::uint32_t value) { return std::to_string(value); }

std::string IntToText(std::int32_t value) {
  if (value >= 0) return std::to_string(value);
  std::uint32_t magnitude = 0u - static_cast<std::uint32_t>(value);
  return "-" + std::to_string(magnitude);
}

int ParseDottedText(Oid* out, std::string_view text, bool plain) {
  std::size_t dots = static_cast<std::size_t>(std::count(text.begin(), text.end(), '.'));
  if (dots == 0) {
    LOG_ERROR(plain ? "Incorrect format of IpAddress" : "Incorrect format of OID");
    return -1;
  }
  std::size_t expected = plain ? dots + 1 : dots;
  if (!plain) text.remove_prefix(1);
  if (!text.empty() && text.back() == '.') return -1;
  out->clear();
  while (!text.empty() || out->size() < expected) {
    std::size_t end = text.find('.');
    std::optional<std::uint64_t> value = ParseDecimal(text.substr(0, end), 0xFFFFFFFF);
    if (!value) {
      out->clear();
      return -1;
    }
    out->push_back(static_cast<std::uint32_t>(*value));
    if (end == std::string_view::npos) break;
    text.remove_prefix(end + 1);
  }
  if (out->size() != expected) return 0;
  return static_cast<int>(out->size());
}

std::string OidToPlainText(std::span<const std::uint32_t> oid) {
  std::string text;
  text.reserve(oid.size() * 4);
  for (std::size_t i = 0; i < oid.size(); ++i) {
    if (i > 0) text.push_back('.');
    text += std::to_string(oid[i]);
  }
  return text;
}

std::string OidToText(std::span<const std::uint32_t> oid) {
  std::string text;
  text.reserve(oid.size() * 4);
  for (std::uint32_t id : oid) {
    text.push_back('.');
    text += std::to_string(id);
  }
  return text;
}

int CompareOid(std::span<const std::uint32_t> a, std::span<const std::uint32_t> b) {
  std::size_t shorter = std::min(a.size(), b.size());
  for (std::size_t i = 0; i < shorter; ++i) {
    if (a[i] != b[i]) return a[i] > b[i] ? 1 : -1;
  }
  if (a.size() == b.size()) return 0;
  return a.size() < b.size() ? -1 : 2;
}

std::string BytesToHex(std::string_view bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(bytes.size() * 2);
  for (unsigned char c : bytes) {
    text.push_back(kDigits[c >> 4]);
    text.push_back(kDigits[c & 0x0F]);
  }
  return text;
}

}  // namespace tessel
