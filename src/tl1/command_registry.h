// The TL1 command codes the host has announced, kept in ascending order compared without regard
// to the case of letters; a code that differs from a registered one only in case is refused.
// Registration and lookups may run on any threads at once.
#pragma once

#include <optional>
#include <shared_mutex>
#include <string>
#include <string_view>
#include <vector>

#include "tl1/input_cmd.h"

namespace tessel {

class Tl1CommandRegistry {
 public:
  // False when the code is empty or registered already.
  bool RegisterCmd(std::string_view commandCode);
  // The registered code that serves the command: its own code, else the last registered
  // VERB-MOD1, else the last registered VERB (so RTRV-ALM serves RTRV-ALM-ALL); nullopt when none.
  std::optional<std::string> FindTL1Command(const Tl1InputCmd& cmd) const;
  std::vector<std::string> Codes() const;  // in registry order
  void Clear();

 private:
  mutable std::shared_mutex mutex_;
  std::vector<std::string> codes_;
};

// Compares ASCII letters without regard to case; <0, 0 or >0.
int CompareCommandCodes(std::string_view left, std::string_view right);

}  // namespace tessel
