// tessel_loadgen: an SNMP v1/v2c/v3 load generator for loopback benchmarks. One thread keeps a
// window of requests outstanding over many agent addresses (round robin), on non-blocking UDP
// sockets driven by epoll with sendmmsg/recvmmsg batches, matches answers by request-id, and
// reports throughput and latency percentiles for the measured interval. SNMPv3 requests go to
// each agent after one discovery exchange with it, with keys localised for its engine. Every run
// is bounded by its discovery (three time-outs), warm-up and measured durations plus one
// time-out, and stops by itself.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sched.h>
#include <sys/epoll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "latency_histogram.h"
#include "options.h"
#include "snmp_wire.h"
#include "snmpv3_wire.h"

namespace {

using tessel::bench::Histogram;
namespace v3 = tessel::bench::v3;

constexpr int kMaxBatch = 64;
constexpr std::size_t kReceiveSize = 65536;
// Request-ids in [2^24, 2^31) always encode in four octets, so a request's template is patched
// in place instead of re-encoded.
constexpr std::uint32_t kFirstRequestId = 1u << 24;
constexpr std::uint32_t kLastRequestId = 0x7FFFFFFFu;
// Discovery msgIDs are 1 + the target's index: below every request-id.
constexpr std::uint32_t kFirstDiscoveryId = 1;
constexpr int kDiscoveryTries = 3;

std::int64_t NowNs() {
  timespec ts{};
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<std::int64_t>(ts.tv_sec) * 1000000000 + ts.tv_nsec;
}

double CpuSeconds() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return static_cast<double>(usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) +
         static_cast<double>(usage.ru_utime.tv_usec + usage.ru_stime.tv_usec) / 1e6;
}

struct GeneratorOptions {
  std::vector<sockaddr_in> targets;
  std::string community = "public";
  int version = 1;  // wire value: 0 SNMPv1, 1 SNMPv2c
  std::uint8_t pduType = tessel::bench::kPduGet;
  std::vector<std::uint32_t> oid{1, 3, 6, 1, 2, 1, 1, 5, 0};
  int nonRepeaters = 0;
  int maxRepetitions = 10;
  int window = 64;
  int sockets = 1;
  int batch = 32;
  int timeoutMs = 1000;
  double warmupSeconds = 1;
  double measureSeconds = 5;
  double rate = 0;   // requests per second; 0 = closed loop
  int requests = 0;  // requests in all, warm-up included; 0 = as many as the durations allow
  int cpu = -1;
  bool quiet = false;
  bool untilAnswer = false;
  std::string v3User;  // empty: v1/v2c
  std::string v3AuthPassword;
  std::string v3PrivPassword;
  v3::Level v3Level = v3::Level::kAuthPriv;
};

// One window slot: the request it has outstanding, if any.
struct Slot {
  std::uint32_t requestId = 0;
  std::uint32_t target = 0;
  std::int64_t sentNs = 0;
  bool busy = false;
  bool measured = false;
};

struct Counters {
  std::uint64_t sent = 0;       // measured requests
  std::uint64_t responses = 0;  // answers to measured requests
  std::uint64_t lost = 0;       // measured requests unanswered within the time-out
  std::uint64_t errors = 0;     // answers with error-status != 0
  std::uint64_t malformed = 0;
  std::uint64_t late = 0;  // answers matching no outstanding request
  std::uint64_t notResponse = 0;
  std::uint64_t wrongSource = 0;
  std::uint64_t sendFailures = 0;
  std::uint64_t targetsAnswered = 0;  // targets with at least one measured answer
};

// A pending sendmmsg batch on one socket.
struct SendBatch {
  mmsghdr headers[kMaxBatch]{};
  iovec vectors[kMaxBatch]{};
  std::uint8_t payload[kMaxBatch][tessel::bench::kMaxRequestSize]{};
  int slots[kMaxBatch]{};
  int count = 0;
};

struct ReceiveBatch {
  mmsghdr headers[kMaxBatch]{};
  iovec vectors[kMaxBatch]{};
  sockaddr_in sources[kMaxBatch]{};
  std::vector<std::uint8_t> buffers;
  ReceiveBatch() : buffers(kReceiveSize * kMaxBatch) {}
};

