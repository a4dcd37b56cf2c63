#include "tl1/tl1_service.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <utility>

#include "base/log.h"

namespace tessel {

struct Tl1Service::Session {
  Session(TcpSessionId id, std::int32_t agentId, bool interactive,
          LineEditor::Completion completion)
      : id(id), agentId(agentId), input(interactive, std::move(completion)) {}
  const TcpSessionId id;
  const std::int32_t agentId;
  Tl1SessionInput input;  // the TCP loop thread only
  // Guarded by workMutex_.
  std::deque<Work> inbox;
  bool scheduled = false;  // in readySessions_ or held by a worker
  bool inputEnded = false;  // the client sends no more: close once the inbox is answered
  // The worker holding the session only.
  bool loggedIn = false;
  // Guarded by mutex_: the ATAG of the next autonomous message when this is the agent's first
  // session.
  std::uint32_t atag = 0;
};

namespace {

constexpr const char* kPromptLine = "\r\nTL1>>";

// An autonomous message whose identification ends with CANC closes the session once it is sent.
bool ClosesSession(const std::string& identification) {
  return identification.find("CANC") != std::string::npos &&
         identification.find("CANC ") == std::string::npos;
}

}  // namespace

Tl1Service::Tl1Service(Tl1ServiceOptions options)
    : options_(std::move(options)),
      pending_(options_.clock),
      engine_(&registry_, &pending_, options_.host, options_.localTime),
      tcp_(this, options_.tcp) {}

Tl1Service::~Tl1Service() { Stop(); }

HostBridge* Tl1Service::Host() const { return options_.host ? options_.host : InstalledHost(); }

std::vector<std::string> Tl1Service::Complete(std::string_view prefix) const {
  std::vector<std::string> matches;
  for (std::string& code : registry_.Codes()) {
    if (code.size() >= prefix.size() &&
        CompareCommandCodes(code.substr(0, prefix.size()), prefix) == 0)
      matches.push_back(std::move(code));
  }
  return matches;
}

void Tl1Service::RegisterAgent(const Tl1Agent& agent, std::int32_t hostInt) {
  auto info = std::make_shared<const Tl1Agent>(agent);
  Endpoint endpoint{info->ipAddress, info->port};
  std::lock_guard<std::mutex> lock(mutex_);
  ForgetAgentLocked(agent.agentId);
  agents_[agent.agentId] = {std::move(info), hostInt};
  // An agent registered earlier on the same endpoint is no longer found by it; the key takes
  // the new record's text, which lives as long as the index entry.
  agentAt_.erase(endpoint);
  agentAt_.emplace(endpoint, agent.agentId);
}

// The caller holds mutex_.
const Tl1Service::Agent* Tl1Service::FindAgentLocked(const std::string& address,
                                                     std::uint16_t port) const {
  auto at = agentAt_.find({address, port});
  if (at == agentAt_.end()) return nullptr;
  auto found = agents_.find(at->second);
  return found == agents_.end() ? nullptr : &found->second;
}

// The caller holds mutex_.
void Tl1Service::ForgetAgentLocked(std::int32_t agentId) {
  auto found = agents_.find(agentId);
  if (found == agents_.end()) return;
  auto at = agentAt_.find({found->second.info->ipAddress, found->second.info->port});
  if (at != agentAt_.end() && at->second == agentId) agentAt_.erase(at);
  agents_.erase(found);
  telnetPorts_.erase(telnetPorts_.lower_bound({agentId, 0}),
                     telnetPorts_.upper_bound({agentId, UINT16_MAX}));
}

bool Tl1Service::StartAgent(const std::string& address, std::uint16_t port) {
  std::optional<std::int32_t> agentId = AgentIdAt(address, port);
  int error = 0;
  bool started = agentId && tcp_.Listen(static_cast<std::uint32_t>(*agentId), address, port,
                                        keepAliveSeconds_.load(), &error);
  char status[160];
  if (started) {
    std::snprintf(status, sizeof status, "TL1 Agent started at Port : %d, IpAddress : %s ", port,
                  address.c_str());
    std::lock_guard<std::mutex> lock(threadsMutex_);
    StartThreadsLocked();
  } else {
    std::snprintf(status, sizeof status,
                  "Unable to start TL1 Agent at Port :%d and at IpAddress : %s", port,
                  address.c_str());
    LOG_ERROR("%s (errno %d)\n", status, error);
    if (agentId) {
      std::lock_guard<std::mutex> lock(mutex_);
      ForgetAgentLocked(*agentId);
    }
  }
  if (options_.status) {
    options_.status(status);
  } else if (HostBridge* host = Host()) {
    host->PrintStatus(status);
  }
  return started;
}

bool Tl1Service::StartTelnetListener(const std::string& address, std::uint16_t port,
                                     std::int32_t agentId) {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    if (!agents_.contains(agentId)) return false;
    // Known before the first connection can arrive.
    telnetPorts_.insert({agentId, port});
  }
  int error = 0;
  if (tcp_.Listen(static_cast<std::uint32_t>(agentId), address, port, keepAliveSeconds_.load(),
                  &error)) {
    std::lock_guard<std::mutex> lock(threadsMutex_);
    StartThreadsLocked();
    return true;
  }
  LOG_ERROR("Unable to start TL1 telnet listener at %s:%d (errno %d)\n", address.c_str(), port,
            error);
  std::lock_guard<std::mutex> lock(mutex_);
  telnetPorts_.erase({agentId, port});
  return false;
}

