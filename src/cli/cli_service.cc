#include "cli/cli_service.h"

#include <algorithm>
#include <cstdio>
#include <utility>

#include "base/log.h"

namespace tessel {

const char* const kCliSessionLimitLine =
    "% Connection refused: too many sessions on this device\r\n";

namespace {

constexpr std::uint32_t kDefaultKeepAliveSeconds = 300;

std::int64_t Now() { return std::chrono::steady_clock::now().time_since_epoch().count(); }

}  // namespace

struct CliService::Session {
  Session(TcpSessionId id, std::uint32_t agentId, bool ssh, CliSessionEnvironment environment)
      : id(id),
        agentId(agentId),
        ssh(ssh),
        input(!ssh),
        lastInput(Now()),
        cli(WithHistory(std::move(environment)), agentId, ssh) {}

  CliSessionEnvironment WithHistory(CliSessionEnvironment environment) {
    environment.history = [this] {
      std::lock_guard<std::mutex> lock(inputMutex);
      return input.History();
    };
    return environment;
  }

  const TcpSessionId id;
  const std::uint32_t agentId;
  const bool ssh;  // logged in by the SSH server
  std::mutex inputMutex;
  CliInput input;  // guarded by inputMutex
  std::atomic<std::int64_t> lastInput;
  std::atomic<std::uint64_t> idleSerial{0};
  // Guarded by workMutex_.
  std::optional<CliInputEvent> event;
  bool scheduled = false;  // in readySessions_ or held by a worker
  // The worker holding the session only.
  CliSession cli;
};

CliService::CliService(CliServiceOptions options)
    : options_(std::move(options)), tcp_(this, options_.tcp) {}

CliService::~CliService() { Stop(); }

void CliService::Report(const std::string& status) {
  if (options_.status) {
    options_.status(status);
  } else if (HostBridge* host = options_.host ? options_.host : InstalledHost()) {
    host->PrintStatus(status);
  }
}

std::uint32_t CliService::RegisterAgent(CliAgent agent) {
  return agents_.Register(std::move(agent));
}

bool CliService::StartAgent(const std::string& address, std::uint16_t port, bool telnetServer,
                            std::int32_t hostInt1, std::int32_t hostInt2) {
  std::optional<CliAgent> agent = agents_.FindAt(address, port);
  if (agent) {
    std::lock_guard<std::mutex> lock(mutex_);
    if (listening_.count(agent->id) > 0) return true;  // already open
  }
  int error = 0;
  bool started = false;
  if (agent) {
    // Known before the first connection can arrive.
    agents_.Update(agent->id, [&](CliAgent& record) {
      record.telnetServer = telnetServer;
      record.hostInt1 = hostInt1;
      record.hostInt2 = hostInt2;
    });
    Start();
    // Idle sessions are closed by this service's timer, which follows the host's "timeout".
    started = tcp_.Listen(agent->id, address, port, 0, &error);
    if (started) {
      std::lock_guard<std::mutex> lock(mutex_);
      listening_.insert(agent->id);
    }
  }
  const char* what = telnetServer ? "Telnet Server" : "Cli Agent";
  char status[200];
  if (started) {
    std::snprintf(status, sizeof status, "%s Started at Port : %d and at IPAddress : %s", what,
                  port, address.c_str());
  } else {
    std::snprintf(status, sizeof status, "Unable to start %s at Port : %d and at IPAddress : %s",
                  what, port, address.c_str());
    LOG_ERROR("%s (errno %d)\n", status, error);
    if (agent) agents_.Forget(address, port);
  }
  Report(status);
  return started;
}

bool CliService::StartSshListener(const std::string& address, std::uint16_t sshPort,
                                  std::uint16_t cliPort) {
  std::optional<CliAgent> agent = agents_.FindAt(address, cliPort);
  if (!agent || !sshEnabled_ || !options_.sshServer) return false;
  StreamServer* ssh = nullptr;
  {
    std::lock_guard<std::mutex> lock(sshMutex_);
    if (!ssh_) {
      auto check = [this](std::uint32_t tag, std::string_view user, std::string_view password) {
        std::optional<CliAgent> owner = agents_.Find(tag);
        return owner && owner->userName == user && owner->password == password;
      };
      ssh_ = options_.sshServer(this, check, sshKeyDirectory_);
    }
    ssh = ssh_.get();
    sshServer_ = ssh;
  }
  if (ssh == nullptr) return false;
  Start();
  int error = 0;
  if (ssh->Listen(agent->id, address, sshPort, 0, &error)) return true;
  LOG_ERROR("Unable to start the SSH listener at %s:%d (errno %d)\n", address.c_str(), sshPort,
            error);
  return false;
}

void CliService::SetSshKeyDirectory(std::string directory) {
  std::lock_guard<std::mutex> lock(sshMutex_);
  sshKeyDirectory_ = std::move(directory);
}

bool CliService::StopAgent(const std::string& address, std::uint16_t port, bool telnetServer) {
  std::optional<std::uint32_t> id = agents_.Forget(address, port);
  if (!id) return false;
  tcp_.CloseListeners(*id);
  {
    std::lock_guard<std::mutex> lock(mutex_);
    listening_.erase(*id);
  }
  if (StreamServer* ssh = sshServer_.load()) ssh->CloseListeners(*id);
  char status[200];
  if (telnetServer) {
    std::snprintf(status, sizeof status, "Telnet Agent Stopped at port :%d and at IPAddress :%s",
                  port, address.c_str());
  } else {
    std::snprintf(status, sizeof status, "Cli Agent Stopped at Port : %d and at IPAddress : %s",
                  port, address.c_str());
  }
  Report(status);
  return true;
}

CliCounters CliService::Counters() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return {sessions_.size(), loginsSucceeded_.load(), commandsAnswered_.load()};
}

