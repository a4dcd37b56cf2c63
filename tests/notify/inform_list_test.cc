#include "notify/inform_list.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <map>
#include <thread>

namespace tessel {
namespace {

PeerSocketAddress Manager(std::uint16_t port) {
  PeerSocketAddress address{};
  address.v4.sin_family = AF_INET;
  address.v4.sin_port = htons(port);
  inet_pton(AF_INET, "127.0.0.1", &address.v4.sin_addr);
  return address;
}

const DeviceEndpoint kDevice{"127.0.1.7", 1161};

PendingInform Inform(std::int32_t requestId, std::uint32_t timeout, std::uint32_t retries) {
  PendingInform inform;
  inform.requestId = requestId;
  inform.device = kDevice;
  inform.target.managerSockAddr = Manager(162);
  inform.target.community = "public";
  inform.target.timeout = timeout;
  inform.target.retries = retries;
  return inform;
}

ResponseOrigin From(std::uint16_t port, DeviceEndpoint device = kDevice,
                    std::string community = "public") {
  return {std::move(device), Manager(port), std::move(community)};
}

// Counts every InformRequest sent and every inform dropped; sends fail while refuse is set.
struct Recorder {
  std::atomic<int> sends{0};
  std::atomic<bool> refuse{false};
  std::vector<PendingInform> dropped;  // the list reports outside its lock, from one thread here
  InformList list{[this](const PendingInform&) {
                    ++sends;
                    return !refuse.load();
                  },
                  [this](const PendingInform& inform) { dropped.push_back(inform); }};
};

// The timer on a clock the test turns: timeout 5 and retries 2 send three InformRequests 5 s
// apart, then drop the inform and report it with every send counted.
TEST(InformListTest, TimeoutAndRetriesSendThreeTimesThenDrop) {
  Recorder recorder;
  recorder.list.Add(Inform(7, 5, 2), 0);
  EXPECT_EQ(recorder.sends, 1);
  EXPECT_EQ(recorder.list.Expire(4999), 5000u);
  EXPECT_EQ(recorder.sends, 1);
  EXPECT_EQ(recorder.list.Expire(5000), 10000u);
  EXPECT_EQ(recorder.sends, 2);
  EXPECT_EQ(recorder.list.Expire(10500), 15500u);
  EXPECT_EQ(recorder.sends, 3);
  EXPECT_TRUE(recorder.dropped.empty());
  EXPECT_EQ(recorder.list.Expire(15500), std::nullopt);
  EXPECT_EQ(recorder.sends, 3);
  ASSERT_EQ(recorder.dropped.size(), 1u);
  EXPECT_EQ(recorder.dropped[0].sends, 3u);
  EXPECT_EQ(recorder.dropped[0].requestId, 7);
  EXPECT_EQ(recorder.list.Pending(), 0u);
}

// Only a Response from the manager's own address and port, to the device that sent the inform,
// with its request-id and community, acknowledges it; and only once.
TEST(InformListTest, OnlyTheManagerItWasSentToAcknowledges) {
  Recorder recorder;
  InformList::Added added = recorder.list.Add(Inform(7, 5, 0), 0);
  ASSERT_TRUE(added.sent);
  EXPECT_FALSE(recorder.list.Acknowledge(From(163), 7));  // another port of the same host
  EXPECT_FALSE(recorder.list.Acknowledge(From(162, {"127.0.1.8", 1161}), 7));
  EXPECT_FALSE(recorder.list.Acknowledge(From(162, kDevice, "other"), 7));
  EXPECT_FALSE(recorder.list.Acknowledge(From(162), 8));
  std::optional<PendingInform> answered = recorder.list.Acknowledge(From(162), 7);
  ASSERT_TRUE(answered);
  EXPECT_EQ(answered->informId, added.informId);
  EXPECT_FALSE(recorder.list.Acknowledge(From(162), 7));
  EXPECT_EQ(recorder.list.Expire(60000), std::nullopt);
  EXPECT_TRUE(recorder.dropped.empty());
}

// An inform that cannot be sent is dropped at once, on its first send as on a retry.
TEST(InformListTest, InformThatCannotBeSentOrKeptIsDroppedAtOnce) {
  Recorder recorder;
  recorder.refuse = true;
  EXPECT_FALSE(recorder.list.Add(Inform(1, 5, 3), 0).sent);
  EXPECT_EQ(recorder.list.Pending(), 0u);
  ASSERT_EQ(recorder.dropped.size(), 1u);
  recorder.refuse = false;
  recorder.list.Add(Inform(2, 5, 3), 0);
  recorder.refuse = true;
  EXPECT_EQ(recorder.list.Expire(5000), std::nullopt);
  ASSERT_EQ(recorder.dropped.size(), 2u);
  EXPECT_EQ(recorder.dropped[1].sends, 2u);

  recorder.refuse = false;
  for (std::size_t i = 0; i < InformList::kMaxPending; ++i) recorder.list.Add(Inform(3, 5, 0), 0);
  int sends = recorder.sends;
  EXPECT_FALSE(recorder.list.Add(Inform(4, 5, 0), 0).sent);
  EXPECT_EQ(recorder.sends, sends);
  EXPECT_EQ(recorder.list.Pending(), InformList::kMaxPending);
  EXPECT_EQ(recorder.dropped.back().requestId, 4);
}

// Senders, acknowledgers and the timer thread at once: every inform ends exactly once, answered
// or dropped (run under ThreadSanitizer as well).
TEST(InformListTest, ConcurrentSendersAcknowledgersAndTimerEndEachInformOnce) {
  constexpr int kThreads = 4;
  constexpr int kPerThread = 200;
  std::mutex mutex;
  std::map<std::int32_t, int> ends;
  InformList list([](const PendingInform&) { return true; },
                  [&](const PendingInform& inform) {
                    std::lock_guard<std::mutex> lock(mutex);
                    ++ends[inform.requestId];
                  });
  auto start = std::chrono::steady_clock::now();
  list.StartTimer([start] {
    return static_cast<std::uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                          std::chrono::steady_clock::now() - start)
                                          .count());
  });
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kPerThread; ++i) {
        std::int32_t id = t * kPerThread + i + 1;
        list.Add(Inform(id, i % 2, 0), 0);  // timeout 0: due at once
        if (list.Acknowledge(From(162), id)) {
          std::lock_guard<std::mutex> lock(mutex);
          ++ends[id];
        }
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  for (int wait = 0; wait < 300 && list.Pending() > 0; ++wait)
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  list.StopTimer();
  EXPECT_EQ(list.Pending(), 0u);
  std::lock_guard<std::mutex> lock(mutex);
  ASSERT_EQ(ends.size(), static_cast<std::size_t>(kThreads * kPerThread));
  for (const auto& [id, count] : ends) EXPECT_EQ(count, 1) << "inform " << id;
}

}  // namespace
}  // namespace tessel