bool Tl1Service::StopAgent(const std::string& address, std::uint16_t port) {
  std::int32_t agentId = 0;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    const Agent* agent = FindAgentLocked(address, port);
    if (agent == nullptr) return false;
    agentId = agent->info->agentId;
    ForgetAgentLocked(agentId);
  }
  tcp_.CloseListeners(static_cast<std::uint32_t>(agentId));
  return true;
}

std::optional<std::int32_t> Tl1Service::AgentIdAt(const std::string& address,
                                                  std::uint16_t port) const {
  std::lock_guard<std::mutex> lock(mutex_);
  const Agent* agent = FindAgentLocked(address, port);
  if (agent == nullptr) return std::nullopt;
  return agent->info->agentId;
}

std::optional<std::string> Tl1Service::ModeInfo(const std::string& address,
                                                std::uint16_t port) const {
  std::lock_guard<std::mutex> lock(mutex_);
  const Agent* agent = FindAgentLocked(address, port);
  if (agent == nullptr) return std::nullopt;
  const Tl1Agent& info = *agent->info;
  if (info.hostText1.empty() || info.hostText2.empty()) return info.hostText3;
  return info.hostText1 + "|" + info.hostText2 + "|" + info.hostText3;
}

std::uint32_t Tl1Service::SetKeepAlive(std::uint32_t seconds) {
  keepAliveSeconds_ = seconds;
  return seconds;
}

void Tl1Service::SetLoginRequired(std::int32_t agentId, bool required) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (required)
    loginRequired_.insert(agentId);
  else
    loginRequired_.erase(agentId);
}

Tl1Counters Tl1Service::Counters() const {
  return {sessionsOpen_.load(), commandsAnswered_.load()};
}

// The caller holds threadsMutex_.
void Tl1Service::StartThreadsLocked() {
  if (!threads_.empty()) return;
  stopping_ = false;
  for (std::size_t i = 0; i < options_.workers; ++i)
    threads_.emplace_back([this] { WorkerLoop(); });
  threads_.emplace_back([this] { AlarmLoop(); });
  threads_.emplace_back([this] { TimerLoop(); });
}

