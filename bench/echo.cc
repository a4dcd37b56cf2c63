// tessel_echo: a UDP echo server, the ceiling of the machine for a request/response workload.
// One thread waits on epoll over one socket per address, receives in recvmmsg batches and sends
// each batch straight back with sendmmsg. It stops after --duration seconds, --count datagrams,
// or SIGTERM/SIGINT, and prints what it echoed.
#include <netinet/in.h>
#include <sched.h>
#include <signal.h>
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

#include "datagram_batch.h"
#include "options.h"

namespace {

volatile sig_atomic_t stopRequested = 0;
void OnStopSignal(int) { stopRequested = 1; }

std::int64_t NowMs() {
  timespec ts{};
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<std::int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

struct EchoOptions {
  std::vector<sockaddr_in> addresses;
  double seconds = 60;
  long long count = 0;  // 0: no limit
  int cpu = -1;
};

class EchoServer {
 public:
  bool Open(const std::vector<sockaddr_in>& addresses);
  std::uint64_t Serve(const EchoOptions& options);

 private:
  void EchoAll(int fd);

  int epoll_ = -1;
  std::vector<int> fds_;
  tessel::bench::DatagramBatch batch_;
  std::uint64_t echoed_ = 0;
};

bool EchoServer::Open(const std::vector<sockaddr_in>& addresses) {
  epoll_ = epoll_create1(EPOLL_CLOEXEC);
  if (epoll_ < 0) return false;
  for (const sockaddr_in& address : addresses) {
    int fd = socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    if (fd < 0) return false;
    int size = 4 << 20;
    setsockopt(fd, SOL_SOCKET, SO_RCVBUF, &size, sizeof size);
    setsockopt(fd, SOL_SOCKET, SO_SNDBUF, &size, sizeof size);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) return false;
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.fd = fd;
    if (epoll_ctl(epoll_, EPOLL_CTL_ADD, fd, &event) != 0) return false;
    fds_.push_back(fd);
  }
  return true;
}

// Reads until the socket is empty, answering each batch before reading the next one.
void EchoServer::EchoAll(int fd) {
  for (;;) {
    const int received = batch_.Receive(fd);
    if (received == 0) return;
    for (int i = 0; i < received; ++i) batch_.Return(i);
    echoed_ += static_cast<std::uint64_t>(batch_.SendReturned(fd));
    if (received < tessel::bench::DatagramBatch::kSize) return;
  }
}

std::uint64_t EchoServer::Serve(const EchoOptions& options) {
  const std::int64_t end = NowMs() + static_cast<std::int64_t>(options.seconds * 1000);
  epoll_event events[64];
  while (!stopRequested) {
    const std::int64_t now = NowMs();
    if (now >= end || (options.count > 0 && echoed_ >= static_cast<std::uint64_t>(options.count)))
      break;
    const int ready =
        epoll_wait(epoll_, events, 64, static_cast<int>(std::min<std::int64_t>(end - now, 100)));
    for (int i = 0; i < ready; ++i) EchoAll(events[i].data.fd);
  }
  for (int fd : fds_) close(fd);
  close(epoll_);
  return echoed_;
}

const char kUsage[] =
    "usage: tessel_echo --address A[+N][,B...] --port P [--duration S] [--count N] [--cpu N]\n"
    "  echoes every datagram to its sender for S seconds (60, at most 3600) or N datagrams\n"
    "  addresses must be loopback (127.0.0.0/8)\n";

bool ParseArguments(int argc, char** argv, EchoOptions* options) {
  tessel::bench::ArgumentReader args(argc, argv);
  std::string name;
  std::string value;
  std::string addresses = "127.0.0.1";
  std::uint16_t port = 0;
  while (args.Next(&name)) {
    int number = 0;
    bool ok = args.Value(&value);
    if (!ok) {
    } else if (name == "--address") {
      addresses = value;
    } else if (name == "--port") {
      ok = tessel::bench::ParsePort(value, &port);
    } else if (name == "--duration") {
      ok = tessel::bench::ParseSeconds(value, 0.001, 3600, &options->seconds);
    } else if (name == "--count") {
      ok = tessel::bench::ParseInt(value, 1, 2000000000, &number);
      options->count = number;
    } else if (name == "--cpu") {
      ok = tessel::bench::ParseInt(value, 0, CPU_SETSIZE - 1, &options->cpu);
    } else {
      ok = false;
    }
    if (!ok) return false;
  }
  return port != 0 && tessel::bench::ParseTargets(addresses, port, &options->addresses);
}

}  // namespace

int main(int argc, char** argv) {
  EchoOptions options;
  if (!ParseArguments(argc, argv, &options)) {
    std::fputs(kUsage, stderr);
    return 2;
  }
  if (options.cpu >= 0 && !tessel::bench::PinToCpu(options.cpu)) {
    std::fprintf(stderr, "echo: cannot pin to CPU %d: %s\n", options.cpu, std::strerror(errno));
    return 2;
  }
  struct sigaction action {};
  action.sa_handler = OnStopSignal;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
  EchoServer server;
  if (!server.Open(options.addresses)) {
    std::fprintf(stderr, "echo: cannot open sockets: %s\n", std::strerror(errno));
    return 2;
  }
  const std::uint64_t echoed = server.Serve(options);
  std::printf("ECHO echoed=%llu\n", static_cast<unsigned long long>(echoed));
  return 0;
}