class Generator {
 public:
  explicit Generator(const GeneratorOptions& options)
      : options_(options), slots_(options.window), targetAnswered_(options.targets.size()) {}
  bool Open();
  int Run();

 private:
  bool Discover();
  void Loop();
  void FillWindow(std::int64_t now);
  void Queue(int slotIndex, std::int64_t now);
  void Flush(int socketIndex);
  void Drain(int socketIndex, std::int64_t now);
  void Answer(const std::uint8_t* data, std::size_t length, const sockaddr_in& source,
              std::int64_t now);
  void AnswerV3(const std::uint8_t* data, std::size_t length, const sockaddr_in& source,
                std::int64_t now);
  int Claim(std::uint32_t requestId);
  void Release(int slotIndex);
  void Complete(const Slot& slot, const tessel::bench::ReplySummary& reply,
                const sockaddr_in& source, std::int64_t now);
  void Expire(std::int64_t now);
  std::int64_t WaitNs(std::int64_t now) const;
  std::uint64_t Allowed(std::int64_t now) const;
  bool Exhausted() const;
  void Report(double seconds, double cpuSeconds) const;
  std::uint32_t NextRequestId(int slotIndex);

  GeneratorOptions options_;
  std::vector<int> fds_;
  int epoll_ = -1;
  std::vector<Slot> slots_;
  std::vector<bool> targetAnswered_;
  std::vector<int> freeSlots_;
  std::vector<SendBatch> batches_;
  ReceiveBatch receive_;
  tessel::bench::RequestTemplate template_;  // the whole message, or for SNMPv3 the PDU
  std::vector<v3::Peer> peers_;              // SNMPv3: one per target
  std::uint64_t salt_ = 0;
  bool reportShown_ = false;
  Histogram histogram_;
  Counters counters_;
  std::uint64_t totalSent_ = 0;
  std::uint64_t issued_ = 0;  // sent, or queued in a batch: what pacing counts
  std::uint64_t nextTarget_ = 0;
  std::uint64_t busy_ = 0;
  std::int64_t startNs_ = 0;
  std::int64_t measureStartNs_ = 0;
  std::int64_t measureEndNs_ = 0;
  std::int64_t lastExpireNs_ = 0;
  bool answered_ = false;
};

bool Generator::Open() {
  const bool encoded =
      options_.v3User.empty()
          ? tessel::bench::EncodeRequestTemplate(
                options_.version, options_.community, options_.pduType, options_.oid,
                options_.nonRepeaters, options_.maxRepetitions, &template_)
          : tessel::bench::EncodePduTemplate(options_.pduType, options_.oid, options_.nonRepeaters,
                                             options_.maxRepetitions, &template_);
  if (!encoded) {
    std::fprintf(stderr, "loadgen: the request does not fit one datagram\n");
    return false;
  }
  epoll_ = epoll_create1(EPOLL_CLOEXEC);
  if (epoll_ < 0) return false;
  for (int i = 0; i < options_.sockets; ++i) {
    int fd = socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    if (fd < 0) return false;
    int size = 4 << 20;
    setsockopt(fd, SOL_SOCKET, SO_RCVBUF, &size, sizeof size);
    setsockopt(fd, SOL_SOCKET, SO_SNDBUF, &size, sizeof size);
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u32 = static_cast<std::uint32_t>(i);
    if (epoll_ctl(epoll_, EPOLL_CTL_ADD, fd, &event) != 0) return false;
    fds_.push_back(fd);
  }
  batches_.resize(static_cast<std::size_t>(options_.sockets));
  for (int i = options_.window - 1; i >= 0; --i) freeSlots_.push_back(i);
  for (int i = 0; i < kMaxBatch; ++i) {
    receive_.vectors[i] = {receive_.buffers.data() + static_cast<std::size_t>(i) * kReceiveSize,
                           kReceiveSize};
    receive_.headers[i].msg_hdr.msg_iov = &receive_.vectors[i];
    receive_.headers[i].msg_hdr.msg_iovlen = 1;
  }
  return true;
}

