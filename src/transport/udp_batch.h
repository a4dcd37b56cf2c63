// A batch of datagrams read from one socket with a single recvmmsg and answered with a single
// sendmmsg: the receive path of a busy agent costs two system calls per batch rather than two
// per request. Buffers are allocated once; a batch belongs to one thread.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace tessel {

class UdpBatch {
 public:
  static constexpr std::size_t kSize = 16;

  UdpBatch();
  UdpBatch(const UdpBatch&) = delete;
  UdpBatch& operator=(const UdpBatch&) = delete;

  // Reads what the socket holds, up to kSize datagrams; their count, 0 when none. Forgets the
  // previous batch and its replies. A datagram longer than the buffer keeps the buffer's length.
  std::size_t Receive(int socket);

  std::span<const std::uint8_t> Datagram(std::size_t i) const;
  const sockaddr_storage& Peer(std::size_t i) const { return peers_[i]; }

  // Where the reply to datagram i is built, and its capacity.
  std::uint8_t* ReplyBuffer(std::size_t i) { return replies_[i].data(); }
  std::size_t ReplyCapacity() const { return kBufferSize; }
  // Queues length bytes of ReplyBuffer(i) for datagram i's peer.
  void QueueReply(std::size_t i, std::size_t length);

  // Sends the queued replies from the socket, in order; the count that could not be sent.
  std::size_t SendQueued(int socket);

 private:
  static constexpr std::size_t kBufferSize = 20000;

  std::array<std::vector<std::uint8_t>, kSize> requests_;
  std::array<std::vector<std::uint8_t>, kSize> replies_;
  std::array<sockaddr_storage, kSize> peers_{};
  std::array<iovec, kSize> requestData_{};
  std::array<mmsghdr, kSize> received_{};
  std::array<iovec, kSize> replyData_{};
  std::array<mmsghdr, kSize> outgoing_{};
  std::size_t count_ = 0;
  std::size_t queued_ = 0;
};

}  // namespace tessel
