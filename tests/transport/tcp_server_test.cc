#include "transport/tcp_server.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <condition_variable>
#include <ctime>
#include <functional>
#include <future>
#include <map>
#include <set>
#include <thread>

namespace tessel {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

// Ports of this suite: per process, so that runs on one machine at the same time do not meet.
const std::uint16_t kBasePort = static_cast<std::uint16_t>(10000 + (::getpid() % 900) * 10);
const std::string kAddress = "127.86.0.1";

// Records accepts and closes; a test may hook into accepts and reads.
class Recorder : public TcpSessionEvents {
 public:
  void OnAccepted(TcpSessionId id, std::uint32_t tag, const TcpPeer& peer) override {
    if (onAccepted) onAccepted(id);
    std::lock_guard<std::mutex> lock(mutex_);
    EXPECT_EQ(tag, TcpListenerTagOf(id));
    accepted_.push_back(id);
    closed_.erase(id);  // numbering restarted: the id is new again
    peers_[id] = peer;
    changed_.notify_all();
  }
  void OnBytes(TcpSessionId id, std::string_view bytes) override { onBytes(id, bytes); }
  bool OnInputEnded(TcpSessionId id) override { return answersDue && answersDue(id); }
  void OnClosed(TcpSessionId id) override {
    std::lock_guard<std::mutex> lock(mutex_);
    EXPECT_TRUE(closed_.insert(id).second) << "closed twice";
    changed_.notify_all();
  }
  // Whether condition held within the timeout; it is evaluated under the recorder's lock.
  bool WaitUntil(const std::function<bool()>& condition, std::chrono::milliseconds timeout = 3s) {
    std::unique_lock<std::mutex> lock(mutex_);
    return changed_.wait_for(lock, timeout, condition);
  }
  bool WaitForAccepts(std::size_t count) {
    return WaitUntil([&] { return accepted_.size() >= count; });
  }
  bool WaitForClose(TcpSessionId id, std::chrono::milliseconds timeout = 3s) {
    return WaitUntil([&] { return closed_.contains(id); }, timeout);
  }

  std::function<void(TcpSessionId)> onAccepted;
  std::function<void(TcpSessionId, std::string_view)> onBytes = [](auto, auto) {};
  std::function<bool(TcpSessionId)> answersDue;  // what OnInputEnded answers; unset: false
  std::vector<TcpSessionId> accepted_;
  std::map<TcpSessionId, TcpPeer> peers_;
  std::set<TcpSessionId> closed_;
  std::mutex mutex_;

 private:
  std::condition_variable changed_;
};

// A client socket connecting to address:port; receiveBuffer shrinks its window when not 0.
int Connect(const std::string& address, std::uint16_t port, int receiveBuffer = 0, int flags = 0) {
  addrinfo hints{};
  hints.ai_flags = AI_NUMERICHOST | AI_NUMERICSERV;
  hints.ai_socktype = SOCK_STREAM;
  addrinfo* to = nullptr;
  EXPECT_EQ(getaddrinfo(address.c_str(), std::to_string(port).c_str(), &hints, &to), 0);
  int socket = ::socket(to->ai_family, SOCK_STREAM | flags, 0);
  if (receiveBuffer > 0)
    setsockopt(socket, SOL_SOCKET, SO_RCVBUF, &receiveBuffer, sizeof receiveBuffer);
  EXPECT_TRUE(connect(socket, to->ai_addr, to->ai_addrlen) == 0 || errno == EINPROGRESS);
  freeaddrinfo(to);
  return socket;
}

void Write(int socket, std::string_view bytes) {
  ASSERT_EQ(send(socket, bytes.data(), bytes.size(), MSG_NOSIGNAL), std::ssize(bytes));
}

// Reads until count bytes came or nothing came for timeoutMs; *closed tells whether the peer
// closed (end of stream or reset). A pause between reads makes a slow reader.
std::string Read(int socket, std::size_t count, int timeoutMs = 1000, bool* closed = nullptr,
                 std::chrono::milliseconds pause = 0ms) {
  std::string bytes;
  std::vector<char> buffer(64 * 1024);
  pollfd ready{socket, POLLIN, 0};
  while (bytes.size() < count && poll(&ready, 1, timeoutMs) == 1) {
    ssize_t got = recv(socket, buffer.data(), std::min(buffer.size(), count - bytes.size()), 0);
    if (got <= 0 && closed) *closed = true;
    if (got <= 0) break;
    bytes.append(buffer.data(), static_cast<std::size_t>(got));
    std::this_thread::sleep_for(pause);
  }
  return bytes;
}

bool PeerClosed(int socket, int timeoutMs = 1000) {
  bool closed = false;
  Read(socket, SIZE_MAX, timeoutMs, &closed);
  return closed;
}

std::string Pattern(std::size_t size) {
  std::string bytes(size, '\0');
  for (std::size_t i = 0; i < size; ++i) bytes[i] = static_cast<char>('a' + (i * 7 + i / 251) % 26);
  return bytes;
}

class TcpServerTest : public ::testing::Test {
 protected:
  ~TcpServerTest() override {
    server_.Stop();
    for (int socket : clients_) close(socket);
  }
  int Client(const std::string& address, std::uint16_t port, int receiveBuffer = 0) {
    clients_.push_back(Connect(address, port, receiveBuffer));
    return clients_.back();
  }
  TcpSessionId Accepted(std::size_t index) {
    EXPECT_TRUE(events_.WaitForAccepts(index + 1));
    std::lock_guard<std::mutex> lock(events_.mutex_);
    return index < events_.accepted_.size() ? events_.accepted_[index] : 0;
  }

