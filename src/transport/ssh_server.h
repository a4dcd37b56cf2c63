// SSH listeners and their sessions: a client that has authenticated with a password and opened a
// shell on one session channel is a session of the StreamServer contract, whose channel data are
// its bytes. One event-loop thread per server owns every SSH connection (libssh sessions are not
// thread-safe): it blocks in poll over the connections, an epoll descriptor that holds every
// listener (thousands of them cost one descriptor there) and an eventfd that other threads write
// when they queue output or close something. Key exchange and authentication are non-blocking, so a
// slow or silent client holds up nobody; one that has not opened its shell within the login time
// is dropped. The server knows no protocol and never logs payload or passwords.
//
// Threads: every operation is safe from any thread. The callbacks (events and authenticate) run on
// the loop thread, one at a time, without the server's lock held; the events callbacks may call
// Send, Close, CloseListeners, SessionsOf and SessionCount, not Listen or Stop. For one session
// OnAccepted comes first (once its shell is open), OnClosed last, and no OnBytes follows it; a
// connection that never opened its shell is closed without a word to the events object.
#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <unordered_map>
#include <vector>

#include "transport/stream_server.h"

struct ssh_bind_struct;
struct ssh_event_struct;

namespace tessel {

struct SshServerOptions {
  // Holds ssh_host_ed25519_key and ssh_host_rsa_key (3072 bits), generated (mode 0600) when
  // missing and loaded as they are afterwards, so that clients see the same host after a restart.
  std::string hostKeyDirectory{};
  // Password check for a connection to a listener of tag; called on the server's thread. Three
  // refusals disconnect the client.
  std::function<bool(std::uint32_t tag, std::string_view user, std::string_view password)>
      authenticate{};
  // Output a session may have queued beyond what its channel takes; more closes the session.
  std::size_t outputCap = std::size_t{1} << 20;
  // How long a client may take from its TCP connect to an open shell.
  std::chrono::milliseconds loginTimeout{10000};
};

class SshServer final : public StreamServer {
 public:
  SshServer(TcpSessionEvents* events, SshServerOptions options);
  ~SshServer() override;  // Stop
  SshServer(const SshServer&) = delete;
  SshServer& operator=(const SshServer&) = delete;

  // Listens on address:port as TcpServer does (numeric IPv4 or IPv6 text, "" any IPv4 address).
  // The first call loads or generates the host keys; a key that cannot be read, parsed or
  // written fails it (logged with the file's name) with *error set to the errno of that step
  // (EINVAL for a file that holds no key). Sessions silent for keepAliveSeconds are closed (0
  // never).
  bool Listen(std::uint32_t tag, const std::string& address, std::uint16_t port,
              std::uint32_t keepAliveSeconds, int* error = nullptr) override;
  // Closes every listener of tag (its port is free on return) and every connection of tag.
  void CloseListeners(std::uint32_t tag) override;
  // Queues bytes for the session's channel. False when it is gone or closing, or when its queued
  // output would pass the cap, which closes it.
  bool Send(TcpSessionId session, std::string bytes) override;
  void Close(TcpSessionId session, bool afterPendingOutput) override;
  // The sessions of tag whose shell is open, in accept order.
  std::vector<TcpSessionId> SessionsOf(std::uint32_t tag) const override;
  std::size_t SessionCount() const override;
  void Stop() override;

 private:
  struct Connection;
  struct Listener {
    std::uint32_t tag = 0;
    std::uint32_t keepAliveSeconds = 0;
  };
  // A login or keep-alive deadline of a connection (serial tells it from a later one with the
  // same id), or with serial 0 the end of a pause in accepting.
  struct TimerEntry {
    std::chrono::steady_clock::time_point deadline;
    TcpSessionId session = 0;
    std::uint64_t serial = 0;
    bool login = false;  // a login deadline, else a keep-alive one
  };

  bool PrepareHostKeys(int* error);
  bool StartLoop();
  void Loop();
  int MillisecondsToDeadline() const;
  void AcceptReady();
  void AcceptOn(int listenerSocket);
  void StartConnection(int socket, const Listener& listener);
  bool OpenShell(Connection& connection);
  void ListOutput(Connection& connection);
  void WritePendingOutput();
  void WriteOutput(Connection& connection);
  void CheckConnections();
  void Retire(TcpSessionId id);
  void RetireConnection(Connection& connection);
  void Wake();
  void FinishClosing();
  void Schedule(const TimerEntry& entry);
  void OnTimer();
  void ResumeAccepting();
  TcpSessionId NextSessionId(std::uint32_t tag);
  void CloseListener(int socket);

  // libssh's callbacks, with the connection as their user data.
  struct Callbacks;

  TcpSessionEvents* const events_;
  const SshServerOptions options_;
  int listenerEpoll_ = -1;
  int wakeEvent_ = -1;
  bool ready_ = true;  // the descriptors above exist
  ssh_event_struct* event_ = nullptr;
  ssh_bind_struct* bind_ = nullptr;  // the host keys and algorithms every connection gets

  std::mutex startMutex_;  // orders starting and stopping the loop thread and loading the keys
  std::thread loop_;
  std::atomic<bool> stopping_{false};

  // Guards the listeners, the connection map, the closing list and every connection's output.
  mutable std::mutex mutex_;
  std::unordered_map<int, Listener> listeners_;  // by listening socket
  std::multimap<std::uint32_t, int> listenersByTag_;
  std::vector<int> pausedListeners_;  // out of descriptors when they last accepted
  std::map<TcpSessionId, std::unique_ptr<Connection>> connections_;  // accept order per tag
  std::vector<std::unique_ptr<Connection>> closing_;  // left the map; the loop closes them
  std::vector<TcpSessionId> pendingOutput_;           // connections with output to hand libssh
  std::size_t openSessions_ = 0;                      // connections whose shell is open
  std::uint32_t nextClientNumber_ = 1;

  // Loop thread only.
  std::vector<TimerEntry> timers_;  // a heap, earliest deadline first
  std::vector<TcpSessionId> windowWaiting_;
  bool listenersReady_ = false;  // output waits for the client's channel window
  std::uint64_t nextSerial_ = 1;
};

}  // namespace tessel
