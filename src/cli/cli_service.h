// The CLI service: the CLI agents the host registered, their Telnet listeners (and SSH ones when
// an SSH server is plugged in) on one TcpServer whose listener tag is the agent id, the workers
// that answer each session's lines through CliSession, and the timer that settles a silent
// Telnet opening after a second and closes idle sessions.
//
// Threads, all blocking until there is work: the TCP server's loop (and the SSH server's) reads
// input into each session's CliInput; seven workers (a worker takes a session with an event and
// answers it, so the events of one session are answered in order, one at a time); the timer
// thread. A Telnet opening never holds the accept loop: the request for the terminal type is
// sent and the session is served when the client answers, refuses, sends data or the second
// runs out, whichever comes first. Every public operation is safe from any thread.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "cli/cli_agents.h"
#include "cli/cli_input.h"
#include "cli/cli_prompts.h"
#include "cli/cli_session.h"
#include "engine/host_bridge.h"
#include "transport/stream_server.h"
#include "transport/tcp_server.h"

namespace tessel {

// Checks a user and password for a connection to the listener of tag (an agent id).
using CliPasswordCheck =
    std::function<bool(std::uint32_t tag, std::string_view user, std::string_view password)>;
// Makes the SSH server: its sessions report to events, authenticate with check, carry ids whose
// client number has the top bit set and start logged in; its host keys live in keyDirectory.
using SshServerFactory = std::function<std::unique_ptr<StreamServer>(
    TcpSessionEvents* events, CliPasswordCheck check, const std::string& keyDirectory)>;

struct CliServiceOptions {
  HostBridge* host = nullptr;  // nullptr: the installed host at each call
  std::size_t workers = 7;
  TcpServerOptions tcp;
  // Where the agents' status lines go; unset: the host's PrintStatus.
  std::function<void(const std::string&)> status;
  // How long a Telnet client may take to settle the opening.
  std::chrono::milliseconds negotiationTimeout{1000};
  std::size_t sessionsPerAgent = 500;
  // The directory below which conf/IosModes.prop and conf/IosPrompts.prop are read.
  std::string baseDirectory = "./";
  // Unset: no SSH (StartSshListener refuses).
  SshServerFactory sshServer;
};

struct CliCounters {
  std::uint64_t sessionsOpen = 0;
  std::uint64_t loginsSucceeded = 0;
  std::uint64_t commandsAnswered = 0;
};

// The one line a connection past an agent's session limit gets before it is closed.
extern const char* const kCliSessionLimitLine;
inline constexpr std::uint32_t kSshClientBit = 0x80000000u;

class CliService final : private TcpSessionEvents {
 public:
  explicit CliService(CliServiceOptions options = {});
  ~CliService() override;  // Stop
  CliService(const CliService&) = delete;
  CliService& operator=(const CliService&) = delete;

  CliAgents& Agents() { return agents_; }
  CliPrompts& Prompts() { return prompts_; }
  void ReadUserModes() { prompts_.ReadUserModes(options_.baseDirectory); }

  // Starts the workers and the timer (idempotent).
  void Start();
  // Registers an agent (replacing the one at its address and port) without opening it.
  std::uint32_t RegisterAgent(CliAgent agent);
  // Opens the Telnet listener of the agent registered at address:port and tells the status
  // line; a failure forgets the agent. telnetServer: sessions log in to a shell-like prompt.
  bool StartAgent(const std::string& address, std::uint16_t port, bool telnetServer,
                  std::int32_t hostInt1, std::int32_t hostInt2);
  // Opens an SSH listener on sshPort for the agent registered at address:cliPort.
  bool StartSshListener(const std::string& address, std::uint16_t sshPort, std::uint16_t cliPort);
  void SetSshEnabled(bool enabled) { sshEnabled_ = enabled; }
  // Where the SSH server made from now on keeps its host keys.
  void SetSshKeyDirectory(std::string directory);
  // Closes the agent's listeners and sessions and forgets it; false when there is none.
  bool StopAgent(const std::string& address, std::uint16_t port, bool telnetServer);

  CliCounters Counters() const;
  // Closes every listener and session, ends the threads and forgets every agent.
  void Stop();

 private:
  struct Session;
  using Clock = std::chrono::steady_clock;
  struct Timer {
    Clock::time_point deadline;
    TcpSessionId session = 0;
    bool negotiation = false;  // else an idle check
    std::uint64_t serial = 0;  // an idle check counts only while it is the session's latest
    bool operator>(const Timer& other) const { return deadline > other.deadline; }
  };

  void OnAccepted(TcpSessionId session, std::uint32_t listenerTag, const TcpPeer& peer) override;
  void OnBytes(TcpSessionId session, std::string_view bytes) override;
  void OnClosed(TcpSessionId session) override;

  StreamServer& ServerOf(TcpSessionId id);
  std::shared_ptr<Session> Find(TcpSessionId id) const;
  void Report(const std::string& status);
  // The caller holds the session's input mutex.
  void PumpLocked(Session& session, const std::shared_ptr<Session>& shared);
  void Send(Session& session, std::string bytes);
  void Enqueue(const std::shared_ptr<Session>& session, CliInputEvent event);
  void WorkerLoop();
  void Answer(const std::shared_ptr<Session>& session, const CliInputEvent& event);
  void Schedule(Timer timer);
  // Arms the session's idle check at deadline; the checks armed before it are void.
  void ScheduleIdleCheck(Session& session, Clock::time_point deadline);
  void CheckIdleSoon(std::uint32_t agentId);
  void TimerLoop();
  void OnTimer(const Timer& timer);

  const CliServiceOptions options_;
  CliAgents agents_;
  CliPrompts prompts_;
  TcpServer tcp_;
  std::mutex sshMutex_;                // guards making the SSH server
  std::unique_ptr<StreamServer> ssh_;  // made once, kept until the service ends
  std::atomic<StreamServer*> sshServer_{nullptr};
  std::string sshKeyDirectory_;  // guarded by sshMutex_
  std::atomic<bool> sshEnabled_{true};
  std::atomic<std::uint64_t> loginsSucceeded_{0};
  std::atomic<std::uint64_t> commandsAnswered_{0};

  std::mutex threadsMutex_;  // orders starting and stopping the threads
  std::vector<std::thread> threads_;
  std::atomic<bool> stopping_{false};

  // Guards the sessions and their count per agent.
  mutable std::mutex mutex_;
  std::map<TcpSessionId, std::shared_ptr<Session>> sessions_;
  std::map<std::uint32_t, std::size_t> sessionsPerAgent_;
  std::set<std::uint32_t> listening_;  // agents whose Telnet listener is open

  // Sessions with an event to answer, each at most once.
  std::mutex workMutex_;
  std::condition_variable workReady_;
  std::deque<std::shared_ptr<Session>> readySessions_;

  std::mutex timerMutex_;
  std::condition_variable timerWake_;
  std::vector<Timer> timers_;  // a heap, earliest first
};

}  // namespace tessel
