// Address requests as rtnetlink messages, and the kernel's acknowledgments as statuses. Pure:
// builds into caller-owned buffers and never touches a socket, so the batching is testable without
// a kernel.
#pragma once

#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace tessel {

// Statuses of one address operation, as the host reads them.
inline constexpr std::int32_t kVipAdded = 1;
inline constexpr std::int32_t kVipRemoved = 1;
inline constexpr std::int32_t kVipAlreadyExists = -2;
inline constexpr std::int32_t kVipNoSuchInterface = -3;
inline constexpr std::int32_t kVipNoUsableInterface = -5;
inline constexpr std::int32_t kVipInvalidParameter = 87;
inline constexpr std::int32_t kVipFailed = 0;

// One IPv4 or IPv6 address with its prefix length.
struct IpAddress {
  int family = AF_INET;
  std::array<std::uint8_t, 16> bytes{};
  std::uint8_t prefix = 32;

  std::size_t Length() const { return family == AF_INET ? 4 : 16; }
  std::uint8_t HostPrefix() const { return family == AF_INET ? 32 : 128; }
  bool operator<(const IpAddress& other) const {
    return family != other.family ? family < other.family : bytes < other.bytes;
  }
  bool operator==(const IpAddress& other) const = default;
};

// "ADDRESS" or "ADDRESS/PREFIX"; the family must be the one asked for, the prefix defaults to the
// host length. Nothing for anything else.
std::optional<IpAddress> ParseIpAddress(const std::string& text, bool isIPv6);
std::string IpAddressText(const IpAddress& address);

// An address to add to or remove from the interface with the given index.
struct AddressRequest {
  IpAddress address;
  std::uint32_t interfaceIndex = 0;
};

enum class AddressOperation { kAdd, kDelete };

// Messages that fit one send whose acknowledgments fit the receive buffer.
inline constexpr std::size_t kMessagesPerBatch = 1000;
// Room for one address message (header, ifaddrmsg, two addresses, flags), rounded up.
inline constexpr std::size_t kMaxAddressMessage = 128;

// Appends one RTM_NEWADDR or RTM_DELADDR with NLM_F_REQUEST | NLM_F_ACK (and NLM_F_CREATE |
// NLM_F_EXCL for additions; IPv6 additions carry IFA_F_NODAD) at buffer[used]; returns the new used
// size. The buffer must have kMaxAddressMessage bytes free.
std::size_t PutAddressMessage(std::uint8_t* buffer, std::size_t used, AddressOperation operation,
                              const AddressRequest& request, std::uint32_t sequence);

// The requests split into batches of at most perBatch messages, message k of the whole
// call numbered firstSequence + k.
struct AddressBatch {
  std::vector<std::uint8_t> bytes;
  std::uint32_t firstSequence = 0;
  std::size_t count = 0;
};
std::vector<AddressBatch> BuildAddressBatches(AddressOperation operation,
                                              std::span<const AddressRequest> requests,
                                              std::uint32_t firstSequence,
                                              std::size_t perBatch = kMessagesPerBatch);

// The status of an operation the kernel acknowledged with the given error (0 or a positive errno).
// An address already gone counts as removed.
std::int32_t StatusOfAcknowledgment(AddressOperation operation, int error);

// Interface names the kernel would take: 1 to 15 characters, no '/', ':' or whitespace, not "." or
// "..".
bool IsValidInterfaceName(const std::string& name);

}  // namespace tessel
