#include "transport/ssh_server.h"

#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <libssh/callbacks.h>
#include <libssh/libssh.h>
#include <libssh/server.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cstring>
#include <deque>
#include <new>
#include <system_error>

#include "base/log.h"
#include "transport/listening_socket.h"

namespace tessel {

using Clock = std::chrono::steady_clock;

namespace {

// Set in the client number of every SSH session id, so that these ids never meet those of a
// TcpServer serving the same tags.
constexpr std::uint32_t kSshClientBit = 0x80000000u;
constexpr int kMaxListenerEvents = 64;
// Accepts per readiness of one listener, so that a burst on one cannot starve the others.
constexpr int kAcceptsPerWakeup = 64;
constexpr int kMaxPasswordFailures = 3;
constexpr std::size_t kMaxWriteSlice = 32 * 1024;
// How long accepting stays paused on a listener after the process ran out of descriptors, unless
// a connection closes first.
constexpr std::chrono::milliseconds kAcceptRetry{1000};

// What every client is offered, preferred first.
constexpr const char* kCiphers =
    "chacha20-poly1305@openssh.com,aes256-gcm@openssh.com,aes128-gcm@openssh.com,aes256-ctr,"
    "aes192-ctr,aes128-ctr";
constexpr const char* kMacs =
    "hmac-sha2-256-etm@openssh.com,hmac-sha2-512-etm@openssh.com,hmac-sha2-256,hmac-sha2-512";
constexpr const char* kKeyExchanges =
    "curve25519-sha256,curve25519-sha256@libssh.org,ecdh-sha2-nistp256,ecdh-sha2-nistp384,"
    "ecdh-sha2-nistp521,diffie-hellman-group16-sha512,diffie-hellman-group14-sha256";
constexpr const char* kHostKeyAlgorithms = "ssh-ed25519,rsa-sha2-512,rsa-sha2-256";

struct HostKeyFile {
  const char* name;
  ssh_keytypes_e type;
  int bits;
};
constexpr std::array<HostKeyFile, 2> kHostKeyFiles{{
    {"ssh_host_ed25519_key", SSH_KEYTYPE_ED25519, 0},
    {"ssh_host_rsa_key", SSH_KEYTYPE_RSA, 3072},
}};

// Creates path and its missing parents (mode 0700); 0 or the errno of the failing step.
int MakeDirectories(const std::string& path) {
  for (std::size_t end = 1; end <= path.size(); ++end) {
    if (end < path.size() && path[end] != '/') continue;
    if (mkdir(path.substr(0, end).c_str(), 0700) != 0 && errno != EEXIST) return errno;
  }
  struct stat info {};
  if (stat(path.c_str(), &info) != 0) return errno;
  return S_ISDIR(info.st_mode) ? 0 : ENOTDIR;
}

int ReadWholeFile(const std::string& path, std::string* text) {
  int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) return errno;
  std::array<char, 4096> buffer;
  ssize_t count;
  while ((count = read(file, buffer.data(), buffer.size())) > 0)
    text->append(buffer.data(), static_cast<std::size_t>(count));
  int error = count < 0 ? errno : 0;
  ::close(file);
  return error;
}

// Writes text to path with mode 0600, through a new file renamed over it, so that a crash never
// leaves half a key behind.
int WriteKeyFile(const std::string& path, const std::string& text) {
  std::string fresh = path + ".new";
  int file = open(fresh.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0600);
  if (file < 0) return errno;
  int error = fchmod(file, 0600) == 0 ? 0 : errno;
  for (std::size_t done = 0; error == 0 && done < text.size();) {
    ssize_t count = write(file, text.data() + done, text.size() - done);
    if (count < 0 && errno != EINTR) error = errno;
    if (count > 0) done += static_cast<std::size_t>(count);
  }
  if (error == 0 && fsync(file) != 0) error = errno;
  if (::close(file) != 0 && error == 0) error = errno;
  if (error == 0 && rename(fresh.c_str(), path.c_str()) != 0) error = errno;
  if (error != 0) unlink(fresh.c_str());
  return error;
}

// The key stored at path, or a new one written there when the file is missing; 0 or the errno
// of the failing step (EINVAL when the file holds no key of the expected type).
int LoadOrCreateKey(const std::string& path, const HostKeyFile& file, ssh_key* key) {
  std::string text;
  int error = ReadWholeFile(path, &text);
  if (error == 0) {
    if (ssh_pki_import_privkey_base64(text.c_str(), nullptr, nullptr, nullptr, key) != SSH_OK)
      return EINVAL;
    return ssh_key_type(*key) == file.type ? 0 : EINVAL;
  }
  if (error != ENOENT) return error;
  if (ssh_pki_generate(file.type, file.bits, key) != SSH_OK) return ENOMEM;
  char* exported = nullptr;
  if (ssh_pki_export_privkey_base64(*key, nullptr, nullptr, nullptr, &exported) != SSH_OK)
    return ENOMEM;
  error = WriteKeyFile(path, exported);
  ssh_string_free_char(exported);
  return error;
}

bool Register(int epoll, int operation, int descriptor, std::uint32_t events) {
  epoll_event event{};
  event.events = events;
  event.data.fd = descriptor;
  return epoll_ctl(epoll, operation, descriptor, &event) == 0;
}

// Heap order: the earliest deadline on top.
constexpr auto kEarliestFirst = [](const auto& left, const auto& right) {
  return left.deadline > right.deadline;
};

}  // namespace

