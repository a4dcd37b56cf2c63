#include "tl1/command_registry.h"

#include <algorithm>
#include <mutex>

namespace tessel {
namespace {

char FoldCase(char c) { return c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c; }

}  // namespace

int CompareCommandCodes(std::string_view left, std::string_view right) {
  std::size_t common = std::min(left.size(), right.size());
  for (std::size_t i = 0; i < common; ++i) {
    auto a = static_cast<unsigned char>(FoldCase(left[i]));
    auto b = static_cast<unsigned char>(FoldCase(right[i]));
    if (a != b) return a < b ? -1 : 1;
  }
  if (left.size() == right.size()) return 0;
  return left.size() < right.size() ? -1 : 1;
}

bool Tl1CommandRegistry::RegisterCmd(std::string_view commandCode) {
  if (commandCode.empty()) return false;
  std::unique_lock lock(mutex_);
  auto position = std::lower_bound(codes_.begin(), codes_.end(), commandCode,
                                   [](const std::string& entry, std::string_view code) {
                                     return CompareCommandCodes(entry, code) < 0;
                                   });
  if (position != codes_.end() && CompareCommandCodes(*position, commandCode) == 0) return false;
  codes_.emplace(position, commandCode);
  return true;
}

std::optional<std::string> Tl1CommandRegistry::FindTL1Command(const Tl1InputCmd& cmd) const {
  std::string fullCode = CommandCodeOf(cmd);
  std::string verbAndModifier = cmd.verb + "-" + cmd.modifier1.value_or("");
  std::shared_lock lock(mutex_);
  const std::string* byModifier = nullptr;
  const std::string* byVerb = nullptr;
  for (const std::string& code : codes_) {
    if (CompareCommandCodes(code, fullCode) == 0) return code;
    if (cmd.modifier1 && CompareCommandCodes(code, verbAndModifier) == 0) byModifier = &code;
    if (CompareCommandCodes(code, cmd.verb) == 0) byVerb = &code;
  }
  if (byModifier) return *byModifier;
  if (byVerb) return *byVerb;
  return std::nullopt;
}

std::vector<std::string> Tl1CommandRegistry::Codes() const {
  std::shared_lock lock(mutex_);
  return codes_;
}

void Tl1CommandRegistry::Clear() {
  std::unique_lock lock(mutex_);
  codes_.clear();
}

}  // namespace tessel
