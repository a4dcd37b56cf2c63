// The TL1 service: the TL1 agents the host registered, their listeners (raw TCP, and telnet for a
// person at a terminal) and sessions on one TcpServer whose listener tag is the agent id, the
// workers that answer commands, the autonomous messages and the delayed-activation timer.
//
// Threads, all blocking until there is work: the TCP server's loop (input is cut into messages
// there and queued on its session), five workers (a worker takes a session with queued messages
// and answers one message, so the messages of one session are answered in order), the alarm
// thread (sends queued autonomous messages, most severe first) and the timer thread (waits for
// the next delayed command). Every public operation is safe from any thread.
#pragma once

#include <array>
#include <atomic>
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
#include <unordered_map>
#include <unordered_set>
#include <utility>
#include <vector>

#include "engine/host_bridge.h"
#include "tl1/command_registry.h"
#include "tl1/pending_list.h"
#include "tl1/response_format.h"
#include "tl1/tl1_engine.h"
#include "tl1/tl1_session_input.h"
#include "transport/tcp_server.h"

namespace tessel {

struct Tl1ServiceOptions {
  HostBridge* host = nullptr;  // nullptr: the installed host at each call
  Tl1LocalTime localTime = SystemLocalTime;
  Tl1PendingList::Clock clock = [] { return std::time(nullptr); };
  std::size_t workers = 5;
  TcpServerOptions tcp;
  // Where the agents' status lines go; unset: the host's PrintStatus.
  std::function<void(const std::string&)> status;
};

// One autonomous message; alarm codes 0..3 are critical, major, minor, non-alarm.
struct Tl1AutonomousMessage {
  std::uint8_t alarmCode = 3;
  std::string verb;
  std::optional<std::string> modifier1;
  std::optional<std::string> modifier2;
  std::vector<Tl1TextElement> lines;
};

struct Tl1Counters {
  std::uint64_t sessionsOpen = 0;
  std::uint64_t commandsAnswered = 0;
};

class Tl1Service final : private TcpSessionEvents {
 public:
  explicit Tl1Service(Tl1ServiceOptions options = {});
  ~Tl1Service() override;  // Stop
  Tl1Service(const Tl1Service&) = delete;
  Tl1Service& operator=(const Tl1Service&) = delete;

  Tl1CommandRegistry& Registry() { return registry_; }

  // Registers an agent (replacing one with the same id) without opening it. hostInt is kept for
  // the host.
  void RegisterAgent(const Tl1Agent& agent, std::int32_t hostInt);
  // Opens the raw listener of the registered agent at address:port and tells the host's status
  // line; a failure forgets the agent.
  bool StartAgent(const std::string& address, std::uint16_t port);
  // Opens a telnet listener for a registered agent.
  bool StartTelnetListener(const std::string& address, std::uint16_t port, std::int32_t agentId);
  // Closes the agent's listeners and sessions and forgets it; false when there is none.
  bool StopAgent(const std::string& address, std::uint16_t port);
  std::optional<std::int32_t> AgentIdAt(const std::string& address, std::uint16_t port) const;
  // hostText1|hostText2|hostText3 when the first two are set, else hostText3.
  std::optional<std::string> ModeInfo(const std::string& address, std::uint16_t port) const;

  // The keep-alive (seconds, 0 never) of the listeners opened from now on; returns it.
  std::uint32_t SetKeepAlive(std::uint32_t seconds);
  void SetLoginRequired(std::int32_t agentId, bool required);

  // Queues the messages for every session of the agent, each message to each session with the
  // agent's next ATAG; the number of sessions reached, 0 (nothing queued) when none is open.
  std::uint32_t SendAutonomous(std::int32_t agentId,
                               const std::vector<Tl1AutonomousMessage>& batch);
  // The ATAG of the agent's next autonomous message; false when no session is open.
  bool SetAtag(std::int32_t agentId, std::uint32_t atag);

  // The agent's commands waiting for delayed activation.
  std::vector<Tl1PendingEntry> ListPending(std::int32_t agentId) const;
  // Runs a waiting command now on its session (nothing is sent when the session is gone).
  bool RunPending(std::int32_t agentId, std::uint32_t id);
  bool CancelPending(std::int32_t agentId, std::uint32_t id);

