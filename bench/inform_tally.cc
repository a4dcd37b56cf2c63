#include "inform_tally.h"

namespace tessel::bench {

void InformTally::Sent(std::uint32_t informId) {
  std::lock_guard<std::mutex> lock(mutex_);
  entries_[informId].sent = true;
}

void InformTally::Acknowledged(std::uint32_t informId) {
  std::lock_guard<std::mutex> lock(mutex_);
  ++entries_[informId].acknowledgments;
}

void InformTally::Dropped(std::uint32_t informId) {
  std::lock_guard<std::mutex> lock(mutex_);
  ++entries_[informId].drops;
}

InformSummary InformTally::Summary() const {
  std::lock_guard<std::mutex> lock(mutex_);
  InformSummary summary;
  for (const auto& [id, entry] : entries_) {
    const std::uint32_t reports = entry.acknowledgments + entry.drops;
    if (!entry.sent) {
      summary.unknown += reports;
      continue;
    }
    ++summary.sent;
    if (entry.acknowledgments > 1) summary.duplicates += entry.acknowledgments - 1;
    if (entry.acknowledgments > 0 && entry.drops > 0) {
      ++summary.both;
    } else if (entry.acknowledgments > 0) {
      ++summary.acknowledged;
    } else if (entry.drops > 0) {
      ++summary.dropped;
    } else {
      ++summary.unanswered;
    }
  }
  return summary;
}

}  // namespace tessel::bench
