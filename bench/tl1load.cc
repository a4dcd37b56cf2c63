// tessel_tl1load: TCP request/response load on loopback, for TL1 agents and for the TCP echo server
// that gives the machine's ceiling for the same exchange.
//   tessel_tl1load load --targets A+N --port P --connections C --seconds S [--warmup W]
//                       [--command TEXT] [--until TEXT] [--rate R]
//     C connections spread round robin over the targets, each sending TEXT ({n}: the 1-based
//     number of its target) and waiting for TEXT's answer to end in --until before it sends again
//     (closed loop; with --rate, R exchanges per second in all, started on a fixed schedule).
//     Prints "RESULT exchanges=.. rate=.. p50_us=.. p99_us=.. errors=..".
//   tessel_tl1load connect --targets A+N --port P --count K [--command TEXT] [--until TEXT]
//     opens K sessions one after another, round robin over the targets, each answering one
//     exchange before it closes; prints "RESULT sessions=.. rate=.. errors=..".
//   tessel_tl1load echo --targets A+N --port P --seconds S
//     one thread, epoll: every byte a client sends comes straight back, until S seconds passed.
// Every run is bounded in time; every address must be in 127.0.0.0/8.
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/epoll.h>
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

namespace {

using tessel::bench::ArgumentReader;
using tessel::bench::Histogram;

constexpr std::size_t kReadSize = 65536;
constexpr int kMaxEvents = 256;

std::uint64_t NowNs() {
  timespec ts{};
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<std::uint64_t>(ts.tv_sec) * 1000000000u +
         static_cast<std::uint64_t>(ts.tv_nsec);
}

struct Options {
  std::string mode;
  std::string targetsText;
  std::uint16_t port = 0;
  std::vector<sockaddr_in> targets;
  int connections = 100;
  int count = 1000;
  double seconds = 10;
  double warmup = 1;
  double rate = 0;  // 0: closed loop
  std::string command = "RTRV-HDR:NE{n}::1;";
  std::string until = "TL1>>";
};

class Descriptor {
 public:
  explicit Descriptor(int fd = -1) : fd_(fd) {}
  Descriptor(Descriptor&& other) noexcept : fd_(other.fd_) { other.fd_ = -1; }
  Descriptor& operator=(Descriptor&& other) noexcept {
    std::swap(fd_, other.fd_);
    return *this;
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  ~Descriptor() {
    if (fd_ >= 0) close(fd_);
  }
  int get() const { return fd_; }

 private:
  int fd_;
};

std::string CommandFor(const std::string& pattern, std::size_t target) {
  std::string text = pattern;
  const std::string number = std::to_string(target + 1);
  for (std::size_t at = text.find("{n}"); at != std::string::npos; at = text.find("{n}", at)) {
    text.replace(at, 3, number);
    at += number.size();
  }
  return text;
}

// A blocking connection with TCP_NODELAY, as a TL1 manager holds one; -1 on failure.
Descriptor Connect(const sockaddr_in& address) {
  Descriptor socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (socket.get() < 0) return Descriptor();
  int one = 1;
  setsockopt(socket.get(), IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
  timeval timeout{5, 0};
  setsockopt(socket.get(), SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  setsockopt(socket.get(), SOL_SOCKET, SO_SNDTIMEO, &timeout, sizeof timeout);
  if (connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    return Descriptor();
  }
  return socket;
}

bool EndsWith(const std::string& text, const std::string& end) {
  return text.size() >= end.size() && text.compare(text.size() - end.size(), end.size(), end) == 0;
}

bool SendAll(int fd, const std::string& text) {
  std::size_t sent = 0;
  while (sent < text.size()) {
    ssize_t n = send(fd, text.data() + sent, text.size() - sent, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    sent += static_cast<std::size_t>(n);
  }
  return true;
}

// One connection of the load: what it sends, what it has received of the answer, and when it sent.
struct Session {
  Descriptor socket;
  std::string command;
  std::string received;
  std::uint64_t sentAt = 0;
  bool waiting = false;
};

class Load {
 public:
  explicit Load(const Options& options) : options_(options) {}

  int Run() {
    Descriptor poll(epoll_create1(EPOLL_CLOEXEC));
    epoll_ = poll.get();
    if (!Open()) return 1;
    const std::uint64_t start = NowNs();
    measureFrom_ = start + static_cast<std::uint64_t>(options_.warmup * 1e9);
    const std::uint64_t end = measureFrom_ + static_cast<std::uint64_t>(options_.seconds * 1e9);
    const std::uint64_t interval =
        options_.rate > 0 ? static_cast<std::uint64_t>(1e9 / options_.rate) : 0;
    std::uint64_t nextStart = start;
    std::size_t nextSession = 0;
    if (interval == 0) {
      for (std::size_t i = 0; i < sessions_.size(); ++i) Send(i, start);
    }
    epoll_event events[kMaxEvents];
    for (std::uint64_t now = NowNs(); now < end; now = NowNs()) {
      if (interval != 0) {
        // Paced: start every exchange that is due on a session that is free, else skip it.
        for (; nextStart <= now; nextStart += interval) {
          for (std::size_t tried = 0; tried < sessions_.size(); ++tried, ++nextSession) {
            std::size_t index = nextSession % sessions_.size();
            if (!sessions_[index].waiting) {
              Send(index, now);
              ++nextSession;
              break;
            }
          }
        }
      }
      const std::uint64_t wakeAt = interval != 0 ? std::min(nextStart, end) : end;
      const int timeoutMs =
          static_cast<int>(std::max<std::uint64_t>(1, (wakeAt - std::min(wakeAt, now)) / 1000000));
      const int ready = epoll_wait(epoll_, events, kMaxEvents,
                                   interval != 0 ? std::min(timeoutMs, 1) : timeoutMs);
      for (int e = 0; e < ready; ++e) Receive(events[e].data.u32, interval == 0);
    }
    const double measured = static_cast<double>(end - measureFrom_) / 1e9;
    std::printf("RESULT exchanges=%llu rate=%.0f p50_us=%.1f p99_us=%.1f errors=%llu\n",
                static_cast<unsigned long long>(latency_.Count()),
                static_cast<double>(latency_.Count()) / measured, latency_.Percentile(0.5) / 1000.0,
                latency_.Percentile(0.99) / 1000.0, static_cast<unsigned long long>(errors_));
    return errors_ == 0 && latency_.Count() > 0 ? 0 : 1;
  }

 private:
  bool Open() {
    sessions_.resize(static_cast<std::size_t>(options_.connections));
    for (std::size_t i = 0; i < sessions_.size(); ++i) {
      const std::size_t target = i % options_.targets.size();
      sessions_[i].socket = Connect(options_.targets[target]);
      sessions_[i].command = CommandFor(options_.command, target);
      if (sessions_[i].socket.get() < 0) {
        std::fprintf(stderr, "tessel_tl1load: connection %zu cannot connect: %s\n", i,
                     std::strerror(errno));
        return false;
      }
      epoll_event event{};
      event.events = EPOLLIN;
      event.data.u32 = static_cast<std::uint32_t>(i);
      epoll_ctl(epoll_, EPOLL_CTL_ADD, sessions_[i].socket.get(), &event);
    }
    return true;
  }

  void Send(std::size_t index, std::uint64_t now) {
    Session& session = sessions_[index];
    session.received.clear();
    session.sentAt = now;
    session.waiting = SendAll(session.socket.get(), session.command);
    if (!session.waiting) ++errors_;
  }

  void Receive(std::size_t index, bool closedLoop) {
    Session& session = sessions_[index];
    char buffer[kReadSize];
    ssize_t n = recv(session.socket.get(), buffer, sizeof buffer, MSG_DONTWAIT);
    if (n <= 0) {
      if (n == 0 || (errno != EAGAIN && errno != EINTR)) {
        ++errors_;
        epoll_ctl(epoll_, EPOLL_CTL_DEL, session.socket.get(), nullptr);
        session.waiting = false;
      }
      return;
    }
    session.received.append(buffer, static_cast<std::size_t>(n));
    if (!session.waiting || !EndsWith(session.received, options_.until)) return;
    const std::uint64_t now = NowNs();
    if (session.sentAt >= measureFrom_) latency_.Record(now - session.sentAt);
    session.waiting = false;
    if (closedLoop) Send(index, now);
  }

  const Options& options_;
  std::vector<Session> sessions_;
  int epoll_ = -1;
  std::uint64_t measureFrom_ = 0;
  std::uint64_t errors_ = 0;
  Histogram latency_;
};

// Sessions opened and served one after another: accept, one exchange, close.
int ConnectRate(const Options& options) {
  std::uint64_t errors = 0;
  const std::uint64_t start = NowNs();
  const std::uint64_t deadline = start + static_cast<std::uint64_t>(options.seconds * 1e9);
  int opened = 0;
  for (; opened < options.count && NowNs() < deadline; ++opened) {
    const std::size_t target = static_cast<std::size_t>(opened) % options.targets.size();
    Descriptor socket = Connect(options.targets[target]);
    if (socket.get() < 0 || !SendAll(socket.get(), CommandFor(options.command, target))) {
      ++errors;
      continue;
    }
    std::string received;
    char buffer[kReadSize];
    while (!EndsWith(received, options.until)) {
      ssize_t n = recv(socket.get(), buffer, sizeof buffer, 0);
      if (n <= 0) {
        ++errors;
        break;
      }
      received.append(buffer, static_cast<std::size_t>(n));
    }
  }
  const double seconds = static_cast<double>(NowNs() - start) / 1e9;
  std::printf("RESULT sessions=%d rate=%.0f errors=%llu\n", opened, opened / seconds,
              static_cast<unsigned long long>(errors));
  return errors == 0 ? 0 : 1;
}

// Echoes every byte back on one thread until the time is up.
int Echo(const Options& options) {
  Descriptor poll(epoll_create1(EPOLL_CLOEXEC));
  std::vector<Descriptor> listeners;
  for (const sockaddr_in& address : options.targets) {
    Descriptor listener(socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    int one = 1;
    setsockopt(listener.get(), SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
    if (bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        listen(listener.get(), SOMAXCONN) != 0) {
      std::fprintf(stderr, "tessel_tl1load: cannot listen: %s\n", std::strerror(errno));
      return 1;
    }
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = (std::uint64_t{1} << 32) | static_cast<std::uint32_t>(listener.get());
    epoll_ctl(poll.get(), EPOLL_CTL_ADD, listener.get(), &event);
    listeners.push_back(std::move(listener));
  }
  std::printf("listening\n");
  std::fflush(stdout);
  const std::uint64_t end = NowNs() + static_cast<std::uint64_t>(options.seconds * 1e9);
  epoll_event events[kMaxEvents];
  char buffer[kReadSize];
  for (std::uint64_t now = NowNs(); now < end; now = NowNs()) {
    const int ready =
        epoll_wait(poll.get(), events, kMaxEvents, static_cast<int>((end - now) / 1000000 + 1));
    for (int e = 0; e < ready; ++e) {
      const int fd = static_cast<int>(events[e].data.u64 & 0xFFFFFFFFu);
      if (events[e].data.u64 >> 32) {
        const int client = accept4(fd, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
        if (client < 0) continue;
        int one = 1;
        setsockopt(client, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
        epoll_event event{};
        event.events = EPOLLIN;
        event.data.u64 = static_cast<std::uint32_t>(client);
        epoll_ctl(poll.get(), EPOLL_CTL_ADD, client, &event);
        continue;
      }
      const ssize_t n = recv(fd, buffer, sizeof buffer, 0);
      if (n <= 0 || !SendAll(fd, std::string(buffer, static_cast<std::size_t>(n)))) {
        close(fd);  // closing also takes it off the epoll set
      }
    }
  }
  return 0;
}

bool Parse(int argc, char** argv, Options* options) {
  ArgumentReader reader(argc, argv);
  if (!reader.Next(&options->mode)) return false;
  std::string name, value;
  while (reader.Next(&name)) {
    if (!reader.Value(&value)) return false;
    bool ok = true;
    if (name == "--targets") {
      options->targetsText = value;
    } else if (name == "--port") {
      ok = tessel::bench::ParsePort(value, &options->port);
    } else if (name == "--connections") {
      ok = tessel::bench::ParseInt(value, 1, 10000, &options->connections);
    } else if (name == "--count") {
      ok = tessel::bench::ParseInt(value, 1, 1000000, &options->count);
    } else if (name == "--seconds") {
      ok = tessel::bench::ParseSeconds(value, 0.1, 600, &options->seconds);
    } else if (name == "--warmup") {
      ok = tessel::bench::ParseSeconds(value, 0, 60, &options->warmup);
    } else if (name == "--rate") {
      ok = tessel::bench::ParseSeconds(value, 1, 10000000, &options->rate);
    } else if (name == "--command") {
      options->command = value;
    } else if (name == "--until") {
      options->until = value;
    } else {
      ok = false;
    }
    if (!ok) {
      std::fprintf(stderr, "tessel_tl1load: bad %s %s\n", name.c_str(), value.c_str());
      return false;
    }
  }
  return options->port != 0 && !options->until.empty() &&
         tessel::bench::ParseTargets(options->targetsText, options->port, &options->targets);
}

}  // namespace

int main(int argc, char** argv) {
  Options options;
  if (!Parse(argc, argv, &options)) {
    std::fprintf(
        stderr,
        "usage: tessel_tl1load load|connect|echo --targets A+N --port P [--connections C] "
        "[--count K] [--seconds S] [--warmup W] [--rate R] [--command TEXT] [--until TEXT]\n");
    return 2;
  }
  if (options.mode == "load") return Load(options).Run();
  if (options.mode == "connect") return ConnectRate(options);
  if (options.mode == "echo") return Echo(options);
  std::fprintf(stderr, "tessel_tl1load: unknown mode %s\n", options.mode.c_str());
  return 2;
}
