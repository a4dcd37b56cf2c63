#include "vip/rtnetlink.h"

// net/if.h before the kernel's headers, which would define its flags a second time.
#include <net/if.h>
// clang-format off
#include <libmnl/libmnl.h>
#include <linux/if_addr.h>
#include <linux/if_arp.h>
#include <linux/if_link.h>
#include <linux/rtnetlink.h>
// clang-format on
#include <sys/time.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace tessel {
namespace {

// An acknowledgment's skb takes about this much of the receive buffer, whatever its size.
constexpr int kAcknowledgmentCharge = 1024;
constexpr int kWantedReceiveBuffer = 4 << 20;
constexpr int kWantedSendBuffer = 1 << 20;
// A kernel that stops answering must not hang the host for ever.
constexpr time_t kReceiveTimeoutSeconds = 10;

// Root may pass the system's limits; others get what the limits allow.
void SetBuffer(int descriptor, int forced, int plain, int bytes) {
  if (setsockopt(descriptor, SOL_SOCKET, forced, &bytes, sizeof bytes) != 0) {
    setsockopt(descriptor, SOL_SOCKET, plain, &bytes, sizeof bytes);
  }
}

// libmnl's attribute loop macro converts from void*, which C++ refuses.
template <typename Visit>
void ForEachAttribute(const nlmsghdr* header, std::size_t offset, Visit visit) {
  const auto* tail = static_cast<const char*>(mnl_nlmsg_get_payload_tail(header));
  for (auto* attribute = static_cast<const nlattr*>(mnl_nlmsg_get_payload_offset(header, offset));
       mnl_attr_ok(attribute, static_cast<int>(tail - reinterpret_cast<const char*>(attribute)));
       attribute = mnl_attr_next(attribute)) {
    visit(attribute);
  }
}

}  // namespace

Rtnetlink::~Rtnetlink() {
  if (socket_ != nullptr) mnl_socket_close(socket_);
}

