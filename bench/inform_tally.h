// The books of an inform load: which informs were sent, and how often the engine reported each
// one acknowledged or dropped. Reports may come before the sender has recorded the inform (the
// Response can be faster than the send's return), so nothing is judged until Summary.
// Thread-safe.
#pragma once

#include <cstdint>
#include <mutex>
#include <unordered_map>

namespace tessel::bench {

struct InformSummary {
  std::uint64_t sent = 0;
  std::uint64_t acknowledged = 0;  // sent informs acknowledged (and never dropped)
  std::uint64_t duplicates = 0;    // acknowledgments beyond the first of an inform
  std::uint64_t unknown = 0;       // reports of inform IDs that were never sent
  std::uint64_t dropped = 0;       // sent informs reported dropped
  std::uint64_t both = 0;          // sent informs reported both acknowledged and dropped
  std::uint64_t unanswered = 0;    // sent informs with no report at all
  bool Clean() const {
    return acknowledged == sent && duplicates == 0 && unknown == 0 && dropped == 0 && both == 0 &&
           unanswered == 0;
  }
};

class InformTally {
 public:
  void Sent(std::uint32_t informId);
  void Acknowledged(std::uint32_t informId);
  void Dropped(std::uint32_t informId);
  InformSummary Summary() const;

 private:
  struct Entry {
    bool sent = false;
    std::uint32_t acknowledgments = 0;
    std::uint32_t drops = 0;
  };
  mutable std::mutex mutex_;
  std::unordered_map<std::uint32_t, Entry> entries_;
};

}  // namespace tessel::bench