  Recorder events_;
  // A small kernel send buffer, so that output waits in the server beyond a few KiB.
  TcpServer server_{&events_, {.sendBuffer = 16 * 1024}};
  std::vector<int> clients_;
};

TEST_F(TcpServerTest, SessionsCarryTheirTagAndConsecutiveNumbersAndEchoInOrder) {
  ASSERT_TRUE(server_.Listen(7, kAddress, kBasePort, 0));
  ASSERT_TRUE(server_.Listen(0xFFFFFFFF, "::1", kBasePort, 0));
  int error = 0;
  EXPECT_FALSE(server_.Listen(8, kAddress, kBasePort, 0, &error));
  EXPECT_EQ(error, EADDRINUSE);
  // The IPv6 wildcard does not take the IPv4 one.
  EXPECT_TRUE(server_.Listen(8, "::", kBasePort + 1, 0));
  EXPECT_TRUE(server_.Listen(8, "", kBasePort + 1, 0));
  events_.onBytes = [&](TcpSessionId id, std::string_view bytes) {
    EXPECT_TRUE(server_.Send(id, std::string(bytes)));  // from the loop thread
  };
  int first = Client(kAddress, kBasePort);
  TcpSessionId firstId = Accepted(0);
  int second = Client(kAddress, kBasePort);
  TcpSessionId secondId = Accepted(1);
  Client("::1", kBasePort);
  TcpSessionId v6Id = Accepted(2);

  EXPECT_EQ(TcpListenerTagOf(firstId), 7u);
  EXPECT_EQ(TcpClientNumberOf(secondId), TcpClientNumberOf(firstId) + 1);
  EXPECT_EQ(server_.SessionsOf(7), (std::vector<TcpSessionId>{firstId, secondId}));
  EXPECT_EQ(server_.SessionsOf(0xFFFFFFFF), std::vector<TcpSessionId>{v6Id});
  EXPECT_EQ(server_.SessionCount(), 3u);
  EXPECT_EQ(events_.peers_[v6Id].address, "::1");
  EXPECT_EQ(events_.peers_[firstId].address, "127.0.0.1");

  // One message over several segments, then one far larger than a read.
  std::string expected = "RTRV-HDR:::1;" + Pattern(300 * 1024);
  Write(first, "RTRV-");
  std::this_thread::sleep_for(20ms);
  Write(first, expected.substr(5, 8));
  Write(first, expected.substr(13));
  Write(second, "second");
  EXPECT_TRUE(Read(first, expected.size()) == expected);
  EXPECT_EQ(Read(second, 6), "second");
}

// With a full accept queue new connections would wait for the client's SYN retry; here the loop
// is held in the first accept while 200 more connect.
TEST_F(TcpServerTest, BurstOfConnectsIsAcceptedAtOnce) {
  ASSERT_TRUE(server_.Listen(1, kAddress, kBasePort + 1, 0));
  std::promise<void> release;
  std::shared_future<void> released = release.get_future().share();
  events_.onAccepted = [&](TcpSessionId) { released.wait_for(3s); };
  Client(kAddress, kBasePort + 1);
  std::vector<pollfd> burst;
  for (int i = 0; i < 200; ++i) {
    clients_.push_back(Connect(kAddress, kBasePort + 1, 0, SOCK_NONBLOCK));
    burst.push_back({clients_.back(), POLLOUT, 0});
  }
  std::size_t connected = 0;
  for (auto deadline = Clock::now() + 500ms; connected < burst.size() && Clock::now() < deadline;) {
    poll(burst.data(), burst.size(), 50);
    connected = 0;
    for (pollfd& client : burst) connected += (client.revents & POLLOUT) ? 1 : 0;
  }
  release.set_value();
  EXPECT_EQ(connected, 200u);
  EXPECT_TRUE(events_.WaitForAccepts(201));
}

TEST_F(TcpServerTest, OutputBeyondTheCapClosesOnlyAClientThatStopsReading) {
  ASSERT_TRUE(server_.Listen(1, kAddress, kBasePort + 2, 0));
  int slow = Client(kAddress, kBasePort + 2, 16 * 1024);
  TcpSessionId slowId = Accepted(0);
  Client(kAddress, kBasePort + 2, 16 * 1024);
  TcpSessionId stalledId = Accepted(1);

  std::string large = Pattern(600 * 1024);
  ASSERT_TRUE(server_.Send(slowId, large));
  EXPECT_TRUE(Read(slow, large.size(), 1000, nullptr, 2ms) == large);

  int sends = 0;
  while (sends < 200 && server_.Send(stalledId, Pattern(64 * 1024))) ++sends;
  EXPECT_LT(sends, 200);
  EXPECT_TRUE(events_.WaitForClose(stalledId));
  EXPECT_EQ(server_.SessionsOf(1), std::vector<TcpSessionId>{slowId});
}

TEST_F(TcpServerTest, KeepAliveClosesASilentClientOnly) {
  ASSERT_TRUE(server_.Listen(1, kAddress, kBasePort + 3, 1));
  ASSERT_TRUE(server_.Listen(2, kAddress, kBasePort + 4, 0));
  int silent = Client(kAddress, kBasePort + 3);
  int talking = Client(kAddress, kBasePort + 3);
  Client(kAddress, kBasePort + 4);
  ASSERT_TRUE(events_.WaitForAccepts(3));
  auto start = Clock::now();
  std::this_thread::sleep_for(600ms);
  Write(talking, "x");

  EXPECT_TRUE(PeerClosed(silent, 2000));
  EXPECT_GE(Clock::now() - start, 900ms);
  EXPECT_FALSE(PeerClosed(talking, 0));
  std::this_thread::sleep_for(300ms);
  EXPECT_EQ(server_.SessionsOf(2).size(), 1u);  // keep-alive 0: never
  EXPECT_EQ(server_.SessionCount(), 2u);
}

TEST_F(TcpServerTest, ClosingListenersClosesTheirSessionsFreesThePortAndRestartsNumbering) {
  ASSERT_TRUE(server_.Listen(3, kAddress, kBasePort + 5, 0));
  ASSERT_TRUE(server_.Listen(4, kAddress, kBasePort + 6, 0));
  int closed = Client(kAddress, kBasePort + 5);
  TcpSessionId closedId = Accepted(0);
  int kept = Client(kAddress, kBasePort + 6);
  TcpSessionId keptId = Accepted(1);
  ASSERT_EQ(TcpClientNumberOf(keptId), 2u);

  server_.CloseListeners(3);
  EXPECT_TRUE(server_.SessionsOf(3).empty());
  EXPECT_TRUE(PeerClosed(closed));
  EXPECT_TRUE(events_.WaitForClose(closedId));
  EXPECT_FALSE(PeerClosed(kept, 0));
  EXPECT_FALSE(server_.Send(closedId, "gone"));
  ASSERT_TRUE(server_.Listen(3, kAddress, kBasePort + 5, 0));
  Client(kAddress, kBasePort + 5);
  EXPECT_EQ(TcpClientNumberOf(Accepted(2)), 3u);  // a listener was left: numbering goes on

  server_.CloseListeners(3);
  server_.CloseListeners(4);
  EXPECT_TRUE(PeerClosed(kept));
  ASSERT_TRUE(server_.Listen(5, kAddress, kBasePort + 6, 0));
  Client(kAddress, kBasePort + 6);
  EXPECT_EQ(Accepted(3), MakeTcpSessionId(5, 1));
}

TEST_F(TcpServerTest, CloseAfterPendingOutputAndStopEndSessionsCleanly) {
  ASSERT_TRUE(server_.Listen(1, kAddress, kBasePort + 7, 5));
  int closing = Client(kAddress, kBasePort + 7, 16 * 1024);
  TcpSessionId closingId = Accepted(0);
  int stopped = Client(kAddress, kBasePort + 7, 16 * 1024);
  TcpSessionId stoppedId = Accepted(1);
  std::string queued = Pattern(600 * 1024);
  ASSERT_TRUE(server_.Send(closingId, queued));
  ASSERT_TRUE(server_.Send(stoppedId, queued));
  server_.Close(closingId, true);
  EXPECT_FALSE(server_.Send(closingId, "late"));
  bool closed = false;
  EXPECT_TRUE(Read(closing, queued.size() + 4, 1000, &closed) == queued);
  EXPECT_TRUE(closed || PeerClosed(closing));
  EXPECT_TRUE(events_.WaitForClose(closingId));

  server_.Stop();  // with output still queued
  EXPECT_EQ(server_.SessionCount(), 0u);
  EXPECT_TRUE(events_.closed_.contains(stoppedId));
  EXPECT_TRUE(PeerClosed(stopped));
  ASSERT_TRUE(server_.Listen(1, kAddress, kBasePort + 7, 0));
  Client(kAddress, kBasePort + 7);
  EXPECT_EQ(Accepted(2), MakeTcpSessionId(1, 1));
}

// A client that half-closes after its request (nc -N, a script's pipe) still reads the answer.
TEST(TcpServerHalfCloseTest, OutputDueAfterTheClientsEndOfInputIsSentWithinABound) {
  Recorder events;
  TcpServer server(&events, {.sendBuffer = 16 * 1024, .halfClosedLimit = 300ms});
  ASSERT_TRUE(server.Listen(1, kAddress, kBasePort + 8, 0));
  std::string answer = Pattern(300 * 1024);  // far more than the socket buffers hold
  events.onBytes = [&](TcpSessionId id, std::string_view) { server.Send(id, answer); };
  int answered = Connect(kAddress, kBasePort + 8, 16 * 1024);
  Write(answered, "q");
  shutdown(answered, SHUT_WR);
  bool closed = false;
  EXPECT_TRUE(Read(answered, answer.size() + 1, 1000, &closed) == answer);
  EXPECT_TRUE(closed || PeerClosed(answered));

  // A service that still owes answers and never sends them holds the session no longer than
  // the bound, keep-alive 0 or not.
  events.answersDue = [](TcpSessionId) { return true; };
  int owed = Connect(kAddress, kBasePort + 8);
  shutdown(owed, SHUT_WR);
  auto ended = Clock::now();
  EXPECT_TRUE(PeerClosed(owed, 2000));
  EXPECT_GE(Clock::now() - ended, 250ms);
  EXPECT_TRUE(events.WaitUntil([&] { return events.closed_.size() == 2; }));
  server.Stop();
  close(answered);
  close(owed);
}

// Out of descriptors, a waiting connection must not keep the loop busy; it is accepted once
// descriptors are free again.
TEST(TcpServerDescriptorsTest, AcceptingPausesWhileTheProcessHasNoDescriptorLeft) {
  Recorder events;
  TcpServer server(&events, {.acceptRetry = 200ms});
  ASSERT_TRUE(server.Listen(1, kAddress, kBasePort + 9, 0));
  rlimit saved{};
  getrlimit(RLIMIT_NOFILE, &saved);
  int original = open("/dev/null", O_RDONLY);
  rlimit low = saved;
  low.rlim_cur = static_cast<rlim_t>(original + 64);
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &low), 0);
  std::vector<int> fillers{original};
  for (int filler; fillers.size() < 200 && (filler = dup(original)) >= 0;)
    fillers.push_back(filler);
  ASSERT_EQ(errno, EMFILE);
  close(fillers.back());
  fillers.pop_back();
  int client = Connect(kAddress, kBasePort + 9);  // takes the last descriptor

  std::clock_t before = std::clock();  // CPU time of every thread of the process
  std::this_thread::sleep_for(300ms);
  double busy = static_cast<double>(std::clock() - before) / CLOCKS_PER_SEC;
  for (int filler : fillers) close(filler);
  setrlimit(RLIMIT_NOFILE, &saved);
  EXPECT_LT(busy, 0.02);  // about 1 ms when idle; a spinning loop takes far more on a busy machine
  EXPECT_TRUE(events.WaitForAccepts(1));
  close(client);
}

}  // namespace
}  // namespace tessel
