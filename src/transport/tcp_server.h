// TCP listeners and their connections, served by one event-loop thread per server. The thread
// blocks in epoll_wait: an eventfd wakes it for closes and stop, a timerfd for keep-alive expiry;
// with no input, output or keep-alive due it costs nothing. The server knows no protocol: it hands
// the bytes it reads to a TcpSessionEvents and writes what it is given; it never logs payload.
//
// Threads: every operation is safe from any thread. The callbacks run on the loop thread, one at
// a time, without the server's lock held, so a callback may call Send, Close, CloseListeners,
// SessionsOf and SessionCount; it must not call Listen or Stop (they wait for the loop) nor destroy
// the server. For one session OnAccepted comes first, OnClosed last, and no OnBytes follows it.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <unordered_map>
#include <vector>

#include "transport/stream_server.h"

namespace tessel {

struct TcpServerOptions {
  // Output a session may have queued and not yet written; more closes the session, so a client
  // that stops reading cannot grow the engine's memory without bound.
  std::size_t outputCap = std::size_t{1} << 20;
  // The kernel's send buffer of each session in bytes (0: the system's, which grows on demand);
  // what it does not take waits in the session's output.
  int sendBuffer = 0;
  // How long accepting stays paused on a listener after the process ran out of descriptors,
  // unless a session closes first.
  std::chrono::milliseconds acceptRetry{1000};
  // How long a session stays open after the peer ended its input, for the answers still due to
  // it; its keep-alive closes it sooner when that comes first.
  std::chrono::milliseconds halfClosedLimit{10000};
};

class TcpServer final : public StreamServer {
 public:
  explicit TcpServer(TcpSessionEvents* events, TcpServerOptions options = {});
  ~TcpServer() override;  // Stop
  TcpServer(const TcpServer&) = delete;
  TcpServer& operator=(const TcpServer&) = delete;

  // Listens on address:port (numeric IPv4 or IPv6 text; IPv6 listeners are IPv6-only; "" is any
  // IPv4 address) with the system's backlog. tag is the caller's name for the listener, carried
  // in the ids of its sessions; several listeners may share one. A session accepted here is
  // closed when silent for keepAliveSeconds (0 never); input of any kind counts. The first
  // listener starts the loop thread. False with *error (when given) set to the errno of the
  // failing step; EINVAL for an address that is not numeric.
  bool Listen(std::uint32_t tag, const std::string& address, std::uint16_t port,
              std::uint32_t keepAliveSeconds, int* error = nullptr) override;
  // Closes every listener of tag at once (its port is free on return) and every session of tag
  // (their OnClosed follow on the loop thread). When no listener is left, client numbers start
  // again at 1.
  void CloseListeners(std::uint32_t tag) override;
  // Queues bytes for the session (written at once as far as the socket takes them). False when
  // the session is gone or closing, or when its queued output would pass the cap, which closes it.
  bool Send(TcpSessionId session, std::string bytes) override;
  // Closes the session; with afterPendingOutput once its queued output is written. Further Send
  // calls return false either way.
  void Close(TcpSessionId session, bool afterPendingOutput) override;
  // The open sessions of tag in accept order.
  std::vector<TcpSessionId> SessionsOf(std::uint32_t tag) const override;
  std::size_t SessionCount() const override;
  // Closes every listener and session and ends the loop thread once their OnClosed calls are
  // made. The server may listen again afterwards.
  void Stop() override;

 private:
  // A listening socket's tag and the keep-alive of the sessions it accepts.
  struct Listener {
    std::uint32_t tag = 0;
    std::uint32_t keepAliveSeconds = 0;
  };
  struct Session;
  // A keep-alive or half-close deadline of a session (serial tells it from a later session with
  // the same id), or with serial 0 the end of a pause in accepting.
  struct TimerEntry {
    std::chrono::steady_clock::time_point deadline;
    TcpSessionId session = 0;
    std::uint64_t serial = 0;
  };
  enum class AcceptResult { kAccepted, kNoneWaiting, kOutOfDescriptors };

  bool StartLoop();
  void Loop();
  void Dispatch(std::uint64_t key, std::uint32_t events);
  void AcceptOn(int listenerSocket);
  AcceptResult AcceptOne(int listenerSocket, const Listener& listener,
                         std::vector<Session*>* accepted);
  void ResumeAccepting();
  void ReadFrom(TcpSessionId id);
  void EndInput(Session& session);
  void FlushOutput(TcpSessionId id);
  bool WriteQueued(Session& session);
  void Watch(Session& session, bool wantOutput);
  void Wake();
  void Retire(TcpSessionId id);
  void FinishClosing();
  void Schedule(const TimerEntry& entry);
  void OnTimer();
  void ArmTimer();
  TcpSessionId NextSessionId(std::uint32_t tag);
  void CloseListener(int socket);
  void ForgetListener(std::uint32_t tag, int socket);

  TcpSessionEvents* const events_;
  const TcpServerOptions options_;
  int epoll_ = -1;
  int wakeEvent_ = -1;
  int timer_ = -1;

  std::mutex startMutex_;  // orders starting and stopping the loop thread
  std::thread loop_;
  std::atomic<bool> stopping_{false};

  // Guards the listeners, the session map, the closing list and every session's output.
  mutable std::mutex mutex_;
  // By listening socket; a server may hold tens of thousands, so the records stay small.
  std::unordered_map<int, Listener> listeners_;
  std::unordered_multimap<std::uint32_t, int> listenersByTag_;
  std::vector<int> pausedListeners_;  // out of descriptors when they last accepted
  std::map<TcpSessionId, std::unique_ptr<Session>> sessions_;  // ordered: accept order per tag
  std::vector<std::unique_ptr<Session>> closing_;              // left the map; the loop closes them
  std::uint32_t nextClientNumber_ = 1;

  // Loop thread only.
  std::vector<TimerEntry> timers_;  // a heap, earliest deadline first
  std::uint64_t nextSerial_ = 1;
  std::vector<char> readBuffer_;
  bool bytesThisRound_ = false;  // an OnBytes call since the last OnReadsDone
};

}  // namespace tessel
