#include "transport/ssh_server.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <libssh/libssh.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <condition_variable>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <set>

namespace tessel {
namespace {

using namespace std::chrono_literals;

// Ports of this suite: per process, so that runs on one machine at the same time do not meet.
const std::uint16_t kBasePort = static_cast<std::uint16_t>(20000 + (::getpid() % 900) * 10);
const std::string kAddress = "127.86.1.1";

// One directory of host keys for the suite: making an RSA key takes a while.
class KeyDirectory {
 public:
  KeyDirectory() {
    char pattern[] = "/tmp/tessel-ssh-test-XXXXXX";
    root_ = mkdtemp(pattern);
  }
  ~KeyDirectory() { std::filesystem::remove_all(root_); }
  std::string Keys() const { return root_ + "/state/keys"; }
  const std::string& Root() const { return root_; }

 private:
  std::string root_;
};
const KeyDirectory& Keys() {
  static KeyDirectory directory;
  return directory;
}

// Records what the server reports; the tests wait on it.
class Events : public TcpSessionEvents {
 public:
  void OnAccepted(TcpSessionId id, std::uint32_t tag, const TcpPeer& peer) override {
    std::lock_guard<std::mutex> lock(mutex_);
    EXPECT_EQ(tag, TcpListenerTagOf(id));
    EXPECT_FALSE(peer.address.empty());
    EXPECT_NE(peer.localPort, 0);
    accepted.push_back(id);
    changed_.notify_all();
  }
  void OnBytes(TcpSessionId id, std::string_view bytes) override {
    std::lock_guard<std::mutex> lock(mutex_);
    EXPECT_FALSE(closed.contains(id)) << "bytes after close";
    input[id].append(bytes);
    changed_.notify_all();
  }
  void OnClosed(TcpSessionId id) override {
    std::lock_guard<std::mutex> lock(mutex_);
    EXPECT_TRUE(closed.insert(id).second) << "closed twice";
    changed_.notify_all();
  }
  bool WaitUntil(const std::function<bool()>& condition, std::chrono::milliseconds timeout = 5s) {
    std::unique_lock<std::mutex> lock(mutex_);
    return changed_.wait_for(lock, timeout, condition);
  }
  TcpSessionId Accepted(std::size_t index) {
    if (!WaitUntil([&] { return accepted.size() > index; })) return 0;
    std::lock_guard<std::mutex> lock(mutex_);
    return accepted[index];
  }

  std::mutex mutex_;
  std::vector<TcpSessionId> accepted;
  std::map<TcpSessionId, std::string> input;
  std::set<TcpSessionId> closed;

 private:
  std::condition_variable changed_;
};

struct Algorithms {
  const char* cipher = nullptr;
  const char* mac = nullptr;
  const char* keyExchange = nullptr;
  const char* hostKey = nullptr;
};

// A client over libssh's client API, blocking, with a timeout on every step.
class Client {
 public:
  explicit Client(unsigned int port, const Algorithms& only = {}) : session_(ssh_new()) {
    int timeout = 5;
    bool processConfig = false;
    ssh_options_set(session_, SSH_OPTIONS_HOST, kAddress.c_str());
    ssh_options_set(session_, SSH_OPTIONS_PORT, &port);
    ssh_options_set(session_, SSH_OPTIONS_USER, "admin");
    ssh_options_set(session_, SSH_OPTIONS_TIMEOUT, &timeout);
    ssh_options_set(session_, SSH_OPTIONS_PROCESS_CONFIG, &processConfig);
    for (auto [option, value] : {std::pair{SSH_OPTIONS_CIPHERS_C_S, only.cipher},
                                 {SSH_OPTIONS_CIPHERS_S_C, only.cipher},
                                 {SSH_OPTIONS_HMAC_C_S, only.mac},
                                 {SSH_OPTIONS_HMAC_S_C, only.mac},
                                 {SSH_OPTIONS_KEY_EXCHANGE, only.keyExchange},
                                 {SSH_OPTIONS_HOSTKEYS, only.hostKey}})
      if (value != nullptr) {
        EXPECT_EQ(ssh_options_set(session_, option, value), SSH_OK);
      }
  }
  ~Client() {
    Disconnect();
    ssh_free(session_);
  }
  void Disconnect() {
    if (channel_ != nullptr) ssh_channel_free(channel_);
    channel_ = nullptr;
    ssh_disconnect(session_);
  }
  bool Connect() { return ssh_connect(session_) == SSH_OK; }
  int Password(const char* password) { return ssh_userauth_password(session_, nullptr, password); }
  bool Login() { return Connect() && Password("secret") == SSH_AUTH_SUCCESS; }
  bool OpenShell() {
    channel_ = ssh_channel_new(session_);
    return ssh_channel_open_session(channel_) == SSH_OK &&
           ssh_channel_request_pty(channel_) == SSH_OK &&
           ssh_channel_request_shell(channel_) == SSH_OK;
  }
  bool Write(std::string_view bytes) {
    return ssh_channel_write(channel_, bytes.data(), static_cast<std::uint32_t>(bytes.size())) ==
           static_cast<int>(bytes.size());
  }
  // What arrives until it holds expected or nothing comes for five seconds; *closed tells whether
  // the channel ended.
  std::string ReadUntil(std::string_view expected, bool* closed = nullptr) {
    std::string bytes;
    std::array<char, 4096> buffer;
    while (bytes.find(expected) == std::string::npos) {
      int count = ssh_channel_read_timeout(channel_, buffer.data(), buffer.size(), 0, 5000);
      if (count <= 0) {
        if (closed) *closed = count < 0 || ssh_channel_is_eof(channel_);
        break;
      }
      bytes.append(buffer.data(), static_cast<std::size_t>(count));
    }
    return bytes;
  }
  bool Closed() {
    bool closed = false;
    ReadUntil("\x01never", &closed);
    return closed;
  }
  ssh_key HostKey() {
    ssh_key key = nullptr;
    EXPECT_EQ(ssh_get_server_publickey(session_, &key), SSH_OK);
    return key;
  }
  ssh_session session() { return session_; }