void Tl1Service::Stop() {
  tcp_.Stop();
  {
    std::lock_guard<std::mutex> lock(threadsMutex_);
    stopping_ = true;
    // Each wait checks stopping_ under its own mutex, so none misses the wake-up.
    { std::lock_guard<std::mutex> work(workMutex_); }
    { std::lock_guard<std::mutex> alarm(alarmMutex_); }
    { std::lock_guard<std::mutex> timer(timerMutex_); }
    workReady_.notify_all();
    alarmReady_.notify_all();
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
    std::lock_guard<std::mutex> lock(alarmMutex_);
    for (auto& queue : alarms_) queue.clear();
  }
  for (const Tl1PendingEntry& entry : pending_.List()) pending_.Cancel(entry.id);
  std::lock_guard<std::mutex> lock(mutex_);
  agents_.clear();
  agentAt_.clear();
  loginRequired_.clear();
  telnetPorts_.clear();
  sessions_.clear();
  registry_.Clear();
}

// Sessions.

void Tl1Service::OnAccepted(TcpSessionId id, std::uint32_t listenerTag, const TcpPeer& peer) {
  auto agentId = static_cast<std::int32_t>(listenerTag);
  bool interactive = false;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    interactive = telnetPorts_.contains({agentId, peer.localPort});
  }
  auto session = std::make_shared<Session>(
      id, agentId, interactive, [this](std::string_view prefix) { return Complete(prefix); });
  std::string opening = session->input.Open();
  {
    std::lock_guard<std::mutex> lock(mutex_);
    sessions_[id] = session;
  }
  ++sessionsOpen_;
  if (!opening.empty()) tcp_.Send(id, std::move(opening));
}

std::shared_ptr<Tl1Service::Session> Tl1Service::FindSession(TcpSessionId id) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  return found == sessions_.end() ? nullptr : found->second;
}

void Tl1Service::OnBytes(TcpSessionId id, std::string_view bytes) {
  std::shared_ptr<Session> session = FindSession(id);
  if (!session) return;
  Tl1InputResult input = session->input.Feed(bytes);
  if (!input.reply.empty()) tcp_.Send(id, std::move(input.reply));
  if (input.events.empty()) return;
  std::vector<Work> work;
  work.reserve(input.events.size());
  for (Tl1InputEvent& event : input.events) work.push_back({std::move(event), std::nullopt});
  Enqueue(session, std::move(work), true);
}

// One wake-up per session made ready in the round, at most one per worker: a worker that is
// busy takes the next ready session without being woken.
void Tl1Service::OnReadsDone() {
  if (wakeUps_ == 0) return;
  std::size_t wake = std::min(wakeUps_, options_.workers);
  wakeUps_ = 0;
  std::lock_guard<std::mutex> lock(workMutex_);
  for (std::size_t i = 0; i < wake; ++i) workReady_.notify_one();
}

// The messages received before the end of input are still answered; the worker that answers the
// last of them closes the session.
bool Tl1Service::OnInputEnded(TcpSessionId id) {
  std::shared_ptr<Session> session = FindSession(id);
  if (!session) return false;
  std::lock_guard<std::mutex> lock(workMutex_);
  session->inputEnded = true;
  return session->scheduled;
}

void Tl1Service::OnClosed(TcpSessionId id) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (sessions_.erase(id) > 0) --sessionsOpen_;
}

// Workers.

void Tl1Service::Enqueue(const std::shared_ptr<Session>& session, std::vector<Work> work,
                         bool wakeLater) {
  std::lock_guard<std::mutex> lock(workMutex_);
  for (Work& unit : work) session->inbox.push_back(std::move(unit));
  if (session->scheduled) return;
  session->scheduled = true;
  readySessions_.push_back(session);
  if (wakeLater)
    ++wakeUps_;
  else
    workReady_.notify_one();
}

void Tl1Service::WorkerLoop() {
  while (true) {
    std::shared_ptr<Session> session;
    Work work;
    {
      std::unique_lock<std::mutex> lock(workMutex_);
      workReady_.wait(lock, [this] { return stopping_ || !readySessions_.empty(); });
      if (stopping_) return;
      session = std::move(readySessions_.front());
      readySessions_.pop_front();
      work = std::move(session->inbox.front());
      session->inbox.pop_front();
    }
    Answer(*session, work);
    bool answeredAll = false;
    {
      std::lock_guard<std::mutex> lock(workMutex_);
      if (session->inbox.empty()) {
        session->scheduled = false;
        answeredAll = session->inputEnded;
      } else {
        // Behind the other waiting sessions, so that a busy one does not hold a worker.
        readySessions_.push_back(session);
        workReady_.notify_one();
      }
    }
    if (answeredAll) tcp_.Close(session->id, true);
  }
}

