// The device addresses this engine put on the host's interfaces. Every address added is recorded
// with its prefix length and interface, so that removal takes away exactly those, with the prefix
// they were added with, and never an address that was there before. Thread-safe: host threads may
// call it at any time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "vip/netlink_messages.h"
#include "vip/rtnetlink.h"

namespace tessel {

// A subnet mask as a prefix length: empty gives the host length; a number or (IPv4) a dotted
// contiguous mask gives its length; nothing for anything else.
std::optional<std::uint8_t> PrefixOfMask(const std::string& mask, bool isIPv6);

class VirtualIps {
 public:
  // With a list of interfaces, each carries at most this many of the engine's addresses.
  static constexpr std::size_t kMaxAddressesPerInterface = 8192;

  explicit VirtualIps(std::unique_ptr<AddressKernel> kernel);

  // Adds "ADDRESS" or "ADDRESS/PREFIX" texts (IPv6 where isIPv6[i] is 1) in batches: spread over
  // the interface list when one is set, else on interfaceName, else (empty name) on the selected
  // adapter. One status per address (kVipAdded, kVipAlreadyExists, ...).
  std::vector<std::int32_t> Add(std::span<const std::string> addresses,
                                std::span<const std::int32_t> isIPv6,
                                const std::string& interfaceName);
  // Removes those of the addresses that this engine added, latest first. An address it did not
  // add is left alone and counts as removed, as does one already gone.
  std::vector<std::int32_t> Remove(std::span<const std::string> addresses,
                                   std::span<const std::int32_t> isIPv6);
  // Removes every address this engine added, latest first; the number removed.
  std::size_t RemoveAll();

  // Replaces the interface list; its size.
  std::size_t SetInterfaces(std::vector<std::string> names);
  // The adapter chosen at first need (see AddressKernel::SelectAdapter), remembered after.
  std::optional<NetworkInterface> Adapter();
  // How many addresses the engine holds on the named interface.
  std::size_t HeldOn(const std::string& interfaceName) const;

 private:
  struct Record {
    IpAddress address;  // with the prefix it was added with
    std::uint32_t interfaceIndex = 0;
    std::string interfaceName;
    std::uint64_t order = 0;
  };
  using Records = std::map<IpAddress, Record>;  // by address, whatever the prefix

  std::optional<NetworkInterface> AdapterLocked();
  // The interface the next address goes to, or a failure status.
  std::int32_t ChooseInterface(const std::string& interfaceName,
                               const std::map<std::string, std::size_t>& pending,
                               std::string* chosen);
  // Removes the given records, latest first; one status per record, in the order given.
  std::vector<std::int32_t> RemoveRecords(const std::vector<Records::iterator>& records);

  mutable std::mutex mutex_;
  std::unique_ptr<AddressKernel> kernel_;
  Records records_;
  std::uint64_t nextOrder_ = 0;
  std::vector<std::string> interfaces_;
  std::map<std::string, std::size_t> heldPerInterface_;
  std::optional<NetworkInterface> adapter_;
};

// The engine's one instance, over rtnetlink.
VirtualIps& TheVirtualIps();

}  // namespace tessel