// Slot i owns the request-ids congruent to i modulo the window, so an answer finds its slot
// without a search; a stale id (an answer after its time-out) no longer matches the slot.
std::uint32_t Generator::NextRequestId(int slotIndex) {
  const std::uint32_t window = static_cast<std::uint32_t>(options_.window);
  Slot& slot = slots_[static_cast<std::size_t>(slotIndex)];
  std::uint32_t next = slot.requestId == 0 ? kFirstRequestId + static_cast<std::uint32_t>(slotIndex)
                                           : slot.requestId + window;
  if (next > kLastRequestId - window)
    next = kFirstRequestId + static_cast<std::uint32_t>(slotIndex);
  return next;
}

// How many requests may have been issued by now: the pacing rate's and --requests' bound.
std::uint64_t Generator::Allowed(std::int64_t now) const {
  std::uint64_t allowed = UINT64_MAX;
  if (options_.rate > 0) {
    double elapsed = static_cast<double>(now - startNs_) / 1e9;
    allowed = static_cast<std::uint64_t>(elapsed * options_.rate) + 1;
  }
  if (options_.requests > 0) allowed = std::min<std::uint64_t>(allowed, options_.requests);
  return allowed;
}

bool Generator::Exhausted() const {
  return options_.requests > 0 && issued_ >= static_cast<std::uint64_t>(options_.requests);
}

void Generator::Queue(int slotIndex, std::int64_t now) {
  Slot& slot = slots_[static_cast<std::size_t>(slotIndex)];
  slot.requestId = NextRequestId(slotIndex);
  slot.target = static_cast<std::uint32_t>(nextTarget_++ % options_.targets.size());
  slot.sentNs = now;
  slot.busy = true;
  slot.measured = now >= measureStartNs_;
  const int socketIndex = slotIndex % options_.sockets;
  SendBatch& batch = batches_[static_cast<std::size_t>(socketIndex)];
  const int n = batch.count++;
  std::size_t size = template_.bytes.size();
  if (peers_.empty()) {
    std::memcpy(batch.payload[n], template_.bytes.data(), size);
    tessel::bench::PatchRequestId(batch.payload[n], template_, slot.requestId);
  } else {
    // A request that cannot be encoded goes out empty and is counted lost.
    size = peers_[slot.target].Encode(slot.requestId, now, salt_++, batch.payload[n],
                                      tessel::bench::kMaxRequestSize);
  }
  batch.vectors[n] = {batch.payload[n], size};
  msghdr& header = batch.headers[n].msg_hdr;
  header = {};
  header.msg_name = &options_.targets[slot.target];
  header.msg_namelen = sizeof(sockaddr_in);
  header.msg_iov = &batch.vectors[n];
  header.msg_iovlen = 1;
  batch.slots[n] = slotIndex;
  ++busy_;
  ++issued_;
  if (batch.count == options_.batch) Flush(socketIndex);
}

// Requests the kernel would not take go back to the free list unsent: a full socket buffer is
// back-pressure, not loss.
void Generator::Flush(int socketIndex) {
  SendBatch& batch = batches_[static_cast<std::size_t>(socketIndex)];
  int done = 0;
  while (done < batch.count) {
    int sent = sendmmsg(fds_[static_cast<std::size_t>(socketIndex)], batch.headers + done,
                        static_cast<unsigned>(batch.count - done), 0);
    if (sent <= 0) {
      if (sent < 0 && errno == EINTR) continue;
      break;
    }
    done += sent;
  }
  for (int i = 0; i < done; ++i) {
    ++totalSent_;
    if (slots_[static_cast<std::size_t>(batch.slots[i])].measured) ++counters_.sent;
  }
  for (int i = done; i < batch.count; ++i) {
    slots_[static_cast<std::size_t>(batch.slots[i])].busy = false;
    freeSlots_.push_back(batch.slots[i]);
    --busy_;
    --issued_;
    ++counters_.sendFailures;
  }
  batch.count = 0;
}

