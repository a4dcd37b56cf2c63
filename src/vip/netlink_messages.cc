#include "vip/netlink_messages.h"

#include <arpa/inet.h>
#include <libmnl/libmnl.h>
#include <linux/if_addr.h>
#include <linux/rtnetlink.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <charconv>

namespace tessel {

std::optional<IpAddress> ParseIpAddress(const std::string& text, bool isIPv6) {
  IpAddress address;
  address.family = isIPv6 ? AF_INET6 : AF_INET;
  std::size_t slash = text.find('/');
  std::string host = text.substr(0, slash);
  if (inet_pton(address.family, host.c_str(), address.bytes.data()) != 1) return std::nullopt;
  address.prefix = address.HostPrefix();
  if (slash == std::string::npos) return address;
  const char* first = text.data() + slash + 1;
  const char* last = text.data() + text.size();
  unsigned prefix = 0;
  auto [end, error] = std::from_chars(first, last, prefix);
  if (first == last || error != std::errc{} || end != last || prefix == 0 ||
      prefix > address.HostPrefix()) {
    return std::nullopt;
  }
  address.prefix = static_cast<std::uint8_t>(prefix);
  return address;
}

std::string IpAddressText(const IpAddress& address) {
  char text[INET6_ADDRSTRLEN] = {};
  inet_ntop(address.family, address.bytes.data(), text, sizeof text);
  return text;
}

std::size_t PutAddressMessage(std::uint8_t* buffer, std::size_t used, AddressOperation operation,
                              const AddressRequest& request, std::uint32_t sequence) {
  nlmsghdr* header = mnl_nlmsg_put_header(buffer + used);
  const bool add = operation == AddressOperation::kAdd;
  header->nlmsg_type = add ? RTM_NEWADDR : RTM_DELADDR;
  header->nlmsg_flags = NLM_F_REQUEST | NLM_F_ACK;
  if (add) header->nlmsg_flags |= NLM_F_CREATE | NLM_F_EXCL;
  header->nlmsg_seq = sequence;
  auto* message = static_cast<ifaddrmsg*>(mnl_nlmsg_put_extra_header(header, sizeof(ifaddrmsg)));
  const IpAddress& address = request.address;
  message->ifa_family = static_cast<std::uint8_t>(address.family);
  message->ifa_prefixlen = address.prefix;
  message->ifa_scope = RT_SCOPE_UNIVERSE;
  message->ifa_index = request.interfaceIndex;
  const auto length = static_cast<std::size_t>(address.Length());
  mnl_attr_put(header, IFA_LOCAL, length, address.bytes.data());
  mnl_attr_put(header, IFA_ADDRESS, length, address.bytes.data());
  // Agents bind as soon as the call returns: no duplicate address detection to wait for.
  if (add && address.family == AF_INET6) mnl_attr_put_u32(header, IFA_FLAGS, IFA_F_NODAD);
  return used + header->nlmsg_len;
}

std::vector<AddressBatch> BuildAddressBatches(AddressOperation operation,
                                              std::span<const AddressRequest> requests,
                                              std::uint32_t firstSequence, std::size_t perBatch) {
  std::vector<AddressBatch> batches;
  perBatch = std::max<std::size_t>(perBatch, 1);
  for (std::size_t start = 0; start < requests.size(); start += perBatch) {
    AddressBatch& batch = batches.emplace_back();
    batch.count = std::min(perBatch, requests.size() - start);
    batch.firstSequence = firstSequence + static_cast<std::uint32_t>(start);
    batch.bytes.resize(batch.count * kMaxAddressMessage);
    std::size_t used = 0;
    for (std::size_t k = 0; k < batch.count; ++k) {
      used = PutAddressMessage(batch.bytes.data(), used, operation, requests[start + k],
                               batch.firstSequence + static_cast<std::uint32_t>(k));
    }
    batch.bytes.resize(used);
  }
  return batches;
}

std::int32_t StatusOfAcknowledgment(AddressOperation operation, int error) {
  if (error == 0) return operation == AddressOperation::kAdd ? kVipAdded : kVipRemoved;
  if (operation == AddressOperation::kDelete && error == EADDRNOTAVAIL) return kVipRemoved;
  switch (error) {
    case EEXIST:
      return kVipAlreadyExists;
    case ENODEV:
      return kVipNoSuchInterface;
    case EINVAL:
      return kVipInvalidParameter;
    default:
      return kVipFailed;
  }
}

bool IsValidInterfaceName(const std::string& name) {
  if (name.empty() || name.size() > 15 || name == "." || name == "..") return false;
  return std::none_of(name.begin(), name.end(), [](char c) {
    return c == '/' || c == ':' || c == '\0' || std::isspace(static_cast<unsigned char>(c));
  });
}

}  // namespace tessel