 private:
  ssh_session session_;
  ssh_channel channel_ = nullptr;
};

// A TCP connection that never says a word.
int SilentConnection(std::uint16_t port) {
  int socket = ::socket(AF_INET, SOCK_STREAM, 0);
  sockaddr_in to{};
  to.sin_family = AF_INET;
  to.sin_port = htons(port);
  inet_pton(AF_INET, kAddress.c_str(), &to.sin_addr);
  EXPECT_EQ(connect(socket, reinterpret_cast<sockaddr*>(&to), sizeof to), 0);
  return socket;
}

// Whether the peer closed within timeoutMs (whatever it sent first is skipped).
bool PeerClosed(int socket, int timeoutMs) {
  std::array<char, 4096> buffer;
  pollfd ready{socket, POLLIN, 0};
  while (poll(&ready, 1, timeoutMs) == 1)
    if (recv(socket, buffer.data(), buffer.size(), 0) <= 0) return true;
  return false;
}

class SshServerTest : public ::testing::Test {
 protected:
  SshServerTest() {
    options_.hostKeyDirectory = Keys().Keys();
    options_.loginTimeout = 2s;
    options_.authenticate = [this](std::uint32_t tag, std::string_view user,
                                   std::string_view password) {
      std::lock_guard<std::mutex> lock(events_.mutex_);
      logins_.push_back(std::to_string(tag) + " " + std::string(user));
      return user == "admin" && password == "secret";
    };
    server_ = std::make_unique<SshServer>(&events_, options_);
  }