struct SshServer::Connection {
  Connection(SshServer* server, std::uint32_t keepAliveSeconds, std::uint64_t serial)
      : server(server), keepAlive(keepAliveSeconds), serial(serial) {}
  SshServer* const server;
  const std::chrono::seconds keepAlive;
  const std::uint64_t serial;
  TcpSessionId id = 0;
  // Loop thread only.
  ssh_session session = nullptr;
  ssh_channel channel = nullptr;
  ssh_server_callbacks_struct serverCallbacks{};
  ssh_channel_callbacks_struct channelCallbacks{};
  bool inEvent = false;
  bool waitingForWindow = false;  // in windowWaiting_
  bool authenticated = false;
  bool shellRequested = false;
  int passwordFailures = 0;
  TcpPeer peer;
  Clock::time_point lastInput;
  // Under the server's lock.
  bool open = false;     // the shell is open and OnAccepted made
  bool retired = false;  // left the map
  bool outputListed = false;  // in pendingOutput_
  bool closeAfterOutput = false;
  std::deque<std::string> output;
  std::size_t frontWritten = 0;  // bytes of output.front() already handed to the channel
  std::size_t queuedBytes = 0;
};

// libssh calls these on the loop thread from inside ssh_event_dopoll.
struct SshServer::Callbacks {
  static int Wake(socket_t descriptor, int, void*) {
    std::uint64_t count;
    if (read(descriptor, &count, sizeof count) < 0 && errno != EAGAIN)
      LOG_ERROR("SSH server: cannot read its wake event (errno %d)", errno);
    return 0;
  }

  // Accepting waits until the poll is over (see Loop).
  static int ListenersReady(socket_t, int, void* data) {
    static_cast<SshServer*>(data)->listenersReady_ = true;
    return 0;
  }

  static int Password(ssh_session, const char* user, const char* password, void* data) {
    auto& connection = *static_cast<Connection*>(data);
    SshServer& server = *connection.server;
    const auto& check = server.options_.authenticate;
    if (!Retired(connection) && check &&
        check(TcpListenerTagOf(connection.id), user ? user : "", password ? password : "")) {
      connection.authenticated = true;
      return SSH_AUTH_SUCCESS;
    }
    if (++connection.passwordFailures >= kMaxPasswordFailures) {
      LOG_TRACE("SSH connection from %s: %d wrong passwords, disconnected",
                connection.peer.address.c_str(), connection.passwordFailures);
      server.RetireConnection(connection);
    }
    return SSH_AUTH_DENIED;
  }

