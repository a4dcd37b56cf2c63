#include "transport/udp_batch.h"

#include <cerrno>

#include "base/log.h"
#include "transport/udp.h"

namespace tessel {

UdpBatch::UdpBatch() {
  for (std::size_t i = 0; i < kSize; ++i) {
    requests_[i].resize(kBufferSize);
    replies_[i].resize(kBufferSize);
  }
}

std::size_t UdpBatch::Receive(int socket) {
  count_ = 0;
  queued_ = 0;
  for (std::size_t i = 0; i < kSize; ++i) {
    requestData_[i] = {requests_[i].data(), kBufferSize};
    msghdr& header = received_[i].msg_hdr;
    header = msghdr{};
    header.msg_name = &peers_[i];
    header.msg_namelen = sizeof peers_[i];
    header.msg_iov = &requestData_[i];
    header.msg_iovlen = 1;
  }
  int received = recvmmsg(socket, received_.data(), kSize, MSG_DONTWAIT, nullptr);
  if (received < 0) {
    if (errno != EAGAIN && errno != EWOULDBLOCK && errno != EINTR)
      LOG_ERROR("Error while receiving a SNMP messge !!!!");
    return 0;
  }
  count_ = static_cast<std::size_t>(received);
  for (std::size_t i = 0; i < count_; ++i) {
    if (received_[i].msg_hdr.msg_flags & MSG_TRUNC) received_[i].msg_len = kBufferSize;
  }
  return count_;
}

std::span<const std::uint8_t> UdpBatch::Datagram(std::size_t i) const {
  return {requests_[i].data(), received_[i].msg_len};
}

void UdpBatch::QueueReply(std::size_t i, std::size_t length) {
  replyData_[queued_] = {replies_[i].data(), length};
  msghdr& header = outgoing_[queued_].msg_hdr;
  header = msghdr{};
  header.msg_name = &peers_[i];
  header.msg_namelen = SocketAddressLength(peers_[i].ss_family);
  header.msg_iov = &replyData_[queued_];
  header.msg_iovlen = 1;
  ++queued_;
}

std::size_t UdpBatch::SendQueued(int socket) {
  std::size_t sent = 0;
  std::size_t unsent = 0;
  int attempts = 0;
  // A reply the socket refuses is tried three times, then skipped; the rest still go.
  while (sent < queued_) {
    int result = sendmmsg(socket, outgoing_.data() + sent, static_cast<unsigned>(queued_ - sent),
                          MSG_DONTWAIT);
    if (result > 0) {
      sent += static_cast<std::size_t>(result);
      attempts = 0;
      continue;
    }
    LOG_ERROR("The error in sending snmp message !!! is %d", errno);
    if (++attempts == 3) {
      ++sent;
      ++unsent;
      attempts = 0;
    }
  }
  queued_ = 0;
  return unsent;
}

}  // namespace tessel
