#include "transport/wildcard_sockets.h"

#include <sys/epoll.h>

#include <mutex>

namespace tessel {
namespace {

struct Wildcards {
  std::mutex mutex;
  int ipv4 = -1;
  int ipv6 = -1;
  int notify = -1;
  std::uint16_t port = 0;  // the SNMP port they serve; 0 when closed
  bool released = false;   // an agent is binding, or has bound, the SNMP port
  WildcardWatch watch;
};

Wildcards& TheWildcards() {
  static Wildcards wildcards;
  return wildcards;
}

int OpenWildcard(const char* address, std::uint16_t port, bool ipv6, bool wantDestination) {
  int error = 0;
  return OpenUdpSocket(address, port, ipv6, UdpBindOptions{true, wantDestination}, &error);
}

void CloseWildcard(const Wildcards& wildcards, int* socket) {
  if (*socket < 0) return;
  if (wildcards.watch.epoll >= 0) epoll_ctl(wildcards.watch.epoll, EPOLL_CTL_DEL, *socket, nullptr);
  CloseUdpSocket(*socket);
  *socket = -1;
}

// Opens the SNMP-port sockets and watches them; the number that could not be opened.
int OpenPortLocked(Wildcards& wildcards) {
  wildcards.ipv4 = OpenWildcard("0.0.0.0", wildcards.port, false, true);
  wildcards.ipv6 = OpenWildcard("::", wildcards.port, true, true);
  int failures = 0;
  for (int socket : {wildcards.ipv4, wildcards.ipv6}) {
    if (socket < 0) {
      ++failures;
      continue;
    }
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = wildcards.watch.tag | static_cast<std::uint64_t>(socket);
    if (wildcards.watch.epoll >= 0) epoll_ctl(wildcards.watch.epoll, EPOLL_CTL_ADD, socket, &event);
  }
  return failures;
}

void ClosePortLocked(Wildcards& wildcards) {
  CloseWildcard(wildcards, &wildcards.ipv4);
  CloseWildcard(wildcards, &wildcards.ipv6);
}

void CloseLocked(Wildcards& wildcards) {
  ClosePortLocked(wildcards);
  CloseWildcard(wildcards, &wildcards.notify);
  wildcards.port = 0;
  wildcards.released = false;
  wildcards.watch = WildcardWatch{};
}

bool IsOpenLocked(const Wildcards& wildcards, int socket) {
  return socket >= 0 && (socket == wildcards.ipv4 || socket == wildcards.ipv6);
}

}  // namespace

int OpenWildcardSockets(std::uint16_t port, std::uint16_t trapPort, WildcardWatch watch) {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  if (port == 0 || wildcards.port == port) return 0;
  CloseLocked(wildcards);
  wildcards.port = port;
  wildcards.watch = watch;
  int failures = OpenPortLocked(wildcards);
  wildcards.notify = OpenWildcard("0.0.0.0", trapPort, false, false);
  return failures + (wildcards.notify < 0 ? 1 : 0);
}

void CloseWildcardSockets() {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  CloseLocked(wildcards);
}

bool ReleaseWildcardPort(std::uint16_t port) {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  if (wildcards.port != port || (wildcards.ipv4 < 0 && wildcards.ipv6 < 0)) return false;
  ClosePortLocked(wildcards);
  wildcards.released = true;
  return true;
}

void RestoreWildcardPort(std::uint16_t port) {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  if (wildcards.port != port || !wildcards.released) return;
  wildcards.released = false;
  OpenPortLocked(wildcards);
}

bool ReadWildcard(int socket, std::uint8_t* buffer, std::size_t capacity, std::size_t* length,
                  TransportDomainInfo* received) {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  return IsOpenLocked(wildcards, socket) &&
         ReadUdpPacket(socket, buffer, capacity, length, received);
}

bool SendViaWildcard(int socket, const TransportDomainInfo& transport, const std::uint8_t* bytes,
                     std::size_t length) {
  Wildcards& wildcards = TheWildcards();
  std::lock_guard<std::mutex> lock(wildcards.mutex);
  return IsOpenLocked(wildcards, socket) && SendUdpPacket(transport, socket, bytes, length, true);
}

}  // namespace tessel