  // One session channel per connection, once authenticated; other channel types are refused by
  // libssh itself.
  static ssh_channel SessionChannel(ssh_session session, void* data) {
    auto& connection = *static_cast<Connection*>(data);
    if (!connection.authenticated || connection.channel != nullptr) return nullptr;
    ssh_channel channel = ssh_channel_new(session);
    if (channel == nullptr) return nullptr;
    ssh_channel_callbacks_struct& callbacks = connection.channelCallbacks;
    callbacks.userdata = &connection;
    callbacks.channel_data_function = Data;
    callbacks.channel_eof_function = End;
    callbacks.channel_close_function = End;
    callbacks.channel_pty_request_function = Pty;
    callbacks.channel_shell_request_function = Shell;
    callbacks.channel_pty_window_change_function = WindowChange;
    callbacks.channel_exec_request_function = Refuse;
    callbacks.channel_subsystem_request_function = Refuse;
    ssh_callbacks_init(&callbacks);
    ssh_set_channel_callbacks(channel, &callbacks);
    connection.channel = channel;
    return channel;
  }

  static int Data(ssh_session, ssh_channel, void* bytes, std::uint32_t length, int, void* data) {
    auto& connection = *static_cast<Connection*>(data);
    connection.lastInput = Clock::now();
    if (!Retired(connection) && connection.shellRequested)
      connection.server->events_->OnBytes(
          connection.id, std::string_view(static_cast<const char*>(bytes), length));
    return static_cast<int>(length);
  }

  // The client's end of file or close ends the session.
  static void End(ssh_session, ssh_channel, void* data) {
    auto& connection = *static_cast<Connection*>(data);
    connection.server->RetireConnection(connection);
  }

  static int Pty(ssh_session, ssh_channel, const char*, int, int, int, int, void* data) {
    static_cast<Connection*>(data)->lastInput = Clock::now();
    return 0;
  }

  static int Shell(ssh_session, ssh_channel, void* data) {
    auto& connection = *static_cast<Connection*>(data);
    if (connection.shellRequested) return 1;
    connection.shellRequested = true;
    return connection.server->OpenShell(connection) ? 0 : 1;
  }

  static int WindowChange(ssh_session, ssh_channel, int, int, int, int, void*) { return 0; }

  static int Refuse(ssh_session, ssh_channel, const char*, void*) { return 1; }

  static bool Retired(const Connection& connection) {
    std::lock_guard<std::mutex> lock(connection.server->mutex_);
    return connection.retired;
  }
};

SshServer::SshServer(TcpSessionEvents* events, SshServerOptions options)
    : events_(events), options_(std::move(options)) {
  listenerEpoll_ = epoll_create1(EPOLL_CLOEXEC);
  wakeEvent_ = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
  event_ = ssh_event_new();
  if (listenerEpoll_ < 0 || wakeEvent_ < 0 || event_ == nullptr ||
      ssh_event_add_fd(event_, wakeEvent_, POLLIN, &Callbacks::Wake, this) != SSH_OK ||
      ssh_event_add_fd(event_, listenerEpoll_, POLLIN, &Callbacks::ListenersReady, this) !=
          SSH_OK) {
    LOG_ERROR("SSH server: cannot create its event descriptors (errno %d)", errno);
    ready_ = false;
  }
}

SshServer::~SshServer() {
  Stop();
  if (event_ != nullptr) {
    ssh_event_remove_fd(event_, wakeEvent_);
    ssh_event_remove_fd(event_, listenerEpoll_);
    ssh_event_free(event_);
  }
  if (bind_ != nullptr) ssh_bind_free(bind_);
  for (int descriptor : {wakeEvent_, listenerEpoll_})
    if (descriptor >= 0) ::close(descriptor);
}