void Generator::FillWindow(std::int64_t now) {
  if (now >= measureEndNs_) return;
  const std::uint64_t allowed = Allowed(now);
  while (!freeSlots_.empty() && issued_ < allowed) {
    int slotIndex = freeSlots_.back();
    freeSlots_.pop_back();
    Queue(slotIndex, now);
  }
  for (int i = 0; i < options_.sockets; ++i) {
    if (batches_[static_cast<std::size_t>(i)].count > 0) Flush(i);
  }
}

// The slot whose request has this id, or -1 (counted late) when none is outstanding.
int Generator::Claim(std::uint32_t requestId) {
  if (requestId < kFirstRequestId) {
    ++counters_.late;
    return -1;
  }
  const std::uint32_t window = static_cast<std::uint32_t>(options_.window);
  const std::uint32_t slotIndex = (requestId - kFirstRequestId) % window;
  const Slot& slot = slots_[slotIndex];
  if (!slot.busy || slot.requestId != requestId) {
    ++counters_.late;
    return -1;
  }
  return static_cast<int>(slotIndex);
}

void Generator::Release(int slotIndex) {
  slots_[static_cast<std::size_t>(slotIndex)].busy = false;
  --busy_;
  freeSlots_.push_back(slotIndex);
}

void Generator::Complete(const Slot& slot, const tessel::bench::ReplySummary& reply,
                         const sockaddr_in& source, std::int64_t now) {
  answered_ = true;
  if (!slot.measured) return;
  const sockaddr_in& target = options_.targets[slot.target];
  if (source.sin_addr.s_addr != target.sin_addr.s_addr || source.sin_port != target.sin_port) {
    ++counters_.wrongSource;
  }
  ++counters_.responses;
  if (!targetAnswered_[slot.target]) {
    targetAnswered_[slot.target] = true;
    ++counters_.targetsAnswered;
  }
  if (reply.pduType != tessel::bench::kPduResponse) ++counters_.notResponse;
  if (reply.errorStatus != 0) ++counters_.errors;
  histogram_.Record(static_cast<std::uint64_t>(now - slot.sentNs));
}

void Generator::Answer(const std::uint8_t* data, std::size_t length, const sockaddr_in& source,
                       std::int64_t now) {
  tessel::bench::ReplySummary reply;
  if (!tessel::bench::DecodeReply(data, length, &reply)) {
    ++counters_.malformed;
    return;
  }
  const int slotIndex = Claim(reply.requestId);
  if (slotIndex < 0) return;
  Release(slotIndex);
  Complete(slots_[static_cast<std::size_t>(slotIndex)], reply, source, now);
}

// The msgID names the request; the answer is then checked with that request's target's keys.
// One that fails the check (digest, decryption, level, request-id) frees its slot as malformed.
void Generator::AnswerV3(const std::uint8_t* data, std::size_t length, const sockaddr_in& source,
                         std::int64_t now) {
  std::uint32_t messageId = 0;
  if (!v3::DecodeMessageId(data, length, &messageId)) {
    ++counters_.malformed;
    return;
  }
  const int slotIndex = Claim(messageId);
  if (slotIndex < 0) return;
  Release(slotIndex);
  const Slot& slot = slots_[static_cast<std::size_t>(slotIndex)];
  tessel::bench::ReplySummary reply;
  std::vector<std::uint32_t> reportOid;
  if (!peers_[slot.target].Decode(data, length, &reply,
                                  reportOid.empty() && !reportShown_ ? &reportOid : nullptr)) {
    ++counters_.malformed;
    return;
  }
  if (!reportOid.empty()) {
    reportShown_ = true;
    std::string text;
    for (std::uint32_t arc : reportOid) text += (text.empty() ? "" : ".") + std::to_string(arc);
    std::fprintf(stderr, "loadgen: first Report from the agents: %s\n", text.c_str());
  }
  Complete(slot, reply, source, now);
}

