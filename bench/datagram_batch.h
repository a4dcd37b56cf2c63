// A batch of datagrams read from one UDP socket with recvmmsg, and sent back to where each came
// from with sendmmsg: the buffers and message headers the echo server and the trap sink share.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tessel::bench {

class DatagramBatch {
 public:
  static constexpr int kSize = 64;

  // Reads up to kSize waiting datagrams without blocking; how many (0 when none was waiting).
  int Receive(int fd);
  std::uint8_t* Data(int i) { return static_cast<std::uint8_t*>(vectors_[i].iov_base); }
  std::size_t Length(int i) const { return headers_[i].msg_len; }
  const sockaddr_in& Sender(int i) const { return peers_[i]; }
  // Marks received datagram i (its bytes as they are now) to go back to its sender.
  void Return(int i);
  // Sends every datagram marked since the last Receive; a full send buffer drops the rest, as a
  // busy server would. How many were sent.
  int SendReturned(int fd);

 private:
  static constexpr std::size_t kDatagramSize = 65536;

  mmsghdr headers_[kSize]{};
  mmsghdr returned_[kSize]{};
  unsigned returnedCount_ = 0;
  iovec vectors_[kSize]{};
  sockaddr_in peers_[kSize]{};
  std::vector<std::uint8_t> buffers_ = std::vector<std::uint8_t>(kDatagramSize * kSize);
};

}  // namespace tessel::bench