bool SshServer::Listen(std::uint32_t tag, const std::string& address, std::uint16_t port,
                       std::uint32_t keepAliveSeconds, int* error) {
  int ignored = 0;
  int& failure = error ? *error : ignored;
  std::lock_guard<std::mutex> start(startMutex_);
  if (!PrepareHostKeys(&failure)) return false;
  if (!StartLoop()) {
    failure = EAGAIN;
    return false;
  }
  int socket = OpenListeningSocket(address, port, 0, &failure);
  if (socket < 0) return false;
  try {
    std::lock_guard<std::mutex> lock(mutex_);
    listeners_.emplace(socket, Listener{tag, keepAliveSeconds});
    listenersByTag_.emplace(tag, socket);
    if (!Register(listenerEpoll_, EPOLL_CTL_ADD, socket, EPOLLIN)) {
      failure = errno;
      CloseListener(socket);
      return false;
    }
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Error in allocating memory");
    std::lock_guard<std::mutex> lock(mutex_);
    CloseListener(socket);
    failure = ENOMEM;
    return false;
  }
  failure = 0;
  LOG_TRACE("SSH listener %u on %s port %u", tag, address.c_str(), port);
  return true;
}

// The caller holds startMutex_. Loads the host keys into the bind every connection is made
// from, generating them where missing.
bool SshServer::PrepareHostKeys(int* error) {
  if (bind_ != nullptr) return true;
  const std::string& directory = options_.hostKeyDirectory;
  if (directory.empty()) {
    LOG_ERROR("SSH server: no host key directory is set");
    *error = EINVAL;
    return false;
  }
  if (int failure = MakeDirectories(directory); failure != 0) {
    LOG_ERROR("SSH server: cannot create the host key directory %s: %s", directory.c_str(),
              std::strerror(failure));
    *error = failure;
    return false;
  }
  ssh_bind bind = ssh_bind_new();
  if (bind == nullptr) {
    *error = ENOMEM;
    return false;
  }
  bool processConfig = false;
  bool configured = ssh_bind_options_set(bind, SSH_BIND_OPTIONS_PROCESS_CONFIG, &processConfig) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_CIPHERS_C_S, kCiphers) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_CIPHERS_S_C, kCiphers) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_HMAC_C_S, kMacs) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_HMAC_S_C, kMacs) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_KEY_EXCHANGE, kKeyExchanges) == 0 &&
      ssh_bind_options_set(bind, SSH_BIND_OPTIONS_HOSTKEY_ALGORITHMS, kHostKeyAlgorithms) == 0;
  if (!configured) {
    LOG_ERROR("SSH server: the SSH library refuses the algorithms: %s", ssh_get_error(bind));
    ssh_bind_free(bind);
    *error = EINVAL;
    return false;
  }
  for (const HostKeyFile& file : kHostKeyFiles) {
    std::string path = directory + "/" + file.name;
    ssh_key key = nullptr;
    int failure = LoadOrCreateKey(path, file, &key);
    if (failure == 0 && ssh_bind_options_set(bind, SSH_BIND_OPTIONS_IMPORT_KEY, key) != 0)
      failure = EINVAL;
    else if (failure == 0)
      key = nullptr;  // the bind owns it now
    if (key != nullptr) ssh_key_free(key);
    if (failure != 0) {
      LOG_ERROR("SSH server: cannot read or write the host key %s: %s", path.c_str(),
                std::strerror(failure));
      ssh_bind_free(bind);
      *error = failure;
      return false;
    }
  }
  bind_ = bind;
  return true;
}

bool SshServer::StartLoop() {
  if (loop_.joinable()) return true;
  if (!ready_) return false;
  try {
    loop_ = std::thread(&SshServer::Loop, this);
  } catch (const std::system_error&) {
    LOG_ERROR("SSH server: the event loop thread cannot start");
    return false;
  }
  return true;
}

// The caller holds mutex_.
void SshServer::CloseListener(int socket) {
  epoll_ctl(listenerEpoll_, EPOLL_CTL_DEL, socket, nullptr);
  ::close(socket);
  listeners_.erase(socket);
}

void SshServer::CloseListeners(std::uint32_t tag) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto [first, last] = listenersByTag_.equal_range(tag);
  for (auto listener = first; listener != last; ++listener) CloseListener(listener->second);
  listenersByTag_.erase(first, last);
  auto connection = connections_.lower_bound(MakeTcpSessionId(tag, 0));
  while (connection != connections_.end() && TcpListenerTagOf(connection->first) == tag)
    Retire((connection++)->first);
  if (listeners_.empty()) nextClientNumber_ = 1;
}

