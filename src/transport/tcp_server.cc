#include "transport/tcp_server.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cinttypes>
#include <cstring>
#include <deque>
#include <new>
#include <system_error>
#include <utility>

#include "base/log.h"
#include "transport/listening_socket.h"

namespace tessel {

using Clock = std::chrono::steady_clock;

namespace {

constexpr std::size_t kReadBufferSize = 64 * 1024;
constexpr int kMaxEvents = 64;
// Accepts per readiness of one listener, so that a burst on one cannot starve the others.
constexpr int kAcceptsPerWakeup = 64;
constexpr std::size_t kMaxWriteParts = 64;

// Keys of the epoll registrations. A session is registered under its id, whose client number is
// never 0; a listener, the wake event and the timer under their descriptor in the upper half.
std::uint64_t DescriptorKey(int descriptor) { return static_cast<std::uint64_t>(descriptor) << 32; }
bool IsSessionKey(std::uint64_t key) { return TcpClientNumberOf(key) != 0; }
int DescriptorOf(std::uint64_t key) { return static_cast<int>(key >> 32); }

bool Register(int epoll, int operation, int descriptor, std::uint64_t key, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.u64 = key;
  return epoll_ctl(epoll, operation, descriptor, &event) == 0;
}

// Writes what the socket takes now without blocking: the count written (0 when it takes
// nothing), or -1 on an error, which is logged.
ssize_t WriteNow(int socket, iovec* parts, std::size_t count) {
  msghdr message{};
  message.msg_iov = parts;
  message.msg_iovlen = count;
  while (true) {
    ssize_t sent = sendmsg(socket, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (sent >= 0) return sent;
    if (errno == EAGAIN || errno == EWOULDBLOCK) return 0;
    if (errno == EINTR) continue;
    LOG_ERROR("Write Error from Socket (fd: %d, errno: %d )", socket, errno);
    return -1;
  }
}

timespec MonotonicTime(Clock::time_point at) {
  auto since = at.time_since_epoch();
  auto seconds = std::chrono::duration_cast<std::chrono::seconds>(since);
  auto nanoseconds = std::chrono::duration_cast<std::chrono::nanoseconds>(since - seconds);
  return {static_cast<time_t>(seconds.count()), static_cast<long>(nanoseconds.count())};
}

// Heap order: the earliest deadline on top.
constexpr auto kEarliestFirst = [](const auto& left, const auto& right) {
  return left.deadline > right.deadline;
};

}  // namespace

struct TcpServer::Session {
  Session(TcpSessionId id, int socket, std::uint32_t keepAliveSeconds, std::uint64_t serial)
      : id(id), socket(socket), keepAlive(keepAliveSeconds), serial(serial) {}
  ~Session() { ::close(socket); }
  const TcpSessionId id;
  const int socket;
  const std::chrono::seconds keepAlive;
  const std::uint64_t serial;
  // Loop thread only.
  TcpPeer peer;
  Clock::time_point lastInput;
  Clock::time_point inputEndedAt;  // when inputEnded was set
  // Under the server's lock.
  std::deque<std::string> output;
  std::size_t frontWritten = 0;  // bytes of output.front() already written
  std::size_t queuedBytes = 0;
  bool watchingOutput = false;
  bool closeAfterOutput = false;
  bool inputEnded = false;  // the peer ended its input: nothing more is read (set on the loop)
};

TcpServer::TcpServer(TcpSessionEvents* events, TcpServerOptions options)
    : events_(events), options_(options), readBuffer_(kReadBufferSize) {
  epoll_ = epoll_create1(EPOLL_CLOEXEC);
  wakeEvent_ = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  timer_ = timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
  if (epoll_ < 0 || wakeEvent_ < 0 || timer_ < 0 ||
      !Register(epoll_, EPOLL_CTL_ADD, wakeEvent_, DescriptorKey(wakeEvent_), EPOLLIN) ||
      !Register(epoll_, EPOLL_CTL_ADD, timer_, DescriptorKey(timer_), EPOLLIN)) {
    LOG_ERROR("TCP server: cannot create its event descriptors (errno %d)", errno);
  }
}

TcpServer::~TcpServer() {
  Stop();
  for (int descriptor : {timer_, wakeEvent_, epoll_})
    if (descriptor >= 0) ::close(descriptor);
}

bool TcpServer::Listen(std::uint32_t tag, const std::string& address, std::uint16_t port,
                       std::uint32_t keepAliveSeconds, int* error) {
  int ignored = 0;
  int& failure = error ? *error : ignored;
  std::lock_guard<std::mutex> start(startMutex_);
  if (!StartLoop()) {
    failure = EAGAIN;
    return false;
  }
  int socket = OpenListeningSocket(address, port, options_.sendBuffer, &failure);
  if (socket < 0) return false;
  try {
    std::lock_guard<std::mutex> lock(mutex_);
    listeners_.emplace(socket, Listener{tag, keepAliveSeconds});
    try {
      listenersByTag_.emplace(tag, socket);
    } catch (const std::bad_alloc&) {
      listeners_.erase(socket);
      throw;
    }
    if (!Register(epoll_, EPOLL_CTL_ADD, socket, DescriptorKey(socket), EPOLLIN)) {
      failure = errno;
      ForgetListener(tag, socket);
      ::close(socket);
      return false;
    }
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Error in allocating memory");
    ::close(socket);
    failure = ENOMEM;
    return false;
  }
  failure = 0;
  LOG_TRACE("TCP listener %u on %s port %u", tag, address.c_str(), port);
  return true;
}

bool TcpServer::StartLoop() {
  if (loop_.joinable()) return true;
  if (epoll_ < 0 || wakeEvent_ < 0 || timer_ < 0) return false;
  try {
    loop_ = std::thread(&TcpServer::Loop, this);
  } catch (const std::system_error&) {
    LOG_ERROR("TCP server: the event loop thread cannot start");
    return false;
  }
  return true;
}

// The caller holds mutex_.
void TcpServer::CloseListener(int socket) {
  epoll_ctl(epoll_, EPOLL_CTL_DEL, socket, nullptr);
  ::close(socket);
  listeners_.erase(socket);
}

// The caller holds mutex_. Drops the records of a listener that never served.
void TcpServer::ForgetListener(std::uint32_t tag, int socket) {
  listeners_.erase(socket);
  auto [first, last] = listenersByTag_.equal_range(tag);
  for (auto listener = first; listener != last; ++listener) {
    if (listener->second == socket) {
      listenersByTag_.erase(listener);
      return;
    }
  }
}

void TcpServer::CloseListeners(std::uint32_t tag) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto [first, last] = listenersByTag_.equal_range(tag);
  for (auto listener = first; listener != last; ++listener) CloseListener(listener->second);
  listenersByTag_.erase(first, last);
  auto session = sessions_.lower_bound(MakeTcpSessionId(tag, 0));
  while (session != sessions_.end() && TcpListenerTagOf(session->first) == tag)
    Retire((session++)->first);
  if (listeners_.empty()) nextClientNumber_ = 1;
}

void TcpServer::Stop() {
  std::lock_guard<std::mutex> start(startMutex_);
  if (!loop_.joinable()) return;
  if (loop_.get_id() == std::this_thread::get_id()) {
    LOG_ERROR("TCP server: Stop called from its own event loop is ignored");
    return;
  }
  {
    std::lock_guard<std::mutex> lock(mutex_);
    while (!listeners_.empty()) CloseListener(listeners_.begin()->first);
    listenersByTag_.clear();
    pausedListeners_.clear();
    while (!sessions_.empty()) Retire(sessions_.begin()->first);
    nextClientNumber_ = 1;
    stopping_ = true;
  }
  Wake();
  loop_.join();
  stopping_ = false;
}

bool TcpServer::Send(TcpSessionId id, std::string bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  if (found == sessions_.end() || found->second->closeAfterOutput) return false;
  Session& session = *found->second;
  std::size_t written = 0;
  if (session.output.empty()) {
    iovec whole{bytes.data(), bytes.size()};
    ssize_t sent = WriteNow(session.socket, &whole, 1);
    if (sent < 0) {
      Retire(id);
      return false;
    }
    written = static_cast<std::size_t>(sent);
  }
  std::size_t rest = bytes.size() - written;
  if (rest == 0) return true;
  if (rest > options_.outputCap - std::min(options_.outputCap, session.queuedBytes)) {
    LOG_ERROR("TCP session %" PRIu64 " has more than %zu bytes of output waiting: closed", id,
              options_.outputCap);
    Retire(id);
    return false;
  }
  try {
    if (session.output.empty()) session.frontWritten = written;
    session.output.push_back(std::move(bytes));
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Error in allocating memory");
    Retire(id);
    return false;
  }
  session.queuedBytes += rest;
  if (!session.watchingOutput) Watch(session, true);
  return true;
}

void TcpServer::Close(TcpSessionId id, bool afterPendingOutput) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  if (found == sessions_.end()) return;
  if (afterPendingOutput && !found->second->output.empty())
    found->second->closeAfterOutput = true;
  else
    Retire(id);
}

