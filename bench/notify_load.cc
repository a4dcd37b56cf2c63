// tessel_notify_load: the engine's notification path under load. It starts the engine as the host
// does (parameters, registry, N agents on consecutive loopback addresses, the SNMP service) with
// the in-memory host, then asks the engine for v2c notifications through SendNotification, the
// operation behind the host's sendNotification, from one thread, round robin over --senders
// devices from --first-sender on. Each leaves from its device's own address and SNMP port.
//   traps:   as fast as the engine takes them;
//   informs: --outstanding at a time, a new one for each the engine reports acknowledged or
//            dropped to the host; afterwards it waits for every inform still out and checks
//            that each was acknowledged exactly once and none was dropped.
// Bounded by --duration seconds and --count notifications, whichever comes first.
#include <arpa/inet.h>
#include <sched.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <mutex>
#include <semaphore>
#include <string>
#include <vector>

#include "engine/engine.h"
#include "inform_tally.h"
#include "notify/notifier.h"
#include "options.h"
#include "snmp/service.h"
#include "snmp/var_value.h"
#include "support/memory_host.h"

namespace tessel::bench {
namespace {

using Clock = std::chrono::steady_clock;

double SecondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

struct LoadOptions {
  std::vector<std::string> devices;  // address texts, device i has agent ID i + 1
  std::uint16_t port = 11241;
  std::size_t senders = 1;
  std::size_t firstSender = 0;  // devices firstSender .. firstSender + senders - 1 send
  std::string managerAddress;
  std::uint16_t managerPort = 0;
  bool informs = false;
  double seconds = 10;
  long long count = 1000000;
  int outstanding = 1000;
  int timeout = 5;
  int cpu = -1;
};

// Keeps the inform books and frees a slot of the window for every inform the engine reports
// acknowledged or dropped.
class LoadHost : public MemoryHost {
 public:
  explicit LoadHost(int outstanding) : slots_(outstanding) {}

  void LogResponseMessage(const InformReport& report) override {
    tally_.Acknowledged(report.informId);
    Reported(acknowledged_);
  }
  void StoreDroppedInformMessage(const InformReport& report) override {
    tally_.Dropped(report.informId);
    Reported(dropped_);
  }

  std::counting_semaphore<>& Slots() { return slots_; }
  InformTally& Tally() { return tally_; }
  std::uint64_t Acknowledged() const { return acknowledged_.load(); }
  // Waits until the engine has reported at least this many informs; false at the deadline.
  bool WaitForReports(std::uint64_t reports, Clock::time_point deadline) {
    std::unique_lock<std::mutex> lock(mutex_);
    return reported_.wait_until(lock, deadline,
                                [&] { return acknowledged_.load() + dropped_.load() >= reports; });
  }

 private:
  void Reported(std::atomic<std::uint64_t>& counter) {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      ++counter;
    }
    reported_.notify_one();
    slots_.release();
  }

