#include "notify/inform_list.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstring>

#include "engine/log.h"

namespace tessel {
namespace {

constexpr std::uint32_t kMaxId = 0x7FFFFFFF;

std::uint64_t DeadlineAfter(std::uint64_t now, std::uint32_t timeoutSeconds) {
  return now + static_cast<std::uint64_t>(timeoutSeconds) * 1000u;
}

bool SameSocketAddress(const PeerSocketAddress& a, const PeerSocketAddress& b) {
  if (a.any.sa_family != b.any.sa_family) return false;
  if (a.any.sa_family == AF_INET)
    return a.v4.sin_port == b.v4.sin_port && a.v4.sin_addr.s_addr == b.v4.sin_addr.s_addr;
  if (a.any.sa_family == AF_INET6)
    return a.v6.sin6_port == b.v6.sin6_port &&
           std::memcmp(&a.v6.sin6_addr, &b.v6.sin6_addr, sizeof a.v6.sin6_addr) == 0;
  return false;
}

bool Answers(const PendingInform& inform, const ResponseOrigin& origin, std::int32_t requestId) {
  return inform.requestId == requestId && inform.device == origin.device &&
         SameSocketAddress(inform.target.managerSockAddr, origin.manager) &&
         (inform.target.version == kSnmpV3 || inform.target.community == origin.community);
}

}  // namespace

std::int32_t NextNotificationRequestId() {
  static std::atomic<std::uint32_t> counter{0};
  std::uint32_t id = counter.fetch_add(1, std::memory_order_relaxed) % kMaxId + 1u;
  return static_cast<std::int32_t>(id);
}

InformList::InformList(Sender sender, Reporter dropped)
    : sender_(std::move(sender)), dropped_(std::move(dropped)) {}

InformList::~InformList() { StopTimer(); }

std::uint32_t InformList::NextInformId() {
  lastInformId_ = lastInformId_ % kMaxId + 1u;
  return lastInformId_;
}

std::uint32_t InformList::ReserveInformId() {
  std::lock_guard<std::mutex> lock(mutex_);
  return NextInformId();
}

InformList::Added InformList::Add(PendingInform inform, std::uint64_t now) {
  std::unique_lock<std::mutex> lock(mutex_);
  if (inform.informId == 0) inform.informId = NextInformId();
  inform.retriesLeft = inform.target.retries;
  inform.sends = 1;
  inform.deadline = DeadlineAfter(now, inform.target.timeout);
  LOG_TRACE("Sending Inform ...\n");
  if (informs_.size() >= kMaxPending) {
    lock.unlock();
    LOG_ERROR("The inform %u is dropped: %zu informs wait for their Response already\n",
              inform.informId, kMaxPending);
    dropped_(inform);
    return {inform.informId, false};
  }
  if (!sender_(inform)) {
    lock.unlock();
    LOG_ERROR("The inform %u cannot be sent: dropped\n", inform.informId);
    dropped_(inform);
    return {inform.informId, false};
  }
  std::uint32_t id = inform.informId;
  informs_.push_back(std::move(inform));
  ++additions_;
  changed_.notify_all();
  return {id, true};
}

std::optional<PendingInform> InformList::Acknowledge(const ResponseOrigin& origin,
                                                     std::int32_t requestId) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = std::find_if(informs_.begin(), informs_.end(), [&](const PendingInform& inform) {
    return Answers(inform, origin, requestId);
  });
  if (found == informs_.end()) return std::nullopt;
  LOG_TRACE("Inform Id matches in the gv_informVector.\n");
  PendingInform answered = std::move(*found);
  informs_.erase(found);
  return answered;
}

std::optional<V3InformSecurity> InformList::FindV3(const ResponseOrigin& origin,
                                                   std::int32_t msgId) const {
  std::lock_guard<std::mutex> lock(mutex_);
  for (const PendingInform& inform : informs_) {
    if (inform.v3 && inform.v3->msgId == msgId && inform.device == origin.device &&
        SameSocketAddress(inform.target.managerSockAddr, origin.manager))
      return inform.v3;
  }
  return std::nullopt;
}

std::optional<std::uint64_t> InformList::Expire(std::uint64_t now) {
  std::vector<PendingInform> dropped;
  std::optional<std::uint64_t> earliest;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto it = informs_.begin(); it != informs_.end();) {
      if (it->deadline <= now) {
        LOG_ERROR("Timer is expired, no response is received for INFORM Request. !!!\n");
        bool resent = false;
        if (it->retriesLeft > 0) {
          LOG_TRACE("Re Sending Inform ...\n");
          --it->retriesLeft;
          ++it->sends;
          it->deadline = DeadlineAfter(now, it->target.timeout);
          resent = sender_(*it);
        }
        if (!resent) {
          LOG_ERROR("Deleteing inform Entry ....\n");
          dropped.push_back(std::move(*it));
          it = informs_.erase(it);
          continue;
        }
      }
      earliest = std::min(earliest.value_or(it->deadline), it->deadline);
      ++it;
    }
  }
  for (const PendingInform& inform : dropped) dropped_(inform);
  return earliest;
}

std::size_t InformList::Pending() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return informs_.size();
}

void InformList::Clear() {
  std::lock_guard<std::mutex> lock(mutex_);
  informs_.clear();
}

void InformList::StartTimer(Clock clock) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (timer_.joinable()) return;
  stopping_ = false;
  timer_ = std::thread([this, clock = std::move(clock)] { TimerLoop(clock); });
}

void InformList::StopTimer() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stopping_ = true;
    changed_.notify_all();
  }
  if (timer_.joinable() && timer_.get_id() != std::this_thread::get_id()) timer_.join();
}

void InformList::TimerLoop(Clock clock) {
  std::unique_lock<std::mutex> lock(mutex_);
  while (!stopping_) {
    std::uint64_t seen = additions_;
    lock.unlock();
    std::optional<std::uint64_t> next = Expire(clock());
    lock.lock();
    auto woken = [&] { return stopping_ || additions_ != seen; };
    if (!next) {
      changed_.wait(lock, woken);
      continue;
    }
    std::uint64_t now = clock();
    if (*next > now) changed_.wait_for(lock, std::chrono::milliseconds(*next - now), woken);
  }
}

}  // namespace tessel
