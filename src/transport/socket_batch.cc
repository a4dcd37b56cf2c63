#include "transport/socket_batch.h"

#include <sys/utsname.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "base/log.h"
#include "transport/udp.h"

#if TESSEL_HAVE_URING
#include <liburing.h>
#endif

namespace tessel {

#if TESSEL_HAVE_URING

struct SocketBatch::Ring {
  io_uring ring{};
  ~Ring() { io_uring_queue_exit(&ring); }
};

namespace {

// Reads that honour MSG_DONTWAIT (never left waiting for data) need a kernel of 6.0 or later.
bool KernelSuffices() {
  utsname system{};
  int major = 0;
  int minor = 0;
  return uname(&system) == 0 && std::sscanf(system.release, "%d.%d", &major, &minor) == 2 &&
         major >= 6;
}

}  // namespace

std::unique_ptr<SocketBatch> SocketBatch::Create() {
  const char* choice = std::getenv("TESSEL_IO");
  if ((choice != nullptr && std::strcmp(choice, "epoll") == 0) || !KernelSuffices()) return nullptr;
  auto ring = std::make_unique<Ring>();
  // Every entry of a batch completes during its submission (MSG_DONTWAIT): twice the batch
  // leaves room without ever filling the completion queue.
  int error = io_uring_queue_init(2 * kSize, &ring->ring, 0);
  if (error < 0) {
    LOG_TRACE("io_uring is not available (%d): sockets are read one by one", -error);
    return nullptr;
  }
  return std::unique_ptr<SocketBatch>(new SocketBatch(std::move(ring)));
}

bool SocketBatch::Complete(std::size_t entries) {
  for (std::size_t k = 0; k < kSize; ++k) results_[k] = -ECANCELED;
  std::size_t submitted = 0;
  for (int tries = 0; submitted < entries && tries < 8; ++tries) {
    int result = io_uring_submit(&ring_->ring);
    if (result > 0) {
      submitted += static_cast<std::size_t>(result);
    } else if (result != -EINTR && result != -EAGAIN && result != -EBUSY) {
      break;
    }
  }
  // Whatever happened, everything submitted is waited for: nothing may still write to the slots.
  std::size_t completed = 0;
  while (completed < submitted) {
    io_uring_cqe* completion = nullptr;
    int result = io_uring_wait_cqe(&ring_->ring, &completion);
    if (result == -EINTR) continue;
    if (result < 0) break;
    results_[static_cast<std::size_t>(completion->user_data)] = completion->res;
    io_uring_cqe_seen(&ring_->ring, completion);
    ++completed;
  }
  if (submitted < entries || completed < submitted) {
    LOG_ERROR("io_uring failed (%zu of %zu entries done): sockets are read one by one from now",
              completed, entries);
    broken_ = true;
  }
  return !broken_;
}

std::size_t SocketBatch::Receive(std::span<const int> sockets) {
  queuedCount_ = 0;
  std::size_t count = std::min(sockets.size(), kSize);
  if (count == 0) return 0;
  for (std::size_t k = 0; k < count; ++k) {
    Slot& slot = slots_[k];
    sockets_[k] = sockets[k];
    slot.data = {slot.request.data(), kBufferSize};
    slot.header = msghdr{};
    slot.header.msg_name = &slot.peer;
    slot.header.msg_namelen = sizeof slot.peer;
    slot.header.msg_iov = &slot.data;
    slot.header.msg_iovlen = 1;
    io_uring_sqe* entry = io_uring_get_sqe(&ring_->ring);
    io_uring_prep_recvmsg(entry, sockets_[k], &slot.header, MSG_DONTWAIT);
    io_uring_sqe_set_data64(entry, k);
  }
  Complete(count);
  std::size_t received = 0;
  for (std::size_t k = 0; k < count; ++k) {
    if (results_[k] == -EINVAL || results_[k] == -EOPNOTSUPP) {
      LOG_ERROR("io_uring cannot read sockets here: sockets are read one by one from now");
      broken_ = true;
    } else if (results_[k] < 0 && results_[k] != -EAGAIN && results_[k] != -ECANCELED) {
      LOG_ERROR("Error while receiving a SNMP messge !!!!");
    }
    if (results_[k] < 0) continue;
    Slot& slot = slots_[k];
    slot.length =
        (slot.header.msg_flags & MSG_TRUNC) ? kBufferSize : static_cast<std::size_t>(results_[k]);
    sources_[received++] = k;
  }
  return received;
}

void SocketBatch::QueueReply(std::size_t i, std::size_t length) {
  std::size_t k = sources_[i];
  Slot& slot = slots_[k];
  slot.data = {slot.reply.data(), length};
  slot.header = msghdr{};
  slot.header.msg_name = &slot.peer;
  slot.header.msg_namelen = SocketAddressLength(slot.peer.ss_family);
  slot.header.msg_iov = &slot.data;
  slot.header.msg_iovlen = 1;
  queued_[queuedCount_++] = k;
}

std::size_t SocketBatch::SendQueued() {
  std::size_t count = queuedCount_;
  queuedCount_ = 0;
  for (std::size_t q = 0; q < count; ++q) {
    std::size_t k = queued_[q];
    io_uring_sqe* entry = io_uring_get_sqe(&ring_->ring);
    io_uring_prep_sendmsg(entry, sockets_[k], &slots_[k].header, MSG_DONTWAIT);
    io_uring_sqe_set_data64(entry, k);
  }
  if (count == 0) return 0;
  Complete(count);
  std::size_t unsent = 0;
  // A reply the batch could not send (a full socket buffer) gets two more tries on its own.
  for (std::size_t q = 0; q < count; ++q) {
    std::size_t k = queued_[q];
    if (results_[k] >= 0) continue;
    bool sent = false;
    for (int attempt = 0; attempt < 2 && !sent; ++attempt)
      sent = sendmsg(sockets_[k], &slots_[k].header, MSG_DONTWAIT) >= 0;
    if (!sent) {
      LOG_ERROR("The error in sending snmp message !!! is %d", errno);
      ++unsent;
    }
  }
  return unsent;
}

#else

struct SocketBatch::Ring {};

std::unique_ptr<SocketBatch> SocketBatch::Create() { return nullptr; }
bool SocketBatch::Complete(std::size_t) { return false; }
std::size_t SocketBatch::Receive(std::span<const int>) { return 0; }
void SocketBatch::QueueReply(std::size_t, std::size_t) {}
std::size_t SocketBatch::SendQueued() { return 0; }

#endif

SocketBatch::SocketBatch(std::unique_ptr<Ring> ring) : ring_(std::move(ring)) {
  for (Slot& slot : slots_) {
    slot.request.resize(kBufferSize);
    slot.reply.resize(kBufferSize);
  }
}

SocketBatch::~SocketBatch() = default;

std::span<const std::uint8_t> SocketBatch::Datagram(std::size_t i) const {
  const Slot& slot = slots_[sources_[i]];
  return {slot.request.data(), slot.length};
}

}  // namespace tessel