void Generator::Drain(int socketIndex, std::int64_t now) {
  for (;;) {
    for (int i = 0; i < kMaxBatch; ++i) {
      receive_.headers[i].msg_hdr.msg_name = &receive_.sources[i];
      receive_.headers[i].msg_hdr.msg_namelen = sizeof(sockaddr_in);
    }
    int count = recvmmsg(fds_[static_cast<std::size_t>(socketIndex)], receive_.headers, kMaxBatch,
                         0, nullptr);
    if (count <= 0) return;
    for (int i = 0; i < count; ++i) {
      const auto* data = static_cast<const std::uint8_t*>(receive_.vectors[i].iov_base);
      if (peers_.empty()) {
        Answer(data, receive_.headers[i].msg_len, receive_.sources[i], now);
      } else {
        AnswerV3(data, receive_.headers[i].msg_len, receive_.sources[i], now);
      }
    }
    if (count < kMaxBatch) return;
  }
}

void Generator::Expire(std::int64_t now) {
  const std::int64_t timeoutNs = static_cast<std::int64_t>(options_.timeoutMs) * 1000000;
  for (std::size_t i = 0; i < slots_.size(); ++i) {
    Slot& slot = slots_[i];
    if (!slot.busy || now - slot.sentNs < timeoutNs) continue;
    slot.busy = false;
    --busy_;
    freeSlots_.push_back(static_cast<int>(i));
    if (slot.measured) ++counters_.lost;
  }
  lastExpireNs_ = now;
}

// How long epoll may sleep: until the next paced send, phase change or time-out scan.
// Nanosecond waits (epoll_pwait2) keep pacing smooth at rates above 1000 requests/s.
std::int64_t Generator::WaitNs(std::int64_t now) const {
  std::int64_t wakeNs = lastExpireNs_ + 10000000;  // time-outs are checked every 10 ms
  if (now < measureEndNs_) {
    wakeNs = std::min(wakeNs, measureEndNs_);
    if (now < measureStartNs_) wakeNs = std::min(wakeNs, measureStartNs_);
    if (!freeSlots_.empty() && !Exhausted()) {
      if (options_.rate <= 0) return 0;
      // The next paced request is due when issued_ / rate seconds have passed since the start.
      double next = static_cast<double>(issued_) / options_.rate * 1e9;
      wakeNs = std::min(wakeNs, startNs_ + static_cast<std::int64_t>(next));
    }
  }
  return std::max<std::int64_t>(wakeNs - now, 0);
}

void Generator::Loop() {
  const std::int64_t timeoutNs = static_cast<std::int64_t>(options_.timeoutMs) * 1000000;
  epoll_event events[16];
  for (;;) {
    std::int64_t now = NowNs();
    if (now - lastExpireNs_ >= 10000000) Expire(now);
    if (options_.untilAnswer && answered_) return;
    if (Exhausted() && busy_ == 0) return;
    if (now >= measureEndNs_ && (busy_ == 0 || now >= measureEndNs_ + timeoutNs)) return;
    FillWindow(now);
    const std::int64_t waitNs = WaitNs(NowNs());
    const timespec wait{static_cast<time_t>(waitNs / 1000000000),
                        static_cast<long>(waitNs % 1000000000)};
    int ready = epoll_pwait2(epoll_, events, 16, &wait, nullptr);
    now = NowNs();
    for (int i = 0; i < ready; ++i) Drain(static_cast<int>(events[i].data.u32), now);
  }
}

