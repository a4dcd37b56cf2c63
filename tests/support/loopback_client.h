// A blocking TCP client for service tests on loopback: sends bytes and reads until an expected
// text arrives, every wait bounded by a timeout.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>

namespace tessel {

class LoopbackClient {
 public:
  LoopbackClient(const std::string& address, std::uint16_t port);
  ~LoopbackClient();
  LoopbackClient(const LoopbackClient&) = delete;
  LoopbackClient& operator=(const LoopbackClient&) = delete;

  bool Connected() const { return connected_; }
  // False when not all bytes could be sent.
  bool Send(const std::string& bytes);
  // Ends what this side sends (a half-close); the server may still answer.
  void EndOutput();
  // Everything received up to and including the count-th occurrence of until; what was received
  // so far when it does not come in time.
  std::string ReadUntil(const std::string& until, int count = 1,
                        std::chrono::milliseconds timeout = std::chrono::seconds(3));
  // Whether the server closed the connection within the timeout (input before it is dropped).
  bool WaitClosed(std::chrono::milliseconds timeout);
  // What arrived and was not yet read, after waiting up to timeout for more.
  std::string Drain(std::chrono::milliseconds timeout);

 private:
  bool Fill(std::chrono::steady_clock::time_point deadline);

  int socket_;
  bool connected_ = false;
  bool closed_ = false;
  std::string buffer_;
};

}  // namespace tessel