void CliService::Start() {
  std::lock_guard<std::mutex> lock(threadsMutex_);
  if (!threads_.empty()) return;
  stopping_ = false;
  for (std::size_t i = 0; i < options_.workers; ++i)
    threads_.emplace_back([this] { WorkerLoop(); });
  threads_.emplace_back([this] { TimerLoop(); });
}

void CliService::Stop() {
  tcp_.Stop();
  if (StreamServer* ssh = sshServer_.load()) ssh->Stop();
  {
    std::lock_guard<std::mutex> lock(threadsMutex_);
    stopping_ = true;
    // Each wait checks stopping_ under its own mutex, so none misses the wake-up.
    { std::lock_guard<std::mutex> work(workMutex_); }
    { std::lock_guard<std::mutex> timer(timerMutex_); }
    workReady_.notify_all();
    timerWake_.notify_all();
    for (std::thread& thread : threads_) thread.join();
    threads_.clear();
    stopping_ = false;
  }
  {
    std::lock_guard<std::mutex> lock(workMutex_);
    readySessions_.clear();
  }
  {
    std::lock_guard<std::mutex> lock(timerMutex_);
    timers_.clear();
  }
  {
    std::lock_guard<std::mutex> lock(mutex_);
    sessions_.clear();
    sessionsPerAgent_.clear();
    listening_.clear();
  }
  agents_.Clear();
}

// Sessions.

StreamServer& CliService::ServerOf(TcpSessionId id) {
  if ((TcpClientNumberOf(id) & kSshClientBit) == 0) return tcp_;
  return *sshServer_.load();  // an SSH session exists only once its server does
}

std::shared_ptr<CliService::Session> CliService::Find(TcpSessionId id) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  return found == sessions_.end() ? nullptr : found->second;
}

void CliService::Send(Session& session, std::string bytes) {
  if (!bytes.empty()) ServerOf(session.id).Send(session.id, std::move(bytes));
}