  Events events_;
  std::vector<std::string> logins_;
  SshServerOptions options_;
  std::unique_ptr<SshServer> server_;
};

TEST_F(SshServerTest, PasswordsShellsAndBytesBothWays) {
  const std::uint16_t port = kBasePort;
  ASSERT_TRUE(server_->Listen(7, kAddress, port, 0));
  Client first(port);
  ASSERT_TRUE(first.Connect());
  EXPECT_EQ(first.Password("wrong"), SSH_AUTH_DENIED);
  ASSERT_EQ(first.Password("secret"), SSH_AUTH_SUCCESS);
  ASSERT_TRUE(first.OpenShell());
  TcpSessionId one = events_.Accepted(0);
  EXPECT_EQ(TcpListenerTagOf(one), 7u);
  EXPECT_EQ(TcpClientNumberOf(one), 0x80000001u);

  Client second(port);
  ASSERT_TRUE(second.Login());
  ASSERT_TRUE(second.OpenShell());
  TcpSessionId two = events_.Accepted(1);
  EXPECT_EQ(TcpListenerTagOf(two), 7u);
  EXPECT_NE(one, two);
  EXPECT_NE(TcpClientNumberOf(two) & 0x80000000u, 0u);
  EXPECT_EQ(server_->SessionsOf(7), (std::vector<TcpSessionId>{one, two}));

  // A command is refused, and so is a second session channel: neither makes a session.
  Client third(port);
  ASSERT_TRUE(third.Login());
  ssh_channel exec = ssh_channel_new(third.session());
  ASSERT_EQ(ssh_channel_open_session(exec), SSH_OK);
  EXPECT_NE(ssh_channel_request_exec(exec, "show version"), SSH_OK);
  EXPECT_NE(ssh_channel_open_session(ssh_channel_new(third.session())), SSH_OK);
  ssh_channel_free(exec);
  EXPECT_EQ(server_->SessionCount(), 2u);
  {
    std::lock_guard<std::mutex> lock(events_.mutex_);
    EXPECT_EQ(logins_, (std::vector<std::string>{"7 admin", "7 admin", "7 admin", "7 admin"}));
  }

  ASSERT_TRUE(first.Write("show version\r"));
  ASSERT_TRUE(second.Write("exit\r"));
  EXPECT_TRUE(events_.WaitUntil([&] {
    return events_.input[one] == "show version\r" && events_.input[two] == "exit\r";
  }));
  // Output larger than one write of the channel arrives whole and in order.
  std::string large(200 * 1024, 'x');
  large += "R7>";
  std::thread sender([&] { EXPECT_TRUE(server_->Send(one, large)); });
  EXPECT_TRUE(server_->Send(two, "R7#"));
  sender.join();
  std::string received = first.ReadUntil("R7>");
  EXPECT_EQ(received.size(), large.size());
  EXPECT_TRUE(received == large);
  EXPECT_EQ(second.ReadUntil("R7#"), "R7#");

  // The client's close ends its session; Close ends the other after its output.
  first.Disconnect();
  EXPECT_TRUE(events_.WaitUntil([&] { return events_.closed.contains(one); }));
  EXPECT_TRUE(server_->Send(two, "bye"));
  server_->Close(two, true);
  EXPECT_FALSE(server_->Send(two, "more"));
  bool closed = false;
  EXPECT_EQ(second.ReadUntil("never", &closed), "bye");
  EXPECT_TRUE(closed);
  EXPECT_TRUE(events_.WaitUntil([&] { return events_.closed.contains(two); }));
  EXPECT_EQ(server_->SessionCount(), 0u);
}

TEST_F(SshServerTest, ThreeWrongPasswordsDisconnect) {
  const std::uint16_t port = kBasePort + 1;
  ASSERT_TRUE(server_->Listen(3, kAddress, port, 0));
  Client client(port);
  ASSERT_TRUE(client.Connect());
  EXPECT_EQ(client.Password("one"), SSH_AUTH_DENIED);
  EXPECT_EQ(client.Password("two"), SSH_AUTH_DENIED);
  EXPECT_NE(client.Password("three"), SSH_AUTH_SUCCESS);
  EXPECT_EQ(client.Password("secret"), SSH_AUTH_ERROR);
}

TEST_F(SshServerTest, ASilentClientHoldsUpNobodyAndIsDroppedAfterTheLoginTime) {
  const std::uint16_t port = kBasePort + 2;
  ASSERT_TRUE(server_->Listen(4, kAddress, port, 0));
  int silent = SilentConnection(port);
  Client client(port);
  ASSERT_TRUE(client.Login());
  ASSERT_TRUE(client.OpenShell());
  EXPECT_NE(events_.Accepted(0), 0u);
  EXPECT_FALSE(PeerClosed(silent, 0)) << "the login waited for the silent client";
  EXPECT_TRUE(PeerClosed(silent, 5000));
  close(silent);
  EXPECT_EQ(server_->SessionCount(), 1u);
}

TEST_F(SshServerTest, CloseListenersFreesThePortAndEndsItsSessions) {
  const std::uint16_t port = kBasePort + 3;
  ASSERT_TRUE(server_->Listen(5, kAddress, port, 0));
  ASSERT_TRUE(server_->Listen(6, kAddress, port + 1, 0));
  Client mine(port);
  Client other(port + 1);
  ASSERT_TRUE(mine.Login() && mine.OpenShell());
  ASSERT_TRUE(other.Login() && other.OpenShell());
  TcpSessionId first = events_.Accepted(0);
  TcpSessionId second = events_.Accepted(1);
  TcpSessionId closing = TcpListenerTagOf(first) == 5 ? first : second;
  TcpSessionId staying = closing == first ? second : first;
  server_->CloseListeners(5);
  int error = 0;
  EXPECT_TRUE(server_->Listen(5, kAddress, port, 0, &error)) << error;
  EXPECT_TRUE(events_.WaitUntil([&] { return events_.closed.contains(closing); }));
  EXPECT_TRUE(mine.Closed());
  EXPECT_EQ(server_->SessionsOf(5), std::vector<TcpSessionId>{});
  EXPECT_EQ(server_->SessionCount(), 1u);
  EXPECT_TRUE(other.Write("still here"));
  EXPECT_TRUE(events_.WaitUntil([&] { return events_.input[staying] == "still here"; }));
}

TEST_F(SshServerTest, OutputPastTheCapClosesASessionThatStopsReading) {
  const std::uint16_t port = kBasePort + 4;
  ASSERT_TRUE(server_->Listen(8, kAddress, port, 0));
  Client client(port);
  ASSERT_TRUE(client.Login() && client.OpenShell());
  TcpSessionId id = events_.Accepted(0);
  std::string chunk(64 * 1024, 'y');
  int sent = 0;
  while (sent < 200 && server_->Send(id, chunk)) {
    ++sent;
    std::this_thread::sleep_for(1ms);  // let the loop hand what the window takes to the channel
  }
  EXPECT_LT(sent, 200);
  EXPECT_GE(sent, 16);
  EXPECT_TRUE(events_.WaitUntil([&] { return events_.closed.contains(id); }));
}

TEST_F(SshServerTest, OfferedAlgorithms) {
  const std::uint16_t port = kBasePort + 5;
  ASSERT_TRUE(server_->Listen(9, kAddress, port, 0));
  const Algorithms cases[] = {
      {"aes128-ctr", "hmac-sha2-256", "curve25519-sha256", "ssh-ed25519"},
      {"aes256-ctr", "hmac-sha2-512", "ecdh-sha2-nistp256", "rsa-sha2-256"},
      {"aes256-gcm@openssh.com", nullptr, "curve25519-sha256", "rsa-sha2-512"},
      {"chacha20-poly1305@openssh.com", nullptr, nullptr, nullptr},
  };
  for (const Algorithms& only : cases) {
    SCOPED_TRACE(only.cipher);
    Client client(port, only);
    ASSERT_TRUE(client.Login()) << ssh_get_error(client.session());
    EXPECT_STREQ(ssh_get_cipher_out(client.session()), only.cipher);
    if (only.mac) {
      EXPECT_STREQ(ssh_get_hmac_out(client.session()), only.mac);
    }
    if (only.keyExchange) {
      EXPECT_STREQ(ssh_get_kex_algo(client.session()), only.keyExchange);
    }
    ssh_key key = client.HostKey();
    if (only.hostKey) {
      EXPECT_STREQ(ssh_key_type_to_char(ssh_key_type(key)),
                   std::string_view(only.hostKey).starts_with("rsa") ? "ssh-rsa" : "ssh-ed25519");
    }
    ssh_key_free(key);
  }
}

TEST_F(SshServerTest, HostKeysAreMadeOnceAndKeptAcrossRestarts) {
  const std::uint16_t port = kBasePort + 6;
  ASSERT_TRUE(server_->Listen(1, kAddress, port, 0));
  for (const char* name : {"/ssh_host_ed25519_key", "/ssh_host_rsa_key"}) {
    struct stat info {};
    ASSERT_EQ(stat((Keys().Keys() + name).c_str(), &info), 0) << name;
    EXPECT_EQ(info.st_mode & 0777, 0600u) << name;
  }
  std::array<ssh_key, 2> before{}, after{};
  const Algorithms kinds[] = {{nullptr, nullptr, nullptr, "ssh-ed25519"},
                              {nullptr, nullptr, nullptr, "rsa-sha2-256"}};
  for (int i = 0; i < 2; ++i) {
    Client client(port, kinds[i]);
    ASSERT_TRUE(client.Connect());
    before[i] = client.HostKey();
  }
  server_ = std::make_unique<SshServer>(&events_, options_);
  ASSERT_TRUE(server_->Listen(1, kAddress, port, 0));
  for (int i = 0; i < 2; ++i) {
    Client client(port, kinds[i]);
    ASSERT_TRUE(client.Connect());
    after[i] = client.HostKey();
    EXPECT_EQ(ssh_key_cmp(before[i], after[i], SSH_KEY_CMP_PUBLIC), 0) << kinds[i].hostKey;
    ssh_key_free(before[i]);
    ssh_key_free(after[i]);
  }

  // A directory that cannot be made, and a key file that holds no key, fail Listen.
  int error = 0;
  std::string file = Keys().Root() + "/plain";
  std::ofstream(file) << "not a directory";
  SshServer blocked(&events_, {.hostKeyDirectory = file + "/keys"});
  EXPECT_FALSE(blocked.Listen(1, kAddress, port + 1, 0, &error));
  EXPECT_EQ(error, ENOTDIR);
  std::string broken = Keys().Root() + "/broken";
  std::filesystem::create_directory(broken);
  std::ofstream(broken + "/ssh_host_ed25519_key") << "garbage";
  SshServer unreadable(&events_, {.hostKeyDirectory = broken});
  EXPECT_FALSE(unreadable.Listen(1, kAddress, port + 1, 0, &error));
  EXPECT_EQ(error, EINVAL);
}

}  // namespace
}  // namespace tessel