  Tl1Counters Counters() const;

  // Closes every listener and session, ends the threads and forgets every agent, command code
  // and waiting command. The service may start again afterwards.
  void Stop();

 private:
  // A network may hold tens of thousands of agents: their records stay small.
  struct Agent {
    std::shared_ptr<const Tl1Agent> info;
    std::int32_t hostInt = 0;
  };
  // An agent's address and port; the text is that of the agent indexed under it.
  struct Endpoint {
    std::string_view address;
    std::uint16_t port = 0;
    bool operator==(const Endpoint&) const = default;
  };
  struct EndpointHash {
    std::size_t operator()(const Endpoint& endpoint) const noexcept {
      return std::hash<std::string_view>{}(endpoint.address) * 31 + endpoint.port;
    }
  };
  // One unit of a session's work: a message, an overflow, an empty line or a delayed command.
  struct Work {
    Tl1InputEvent event;
    std::optional<Tl1InputCmd> delayed;
  };
  struct Session;
  struct Alarm {
    TcpSessionId session = 0;
    std::string text;
    bool closeAfter = false;
  };

  void OnAccepted(TcpSessionId session, std::uint32_t listenerTag, const TcpPeer& peer) override;
  void OnBytes(TcpSessionId session, std::string_view bytes) override;
  void OnClosed(TcpSessionId session) override;
  bool OnInputEnded(TcpSessionId session) override;
  void OnReadsDone() override;

  HostBridge* Host() const;
  std::shared_ptr<Session> FindSession(TcpSessionId id) const;
  std::vector<std::string> Complete(std::string_view prefix) const;
  const Agent* FindAgentLocked(const std::string& address, std::uint16_t port) const;
  void ForgetAgentLocked(std::int32_t agentId);
  void StartThreadsLocked();
  // Queues work for the session; the workers are woken now, or with wakeLater at the end of the
  // TCP loop's round.
  void Enqueue(const std::shared_ptr<Session>& session, std::vector<Work> work,
               bool wakeLater = false);
  void Deliver(Tl1PendingEntry entry);
  void WorkerLoop();
  void Answer(Session& session, const Work& work);
  void AlarmLoop();
  void TimerLoop();
  void WakeTimer();
  std::vector<std::shared_ptr<Session>> SessionsOfLocked(std::int32_t agentId) const;

  const Tl1ServiceOptions options_;
  Tl1CommandRegistry registry_;
  Tl1PendingList pending_;
  Tl1Engine engine_;
  TcpServer tcp_;
  std::atomic<std::uint32_t> keepAliveSeconds_{0};
  std::atomic<std::uint64_t> sessionsOpen_{0};
  std::atomic<std::uint64_t> commandsAnswered_{0};

  std::mutex threadsMutex_;  // orders starting and stopping the threads
  std::vector<std::thread> threads_;
  std::atomic<bool> stopping_{false};

  // Guards the agents, the sessions and their ATAGs.
  mutable std::mutex mutex_;
  std::unordered_map<std::int32_t, Agent> agents_;
  // The agent on each address and port, so that a start or stop by endpoint does not walk them.
  std::unordered_map<Endpoint, std::int32_t, EndpointHash> agentAt_;
  std::unordered_set<std::int32_t> loginRequired_;
  std::set<std::pair<std::int32_t, std::uint16_t>> telnetPorts_;  // agent, telnet listener port
  std::map<TcpSessionId, std::shared_ptr<Session>> sessions_;

  // Sessions with queued work, each at most once.
  std::mutex workMutex_;
  std::condition_variable workReady_;
  std::deque<std::shared_ptr<Session>> readySessions_;
  std::size_t wakeUps_ = 0;  // TCP loop thread only: sessions made ready in this round

  // Autonomous messages by alarm code, each in arrival order.
  std::mutex alarmMutex_;
  std::condition_variable alarmReady_;
  std::array<std::deque<Alarm>, 4> alarms_;

  std::mutex timerMutex_;
  std::condition_variable timerWake_;
  bool timerPoked_ = false;
  std::optional<std::int64_t> timerArmedFor_;  // the expiry the timer waits for
};

}  // namespace tessel
