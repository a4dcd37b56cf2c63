#include "transport/listening_socket.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/log.h"

namespace tessel {

namespace {

bool ParseAddress(const std::string& address, std::uint16_t port, sockaddr_storage* out,
                  socklen_t* length) {
  std::memset(out, 0, sizeof *out);
  auto* v4 = reinterpret_cast<sockaddr_in*>(out);
  if (address.empty() || inet_pton(AF_INET, address.c_str(), &v4->sin_addr) == 1) {
    v4->sin_family = AF_INET;
    v4->sin_port = htons(port);
    *length = sizeof *v4;
    return true;
  }
  auto* v6 = reinterpret_cast<sockaddr_in6*>(out);
  if (inet_pton(AF_INET6, address.c_str(), &v6->sin6_addr) != 1) return false;
  v6->sin6_family = AF_INET6;
  v6->sin6_port = htons(port);
  *length = sizeof *v6;
  return true;
}

bool EnableOption(int socket, int level, int name) {
  int on = 1;
  if (setsockopt(socket, level, name, &on, sizeof on) == 0) return true;
  LOG_TRACE("The error in setsockopt is %d", errno);
  LOG_ERROR("Server Unable to set the Options:");
  return false;
}

}  // namespace

TcpPeer PeerOf(const sockaddr_storage& address) {
  char text[INET6_ADDRSTRLEN] = {};
  TcpPeer peer;
  if (address.ss_family == AF_INET6) {
    const auto& v6 = reinterpret_cast<const sockaddr_in6&>(address);
    inet_ntop(AF_INET6, &v6.sin6_addr, text, sizeof text);
    peer.port = ntohs(v6.sin6_port);
  } else {
    const auto& v4 = reinterpret_cast<const sockaddr_in&>(address);
    inet_ntop(AF_INET, &v4.sin_addr, text, sizeof text);
    peer.port = ntohs(v4.sin_port);
  }
  peer.address = text;
  return peer;
}

int OpenListeningSocket(const std::string& address, std::uint16_t port, int sendBuffer,
                        int* error) {
  sockaddr_storage local;
  socklen_t length = 0;
  if (!ParseAddress(address, port, &local, &length)) {
    *error = EINVAL;
    LOG_ERROR("Server Cannot Bind:");
    return -1;
  }
  bool ipv6 = local.ss_family == AF_INET6;
  int socket = ::socket(local.ss_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, IPPROTO_TCP);
  if (socket < 0) {
    *error = errno;
    LOG_ERROR("Unable to open socket on port number %d ", port);
    return -1;
  }
  if (!EnableOption(socket, SOL_SOCKET, SO_REUSEADDR) ||
      (ipv6 && !EnableOption(socket, IPPROTO_IPV6, IPV6_V6ONLY)) ||
      (sendBuffer > 0 &&
       setsockopt(socket, SOL_SOCKET, SO_SNDBUF, &sendBuffer, sizeof sendBuffer) != 0)) {
    *error = errno;
    ::close(socket);
    return -1;
  }
  if (bind(socket, reinterpret_cast<sockaddr*>(&local), length) != 0) {
    *error = errno;
    LOG_ERROR("Server Cannot Bind:");
    LOG_ERROR("The bind failed due to errno %d", *error);
    ::close(socket);
    return -1;
  }
  if (listen(socket, SOMAXCONN) != 0) {
    *error = errno;
    LOG_ERROR("Server not able to listen:");
    LOG_ERROR("The listen failed due to errno %d", *error);
    ::close(socket);
    return -1;
  }
  return socket;
}

}  // namespace tessel