void CliService::OnAccepted(TcpSessionId id, std::uint32_t listenerTag, const TcpPeer&) {
  bool ssh = (TcpClientNumberOf(id) & kSshClientBit) != 0;
  StreamServer& server = ServerOf(id);
  std::optional<CliAgent> agent = agents_.Find(listenerTag);
  auto session = std::make_shared<Session>(
      id, listenerTag, ssh, CliSessionEnvironment{&agents_, &prompts_, options_.host, {}});
  {
    std::lock_guard<std::mutex> lock(mutex_);
    std::size_t& count = sessionsPerAgent_[listenerTag];
    if (!agent || count >= options_.sessionsPerAgent) {
      if (count == 0) sessionsPerAgent_.erase(listenerTag);
      if (agent) server.Send(id, kCliSessionLimitLine);  // else the agent is being stopped
      server.Close(id, true);
      return;
    }
    ++count;
    sessions_[id] = session;
  }
  std::lock_guard<std::mutex> input(session->inputMutex);
  Send(*session, session->input.Open());
  auto now = Clock::now();
  if (!ssh) Schedule({now + options_.negotiationTimeout, id, true});
  if (ssh) ++loginsSucceeded_;  // the SSH server let it in
  std::uint32_t keepAlive =
      agent->keepAliveSeconds ? agent->keepAliveSeconds : kDefaultKeepAliveSeconds;
  ScheduleIdleCheck(*session, now + std::chrono::seconds(keepAlive));
  PumpLocked(*session, session);
}

void CliService::OnBytes(TcpSessionId id, std::string_view bytes) {
  std::shared_ptr<Session> session = Find(id);
  if (!session) return;
  session->lastInput = Now();
  std::lock_guard<std::mutex> lock(session->inputMutex);
  Send(*session, session->input.Feed(bytes));
  PumpLocked(*session, session);
}

void CliService::OnClosed(TcpSessionId id) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  if (found == sessions_.end()) return;
  auto count = sessionsPerAgent_.find(found->second->agentId);
  if (count != sessionsPerAgent_.end() && --count->second == 0) sessionsPerAgent_.erase(count);
  sessions_.erase(found);
}

void CliService::PumpLocked(Session& session, const std::shared_ptr<Session>& shared) {
  std::string echo;
  std::optional<CliInputEvent> event = session.input.Next(&echo);
  Send(session, std::move(echo));
  if (event) Enqueue(shared, std::move(*event));
}

// Workers.

void CliService::Enqueue(const std::shared_ptr<Session>& session, CliInputEvent event) {
  std::lock_guard<std::mutex> lock(workMutex_);
  session->event = std::move(event);
  if (session->scheduled) return;
  session->scheduled = true;
  readySessions_.push_back(session);
  workReady_.notify_one();
}

void CliService::WorkerLoop() {
  while (true) {
    std::shared_ptr<Session> session;
    CliInputEvent event;
    {
      std::unique_lock<std::mutex> lock(workMutex_);
      workReady_.wait(lock, [this] { return stopping_ || !readySessions_.empty(); });
      if (stopping_) return;
      session = std::move(readySessions_.front());
      readySessions_.pop_front();
      event = std::move(*session->event);
      session->event.reset();
    }
    Answer(session, event);
    std::lock_guard<std::mutex> lock(workMutex_);
    if (!session->event) {
      session->scheduled = false;
    } else {
      // Behind the other waiting sessions, so that a busy one does not hold a worker.
      readySessions_.push_back(std::move(session));
      workReady_.notify_one();
    }
  }
}