std::vector<TcpSessionId> TcpServer::SessionsOf(std::uint32_t tag) const {
  std::vector<TcpSessionId> ids;
  std::lock_guard<std::mutex> lock(mutex_);
  for (auto session = sessions_.lower_bound(MakeTcpSessionId(tag, 0));
       session != sessions_.end() && TcpListenerTagOf(session->first) == tag; ++session)
    ids.push_back(session->first);
  return ids;
}

std::size_t TcpServer::SessionCount() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return sessions_.size();
}

// The caller holds mutex_. The session leaves the map at once (Send fails from now on); the
// loop closes its socket and reports it.
void TcpServer::Retire(TcpSessionId id) {
  auto node = sessions_.extract(id);
  if (node.empty()) return;
  closing_.push_back(std::move(node.mapped()));
  Wake();
}

void TcpServer::Wake() {
  std::uint64_t one = 1;
  // A full counter already wakes the loop.
  if (write(wakeEvent_, &one, sizeof one) < 0 && errno != EAGAIN)
    LOG_ERROR("TCP server: cannot wake its event loop (errno %d)", errno);
}

// The caller holds mutex_.
void TcpServer::Watch(Session& session, bool wantOutput) {
  session.watchingOutput = wantOutput;
  if (!Register(epoll_, EPOLL_CTL_MOD, session.socket, session.id,
                (session.inputEnded ? 0u : EPOLLIN) | (wantOutput ? EPOLLOUT : 0u)))
    LOG_ERROR("TCP server: epoll_ctl failed for fd %d (errno %d)", session.socket, errno);
}

