#include "tl1/pending_list.h"

#include <algorithm>

namespace tessel {

std::int64_t GetTimeInSecond(const std::optional<Tl1DateOrTime>& date,
                             const std::optional<Tl1DateOrTime>& time, std::time_t now) {
  std::tm local{};
  localtime_r(&now, &local);
  if (date) {
    local.tm_year = 100 + (*date)[0];
    local.tm_mon = (*date)[1] - 1;
    local.tm_mday = (*date)[2];
  }
  if (time) {
    local.tm_hour = (*time)[0];
    local.tm_min = (*time)[1];
    local.tm_sec = (*time)[2];
  }
  // Let the rules of the date decide whether daylight saving applies, not the flag of now.
  local.tm_isdst = -1;
  return static_cast<std::int64_t>(std::mktime(&local));
}

Tl1PendingList::Tl1PendingList(Clock clock) : clock_(std::move(clock)) {}

bool Tl1PendingList::CheckDAMesg(std::int32_t on, std::uint64_t sessionId) const {
  return std::none_of(entries_.begin(), entries_.end(), [&](const Tl1PendingEntry& entry) {
    return entry.sessionId == sessionId && entry.command.generalBlock->on == on;
  });
}

std::optional<std::uint32_t> Tl1PendingList::AddToPendingbuffer(const Tl1InputCmd& cmd,
                                                                std::uint64_t sessionId,
                                                                std::string commandText) {
  if (!cmd.generalBlock) return std::nullopt;
  const Tl1GeneralBlock& block = *cmd.generalBlock;
  Tl1PendingEntry entry{0, sessionId, cmd, std::move(commandText), !block.date && !block.time, 0};
  if (!entry.manual) entry.expiry = GetTimeInSecond(block.date, block.time, clock_());

  std::lock_guard<std::mutex> lock(mutex_);
  if (block.on != -1 && !CheckDAMesg(block.on, sessionId)) return std::nullopt;
  entry.id = nextId_;
  nextId_ = nextId_ == UINT32_MAX ? 1 : nextId_ + 1;
  auto position = entries_.end();
  if (!entry.manual) {
    position = std::find_if(entries_.begin(), entries_.end(), [&](const Tl1PendingEntry& other) {
      return other.manual || other.expiry > entry.expiry;
    });
  }
  return entries_.insert(position, std::move(entry))->id;
}

std::optional<std::int64_t> Tl1PendingList::NextExpiry() const {
  std::lock_guard<std::mutex> lock(mutex_);
  if (entries_.empty() || entries_.front().manual) return std::nullopt;
  return entries_.front().expiry;
}

std::vector<Tl1PendingEntry> Tl1PendingList::TakeDue(std::int64_t now) {
  std::vector<Tl1PendingEntry> due;
  std::lock_guard<std::mutex> lock(mutex_);
  while (!entries_.empty() && !entries_.front().manual && entries_.front().expiry <= now) {
    due.push_back(std::move(entries_.front()));
    entries_.pop_front();
  }
  return due;
}

std::vector<Tl1PendingEntry> Tl1PendingList::List() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return {entries_.begin(), entries_.end()};
}

std::optional<Tl1PendingEntry> Tl1PendingList::Take(std::uint32_t id) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = std::find_if(entries_.begin(), entries_.end(),
                            [id](const Tl1PendingEntry& entry) { return entry.id == id; });
  if (found == entries_.end()) return std::nullopt;
  Tl1PendingEntry entry = std::move(*found);
  entries_.erase(found);
  return entry;
}

bool Tl1PendingList::Cancel(std::uint32_t id) { return Take(id).has_value(); }

}  // namespace tessel
