// The kernel side of device addresses: adds and removes addresses in batches over one rtnetlink
// socket, reading every acknowledgment, and finds interfaces. AddressKernel is the seam the
// address manager is written against, so that it can be tested without a kernel.
// Not thread-safe: the owner serialises calls.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "vip/netlink_messages.h"

struct mnl_socket;
struct nlmsghdr;

namespace tessel {

struct NetworkInterface {
  std::uint32_t index = 0;
  std::string name;
};

class AddressKernel {
 public:
  virtual ~AddressKernel() = default;
  // One status per request, in order (see StatusOfAcknowledgment).
  virtual std::vector<std::int32_t> Apply(AddressOperation operation,
                                          std::span<const AddressRequest> requests) = 0;
  // The index of the interface with that name in the caller's network namespace.
  virtual std::optional<std::uint32_t> InterfaceIndex(const std::string& name) = 0;
  // The first interface that is up and running, not loopback, and of Ethernet type (Wi-Fi
  // adapters are Ethernet-typed on Linux).
  virtual std::optional<NetworkInterface> SelectAdapter() = 0;
};

class Rtnetlink final : public AddressKernel {
 public:
  Rtnetlink() = default;
  ~Rtnetlink() override;
  Rtnetlink(const Rtnetlink&) = delete;
  Rtnetlink& operator=(const Rtnetlink&) = delete;

  std::vector<std::int32_t> Apply(AddressOperation operation,
                                  std::span<const AddressRequest> requests) override;
  std::optional<std::uint32_t> InterfaceIndex(const std::string& name) override;
  std::optional<NetworkInterface> SelectAdapter() override;
  // The addresses on an interface (prefix included); nothing when the dump fails.
  std::optional<std::vector<IpAddress>> Addresses(std::uint32_t interfaceIndex);

 private:
  // The socket opens at first use, in the namespace of the thread that uses it first.
  bool Open();
  // Reads the acknowledgments of one sent batch into statuses[first...first + count).
  void ReadAcknowledgments(AddressOperation operation, std::uint32_t firstSequence,
                           std::size_t count, std::span<std::int32_t> statuses);
  // Runs a dump request, calling visit for each message; false when it fails.
  bool Dump(std::uint16_t type, std::uint8_t family,
            const std::function<void(const nlmsghdr*)>& visit);

  mnl_socket* socket_ = nullptr;
  std::uint32_t portId_ = 0;
  std::uint32_t sequence_ = 1;
  std::size_t messagesPerBatch_ = kMessagesPerBatch;
};

}  // namespace tessel
