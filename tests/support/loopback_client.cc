#include "support/loopback_client.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <utility>

namespace tessel {

LoopbackClient::LoopbackClient(const std::string& address, std::uint16_t port)
    : socket_(::socket(AF_INET, SOCK_STREAM, 0)) {
  sockaddr_in to{};
  to.sin_family = AF_INET;
  to.sin_port = htons(port);
  inet_pton(AF_INET, address.c_str(), &to.sin_addr);
  connected_ = ::connect(socket_, reinterpret_cast<sockaddr*>(&to), sizeof to) == 0;
}

LoopbackClient::~LoopbackClient() { ::close(socket_); }

bool LoopbackClient::Send(const std::string& bytes) {
  return ::send(socket_, bytes.data(), bytes.size(), MSG_NOSIGNAL) ==
         static_cast<ssize_t>(bytes.size());
}

void LoopbackClient::EndOutput() { ::shutdown(socket_, SHUT_WR); }

std::string LoopbackClient::ReadUntil(const std::string& until, int count,
                                      std::chrono::milliseconds timeout) {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  while (true) {
    std::size_t end = 0;
    int found = 0;
    for (std::size_t at = buffer_.find(until); at != std::string::npos;
         at = buffer_.find(until, at + until.size())) {
      end = at + until.size();
      if (++found == count) break;
    }
    if (found == count) {
      std::string head = buffer_.substr(0, end);
      buffer_.erase(0, end);
      return head;
    }
    if (!Fill(deadline)) return std::exchange(buffer_, {});
  }
}

bool LoopbackClient::WaitClosed(std::chrono::milliseconds timeout) {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  while (Fill(deadline)) buffer_.clear();
  return closed_;
}

std::string LoopbackClient::Drain(std::chrono::milliseconds timeout) {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  while (Fill(deadline)) {
  }
  return std::exchange(buffer_, {});
}

bool LoopbackClient::Fill(std::chrono::steady_clock::time_point deadline) {
  auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
      deadline - std::chrono::steady_clock::now());
  pollfd ready{socket_, POLLIN, 0};
  if (left.count() <= 0 || ::poll(&ready, 1, static_cast<int>(left.count())) <= 0) return false;
  char bytes[8192];
  ssize_t read = ::recv(socket_, bytes, sizeof bytes, 0);
  if (read <= 0) {
    closed_ = true;
    return false;
  }
  buffer_.append(bytes, static_cast<std::size_t>(read));
  return true;
}

}  // namespace tessel