// Learns each target's engine (ID, boots, time) from its Report to a discovery request, in up to
// kDiscoveryTries rounds of one time-out each, and sets up its keys and scoped PDU. The
// passwords are stretched once; each engine ID then costs one small hash per key.
bool Generator::Discover() {
  v3::User user{options_.v3User, options_.v3Level, {}, {}};
  const auto level = static_cast<std::uint8_t>(options_.v3Level);
  if (level & 1) user.authKey = v3::PasswordToKey(options_.v3AuthPassword);
  if (level & 2) user.privKey = v3::PasswordToKey(options_.v3PrivPassword);
  const std::size_t count = options_.targets.size();
  peers_.resize(count);
  std::vector<bool> known(count, false);
  std::size_t missing = count;
  std::uint8_t* buffer = receive_.buffers.data();
  std::uint8_t probe[tessel::bench::kMaxRequestSize];
  for (int attempt = 0; attempt < kDiscoveryTries && missing > 0; ++attempt) {
    for (std::size_t i = 0; i < count; ++i) {
      if (known[i]) continue;
      const v3::Bytes request =
          v3::EncodeDiscovery(kFirstDiscoveryId + static_cast<std::uint32_t>(i));
      sendto(fds_[0], request.data(), request.size(), 0,
             reinterpret_cast<const sockaddr*>(&options_.targets[i]), sizeof(sockaddr_in));
    }
    const std::int64_t deadline = NowNs() + static_cast<std::int64_t>(options_.timeoutMs) * 1000000;
    for (std::int64_t now = NowNs(); missing > 0 && now < deadline; now = NowNs()) {
      pollfd ready{fds_[0], POLLIN, 0};
      if (poll(&ready, 1, static_cast<int>((deadline - now) / 1000000) + 1) <= 0) continue;
      for (;;) {
        sockaddr_in source{};
        socklen_t sourceSize = sizeof source;
        const ssize_t length = recvfrom(fds_[0], buffer, kReceiveSize, 0,
                                        reinterpret_cast<sockaddr*>(&source), &sourceSize);
        if (length < 0) break;
        std::uint32_t messageId = 0;
        v3::Engine engine;
        if (!v3::DecodeEngine(buffer, static_cast<std::size_t>(length), &messageId, &engine))
          continue;
        const std::size_t index = messageId - kFirstDiscoveryId;
        if (messageId < kFirstDiscoveryId || index >= count || known[index]) continue;
        const sockaddr_in& target = options_.targets[index];
        if (source.sin_addr.s_addr != target.sin_addr.s_addr || source.sin_port != target.sin_port)
          continue;
        if (!peers_[index].Init(user, engine, template_, NowNs()) ||
            peers_[index].Encode(kFirstRequestId, NowNs(), 0, probe, sizeof probe) == 0) {
          std::fprintf(stderr, "loadgen: cannot set up SNMPv3 keys or requests\n");
          return false;
        }
        known[index] = true;
        --missing;
      }
    }
  }
  if (missing > 0)
    std::fprintf(stderr, "loadgen: %zu of %zu targets did not answer discovery\n", missing, count);
  return missing == 0;
}

int Generator::Run() {
  if (!options_.v3User.empty() && !Discover()) {
    for (int fd : fds_) close(fd);
    close(epoll_);
    return 1;
  }
  startNs_ = NowNs();
  lastExpireNs_ = startNs_;
  measureStartNs_ = startNs_ + static_cast<std::int64_t>(options_.warmupSeconds * 1e9);
  measureEndNs_ = measureStartNs_ + static_cast<std::int64_t>(options_.measureSeconds * 1e9);
  const double cpuBefore = CpuSeconds();
  Loop();
  Expire(NowNs() + static_cast<std::int64_t>(options_.timeoutMs) * 1000000);
  const double measured =
      static_cast<double>(std::min(NowNs(), measureEndNs_) - measureStartNs_) / 1e9;
  Report(std::max(measured, 1e-9), CpuSeconds() - cpuBefore);
  for (int fd : fds_) close(fd);
  close(epoll_);
  return answered_ ? 0 : 1;
}

