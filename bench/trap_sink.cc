// tessel_trap_sink: a notification receiver that only counts, the most any trap receiver can take
// on this machine. One thread, one socket: it waits in poll, then reads what the socket holds in
// recvmmsg batches. With --answer-informs it acknowledges every v1/v2c InformRequest at once with
// its Response (the same message, PDU type changed), sent back in one sendmmsg per batch.
// It stops after --duration seconds, after --idle seconds without a datagram once one came, or on
// SIGTERM/SIGINT, and prints what it received. Given the senders' addresses and port, it also
// counts the datagrams that came from elsewhere.
#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sched.h>
#include <signal.h>
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

#include "datagram_batch.h"
#include "options.h"
#include "snmp_wire.h"

namespace {

constexpr int kReceiveBuffer = 4 << 20;  // the usual rmem_max: granted in full without privilege

volatile sig_atomic_t stopRequested = 0;
void OnStopSignal(int) { stopRequested = 1; }

double NowSeconds() {
  timespec ts{};
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) / 1e9;
}

struct SinkOptions {
  sockaddr_in address{};
  double seconds = 60;
  double idleSeconds = 0;  // 0: never stop for silence
  bool answerInforms = false;
  int cpu = -1;
  std::vector<sockaddr_in> senders;  // empty: any sender is expected
};

struct SinkCounts {
  std::uint64_t received = 0;
  std::uint64_t informs = 0;
  std::uint64_t answered = 0;
  std::uint64_t wrongSource = 0;
  double first = 0;  // arrival of the first and of the last datagram
  double last = 0;
};

class TrapSink {
 public:
  bool Open(const sockaddr_in& address);
  SinkCounts Serve(const SinkOptions& options);

 private:
  // Reads until the socket is empty.
  void ReceiveAll(const SinkOptions& options);
  void Answer(int received);
  void CheckSenders(int received, const std::vector<sockaddr_in>& senders);

  int fd_ = -1;
  tessel::bench::DatagramBatch batch_;
  SinkCounts counts_;
};