  std::counting_semaphore<> slots_;
  InformTally tally_;
  std::atomic<std::uint64_t> acknowledged_{0};
  std::atomic<std::uint64_t> dropped_{0};
  std::mutex mutex_;
  std::condition_variable reported_;
};

// Starts the engine with every device; the number that opened their socket.
std::size_t StartEngine(const LoadOptions& options) {
  InitAgentParams({false, 0, "", 0});
  InitSnmpParams();
  InitAgentRegistry();
  std::vector<AgentRegistration> agents;
  agents.reserve(options.devices.size());
  for (std::size_t i = 0; i < options.devices.size(); ++i) {
    agents.push_back({static_cast<std::int32_t>(i + 1),
                      options.devices[i],
                      options.port,
                      {"public"},
                      {"private"},
                      0,
                      "db",
                      "agent" + std::to_string(i + 1),
                      0});
  }
  std::size_t started = 0;
  for (std::int64_t socket : StartSnmpNetwork(agents)) started += socket > 0 ? 1 : 0;
  if (!InitSnmpThread()) return 0;
  return started;
}

// linkDown of interface 2, as a device would raise it.
NotificationRequest LinkDown(const LoadOptions& options) {
  NotificationRequest request;
  request.pduType = options.informs ? kInformRequest : kTrapV2;
  request.version = kSnmpV2c;
  request.managerHost = options.managerAddress;
  request.managerPort = options.managerPort;
  request.community = "public";
  request.trapOid = "1.3.6.1.6.3.1.1.5.3";
  request.bindings = {std::vector<std::string>{"1.3.6.1.2.1.2.2.1.1.2", "1.3.6.1.2.1.2.2.1.7.2",
                                               "1.3.6.1.2.1.2.2.1.8.2"},
                      std::vector<std::int32_t>{kAsnInteger, kAsnInteger, kAsnInteger},
                      std::vector<std::string>{"2", "1", "2"}};
  request.timeout = static_cast<std::uint32_t>(options.timeout);
  request.retries = 0;
  return request;
}

struct LoadCounts {
  std::uint64_t sent = 0;
  std::uint64_t notSent = 0;
  std::uint64_t informIds = 0;  // informs the engine took, sent or reported dropped at once
  double seconds = 0;
};

// The next device's notification; the engine's outcome.
NotifyOutcome SendFrom(NotificationRequest& request, const LoadOptions& options,
                       std::uint64_t index) {
  const std::size_t device =
      options.firstSender + static_cast<std::size_t>(index % options.senders);
  request.agentId = static_cast<std::int32_t>(device + 1);
  request.agentText = options.devices[device];
  return SendNotification(request);
}

LoadCounts SendTraps(const LoadOptions& options) {
  NotificationRequest request = LinkDown(options);
  LoadCounts counts;
  const Clock::time_point start = Clock::now();
  for (long long i = 0; i < options.count; ++i) {
    if (SecondsSince(start) >= options.seconds) break;
    if (SendFrom(request, options, static_cast<std::uint64_t>(i)).result == NotifyResult::kSent)
      ++counts.sent;
    else
      ++counts.notSent;
  }
  counts.seconds = SecondsSince(start);
  return counts;
}

// An inform whose first send failed is reported dropped by the engine, which frees its slot;
// one refused before it got an ID frees its slot here.
LoadCounts SendInforms(const LoadOptions& options, LoadHost& host, std::uint64_t* inWindow) {
  NotificationRequest request = LinkDown(options);
  LoadCounts counts;
  const Clock::time_point start = Clock::now();
  const auto deadline = start + std::chrono::duration_cast<Clock::duration>(
                                    std::chrono::duration<double>(options.seconds));
  for (long long i = 0; i < options.count; ++i) {
    // A free slot is taken at once even past the deadline: the clock is read first.
    if (Clock::now() >= deadline || !host.Slots().try_acquire_until(deadline)) break;
    const NotifyOutcome outcome = SendFrom(request, options, static_cast<std::uint64_t>(i));
    if (outcome.informId != 0) {
      host.Tally().Sent(outcome.informId);
      ++counts.informIds;
    }
    if (outcome.result == NotifyResult::kSent) {
      ++counts.sent;
    } else {
      ++counts.notSent;
      if (outcome.informId == 0) host.Slots().release();
    }
  }
  *inWindow = host.Acknowledged();
  counts.seconds = SecondsSince(start);
  return counts;
}

int Run(const LoadOptions& options) {
  LoadHost host(options.outstanding);
  InstallHost(&host);
  const Clock::time_point launch = Clock::now();
  const std::size_t started = StartEngine(options);
  const double startSeconds = SecondsSince(launch);
  int status = 0;
  if (started != options.devices.size()) {
    std::fprintf(stderr, "notify load: %zu of %zu devices started (ports in use? descriptors?)\n",
                 started, options.devices.size());
    status = 1;
  } else if (!options.informs) {
    const LoadCounts counts = SendTraps(options);
    std::printf(
        "RESULT kind=trap devices=%zu senders=%zu first_sender=%zu sent=%llu not_sent=%llu "
        "seconds=%.3f rate=%.0f start_s=%.2f\n",
        options.devices.size(), options.senders, options.firstSender,
        static_cast<unsigned long long>(counts.sent),
        static_cast<unsigned long long>(counts.notSent), counts.seconds,
        static_cast<double>(counts.sent) / counts.seconds, startSeconds);
  } else {
    std::uint64_t inWindow = 0;
    const LoadCounts counts = SendInforms(options, host, &inWindow);
    // Every inform is acknowledged or dropped within its timeout: wait that long, and a little.
    const bool settled = host.WaitForReports(
        counts.informIds, Clock::now() + std::chrono::seconds(options.timeout + 2));
    const InformSummary summary = host.Tally().Summary();
    std::printf(
        "RESULT kind=inform devices=%zu senders=%zu outstanding=%d sent=%llu "
        "not_sent=%llu seconds=%.3f acknowledged_in_window=%llu rate=%.0f "
        "acknowledged=%llu duplicates=%llu unknown=%llu dropped=%llu both=%llu "
        "unanswered=%llu settled=%s clean=%s start_s=%.2f\n",
        options.devices.size(), options.senders, options.outstanding,
        static_cast<unsigned long long>(summary.sent),
        static_cast<unsigned long long>(counts.notSent), counts.seconds,
        static_cast<unsigned long long>(inWindow), static_cast<double>(inWindow) / counts.seconds,
        static_cast<unsigned long long>(summary.acknowledged),
        static_cast<unsigned long long>(summary.duplicates),
        static_cast<unsigned long long>(summary.unknown),
        static_cast<unsigned long long>(summary.dropped),
        static_cast<unsigned long long>(summary.both),
        static_cast<unsigned long long>(summary.unanswered), settled ? "yes" : "no",
        summary.Clean() ? "yes" : "no", startSeconds);
    if (!summary.Clean()) status = 1;
  }
  AdapterJniStopNetwork();
  InstallHost(nullptr);
  return status;
}

const char kUsage[] =
    "usage: tessel_notify_load --to A:P [--devices N] [--address A] [--port P] [--senders N]\n"
    "                          [--first-sender I] [--informs [--outstanding N] [--timeout S]]\n"
    "                          [--duration S] [--count N] [--cpu N]\n"
    "  starts N devices (10000) from A (127.0.1.1) on port P (11241) and sends v2c linkDown\n"
    "  traps, or informs, round robin from --senders of them (all but the first I), device I\n"
    "  (0) the first, to the manager A:P, for S seconds (10, at most 600) or N notifications\n"
    "  (1000000); loopback only\n";

bool ParseManager(const std::string& text, LoadOptions* options) {
  const std::size_t colon = text.rfind(':');
  std::vector<sockaddr_in> manager;
  if (colon == std::string::npos || !ParsePort(text.substr(colon + 1), &options->managerPort) ||
      !ParseTargets(text.substr(0, colon), options->managerPort, &manager) || manager.size() != 1) {
    return false;
  }
  options->managerAddress = text.substr(0, colon);
  return true;
}

bool DeviceAddresses(const std::string& first, int count, std::vector<std::string>* out) {
  std::vector<sockaddr_in> addresses;
  if (!ParseTargets(first + "+" + std::to_string(count), 1, &addresses)) return false;
  for (const sockaddr_in& address : addresses) {
    char text[INET_ADDRSTRLEN] = {};
    inet_ntop(AF_INET, &address.sin_addr, text, sizeof text);
    out->push_back(text);
  }
  return true;
}

bool ParseArguments(int argc, char** argv, LoadOptions* options) {
  ArgumentReader args(argc, argv);
  std::string name;
  std::string value;
  std::string first = "127.0.1.1";
  int devices = 10000;
  int senders = 0;
  int firstSender = 0;
  int count = 1000000;
  while (args.Next(&name)) {
    if (name == "--informs") {
      options->informs = true;
      continue;
    }
    bool ok = args.Value(&value);
    if (!ok) {
    } else if (name == "--to") {
      ok = ParseManager(value, options);
    } else if (name == "--devices") {
      ok = ParseInt(value, 1, 100000, &devices);
    } else if (name == "--address") {
      first = value;
    } else if (name == "--port") {
      ok = ParsePort(value, &options->port);
    } else if (name == "--senders") {
      ok = ParseInt(value, 1, 100000, &senders);
    } else if (name == "--first-sender") {
      ok = ParseInt(value, 0, 99999, &firstSender);
    } else if (name == "--outstanding") {
      ok = ParseInt(value, 1, 100000, &options->outstanding);
    } else if (name == "--timeout") {
      ok = ParseInt(value, 1, 60, &options->timeout);
    } else if (name == "--duration") {
      ok = ParseSeconds(value, 0.1, 600, &options->seconds);
    } else if (name == "--count") {
      ok = ParseInt(value, 1, 100000000, &count);
    } else if (name == "--cpu") {
      ok = ParseInt(value, 0, CPU_SETSIZE - 1, &options->cpu);
    } else {
      ok = false;
    }
    if (!ok) return false;
  }
  options->count = count;
  options->senders = static_cast<std::size_t>(senders == 0 ? devices - firstSender : senders);
  options->firstSender = static_cast<std::size_t>(firstSender);
  return options->managerPort != 0 && firstSender < devices &&
         options->firstSender + options->senders <= static_cast<std::size_t>(devices) &&
         DeviceAddresses(first, devices, &options->devices);
}

}  // namespace
}  // namespace tessel::bench

int main(int argc, char** argv) {
  tessel::bench::LoadOptions options;
  if (!tessel::bench::ParseArguments(argc, argv, &options)) {
    std::fputs(tessel::bench::kUsage, stderr);
    return 2;
  }
  // Pinned before the engine starts, so that its service threads share the CPU too.
  if (options.cpu >= 0 && !tessel::bench::PinToCpu(options.cpu)) {
    std::fprintf(stderr, "notify load: cannot pin to CPU %d\n", options.cpu);
    return 2;
  }
  return tessel::bench::Run(options);
}