void SshServer::Stop() {
  std::lock_guard<std::mutex> start(startMutex_);
  if (!loop_.joinable()) return;
  if (loop_.get_id() == std::this_thread::get_id()) {
    LOG_ERROR("SSH server: Stop called from its own event loop is ignored");
    return;
  }
  {
    std::lock_guard<std::mutex> lock(mutex_);
    while (!listeners_.empty()) CloseListener(listeners_.begin()->first);
    listenersByTag_.clear();
    pausedListeners_.clear();
    while (!connections_.empty()) Retire(connections_.begin()->first);
    nextClientNumber_ = 1;
    stopping_ = true;
  }
  Wake();
  loop_.join();
  stopping_ = false;
}

bool SshServer::Send(TcpSessionId id, std::string bytes) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = connections_.find(id);
  if (found == connections_.end() || !found->second->open || found->second->closeAfterOutput)
    return false;
  Connection& connection = *found->second;
  if (bytes.empty()) return true;
  std::size_t room = options_.outputCap - std::min(options_.outputCap, connection.queuedBytes);
  if (bytes.size() > room) {
    LOG_ERROR("SSH session %" PRIu64 " has more than %zu bytes of output waiting: closed", id,
              options_.outputCap);
    Retire(id);
    return false;
  }
  try {
    connection.queuedBytes += bytes.size();
    connection.output.push_back(std::move(bytes));
    ListOutput(connection);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Error in allocating memory");
    Retire(id);
    return false;
  }
  return true;
}

void SshServer::Close(TcpSessionId id, bool afterPendingOutput) {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = connections_.find(id);
  if (found == connections_.end()) return;
  if (afterPendingOutput && found->second->open) {
    // The loop closes it once the channel and the socket have taken everything.
    found->second->closeAfterOutput = true;
    Wake();
  } else {
    Retire(id);
  }
}

std::vector<TcpSessionId> SshServer::SessionsOf(std::uint32_t tag) const {
  std::vector<TcpSessionId> ids;
  std::lock_guard<std::mutex> lock(mutex_);
  for (auto connection = connections_.lower_bound(MakeTcpSessionId(tag, 0));
       connection != connections_.end() && TcpListenerTagOf(connection->first) == tag;
       ++connection)
    if (connection->second->open) ids.push_back(connection->first);
  return ids;
}

std::size_t SshServer::SessionCount() const {
  std::lock_guard<std::mutex> lock(mutex_);
  return openSessions_;
}

// The caller holds mutex_. The connection leaves the map at once (Send fails from now on); the
// loop closes it and, when its shell was open, reports it.
void SshServer::Retire(TcpSessionId id) {
  auto node = connections_.extract(id);
  if (node.empty()) return;
  Connection& connection = *node.mapped();
  connection.retired = true;
  if (connection.open) --openSessions_;
  closing_.push_back(std::move(node.mapped()));
  Wake();
}

void SshServer::RetireConnection(Connection& connection) {
  std::lock_guard<std::mutex> lock(mutex_);
  if (!connection.retired) Retire(connection.id);
}

// The caller holds mutex_. Lists the connection for the loop's next round of writes.
void SshServer::ListOutput(Connection& connection) {
  if (connection.outputListed || connection.output.empty()) return;
  bool first = pendingOutput_.empty();
  pendingOutput_.push_back(connection.id);
  connection.outputListed = true;
  if (first) Wake();
}

void SshServer::Wake() {
  std::uint64_t one = 1;
  // A full counter already wakes the loop.
  if (write(wakeEvent_, &one, sizeof one) < 0 && errno != EAGAIN)
    LOG_ERROR("SSH server: cannot wake its event loop (errno %d)", errno);
}