void Tl1Service::Answer(Session& session, const Work& work) {
  Tl1EngineResult result{{}, session.loggedIn, false};
  Tl1SessionContext context{session.id, nullptr, false, session.loggedIn};
  std::shared_ptr<const Tl1Agent> agent;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto found = agents_.find(session.agentId);
    if (found != agents_.end()) agent = found->second.info;
    context.loginRequired = loginRequired_.contains(session.agentId);
  }
  context.agent = agent.get();
  switch (work.event.kind) {
    case Tl1InputEvent::Kind::kEmptyLine:
      break;
    case Tl1InputEvent::Kind::kOverflow:
      result.outputs.push_back(
          {AckFormatter(kAckNoTerminator, "0"), Tl1OutputKind::kAcknowledgment});
      break;
    case Tl1InputEvent::Kind::kMessage:
      result = work.delayed ? engine_.ExecuteCommand(*work.delayed, context)
                            : engine_.TL1Engine(work.event.text, context);
      WakeTimer();
      break;
  }
  if (work.event.kind != Tl1InputEvent::Kind::kEmptyLine) ++commandsAnswered_;
  session.loggedIn = result.loggedIn;
  std::string text;
  for (const Tl1Output& output : result.outputs) text += output.text;
  text += kPromptLine;
  if (session.input.Interactive()) text = EscapeTelnetData(text);
  tcp_.Send(session.id, std::move(text));
  if (result.closeSession) tcp_.Close(session.id, true);
}

void Tl1Service::Deliver(Tl1PendingEntry entry) {
  std::shared_ptr<Session> session = FindSession(entry.sessionId);
  if (!session) return;  // the session closed while its command waited
  std::vector<Work> work;
  work.push_back(
      {{Tl1InputEvent::Kind::kMessage, std::move(entry.commandText)}, std::move(entry.command)});
  Enqueue(session, std::move(work));
}

// Autonomous messages.

// The caller holds mutex_. In accept order.
std::vector<std::shared_ptr<Tl1Service::Session>> Tl1Service::SessionsOfLocked(
    std::int32_t agentId) const {
  std::vector<std::shared_ptr<Session>> found;
  auto tag = static_cast<std::uint32_t>(agentId);
  for (auto it = sessions_.lower_bound(MakeTcpSessionId(tag, 0));
       it != sessions_.end() && TcpListenerTagOf(it->first) == tag; ++it) {
    found.push_back(it->second);
  }
  return found;
}

std::uint32_t Tl1Service::SendAutonomous(std::int32_t agentId,
                                         const std::vector<Tl1AutonomousMessage>& batch) {
  std::vector<std::pair<std::uint8_t, Alarm>> queued;
  std::size_t reached = 0;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto agent = agents_.find(agentId);
    std::vector<std::shared_ptr<Session>> sessions = SessionsOfLocked(agentId);
    if (agent == agents_.end() || sessions.empty()) {
      LOG_TRACE("No client yet connected to the server %d to send autonms\n", agentId);
      return 0;
    }
    reached = sessions.size();
    std::tm now = options_.localTime();
    // The agent's first session counts the ATAGs of all of them.
    std::uint32_t& atag = sessions.front()->atag;
    for (const Tl1AutonomousMessage& message : batch) {
      std::uint8_t code = std::min<std::uint8_t>(message.alarmCode, 3);
      for (const std::shared_ptr<Session>& session : sessions) {
        std::uint32_t number = atag++;
        std::string identification = FormatAutonomousIdentification(
            code, number, message.verb, message.modifier1, message.modifier2);
        std::string text;
        for (const std::string& part :
             FormatAutonomousMessage(agent->second.info->sid, now, code, number, message.verb,
                                     message.modifier1, message.modifier2, message.lines)) {
          text += part;
        }
        if (session->input.Interactive()) text = EscapeTelnetData(text);
        queued.push_back({code, {session->id, std::move(text), ClosesSession(identification)}});
      }
    }
  }
  std::lock_guard<std::mutex> lock(alarmMutex_);
  for (auto& [code, alarm] : queued) alarms_[code].push_back(std::move(alarm));
  alarmReady_.notify_one();
  return static_cast<std::uint32_t>(reached);
}