void TcpServer::Loop() {
  std::array<epoll_event, kMaxEvents> ready;
  while (true) {
    int count = epoll_wait(epoll_, ready.data(), kMaxEvents, -1);
    if (count < 0 && errno != EINTR) {
      LOG_ERROR("TCP server: epoll_wait failed (errno %d)", errno);
      break;
    }
    try {
      for (int i = 0; i < count; ++i) Dispatch(ready[i].data.u64, ready[i].events);
    } catch (const std::bad_alloc&) {
      LOG_ERROR("Error in allocating memory");
    }
    try {
      // After a round cut short too: what its reads queued must not wait for the next round.
      if (std::exchange(bytesThisRound_, false)) events_->OnReadsDone();
      FinishClosing();
    } catch (const std::bad_alloc&) {
      LOG_ERROR("Error in allocating memory");
    }
    if (stopping_.load()) break;
  }
  FinishClosing();
  timers_.clear();
  ArmTimer();
}

void TcpServer::Dispatch(std::uint64_t key, std::uint32_t events) {
  if (IsSessionKey(key)) {
    if (events & (EPOLLIN | EPOLLHUP | EPOLLERR)) ReadFrom(key);
    if (events & EPOLLOUT) FlushOutput(key);
    return;
  }
  int descriptor = DescriptorOf(key);
  if (descriptor == wakeEvent_) {
    std::uint64_t count;
    if (read(wakeEvent_, &count, sizeof count) < 0 && errno != EAGAIN)
      LOG_ERROR("TCP server: cannot read its wake event (errno %d)", errno);
  } else if (descriptor == timer_) {
    OnTimer();
  } else {
    AcceptOn(descriptor);
  }
}

void TcpServer::AcceptOn(int listenerSocket) {
  std::vector<Session*> accepted;
  AcceptResult result = AcceptResult::kAccepted;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto found = listeners_.find(listenerSocket);
    if (found == listeners_.end()) return;  // closed since epoll_wait reported it
    for (int i = 0; i < kAcceptsPerWakeup && result == AcceptResult::kAccepted; ++i)
      result = AcceptOne(listenerSocket, found->second, &accepted);
    if (result == AcceptResult::kOutOfDescriptors) {
      // Level-triggered readiness would report the waiting connection again at once: accept
      // nothing more here until a session closes or the retry time passes.
      Register(epoll_, EPOLL_CTL_MOD, listenerSocket, DescriptorKey(listenerSocket), 0);
      pausedListeners_.push_back(listenerSocket);
    }
  }
  if (result == AcceptResult::kOutOfDescriptors)
    Schedule({Clock::now() + options_.acceptRetry, 0, 0});
  for (Session* session : accepted) {
    session->lastInput = Clock::now();
    if (session->keepAlive.count() > 0)
      Schedule({session->lastInput + session->keepAlive, session->id, session->serial});
    events_->OnAccepted(session->id, TcpListenerTagOf(session->id), session->peer);
  }
}