bool Rtnetlink::Open() {
  if (socket_ != nullptr) return true;
  socket_ = mnl_socket_open(NETLINK_ROUTE);
  if (socket_ == nullptr) return false;
  if (mnl_socket_bind(socket_, 0, MNL_SOCKET_AUTOPID) != 0) {
    mnl_socket_close(socket_);
    socket_ = nullptr;
    return false;
  }
  portId_ = mnl_socket_get_portid(socket_);
  const int descriptor = mnl_socket_get_fd(socket_);
  // Acknowledgments without a copy of the request: a batch's acknowledgments stay small.
  int on = 1;
  mnl_socket_setsockopt(socket_, NETLINK_CAP_ACK, &on, sizeof on);
  SetBuffer(descriptor, SO_RCVBUFFORCE, SO_RCVBUF, kWantedReceiveBuffer);
  SetBuffer(descriptor, SO_SNDBUFFORCE, SO_SNDBUF, kWantedSendBuffer);
  timeval timeout{kReceiveTimeoutSeconds, 0};
  setsockopt(descriptor, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  // A batch whose acknowledgments would overflow the receive buffer would lose some of them.
  int receiveBuffer = 0;
  socklen_t length = sizeof receiveBuffer;
  getsockopt(descriptor, SOL_SOCKET, SO_RCVBUF, &receiveBuffer, &length);
  messagesPerBatch_ = std::clamp<std::size_t>(
      static_cast<std::size_t>(receiveBuffer / kAcknowledgmentCharge) / 2, 16, kMessagesPerBatch);
  return true;
}

std::vector<std::int32_t> Rtnetlink::Apply(AddressOperation operation,
                                           std::span<const AddressRequest> requests) {
  std::vector<std::int32_t> statuses(requests.size(), kVipFailed);
  if (requests.empty() || !Open()) return statuses;
  const std::uint32_t first = sequence_;
  sequence_ += static_cast<std::uint32_t>(requests.size());
  std::size_t done = 0;
  for (const AddressBatch& batch :
       BuildAddressBatches(operation, requests, first, messagesPerBatch_)) {
    std::span<std::int32_t> slice(statuses.data() + done, batch.count);
    done += batch.count;
    if (mnl_socket_sendto(socket_, batch.bytes.data(), batch.bytes.size()) < 0) continue;
    ReadAcknowledgments(operation, batch.firstSequence, batch.count, slice);
  }
  return statuses;
}

void Rtnetlink::ReadAcknowledgments(AddressOperation operation, std::uint32_t firstSequence,
                                    std::size_t count, std::span<std::int32_t> statuses) {
  std::vector<std::uint8_t> buffer(MNL_SOCKET_BUFFER_SIZE * 8);
  std::size_t read = 0;
  while (read < count) {
    ssize_t received = mnl_socket_recvfrom(socket_, buffer.data(), buffer.size());
    if (received < 0) {
      if (errno == EINTR) continue;
      return;  // the unacknowledged stay failed
    }
    int remaining = static_cast<int>(received);
    for (auto* header = reinterpret_cast<const nlmsghdr*>(buffer.data());
         mnl_nlmsg_ok(header, remaining); header = mnl_nlmsg_next(header, &remaining)) {
      if (header->nlmsg_type != NLMSG_ERROR || header->nlmsg_pid != portId_) continue;
      const std::uint32_t position = header->nlmsg_seq - firstSequence;
      if (position >= count) continue;  // late answer to an earlier, abandoned batch
      const auto* error = static_cast<const nlmsgerr*>(mnl_nlmsg_get_payload(header));
      statuses[position] = StatusOfAcknowledgment(operation, -error->error);
      ++read;
    }
  }
}

std::optional<std::uint32_t> Rtnetlink::InterfaceIndex(const std::string& name) {
  if (!IsValidInterfaceName(name)) return std::nullopt;
  const unsigned index = if_nametoindex(name.c_str());
  if (index == 0) return std::nullopt;
  return index;
}

bool Rtnetlink::Dump(std::uint16_t type, std::uint8_t family,
                     const std::function<void(const nlmsghdr*)>& visit) {
  if (!Open()) return false;
  std::vector<std::uint8_t> buffer(MNL_SOCKET_BUFFER_SIZE * 8);
  nlmsghdr* request = mnl_nlmsg_put_header(buffer.data());
  request->nlmsg_type = type;
  request->nlmsg_flags = NLM_F_REQUEST | NLM_F_DUMP;
  const std::uint32_t sequence = sequence_++;
  request->nlmsg_seq = sequence;
  auto* generic = static_cast<rtgenmsg*>(mnl_nlmsg_put_extra_header(request, sizeof(ifinfomsg)));
  generic->rtgen_family = family;
  if (mnl_socket_sendto(socket_, request, request->nlmsg_len) < 0) return false;
  const auto callback = [](const nlmsghdr* header, void* data) -> int {
    (*static_cast<const std::function<void(const nlmsghdr*)>*>(data))(header);
    return MNL_CB_OK;
  };
  for (;;) {
    ssize_t received = mnl_socket_recvfrom(socket_, buffer.data(), buffer.size());
    if (received < 0 && errno == EINTR) continue;
    if (received <= 0) return false;
    const int result =
        mnl_cb_run(buffer.data(), static_cast<std::size_t>(received), sequence, portId_, callback,
                   const_cast<void*>(static_cast<const void*>(&visit)));
    if (result == MNL_CB_STOP) return true;
    if (result == MNL_CB_ERROR) return false;
  }
}

std::optional<NetworkInterface> Rtnetlink::SelectAdapter() {
  std::optional<NetworkInterface> selected;
  const bool dumped = Dump(RTM_GETLINK, AF_UNSPEC, [&](const nlmsghdr* header) {
    const auto* link = static_cast<const ifinfomsg*>(mnl_nlmsg_get_payload(header));
    const unsigned wanted = IFF_UP | IFF_RUNNING;
    if (selected || link->ifi_type != ARPHRD_ETHER || (link->ifi_flags & IFF_LOOPBACK) != 0 ||
        (link->ifi_flags & wanted) != wanted) {
      return;
    }
    ForEachAttribute(header, sizeof(ifinfomsg), [&](const nlattr* attribute) {
      if (mnl_attr_get_type(attribute) == IFLA_IFNAME) {
        selected = NetworkInterface{static_cast<std::uint32_t>(link->ifi_index),
                                    mnl_attr_get_str(attribute)};
      }
    });
  });
  return dumped ? selected : std::nullopt;
}

std::optional<std::vector<IpAddress>> Rtnetlink::Addresses(std::uint32_t interfaceIndex) {
  std::vector<IpAddress> addresses;
  const bool dumped = Dump(RTM_GETADDR, AF_UNSPEC, [&](const nlmsghdr* header) {
    const auto* message = static_cast<const ifaddrmsg*>(mnl_nlmsg_get_payload(header));
    if (message->ifa_index != interfaceIndex) return;
    IpAddress address;
    address.family = message->ifa_family;
    address.prefix = message->ifa_prefixlen;
    // IPv4 names the interface's own address IFA_LOCAL (IFA_ADDRESS is the peer's on
    // point-to-point links); IPv6 gives only IFA_ADDRESS.
    const std::uint16_t wanted = address.family == AF_INET ? IFA_LOCAL : IFA_ADDRESS;
    ForEachAttribute(header, sizeof(ifaddrmsg), [&](const nlattr* attribute) {
      if (mnl_attr_get_type(attribute) == wanted &&
          mnl_attr_get_payload_len(attribute) == address.Length()) {
        std::memcpy(address.bytes.data(), mnl_attr_get_payload(attribute), address.Length());
        addresses.push_back(address);
      }
    });
  });
  if (!dumped) return std::nullopt;
  return addresses;
}

}  // namespace tessel