bool Tl1Service::SetAtag(std::int32_t agentId, std::uint32_t atag) {
  std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::shared_ptr<Session>> sessions = SessionsOfLocked(agentId);
  if (sessions.empty()) return false;
  sessions.front()->atag = atag;
  return true;
}

void Tl1Service::AlarmLoop() {
  auto anyQueued = [this] {
    return std::any_of(alarms_.begin(), alarms_.end(), [](const auto& q) { return !q.empty(); });
  };
  while (true) {
    Alarm alarm;
    {
      std::unique_lock<std::mutex> lock(alarmMutex_);
      alarmReady_.wait(lock, [&] { return stopping_ || anyQueued(); });
      if (stopping_) return;
      auto queue =
          std::find_if(alarms_.begin(), alarms_.end(), [](const auto& q) { return !q.empty(); });
      alarm = std::move(queue->front());
      queue->pop_front();
    }
    if (alarm.closeAfter) {
      tcp_.Send(alarm.session, std::move(alarm.text));
      tcp_.Close(alarm.session, true);
    } else {
      tcp_.Send(alarm.session, alarm.text + kPromptLine);
    }
  }
}

// Delayed activation.

std::vector<Tl1PendingEntry> Tl1Service::ListPending(std::int32_t agentId) const {
  std::vector<Tl1PendingEntry> entries = pending_.List();
  std::erase_if(entries, [agentId](const Tl1PendingEntry& entry) {
    return TcpListenerTagOf(entry.sessionId) != static_cast<std::uint32_t>(agentId);
  });
  return entries;
}

bool Tl1Service::RunPending(std::int32_t agentId, std::uint32_t id) {
  std::vector<Tl1PendingEntry> entries = ListPending(agentId);
  if (std::none_of(entries.begin(), entries.end(), [id](const auto& e) { return e.id == id; }))
    return false;
  std::optional<Tl1PendingEntry> entry = pending_.Take(id);
  if (!entry) return false;
  Deliver(std::move(*entry));
  WakeTimer();
  return true;
}

bool Tl1Service::CancelPending(std::int32_t agentId, std::uint32_t id) {
  std::vector<Tl1PendingEntry> entries = ListPending(agentId);
  if (std::none_of(entries.begin(), entries.end(), [id](const auto& e) { return e.id == id; }))
    return false;
  bool cancelled = pending_.Cancel(id);
  WakeTimer();
  return cancelled;
}

// Wakes the timer when the earliest waiting command is not the one it waits for.
void Tl1Service::WakeTimer() {
  std::optional<std::int64_t> next = pending_.NextExpiry();
  std::lock_guard<std::mutex> lock(timerMutex_);
  if (next == timerArmedFor_) return;
  timerPoked_ = true;
  timerWake_.notify_one();
}

void Tl1Service::TimerLoop() {
  std::unique_lock<std::mutex> lock(timerMutex_);
  while (!stopping_) {
    timerArmedFor_ = pending_.NextExpiry();
    auto woken = [this] { return stopping_ || timerPoked_; };
    if (!timerArmedFor_) {
      timerWake_.wait(lock, woken);
    } else {
      // Measured by the service's clock, so that a clock of its own is waited for as it runs.
      std::int64_t seconds = std::max<std::int64_t>(0, *timerArmedFor_ - options_.clock());
      timerWake_.wait_for(lock, std::chrono::seconds(seconds), woken);
    }
    timerPoked_ = false;
    if (stopping_) return;
    lock.unlock();
    for (Tl1PendingEntry& entry : pending_.TakeDue(options_.clock())) Deliver(std::move(entry));
    lock.lock();
  }
}

}  // namespace tessel