// The caller holds mutex_.
TcpServer::AcceptResult TcpServer::AcceptOne(int listenerSocket, const Listener& listener,
                                             std::vector<Session*>* accepted) {
  sockaddr_storage peer{};
  socklen_t length = sizeof peer;
  int socket = accept4(listenerSocket, reinterpret_cast<sockaddr*>(&peer), &length,
                       SOCK_NONBLOCK | SOCK_CLOEXEC);
  if (socket < 0) {
    int error = errno;
    if (error == EINTR || error == ECONNABORTED) return AcceptResult::kAccepted;
    if (error == EAGAIN || error == EWOULDBLOCK) return AcceptResult::kNoneWaiting;
    LOG_ERROR("Accept failed due to %d", error);
    if (error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM)
      return AcceptResult::kOutOfDescriptors;
    return AcceptResult::kNoneWaiting;
  }
  TcpSessionId id = NextSessionId(listener.tag);
  auto session = std::make_unique<Session>(id, socket, listener.keepAliveSeconds, nextSerial_++);
  session->peer = PeerOf(peer);
  sockaddr_storage local{};
  length = sizeof local;
  if (getsockname(socket, reinterpret_cast<sockaddr*>(&local), &length) == 0)
    session->peer.localPort = PeerOf(local).port;
  if (!Register(epoll_, EPOLL_CTL_ADD, socket, id, EPOLLIN)) {
    LOG_ERROR("TCP server: epoll_ctl failed for fd %d (errno %d)", socket, errno);
    return AcceptResult::kAccepted;
  }
  LOG_TRACE("Accepted client connection from %s and %d ", session->peer.address.c_str(),
            session->peer.port);
  accepted->push_back(session.get());
  sessions_.emplace(id, std::move(session));
  return AcceptResult::kAccepted;
}

// The caller holds mutex_. Client numbers run on from 1 and never give an id still in use.
TcpSessionId TcpServer::NextSessionId(std::uint32_t tag) {
  while (true) {
    std::uint32_t number = nextClientNumber_++;
    if (nextClientNumber_ == 0) nextClientNumber_ = 1;
    TcpSessionId id = MakeTcpSessionId(tag, number);
    if (!sessions_.contains(id)) return id;
  }
}

void TcpServer::ReadFrom(TcpSessionId id) {
  Session* session;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto found = sessions_.find(id);
    if (found == sessions_.end()) return;
    // Only this thread frees sessions, so the record outlives the lock.
    session = found->second.get();
  }
  ssize_t count;
  do {
    count = recv(session->socket, readBuffer_.data(), readBuffer_.size(), 0);
  } while (count < 0 && errno == EINTR);
  if (count > 0) {
    session->lastInput = Clock::now();
    bytesThisRound_ = true;
    events_->OnBytes(id, std::string_view(readBuffer_.data(), static_cast<std::size_t>(count)));
    return;
  }
  if (count < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) return;
  // 0 is the end of the peer's input: the first time it may be a half-close, after which the
  // session is only read again when the socket reports a hang-up, the peer gone for good.
  if (count == 0 && !session->inputEnded) {
    EndInput(*session);
    return;
  }
  // A reset connection counts as closed too.
  if (count < 0 && errno != ECONNRESET)
    LOG_ERROR("Read Error from Socket (fd: %d, errno: %d )", session->socket, errno);
  std::lock_guard<std::mutex> lock(mutex_);
  Retire(id);
}

// Loop thread. The peer may still read what is queued for it and what its last input is answered
// with: the session stops reading and is closed once the service has sent its answers, or at the
// half-close bound.
void TcpServer::EndInput(Session& session) {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    session.inputEnded = true;
    Watch(session, session.watchingOutput);
  }
  session.inputEndedAt = Clock::now();
  Schedule({session.inputEndedAt + options_.halfClosedLimit, session.id, session.serial});
  if (!events_->OnInputEnded(session.id)) Close(session.id, true);
}

void TcpServer::FlushOutput(TcpSessionId id) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = sessions_.find(id);
  if (found == sessions_.end()) return;
  Session& session = *found->second;
  if (!WriteQueued(session)) {
    Retire(id);
  } else if (session.output.empty()) {
    if (session.closeAfterOutput)
      Retire(id);
    else
      Watch(session, false);
  }
}