void CliService::Answer(const std::shared_ptr<Session>& session, const CliInputEvent& event) {
  CliSession& cli = session->cli;
  CliAnswer answer;
  switch (event.kind) {
    case CliInputEvent::Kind::kOpen:
      answer.text = cli.Open();
      break;
    case CliInputEvent::Kind::kLine:
      answer = cli.Line(event.text);
      break;
    case CliInputEvent::Kind::kComplete:
      answer = cli.Complete(event.text);
      break;
    case CliInputEvent::Kind::kHelp:
      answer = cli.Help(event.text);
      break;
    case CliInputEvent::Kind::kSuspend:
      answer = cli.Suspend();
      break;
  }
  if (answer.keepAliveChanged) CheckIdleSoon(session->agentId);
  if (answer.loggedIn) ++loginsSucceeded_;
  if (answer.answered) ++commandsAnswered_;
  Send(*session, session->ssh ? std::move(answer.text) : EscapeTelnetData(answer.text));
  if (answer.close) {
    // Nothing more is read: the event stays answered-pending until the session is gone.
    ServerOf(session->id).Close(session->id, true);
    return;
  }
  std::lock_guard<std::mutex> lock(session->inputMutex);
  CliInput& input = session->input;
  if (answer.historySize) input.SetHistorySize(*answer.historySize);
  if (answer.line) Send(*session, input.SetLine(*answer.line));
  if (answer.showLine) Send(*session, input.ShowLine());
  input.Answered(cli.Masking(), cli.Prompt());
  PumpLocked(*session, session);
}

// Timers.

// Every session of the agent is looked at again under its new idle limit.
void CliService::CheckIdleSoon(std::uint32_t agentId) {
  std::vector<std::shared_ptr<Session>> sessions;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto it = sessions_.lower_bound(MakeTcpSessionId(agentId, 0));
         it != sessions_.end() && TcpListenerTagOf(it->first) == agentId; ++it)
      sessions.push_back(it->second);
  }
  std::optional<CliAgent> agent = agents_.Find(agentId);
  if (!agent || agent->keepAliveSeconds == 0) return;
  auto deadline = Clock::now() + std::chrono::seconds(agent->keepAliveSeconds);
  for (const std::shared_ptr<Session>& session : sessions) ScheduleIdleCheck(*session, deadline);
}

void CliService::ScheduleIdleCheck(Session& session, Clock::time_point deadline) {
  Schedule({deadline, session.id, false, ++session.idleSerial});
}

void CliService::Schedule(Timer timer) {
  std::lock_guard<std::mutex> lock(timerMutex_);
  timers_.push_back(timer);
  std::push_heap(timers_.begin(), timers_.end(), std::greater<>());
  if (timers_.front().session == timer.session) timerWake_.notify_one();
}

void CliService::TimerLoop() {
  std::unique_lock<std::mutex> lock(timerMutex_);
  while (!stopping_) {
    if (timers_.empty()) {
      timerWake_.wait(lock, [this] { return stopping_ || !timers_.empty(); });
      continue;
    }
    Clock::time_point deadline = timers_.front().deadline;
    if (Clock::now() < deadline) {
      timerWake_.wait_until(lock, deadline);
      continue;
    }
    std::pop_heap(timers_.begin(), timers_.end(), std::greater<>());
    Timer due = timers_.back();
    timers_.pop_back();
    lock.unlock();
    OnTimer(due);
    lock.lock();
  }
}

void CliService::OnTimer(const Timer& timer) {
  std::shared_ptr<Session> session = Find(timer.session);
  if (!session) return;
  if (timer.negotiation) {
    std::lock_guard<std::mutex> lock(session->inputMutex);
    session->input.GiveUpNegotiation();
    PumpLocked(*session, session);
    return;
  }
  if (timer.serial != session->idleSerial) return;  // a later check replaced this one
  std::optional<CliAgent> agent = agents_.Find(session->agentId);
  std::uint32_t seconds = agent ? agent->keepAliveSeconds : kDefaultKeepAliveSeconds;
  auto now = Clock::now();
  if (seconds == 0) {  // never closed; looked at again in case the host sets a limit
    ScheduleIdleCheck(*session, now + std::chrono::seconds(kDefaultKeepAliveSeconds));
    return;
  }
  Clock::time_point deadline =
      Clock::time_point(Clock::duration(session->lastInput.load())) + std::chrono::seconds(seconds);
  if (now >= deadline) {
    ServerOf(session->id).Close(session->id, false);
  } else {
    ScheduleIdleCheck(*session, deadline);
  }
}

}  // namespace tessel
