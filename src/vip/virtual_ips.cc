#include "vip/virtual_ips.h"

#include <arpa/inet.h>

#include <algorithm>
#include <bit>
#include <charconv>
#include <set>

namespace tessel {
namespace {

bool FlagAt(std::span<const std::int32_t> flags, std::size_t index, const std::string& text) {
  if (index < flags.size()) return flags[index] == 1;
  return text.find(':') != std::string::npos;
}

std::optional<std::uint8_t> DottedMaskPrefix(const std::string& mask) {
  in_addr parsed{};
  if (inet_pton(AF_INET, mask.c_str(), &parsed) != 1) return std::nullopt;
  const std::uint32_t bits = ntohl(parsed.s_addr);
  const std::uint32_t inverted = ~bits;
  // Contiguous: the host part is a run of ones from the right.
  if ((inverted & (inverted + 1)) != 0 || bits == 0) return std::nullopt;
  return static_cast<std::uint8_t>(std::popcount(bits));
}

}  // namespace

std::optional<std::uint8_t> PrefixOfMask(const std::string& mask, bool isIPv6) {
  const unsigned hostPrefix = isIPv6 ? 128 : 32;
  if (mask.empty()) return static_cast<std::uint8_t>(hostPrefix);
  unsigned prefix = 0;
  auto [end, error] = std::from_chars(mask.data(), mask.data() + mask.size(), prefix);
  if (error == std::errc{} && end == mask.data() + mask.size()) {
    if (prefix == 0 || prefix > hostPrefix) return std::nullopt;
    return static_cast<std::uint8_t>(prefix);
  }
  return isIPv6 ? std::nullopt : DottedMaskPrefix(mask);
}

VirtualIps::VirtualIps(std::unique_ptr<AddressKernel> kernel) : kernel_(std::move(kernel)) {}

std::size_t VirtualIps::SetInterfaces(std::vector<std::string> names) {
  std::lock_guard<std::mutex> lock(mutex_);
  interfaces_ = std::move(names);
  return interfaces_.size();
}

std::optional<NetworkInterface> VirtualIps::Adapter() {
  std::lock_guard<std::mutex> lock(mutex_);
  return AdapterLocked();
}

std::optional<NetworkInterface> VirtualIps::AdapterLocked() {
  if (!adapter_) adapter_ = kernel_->SelectAdapter();
  return adapter_;
}

std::size_t VirtualIps::HeldOn(const std::string& interfaceName) const {
  std::lock_guard<std::mutex> lock(mutex_);
  auto found = heldPerInterface_.find(interfaceName);
  return found == heldPerInterface_.end() ? 0 : found->second;
}

std::int32_t VirtualIps::ChooseInterface(const std::string& interfaceName,
                                         const std::map<std::string, std::size_t>& pending,
                                         std::string* chosen) {
  if (!interfaces_.empty()) {
    for (const std::string& name : interfaces_) {
      const auto held = heldPerInterface_.find(name);
      const auto waiting = pending.find(name);
      const std::size_t count = (held == heldPerInterface_.end() ? 0 : held->second) +
                                (waiting == pending.end() ? 0 : waiting->second);
      if (count < kMaxAddressesPerInterface) {
        *chosen = name;
        return kVipAdded;
      }
    }
    return kVipNoUsableInterface;
  }
  if (!interfaceName.empty()) {
    *chosen = interfaceName;
    return kVipAdded;
  }
  std::optional<NetworkInterface> adapter = AdapterLocked();
  if (!adapter) return kVipNoUsableInterface;
  *chosen = adapter->name;
  return kVipAdded;
}

std::vector<std::int32_t> VirtualIps::Add(std::span<const std::string> addresses,
                                          std::span<const std::int32_t> isIPv6,
                                          const std::string& interfaceName) {
  std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::int32_t> statuses(addresses.size(), kVipFailed);
  std::vector<AddressRequest> requests;
  std::vector<std::size_t> positions;
  std::vector<std::string> names;
  std::map<std::string, std::size_t> pending;
  std::map<std::string, std::optional<std::uint32_t>> indexes;
  for (std::size_t i = 0; i < addresses.size(); ++i) {
    std::optional<IpAddress> address =
        ParseIpAddress(addresses[i], FlagAt(isIPv6, i, addresses[i]));
    std::string name;
    std::int32_t status =
        address ? ChooseInterface(interfaceName, pending, &name) : kVipInvalidParameter;
    if (status == kVipAdded && !IsValidInterfaceName(name)) status = kVipInvalidParameter;
    if (status == kVipAdded) {
      auto [cached, fresh] = indexes.try_emplace(name);
      if (fresh) cached->second = kernel_->InterfaceIndex(name);
      if (!cached->second) status = kVipNoSuchInterface;
      if (status == kVipAdded) requests.push_back({*address, *cached->second});
    }
    if (status != kVipAdded) {
      statuses[i] = status;
      continue;
    }
    positions.push_back(i);
    names.push_back(name);
    ++pending[name];
  }
  const std::vector<std::int32_t> results = kernel_->Apply(AddressOperation::kAdd, requests);
  for (std::size_t k = 0; k < requests.size(); ++k) {
    statuses[positions[k]] = results[k];
    if (results[k] != kVipAdded) continue;
    const Record record{requests[k].address, requests[k].interfaceIndex, names[k], nextOrder_++};
    if (records_.emplace(record.address, record).second) ++heldPerInterface_[names[k]];
  }
  return statuses;
}

std::vector<std::int32_t> VirtualIps::RemoveRecords(const std::vector<Records::iterator>& records) {
  std::vector<std::size_t> latestFirst(records.size());
  for (std::size_t k = 0; k < records.size(); ++k) latestFirst[k] = k;
  // A shorter prefix makes later addresses secondaries of the first: removing the first would take
  // them all, so the latest go first.
  std::sort(latestFirst.begin(), latestFirst.end(), [&](std::size_t a, std::size_t b) {
    return records[a]->second.order > records[b]->second.order;
  });
  std::vector<AddressRequest> requests;
  for (std::size_t k : latestFirst) {
    requests.push_back({records[k]->second.address, records[k]->second.interfaceIndex});
  }
  const std::vector<std::int32_t> results = kernel_->Apply(AddressOperation::kDelete, requests);
  std::vector<std::int32_t> statuses(records.size(), kVipFailed);
  for (std::size_t j = 0; j < latestFirst.size(); ++j) {
    statuses[latestFirst[j]] = results[j];
  }
  for (std::size_t k = 0; k < records.size(); ++k) {
    if (statuses[k] != kVipRemoved) continue;
    --heldPerInterface_[records[k]->second.interfaceName];
    records_.erase(records[k]);
  }
  return statuses;
}

std::vector<std::int32_t> VirtualIps::Remove(std::span<const std::string> addresses,
                                             std::span<const std::int32_t> isIPv6) {
  std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::int32_t> statuses(addresses.size(), kVipRemoved);
  std::vector<Records::iterator> ours;
  std::vector<std::size_t> positions;
  std::set<IpAddress> seen;
  for (std::size_t i = 0; i < addresses.size(); ++i) {
    std::optional<IpAddress> address =
        ParseIpAddress(addresses[i], FlagAt(isIPv6, i, addresses[i]));
    if (!address) {
      statuses[i] = kVipInvalidParameter;
      continue;
    }
    auto found = records_.find(*address);
    if (found == records_.end() || !seen.insert(*address).second) continue;
    ours.push_back(found);
    positions.push_back(i);
  }
  const std::vector<std::int32_t> results = RemoveRecords(ours);
  for (std::size_t k = 0; k < positions.size(); ++k) statuses[positions[k]] = results[k];
  return statuses;
}

std::size_t VirtualIps::RemoveAll() {
  std::lock_guard<std::mutex> lock(mutex_);
  std::vector<Records::iterator> all;
  for (auto it = records_.begin(); it != records_.end(); ++it) all.push_back(it);
  const std::vector<std::int32_t> statuses = RemoveRecords(all);
  return static_cast<std::size_t>(std::count(statuses.begin(), statuses.end(), kVipRemoved));
}

VirtualIps& TheVirtualIps() {
  static VirtualIps instance(std::make_unique<Rtnetlink>());
  return instance;
}

}  // namespace tessel
