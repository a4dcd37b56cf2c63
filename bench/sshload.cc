// SSH logins against the engine's SSH server, in one process: a number of clients (libssh, one
// thread each) start together, connect over loopback, authenticate with a password and open a
// shell; the time from each TCP connect to its first prompt is reported (p50, p99, max). Then the
// memory of many idle listeners: the heap the server holds per listener.
//   tessel_sshload [--clients 100] [--listeners 2000] [--address 127.87.0.1] [--port 12200]
#include <libssh/libssh.h>
#include <malloc.h>
#include <sys/resource.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <latch>
#include <string>
#include <thread>
#include <vector>

#include "latency_histogram.h"
#include "transport/ssh_server.h"

namespace {

using Clock = std::chrono::steady_clock;

// Answers every shell with a prompt.
class PromptEvents : public tessel::TcpSessionEvents {
 public:
  explicit PromptEvents(tessel::StreamServer** server) : server_(server) {}
  void OnAccepted(tessel::TcpSessionId id, std::uint32_t, const tessel::TcpPeer&) override {
    (*server_)->Send(id, "R1>");
  }
  void OnBytes(tessel::TcpSessionId, std::string_view) override {}
  void OnClosed(tessel::TcpSessionId) override {}

 private:
  tessel::StreamServer** server_;
};

// Connect, password, pty, shell, prompt: the nanoseconds from connect to prompt, or 0 on failure.
std::uint64_t LogIn(const std::string& address, unsigned int port) {
  ssh_session session = ssh_new();
  int timeout = 10;
  bool processConfig = false;
  int noDelay = 1;  // as interactive clients do
  ssh_options_set(session, SSH_OPTIONS_NODELAY, &noDelay);
  ssh_options_set(session, SSH_OPTIONS_HOST, address.c_str());
  ssh_options_set(session, SSH_OPTIONS_PORT, &port);
  ssh_options_set(session, SSH_OPTIONS_USER, "admin");
  ssh_options_set(session, SSH_OPTIONS_TIMEOUT, &timeout);
  ssh_options_set(session, SSH_OPTIONS_PROCESS_CONFIG, &processConfig);
  Clock::time_point start = Clock::now();
  std::uint64_t elapsed = 0;
  ssh_channel channel = nullptr;
  char prompt[8] = {};
  if (ssh_connect(session) == SSH_OK &&
      ssh_userauth_password(session, nullptr, "admin") == SSH_AUTH_SUCCESS &&
      (channel = ssh_channel_new(session)) != nullptr &&
      ssh_channel_open_session(channel) == SSH_OK && ssh_channel_request_pty(channel) == SSH_OK &&
      ssh_channel_request_shell(channel) == SSH_OK &&
      ssh_channel_read_timeout(channel, prompt, 3, 0, 10000) == 3) {
    elapsed = static_cast<std::uint64_t>(
        std::chrono::duration_cast<std::chrono::nanoseconds>(Clock::now() - start).count());
  } else {
    std::fprintf(stderr, "login failed: %s\n", ssh_get_error(session));
  }
  if (channel != nullptr) ssh_channel_free(channel);
  ssh_disconnect(session);
  ssh_free(session);
  return elapsed;
}

long ResidentKiB() {
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  return usage.ru_maxrss;
}

}  // namespace

int main(int argc, char** argv) {
  int clients = 100;
  int listeners = 2000;
  std::string address = "127.87.0.1";
  int port = 12200;
  for (int i = 1; i + 1 < argc; i += 2) {
    std::string name = argv[i];
    if (name == "--clients") clients = std::atoi(argv[i + 1]);
    else if (name == "--listeners") listeners = std::atoi(argv[i + 1]);
    else if (name == "--address") address = argv[i + 1];
    else if (name == "--port") port = std::atoi(argv[i + 1]);
  }
  std::string keys = std::filesystem::temp_directory_path() / "tessel-sshload-keys";
  tessel::StreamServer* serverPointer = nullptr;
  PromptEvents events(&serverPointer);
  tessel::SshServer server(&events, {.hostKeyDirectory = keys,
                                     .authenticate = [](std::uint32_t, std::string_view,
                                                        std::string_view) { return true; }});
  serverPointer = &server;
  int error = 0;
  if (!server.Listen(1, address, static_cast<std::uint16_t>(port), 0, &error)) {
    std::fprintf(stderr, "cannot listen: %s\n", std::strerror(error));
    return 1;
  }

  // Logins: all clients start together.
  std::vector<std::uint64_t> times(static_cast<std::size_t>(clients));
  std::latch go(1);
  std::vector<std::thread> threads;
  for (int i = 0; i < clients; ++i)
    threads.emplace_back([&, i] {
      go.wait();
      times[static_cast<std::size_t>(i)] = LogIn(address, static_cast<unsigned int>(port));
    });
  Clock::time_point start = Clock::now();
  go.count_down();
  for (auto& thread : threads) thread.join();
  double wall = std::chrono::duration<double>(Clock::now() - start).count();
  tessel::bench::Histogram histogram;
  int failed = 0;
  for (std::uint64_t time : times) time == 0 ? ++failed : (histogram.Record(time), 0);
  std::printf("logins: %d parallel, %d failed, %.2f s in all; connect to prompt p50 %.1f ms, "
              "p99 %.1f ms, max %.1f ms\n",
              clients, failed, wall, histogram.Percentile(0.5) / 1e6,
              histogram.Percentile(0.99) / 1e6, histogram.Maximum() / 1e6);

  // Idle listeners: the heap they take (the kernel's socket memory is not the engine's).
  server.CloseListeners(1);
  std::size_t heapBefore = mallinfo2().uordblks;
  long residentBefore = ResidentKiB();
  int opened = 0;
  for (int i = 0; i < listeners; ++i) {
    std::string each = "127.87." + std::to_string(1 + i / 250) + "." + std::to_string(1 + i % 250);
    opened += server.Listen(static_cast<std::uint32_t>(i + 2), each,
                            static_cast<std::uint16_t>(port), 0) ? 1 : 0;
  }
  std::size_t heapAfter = mallinfo2().uordblks;
  std::printf("listeners: %d open; heap %.0f bytes per listener; peak resident +%ld KiB\n",
              opened, opened ? static_cast<double>(heapAfter - heapBefore) / opened : 0.0,
              ResidentKiB() - residentBefore);
  server.Stop();
  return failed == 0 ? 0 : 1;
}
