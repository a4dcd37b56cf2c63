// One datagram from each of many sockets read in a single system call, and their replies sent in
// another: the receive path when requests arrive spread over many agents, each socket holding
// one or two (UdpBatch serves the datagrams of one busy socket with recvmmsg/sendmmsg). Built on
// io_uring; where the kernel or the build offers none, Create() answers null and the caller reads
// socket by socket. A batch belongs to one thread.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <vector>

namespace tessel {

class SocketBatch {
 public:
  static constexpr std::size_t kSize = 64;

  // A batch, or null when io_uring cannot be used here (or TESSEL_IO=epoll asks not to).
  static std::unique_ptr<SocketBatch> Create();
  ~SocketBatch();
  SocketBatch(const SocketBatch&) = delete;
  SocketBatch& operator=(const SocketBatch&) = delete;

  // Reads one datagram from each socket (at most kSize sockets), without waiting; the number of
  // datagrams read. Datagram i came from sockets[Source(i)].
  std::size_t Receive(std::span<const int> sockets);
  std::size_t Source(std::size_t i) const { return sources_[i]; }
  std::span<const std::uint8_t> Datagram(std::size_t i) const;
  const sockaddr_storage& Peer(std::size_t i) const { return slots_[sources_[i]].peer; }

  // Where the reply to datagram i is built, and its capacity.
  std::uint8_t* ReplyBuffer(std::size_t i) { return slots_[sources_[i]].reply.data(); }
  std::size_t ReplyCapacity() const { return kBufferSize; }
  // Queues length bytes of ReplyBuffer(i) for datagram i's peer, from the socket it came on.
  void QueueReply(std::size_t i, std::size_t length);

  // Sends the queued replies; the number that could not be sent.
  std::size_t SendQueued();

  // True once io_uring has failed: the batch is then of no further use.
  bool Broken() const { return broken_; }

 private:
  struct Ring;
  struct Slot {
    std::vector<std::uint8_t> request;
    std::vector<std::uint8_t> reply;
    sockaddr_storage peer{};
    iovec data{};
    msghdr header{};
    std::size_t length = 0;
  };
  static constexpr std::size_t kBufferSize = 20000;

  explicit SocketBatch(std::unique_ptr<Ring> ring);
  // Submits what was prepared and waits for every entry submitted; each entry's result lands in
  // results_ (-ECANCELED for one that never ran). False, and Broken(), when not all ran.
  bool Complete(std::size_t entries);

  std::unique_ptr<Ring> ring_;
  std::array<Slot, kSize> slots_;
  std::array<std::size_t, kSize> sources_{};  // the slot, and socket, of each datagram read
  std::array<int, kSize> sockets_{};          // of the slots, while a batch is answered
  std::array<int, kSize> results_{};
  std::array<std::size_t, kSize> queued_{};  // the slots whose reply is queued
  std::size_t queuedCount_ = 0;
  bool broken_ = false;
};

}  // namespace tessel
