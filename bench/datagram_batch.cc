#include "datagram_batch.h"

namespace tessel::bench {

int DatagramBatch::Receive(int fd) {
  returnedCount_ = 0;
  for (int i = 0; i < kSize; ++i) {
    vectors_[i] = {buffers_.data() + static_cast<std::size_t>(i) * kDatagramSize, kDatagramSize};
    headers_[i].msg_hdr = {};
    headers_[i].msg_hdr.msg_name = &peers_[i];
    headers_[i].msg_hdr.msg_namelen = sizeof peers_[i];
    headers_[i].msg_hdr.msg_iov = &vectors_[i];
    headers_[i].msg_hdr.msg_iovlen = 1;
  }
  const int received = recvmmsg(fd, headers_, kSize, MSG_DONTWAIT, nullptr);
  return received < 0 ? 0 : received;
}

void DatagramBatch::Return(int i) {
  vectors_[i].iov_len = headers_[i].msg_len;
  returned_[returnedCount_++].msg_hdr = headers_[i].msg_hdr;
}

int DatagramBatch::SendReturned(int fd) {
  unsigned done = 0;
  while (done < returnedCount_) {
    const int sent = sendmmsg(fd, returned_ + done, returnedCount_ - done, MSG_DONTWAIT);
    if (sent <= 0) break;
    done += static_cast<unsigned>(sent);
  }
  returnedCount_ = 0;
  return static_cast<int>(done);
}

}  // namespace tessel::bench