void SshServer::Loop() {
  while (true) {
    // Errors of poll itself (a signal) only end this round.
    ssh_event_dopoll(event_, MillisecondsToDeadline());
    try {
      // libssh closes the socket of a connection that ends during the poll but keeps it in the
      // event until the session leaves it: finish those first, so that no descriptor number is
      // given out again while the event still watches it under the old session.
      CheckConnections();
      FinishClosing();
      if (listenersReady_) AcceptReady();
      OnTimer();
      WritePendingOutput();
      CheckConnections();
      FinishClosing();
    } catch (const std::bad_alloc&) {
      LOG_ERROR("Error in allocating memory");
    }
    if (stopping_.load()) break;
  }
  FinishClosing();
  timers_.clear();
  windowWaiting_.clear();
  std::lock_guard<std::mutex> lock(mutex_);
  pendingOutput_.clear();
}

int SshServer::MillisecondsToDeadline() const {
  if (timers_.empty()) return -1;
  auto wait = std::chrono::ceil<std::chrono::milliseconds>(timers_.front().deadline - Clock::now());
  return static_cast<int>(std::clamp<std::int64_t>(wait.count(), 0, INT_MAX));
}

void SshServer::AcceptReady() {
  listenersReady_ = false;
  std::array<epoll_event, kMaxListenerEvents> ready;
  int count = epoll_wait(listenerEpoll_, ready.data(), kMaxListenerEvents, 0);
  for (int i = 0; i < count; ++i) AcceptOn(ready[i].data.fd);
}

void SshServer::AcceptOn(int listenerSocket) {
  std::vector<int> accepted;
  Listener listener;
  bool outOfDescriptors = false;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    auto found = listeners_.find(listenerSocket);
    if (found == listeners_.end()) return;  // closed since epoll reported it
    listener = found->second;
    for (int i = 0; i < kAcceptsPerWakeup; ++i) {
      int socket = accept4(listenerSocket, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
      if (socket >= 0) {
        // Key exchange and login are a dialogue of small packets: no waiting for delayed ACKs.
        int on = 1;
        setsockopt(socket, IPPROTO_TCP, TCP_NODELAY, &on, sizeof on);
        accepted.push_back(socket);
        continue;
      }
      int error = errno;
      if (error == EINTR || error == ECONNABORTED) continue;
      if (error == EAGAIN || error == EWOULDBLOCK) break;
      LOG_ERROR("Accept failed due to %d", error);
      if (error == EMFILE || error == ENFILE || error == ENOBUFS || error == ENOMEM) {
        // Level-triggered readiness would report the waiting connection again at once: accept
        // nothing more here until a connection closes or the retry time passes.
        Register(listenerEpoll_, EPOLL_CTL_MOD, listenerSocket, 0);
        pausedListeners_.push_back(listenerSocket);
        outOfDescriptors = true;
      }
      break;
    }
  }
  if (outOfDescriptors) Schedule({Clock::now() + kAcceptRetry, 0, 0});
  for (int socket : accepted) StartConnection(socket, listener);
}