void Generator::Report(double seconds, double cpuSeconds) const {
  const double rate = static_cast<double>(counters_.responses) / seconds;
  const double us = 1e-3;
  const double p50 = static_cast<double>(histogram_.Percentile(0.50)) * us;
  const double p99 = static_cast<double>(histogram_.Percentile(0.99)) * us;
  const double p999 = static_cast<double>(histogram_.Percentile(0.999)) * us;
  const double maximum = static_cast<double>(histogram_.Maximum()) * us;
  const double wall = static_cast<double>(NowNs() - startNs_) / 1e9;
  std::printf(
      "RESULT sent=%llu responses=%llu lost=%llu errors=%llu malformed=%llu late=%llu "
      "not_response=%llu "
      "wrong_source=%llu send_failures=%llu seconds=%.3f rate=%.0f p50_us=%.1f p99_us=%.1f "
      "p999_us=%.1f "
      "max_us=%.1f cpu_pct=%.0f targets=%zu targets_answered=%llu\n",
      static_cast<unsigned long long>(counters_.sent),
      static_cast<unsigned long long>(counters_.responses),
      static_cast<unsigned long long>(counters_.lost),
      static_cast<unsigned long long>(counters_.errors),
      static_cast<unsigned long long>(counters_.malformed),
      static_cast<unsigned long long>(counters_.late),
      static_cast<unsigned long long>(counters_.notResponse),
      static_cast<unsigned long long>(counters_.wrongSource),
      static_cast<unsigned long long>(counters_.sendFailures), seconds, rate, p50, p99, p999,
      maximum, 100.0 * cpuSeconds / std::max(wall, 1e-9), options_.targets.size(),
      static_cast<unsigned long long>(counters_.targetsAnswered));
  if (options_.quiet) return;
  std::printf(
      "%.0f responses/s over %.1f s (%llu sent, %llu lost, %llu errors, %llu malformed); "
      "latency p50 %.1f us, p99 %.1f us, p99.9 %.1f us\n",
      rate, seconds, static_cast<unsigned long long>(counters_.sent),
      static_cast<unsigned long long>(counters_.lost),
      static_cast<unsigned long long>(counters_.errors),
      static_cast<unsigned long long>(counters_.malformed), p50, p99, p999);
}

const char kUsage[] =
    "usage: tessel_loadgen --targets A[+N][,B...] --port P [options]\n"
    "  --community S        (public)\n"
    "  --version 1|2c       (2c)\n"
    "  --get OID | --getnext OID | --getbulk OID   request kind and OID (--get 1.3.6.1.2.1.1.5.0)\n"
    "  --non-repeaters N    GetBulk non-repeaters (0)\n"
    "  --max-repetitions N  GetBulk max-repetitions (10)\n"
    "  --window N           outstanding requests (64)\n"
    "  --sockets N          UDP sockets sharing the window (1)\n"
    "  --batch N            datagrams per sendmmsg, 1..64 (32)\n"
    "  --timeout-ms N       a request unanswered this long is lost (1000)\n"
    "  --warmup S           seconds before measuring (1, at most 600)\n"
    "  --duration S         measured seconds (5, at most 3600)\n"
    "  --rate R             pace to R requests/s instead of a closed loop\n"
    "  --requests N         stop after N requests (N = the targets: one to each)\n"
    "  --cpu N              pin to CPU N\n"
    "  --v3-user NAME       SNMPv3 with this USM user (HMAC-SHA-96, AES-128-CFB) instead of "
    "v1/v2c\n"
    "  --v3-auth-pass P     its authentication password\n"
    "  --v3-priv-pass Q     its privacy password\n"
    "  --v3-level L         authPriv, authNoPriv or noAuthNoPriv (authPriv)\n"
    "  --until-answer       stop at the first answer (a readiness probe; exit 0 when answered)\n"
    "  --quiet              print only the RESULT line\n"
    "Targets must be loopback addresses (127.0.0.0/8).\n";

bool ParseKind(const std::string& name, const std::string& value, GeneratorOptions* options) {
  options->pduType = name == "--get"       ? tessel::bench::kPduGet
                     : name == "--getnext" ? tessel::bench::kPduGetNext
                                           : tessel::bench::kPduGetBulk;
  options->oid.clear();
  return tessel::bench::ParseOid(value, &options->oid);
}

bool ParseLevel(const std::string& text, v3::Level* level) {
  if (text == "authPriv") {
    *level = v3::Level::kAuthPriv;
  } else if (text == "authNoPriv") {
    *level = v3::Level::kAuthNoPriv;
  } else if (text == "noAuthNoPriv") {
    *level = v3::Level::kNoAuthNoPriv;
  } else {
    return false;
  }
  return true;
}

// The passwords a level needs: present and, as agents require, at least eight characters.
bool CheckV3Passwords(const GeneratorOptions& options) {
  const auto level = static_cast<std::uint8_t>(options.v3Level);
  if (((level & 1) && options.v3AuthPassword.size() < 8) ||
      ((level & 2) && options.v3PrivPassword.size() < 8)) {
    std::fprintf(stderr,
                 "loadgen: --v3-level needs --v3-auth-pass (and for authPriv --v3-priv-pass) "
                 "of at least 8 characters\n");
    return false;
  }
  return true;
}