bool TrapSink::Open(const sockaddr_in& address) {
  fd_ = socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
  if (fd_ < 0) return false;
  setsockopt(fd_, SOL_SOCKET, SO_RCVBUF, &kReceiveBuffer, sizeof kReceiveBuffer);
  return bind(fd_, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

// Acknowledges the informs among the batch just received; one the send buffer has no room for
// goes unanswered, as with a busy manager, and the engine's inform timer sees to it.
void TrapSink::Answer(int received) {
  for (int i = 0; i < received; ++i) {
    if (!tessel::bench::AnswerInform(batch_.Data(i), batch_.Length(i))) continue;
    ++counts_.informs;
    batch_.Return(i);
  }
  counts_.answered += static_cast<std::uint64_t>(batch_.SendReturned(fd_));
}

// The senders are consecutive addresses on one port: a range check, whatever their number.
void TrapSink::CheckSenders(int received, const std::vector<sockaddr_in>& senders) {
  if (senders.empty()) return;
  const std::uint32_t first = ntohl(senders.front().sin_addr.s_addr);
  for (int i = 0; i < received; ++i) {
    const sockaddr_in& from = batch_.Sender(i);
    const std::uint32_t offset = ntohl(from.sin_addr.s_addr) - first;
    if (from.sin_port != senders.front().sin_port || offset >= senders.size())
      ++counts_.wrongSource;
  }
}

void TrapSink::ReceiveAll(const SinkOptions& options) {
  for (;;) {
    const int received = batch_.Receive(fd_);
    if (received == 0) return;
    const double now = NowSeconds();
    if (counts_.received == 0) counts_.first = now;
    counts_.last = now;
    counts_.received += static_cast<std::uint64_t>(received);
    CheckSenders(received, options.senders);
    if (options.answerInforms) Answer(received);
    if (received < tessel::bench::DatagramBatch::kSize) return;
  }
}

SinkCounts TrapSink::Serve(const SinkOptions& options) {
  const double end = NowSeconds() + options.seconds;
  std::printf("READY\n");
  std::fflush(stdout);
  while (!stopRequested) {
    const double now = NowSeconds();
    if (now >= end) break;
    if (options.idleSeconds > 0 && counts_.received > 0 &&
        now - counts_.last >= options.idleSeconds) {
      break;
    }
    pollfd ready{fd_, POLLIN, 0};
    const double wait = std::min(end - now, 0.1);
    if (poll(&ready, 1, static_cast<int>(wait * 1000) + 1) == 1) ReceiveAll(options);
  }
  close(fd_);
  return counts_;
}

const char kUsage[] =
    "usage: tessel_trap_sink --address A --port P [--duration S] [--idle S] [--answer-informs]\n"
    "                        [--senders B+N --sender-port Q] [--cpu N]\n"
    "  counts the datagrams that reach A:P for S seconds (60, at most 3600), or until S idle\n"
    "  seconds pass after the first, and those not from Q on one of the N addresses from B;\n"
    "  addresses must be loopback (127.0.0.0/8)\n";

bool ParseArguments(int argc, char** argv, SinkOptions* options) {
  tessel::bench::ArgumentReader args(argc, argv);
  std::string name;
  std::string value;
  std::string address = "127.0.0.1";
  std::uint16_t port = 0;
  std::string senders;
  std::uint16_t senderPort = 0;
  while (args.Next(&name)) {
    if (name == "--answer-informs") {
      options->answerInforms = true;
      continue;
    }
    bool ok = args.Value(&value);
    if (!ok) {
    } else if (name == "--address") {
      address = value;
    } else if (name == "--port") {
      ok = tessel::bench::ParsePort(value, &port);
    } else if (name == "--senders") {
      senders = value;
    } else if (name == "--sender-port") {
      ok = tessel::bench::ParsePort(value, &senderPort);
    } else if (name == "--duration") {
      ok = tessel::bench::ParseSeconds(value, 0.001, 3600, &options->seconds);
    } else if (name == "--idle") {
      ok = tessel::bench::ParseSeconds(value, 0.01, 3600, &options->idleSeconds);
    } else if (name == "--cpu") {
      ok = tessel::bench::ParseInt(value, 0, CPU_SETSIZE - 1, &options->cpu);
    } else {
      ok = false;
    }
    if (!ok) return false;
  }
  std::vector<sockaddr_in> addresses;
  if (port == 0 || !tessel::bench::ParseTargets(address, port, &addresses) ||
      addresses.size() != 1) {
    return false;
  }
  options->address = addresses[0];
  if (senders.empty() != (senderPort == 0)) return false;
  return senders.empty() || (senders.find(',') == std::string::npos &&
                             tessel::bench::ParseTargets(senders, senderPort, &options->senders));
}

}  // namespace

int main(int argc, char** argv) {
  SinkOptions options;
  if (!ParseArguments(argc, argv, &options)) {
    std::fputs(kUsage, stderr);
    return 2;
  }
  if (options.cpu >= 0 && !tessel::bench::PinToCpu(options.cpu)) {
    std::fprintf(stderr, "trap sink: cannot pin to CPU %d: %s\n", options.cpu,
                 std::strerror(errno));
    return 2;
  }
  struct sigaction action {};
  action.sa_handler = OnStopSignal;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
  TrapSink sink;
  if (!sink.Open(options.address)) {
    std::fprintf(stderr, "trap sink: cannot open the socket: %s\n", std::strerror(errno));
    return 2;
  }
  const SinkCounts counts = sink.Serve(options);
  const double span = counts.last - counts.first;
  std::printf(
      "SINK received=%llu informs=%llu answered=%llu wrong_source=%llu seconds=%.3f "
      "rate=%.0f\n",
      static_cast<unsigned long long>(counts.received),
      static_cast<unsigned long long>(counts.informs),
      static_cast<unsigned long long>(counts.answered),
      static_cast<unsigned long long>(counts.wrongSource), span,
      span > 0 ? static_cast<double>(counts.received) / span : 0.0);
  return 0;
}