// Hands an accepted socket to libssh and starts the key exchange without waiting for the client.
void SshServer::StartConnection(int socket, const Listener& listener) {
  auto owned = std::make_unique<Connection>(this, listener.keepAliveSeconds, nextSerial_++);
  Connection& connection = *owned;
  sockaddr_storage address{};
  socklen_t length = sizeof address;
  if (getpeername(socket, reinterpret_cast<sockaddr*>(&address), &length) == 0)
    connection.peer = PeerOf(address);
  length = sizeof address;
  if (getsockname(socket, reinterpret_cast<sockaddr*>(&address), &length) == 0)
    connection.peer.localPort = PeerOf(address).port;
  connection.lastInput = Clock::now();
  connection.session = ssh_new();
  if (connection.session == nullptr || ssh_bind_accept_fd(bind_, connection.session, socket) != SSH_OK) {
    LOG_ERROR("SSH server: cannot take the connection from %s: %s",
              connection.peer.address.c_str(), ssh_get_error(bind_));
    if (connection.session == nullptr || ssh_get_fd(connection.session) != socket) ::close(socket);
    if (connection.session != nullptr) ssh_free(connection.session);
    return;
  }
  {
    std::lock_guard<std::mutex> lock(mutex_);
    connection.id = NextSessionId(listener.tag);
    connections_.emplace(connection.id, std::move(owned));
  }
  Schedule({connection.lastInput + options_.loginTimeout, connection.id, connection.serial, true});
  ssh_server_callbacks_struct& callbacks = connection.serverCallbacks;
  callbacks.userdata = &connection;
  callbacks.auth_password_function = Callbacks::Password;
  callbacks.channel_open_request_session_function = Callbacks::SessionChannel;
  ssh_callbacks_init(&callbacks);
  ssh_set_server_callbacks(connection.session, &callbacks);
  ssh_set_blocking(connection.session, 0);
  ssh_set_auth_methods(connection.session, SSH_AUTH_METHOD_PASSWORD);
  // The first call sends the server's banner and returns; the event loop does the rest.
  if (ssh_handle_key_exchange(connection.session) == SSH_ERROR ||
      ssh_event_add_session(event_, connection.session) != SSH_OK) {
    LOG_TRACE("SSH connection from %s: %s", connection.peer.address.c_str(),
              ssh_get_error(connection.session));
    RetireConnection(connection);
    return;
  }
  connection.inEvent = true;
  LOG_TRACE("Accepted SSH connection from %s and %d", connection.peer.address.c_str(),
            connection.peer.port);
}

// The client has a shell: from now on the connection is a session of the events object. False
// when the connection was closed meanwhile.
bool SshServer::OpenShell(Connection& connection) {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    if (connection.retired) return false;
    connection.open = true;
    ++openSessions_;
  }
  connection.lastInput = Clock::now();
  if (connection.keepAlive.count() > 0)
    Schedule({connection.lastInput + connection.keepAlive, connection.id, connection.serial});
  events_->OnAccepted(connection.id, TcpListenerTagOf(connection.id), connection.peer);
  return true;
}

// The caller holds mutex_. Client numbers run on from 1 below the SSH bit and never give an id
// still in use.
TcpSessionId SshServer::NextSessionId(std::uint32_t tag) {
  while (true) {
    std::uint32_t number = nextClientNumber_++;
    if (nextClientNumber_ >= kSshClientBit) nextClientNumber_ = 1;
    TcpSessionId id = MakeTcpSessionId(tag, kSshClientBit | number);
    if (!connections_.contains(id)) return id;
  }
}

// Writes the output queued since the last round, and retries the connections whose channel window
// was full: libssh reports no window adjustment, but one arrives as a packet, which ends a poll.
void SshServer::WritePendingOutput() {
  std::vector<TcpSessionId> listed;
  listed.swap(windowWaiting_);
  {
    std::lock_guard<std::mutex> lock(mutex_);
    listed.insert(listed.end(), pendingOutput_.begin(), pendingOutput_.end());
    pendingOutput_.clear();
  }
  for (TcpSessionId id : listed) {
    Connection* connection;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      auto found = connections_.find(id);
      if (found == connections_.end()) continue;
      // Only this thread frees connections, so the record outlives the lock.
      connection = found->second.get();
      connection->outputListed = false;
    }
    connection->waitingForWindow = false;
    WriteOutput(*connection);
  }
}

// Hands the channel as much queued output as its window takes; the rest waits for the client's
// window adjustment.
void SshServer::WriteOutput(Connection& connection) {
  while (true) {
    std::uint32_t window = ssh_channel_window_size(connection.channel);
    std::string slice;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      if (connection.retired || connection.output.empty()) return;
      if (window == 0) {
        if (!connection.waitingForWindow) windowWaiting_.push_back(connection.id);
        connection.waitingForWindow = true;
        return;
      }
      const std::string& front = connection.output.front();
      std::size_t size = std::min({front.size() - connection.frontWritten,
                                   static_cast<std::size_t>(window), kMaxWriteSlice});
      slice.assign(front, connection.frontWritten, size);
    }
    int written = ssh_channel_write(connection.channel, slice.data(),
                                    static_cast<std::uint32_t>(slice.size()));
    if (written < 0) {
      LOG_ERROR("SSH session %" PRIu64 ": write error: %s", connection.id,
                ssh_get_error(connection.session));
      RetireConnection(connection);
      return;
    }
    std::lock_guard<std::mutex> lock(mutex_);
    auto taken = static_cast<std::size_t>(written);
    connection.queuedBytes -= taken;
    connection.frontWritten += taken;
    if (connection.frontWritten == connection.output.front().size()) {
      connection.output.pop_front();
      connection.frontWritten = 0;
    }
    if (taken < slice.size()) return;
  }
}

