// Delayed activation: TL1 commands with a general block wait here until their local date and time
// (timed entries, in expiry order) or until they are run by hand (ON without DATE or TIME:
// manual entries, after every timed one in arrival order). Every entry has an id (the first is 1)
// by which it can be run at once or cancelled. The list only keeps time; the owner waits on
// NextExpiry and takes what is due. Safe from any thread.
#pragma once

#include <cstdint>
#include <ctime>
#include <functional>
#include <list>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "tl1/input_cmd.h"

namespace tessel {

struct Tl1PendingEntry {
  std::uint32_t id = 0;
  std::uint64_t sessionId = 0;
  Tl1InputCmd command;      // its general block holds ON, DATE and TIME
  std::string commandText;  // as received
  bool manual = false;
  std::int64_t expiry = 0;  // seconds since the epoch; 0 for manual entries
};

// A local date (two-digit year from 2000) and time of day to seconds since the epoch, with the
// system's daylight-saving rules for that date. A missing date is today's, a missing time the
// current time of day (both of now).
std::int64_t GetTimeInSecond(const std::optional<Tl1DateOrTime>& date,
                             const std::optional<Tl1DateOrTime>& time, std::time_t now);

class Tl1PendingList {
 public:
  using Clock = std::function<std::time_t()>;
  explicit Tl1PendingList(Clock clock = [] { return std::time(nullptr); });

  // Schedules a command with a general block; the new entry's id, or nullopt when an entry of
  // the same session with the same ON is still pending.
  std::optional<std::uint32_t> AddToPendingbuffer(const Tl1InputCmd& cmd, std::uint64_t sessionId,
                                                  std::string commandText);
  // The expiry of the earliest timed entry.
  std::optional<std::int64_t> NextExpiry() const;
  // Removes and returns the timed entries whose expiry is at or before now, earliest first.
  std::vector<Tl1PendingEntry> TakeDue(std::int64_t now);
  std::vector<Tl1PendingEntry> List() const;
  // Removes an entry to run it now.
  std::optional<Tl1PendingEntry> Take(std::uint32_t id);
  bool Cancel(std::uint32_t id);

 private:
  bool CheckDAMesg(std::int32_t on, std::uint64_t sessionId) const;

  Clock clock_;
  mutable std::mutex mutex_;
  std::list<Tl1PendingEntry> entries_;
  std::uint32_t nextId_ = 1;
};

}  // namespace tessel