// The caller holds mutex_. Writes queued output until the socket takes no more; false on a write
// error.
bool TcpServer::WriteQueued(Session& session) {
  while (!session.output.empty()) {
    std::array<iovec, kMaxWriteParts> parts;
    std::size_t count = 0;
    for (auto chunk = session.output.begin(); chunk != session.output.end() && count < parts.size();
         ++chunk, ++count) {
      std::size_t skip = count == 0 ? session.frontWritten : 0;
      parts[count] = {chunk->data() + skip, chunk->size() - skip};
    }
    ssize_t sent = WriteNow(session.socket, parts.data(), count);
    if (sent < 0) return false;
    if (sent == 0) return true;
    auto left = static_cast<std::size_t>(sent);
    session.queuedBytes -= left;
    while (left > 0) {
      std::size_t unwritten = session.output.front().size() - session.frontWritten;
      if (left < unwritten) {
        session.frontWritten += left;
        break;
      }
      left -= unwritten;
      session.output.pop_front();
      session.frontWritten = 0;
    }
  }
  return true;
}

// Closes the sockets of the sessions that left the map and reports each; a closed session may
// give back the descriptor that a paused listener waits for.
void TcpServer::FinishClosing() {
  std::vector<std::unique_ptr<Session>> closed;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    closed.swap(closing_);
  }
  if (closed.empty()) return;
  for (auto& session : closed) {
    TcpSessionId id = session->id;
    epoll_ctl(epoll_, EPOLL_CTL_DEL, session->socket, nullptr);
    session.reset();
    events_->OnClosed(id);
  }
  ResumeAccepting();
}

void TcpServer::ResumeAccepting() {
  std::lock_guard<std::mutex> lock(mutex_);
  for (int socket : pausedListeners_)
    if (listeners_.contains(socket))
      Register(epoll_, EPOLL_CTL_MOD, socket, DescriptorKey(socket), EPOLLIN);
  pausedListeners_.clear();
}

void TcpServer::Schedule(const TimerEntry& entry) {
  timers_.push_back(entry);
  std::push_heap(timers_.begin(), timers_.end(), kEarliestFirst);
  if (timers_.front().serial == entry.serial && timers_.front().session == entry.session)
    ArmTimer();
}

// Keep-alive deadlines are checked lazily: input only moves a session's lastInput, and an entry
// that comes due for a session heard from since is put back at its new deadline. A half-closed
// session's deadline is the earlier of its keep-alive's and the half-close bound's.
void TcpServer::OnTimer() {
  std::uint64_t expirations;
  if (read(timer_, &expirations, sizeof expirations) < 0 && errno != EAGAIN)
    LOG_ERROR("TCP server: cannot read its timer (errno %d)", errno);
  Clock::time_point now = Clock::now();
  while (!timers_.empty() && timers_.front().deadline <= now) {
    TimerEntry due = timers_.front();
    std::pop_heap(timers_.begin(), timers_.end(), kEarliestFirst);
    timers_.pop_back();
    if (due.serial == 0) {
      ResumeAccepting();
      continue;
    }
    std::lock_guard<std::mutex> lock(mutex_);
    auto found = sessions_.find(due.session);
    if (found == sessions_.end() || found->second->serial != due.serial) continue;
    Session& session = *found->second;
    Clock::time_point deadline = Clock::time_point::max();
    if (session.keepAlive.count() > 0) deadline = session.lastInput + session.keepAlive;
    if (session.inputEnded)
      deadline = std::min(deadline, session.inputEndedAt + options_.halfClosedLimit);
    if (deadline > now) {
      timers_.push_back({deadline, due.session, due.serial});
      std::push_heap(timers_.begin(), timers_.end(), kEarliestFirst);
    } else {
      LOG_TRACE("TCP session %" PRIu64 " past its keep-alive or half-close time: closed",
                due.session);
      Retire(due.session);
    }
  }
  ArmTimer();
}

// Sets the timer to the earliest deadline, or disarms it when none is left.
void TcpServer::ArmTimer() {
  itimerspec setting{};
  if (!timers_.empty()) {
    setting.it_value = MonotonicTime(timers_.front().deadline);
    // An absolute time of zero would disarm the timer instead.
    if (setting.it_value.tv_sec == 0 && setting.it_value.tv_nsec == 0) setting.it_value.tv_nsec = 1;
  }
  if (timerfd_settime(timer_, TFD_TIMER_ABSTIME, &setting, nullptr) != 0)
    LOG_ERROR("TCP server: cannot set its timer (errno %d)", errno);
}

}  // namespace tessel