// Retires the connections libssh has seen end (the peer's close or disconnect, a protocol or
// socket error) and those closing after their output once it has all left.
void SshServer::CheckConnections() {
  std::lock_guard<std::mutex> lock(mutex_);
  for (auto entry = connections_.begin(); entry != connections_.end();) {
    Connection& connection = *(entry++)->second;
    if (ssh_get_status(connection.session) & (SSH_CLOSED | SSH_CLOSED_ERROR)) {
      Retire(connection.id);
    } else if (connection.closeAfterOutput && connection.output.empty() &&
               !(ssh_get_poll_flags(connection.session) & SSH_WRITE_PENDING)) {
      Retire(connection.id);
    }
  }
}

// Ends the retired connections and reports those whose shell was open; a closed connection may
// give back the descriptor that a paused listener waits for.
void SshServer::FinishClosing() {
  std::vector<std::unique_ptr<Connection>> closed;
  {
    std::lock_guard<std::mutex> lock(mutex_);
    closed.swap(closing_);
  }
  if (closed.empty()) return;
  for (auto& connection : closed) {
    // Out of the event first: what libssh does below then touches this session alone.
    if (connection->inEvent) ssh_event_remove_session(event_, connection->session);
    // An orderly end for a client still there: an exit status (a command-line client exits with
    // it), end of file and close on its channel first.
    if (connection->channel != nullptr && ssh_channel_is_open(connection->channel)) {
      if (connection->shellRequested) ssh_channel_request_send_exit_status(connection->channel, 0);
      ssh_channel_send_eof(connection->channel);
      ssh_channel_close(connection->channel);
    }
    ssh_disconnect(connection->session);
    ssh_free(connection->session);
    TcpSessionId id = connection->id;
    bool wasOpen = connection->open;
    connection.reset();
    if (wasOpen) events_->OnClosed(id);
  }
  ResumeAccepting();
}

void SshServer::ResumeAccepting() {
  std::lock_guard<std::mutex> lock(mutex_);
  for (int socket : pausedListeners_)
    if (listeners_.contains(socket)) Register(listenerEpoll_, EPOLL_CTL_MOD, socket, EPOLLIN);
  pausedListeners_.clear();
}

void SshServer::Schedule(const TimerEntry& entry) {
  timers_.push_back(entry);
  std::push_heap(timers_.begin(), timers_.end(), kEarliestFirst);
}

// Login deadlines drop connections still without a shell. Keep-alive deadlines are checked
// lazily: input only moves a session's lastInput, and an entry that comes due for a session
// heard from since is put back at its new deadline.
void SshServer::OnTimer() {
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
    auto found = connections_.find(due.session);
    if (found == connections_.end() || found->second->serial != due.serial) continue;
    Connection& connection = *found->second;
    if (due.login) {
      if (!connection.open) {
        LOG_TRACE("SSH connection from %s has no shell after %lld ms: closed",
                  connection.peer.address.c_str(),
                  static_cast<long long>(options_.loginTimeout.count()));
        Retire(due.session);
      }
      continue;
    }
    Clock::time_point deadline = connection.lastInput + connection.keepAlive;
    if (deadline > now) {
      timers_.push_back({deadline, due.session, due.serial});
      std::push_heap(timers_.begin(), timers_.end(), kEarliestFirst);
    } else {
      LOG_TRACE("SSH session %" PRIu64 " silent for its keep-alive time: closed", due.session);
      Retire(due.session);
    }
  }
}

}  // namespace tessel