bool ParseArguments(int argc, char** argv, GeneratorOptions* options) {
  tessel::bench::ArgumentReader args(argc, argv);
  std::string name;
  std::uint16_t port = 161;
  std::string targets;
  while (args.Next(&name)) {
    std::string value;
    bool ok = true;
    if (name == "--quiet") {
      options->quiet = true;
    } else if (name == "--until-answer") {
      options->untilAnswer = true;
    } else if (!args.Value(&value)) {
      ok = false;
    } else if (name == "--targets") {
      targets = value;
    } else if (name == "--port") {
      ok = tessel::bench::ParsePort(value, &port);
    } else if (name == "--community") {
      options->community = value;
    } else if (name == "--v3-user") {
      options->v3User = value;
      ok = !value.empty();
    } else if (name == "--v3-auth-pass") {
      options->v3AuthPassword = value;
    } else if (name == "--v3-priv-pass") {
      options->v3PrivPassword = value;
    } else if (name == "--v3-level") {
      ok = ParseLevel(value, &options->v3Level);
    } else if (name == "--version") {
      ok = value == "1" || value == "2c";
      options->version = value == "1" ? 0 : 1;
    } else if (name == "--get" || name == "--getnext" || name == "--getbulk") {
      ok = ParseKind(name, value, options);
    } else if (name == "--non-repeaters") {
      ok = tessel::bench::ParseInt(value, 0, 1000, &options->nonRepeaters);
    } else if (name == "--max-repetitions") {
      ok = tessel::bench::ParseInt(value, 0, 10000, &options->maxRepetitions);
    } else if (name == "--window") {
      ok = tessel::bench::ParseInt(value, 1, 65536, &options->window);
    } else if (name == "--sockets") {
      ok = tessel::bench::ParseInt(value, 1, 64, &options->sockets);
    } else if (name == "--batch") {
      ok = tessel::bench::ParseInt(value, 1, kMaxBatch, &options->batch);
    } else if (name == "--timeout-ms") {
      ok = tessel::bench::ParseInt(value, 1, 60000, &options->timeoutMs);
    } else if (name == "--warmup") {
      ok = tessel::bench::ParseSeconds(value, 0, 600, &options->warmupSeconds);
    } else if (name == "--duration") {
      ok = tessel::bench::ParseSeconds(value, 0.001, 3600, &options->measureSeconds);
    } else if (name == "--rate") {
      ok = tessel::bench::ParseSeconds(value, 0, 1e8, &options->rate);
    } else if (name == "--requests") {
      ok = tessel::bench::ParseInt(value, 1, 1 << 30, &options->requests);
    } else if (name == "--cpu") {
      ok = tessel::bench::ParseInt(value, 0, CPU_SETSIZE - 1, &options->cpu);
    } else {
      ok = false;
    }
    if (!ok) {
      std::fprintf(stderr, "loadgen: bad option %s\n", name.c_str());
      return false;
    }
  }
  if (!tessel::bench::ParseTargets(targets, port, &options->targets)) {
    std::fprintf(stderr,
                 "loadgen: --targets needs loopback IPv4 addresses (A, A+N, comma lists)\n");
    return false;
  }
  options->sockets = std::min(options->sockets, options->window);
  return options->v3User.empty() || CheckV3Passwords(*options);
}

}  // namespace

int main(int argc, char** argv) {
  GeneratorOptions options;
  if (!ParseArguments(argc, argv, &options)) {
    std::fputs(kUsage, stderr);
    return 2;
  }
  if (options.cpu >= 0 && !tessel::bench::PinToCpu(options.cpu)) {
    std::fprintf(stderr, "loadgen: cannot pin to CPU %d: %s\n", options.cpu, std::strerror(errno));
    return 2;
  }
  Generator generator(options);
  if (!generator.Open()) {
    std::fprintf(stderr, "loadgen: cannot open sockets: %s\n", std::strerror(errno));
    return 2;
  }
  return generator.Run();
}
