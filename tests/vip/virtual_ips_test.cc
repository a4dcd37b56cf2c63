#include "vip/virtual_ips.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <set>

namespace tessel {
namespace {

// A kernel in memory: interfaces by name, the addresses on each, and every request it was sent.
class FakeKernel final : public AddressKernel {
 public:
  struct Sent {
    AddressOperation operation;
    AddressRequest request;
  };

  std::vector<std::int32_t> Apply(AddressOperation operation,
                                  std::span<const AddressRequest> requests) override {
    std::vector<std::int32_t> statuses;
    for (const AddressRequest& request : requests) {
      sent.push_back({operation, request});
      std::set<IpAddress>& present = addresses[request.interfaceIndex];
      int error = 0;
      if (operation == AddressOperation::kAdd) {
        error = present.insert(request.address).second ? 0 : EEXIST;
      } else if (failDeletes) {
        error = EPERM;
      } else {
        error = present.erase(request.address) == 1 ? 0 : EADDRNOTAVAIL;
      }
      statuses.push_back(StatusOfAcknowledgment(operation, error));
    }
    return statuses;
  }
  std::optional<std::uint32_t> InterfaceIndex(const std::string& name) override {
    ++lookups;
    auto found = interfaces.find(name);
    if (found == interfaces.end()) return std::nullopt;
    return found->second;
  }
  std::optional<NetworkInterface> SelectAdapter() override { return adapter; }

  std::map<std::string, std::uint32_t> interfaces{{"eth0", 2}, {"eth1", 3}};
  std::optional<NetworkInterface> adapter;
  std::map<std::uint32_t, std::set<IpAddress>> addresses;
  std::vector<Sent> sent;
  int lookups = 0;
  bool failDeletes = false;
};

class VirtualIpsTest : public ::testing::Test {
 protected:
  VirtualIpsTest() {
    auto kernel = std::make_unique<FakeKernel>();
    kernel_ = kernel.get();
    ips_ = std::make_unique<VirtualIps>(std::move(kernel));
  }
  std::vector<std::int32_t> Add(std::vector<std::string> addresses, const std::string& name) {
    return ips_->Add(addresses, {}, name);
  }

  FakeKernel* kernel_;
  std::unique_ptr<VirtualIps> ips_;
};

std::vector<std::string> Addresses(std::size_t count, int first = 1) {
  std::vector<std::string> texts;
  for (std::size_t i = 0; i < count; ++i) {
    texts.push_back("10." + std::to_string(first + i / 62500) + "." +
                    std::to_string(i % 62500 / 250) + "." + std::to_string(i % 250 + 1));
  }
  return texts;
}

TEST_F(VirtualIpsTest, RemovalTakesOnlyWhatWasAddedLatestFirstWithItsOwnPrefix) {
  kernel_->addresses[2].insert(*ParseIpAddress("10.0.0.3", false));  // there before
  EXPECT_EQ(Add({"10.0.0.1/24", "10.0.0.2/24", "10.0.0.3", "fd00::1", "10.0.0.2"}, "eth0"),
            (std::vector<std::int32_t>{1, 1, -2, 1, -2}));
  kernel_->sent.clear();
  // Never added by the engine: left alone, and nothing is asked of the kernel.
  EXPECT_EQ(ips_->Remove(std::vector<std::string>{"10.0.0.3", "10.9.9.9"}, {}),
            (std::vector<std::int32_t>{1, 1}));
  EXPECT_TRUE(kernel_->sent.empty());
  // Gone already (someone else removed it): counts as removed.
  kernel_->addresses[2].erase(*ParseIpAddress("fd00::1", true));
  EXPECT_EQ(ips_->RemoveAll(), 3u);
  ASSERT_EQ(kernel_->sent.size(), 3u);
  const char* latestFirst[] = {"fd00::1", "10.0.0.2", "10.0.0.1"};
  const int prefixes[] = {128, 24, 24};
  for (std::size_t k = 0; k < 3; ++k) {
    EXPECT_EQ(kernel_->sent[k].operation, AddressOperation::kDelete);
    EXPECT_EQ(IpAddressText(kernel_->sent[k].request.address), latestFirst[k]);
    EXPECT_EQ(kernel_->sent[k].request.address.prefix, prefixes[k]);
  }
  EXPECT_EQ(kernel_->addresses[2], (std::set<IpAddress>{*ParseIpAddress("10.0.0.3", false)}));
  EXPECT_EQ(ips_->RemoveAll(), 0u);
}

TEST_F(VirtualIpsTest, AFailedRemovalKeepsTheRecordForALaterTry) {
  Add({"10.0.0.1", "10.0.0.2"}, "eth0");
  kernel_->failDeletes = true;
  EXPECT_EQ(ips_->Remove(std::vector<std::string>{"10.0.0.2", "10.0.0.1"}, {}),
            (std::vector<std::int32_t>{0, 0}));
  EXPECT_EQ(ips_->HeldOn("eth0"), 2u);
  kernel_->failDeletes = false;
  EXPECT_EQ(ips_->RemoveAll(), 2u);
  EXPECT_EQ(ips_->HeldOn("eth0"), 0u);
}

TEST_F(VirtualIpsTest, BadAddressesAndInterfacesFailPerAddress) {
  EXPECT_EQ(Add({"10.0.0.1", "10.0.0.300", "10.0.0.2/40"}, "nosuch0"),
            (std::vector<std::int32_t>{-3, 87, 87}));
  // A name that is not an interface name never reaches the kernel.
  EXPECT_EQ(Add({"10.0.0.1"}, "eth0; rm -rf /"), (std::vector<std::int32_t>{87}));
  EXPECT_EQ(kernel_->lookups, 1);
  // Without a name the selected adapter takes the addresses; without an adapter they fail.
  EXPECT_EQ(Add({"10.0.0.1"}, ""), (std::vector<std::int32_t>{-5}));
  kernel_->adapter = NetworkInterface{3, "eth1"};
  EXPECT_EQ(Add({"10.0.0.1"}, ""), (std::vector<std::int32_t>{1}));
  EXPECT_EQ(ips_->HeldOn("eth1"), 1u);
  EXPECT_TRUE(kernel_->sent.size() == 1 && kernel_->sent[0].request.interfaceIndex == 3);
}

TEST_F(VirtualIpsTest, AnInterfaceListTakesAtMost8192AddressesPerInterface) {
  EXPECT_EQ(ips_->SetInterfaces({"eth0", "eth1"}), 2u);
  std::vector<std::int32_t> statuses = Add(Addresses(8193), "ignored");
  EXPECT_EQ(std::count(statuses.begin(), statuses.end(), 1), 8193);
  EXPECT_EQ(ips_->HeldOn("eth0"), 8192u);
  EXPECT_EQ(ips_->HeldOn("eth1"), 1u);
  EXPECT_EQ(kernel_->sent[8191].request.interfaceIndex, 2u);
  EXPECT_EQ(kernel_->sent[8192].request.interfaceIndex, 3u);
  // A freed place on the first interface is used again.
  ips_->Remove(std::vector<std::string>{"10.1.0.1"}, {});
  EXPECT_EQ(Add({"10.2.0.1"}, ""), (std::vector<std::int32_t>{1}));
  EXPECT_EQ(ips_->HeldOn("eth0"), 8192u);
  // When every interface is full, no interface can take more.
  statuses = Add(Addresses(8192, 20), "");
  EXPECT_EQ(std::count(statuses.begin(), statuses.end(), 1), 8191);
  EXPECT_EQ(statuses.back(), -5);
  EXPECT_EQ(ips_->HeldOn("eth1"), 8192u);
}

TEST(PrefixOfMaskTest, MasksAndLengthsGivePrefixes) {
  EXPECT_EQ(PrefixOfMask("", false), 32);
  EXPECT_EQ(PrefixOfMask("", true), 128);
  EXPECT_EQ(PrefixOfMask("255.255.255.0", false), 24);
  EXPECT_EQ(PrefixOfMask("255.255.255.255", false), 32);
  EXPECT_EQ(PrefixOfMask("64", true), 64);
  for (const char* bad : {"255.0.255.0", "0.0.0.0", "33", "0", "mask"}) {
    EXPECT_FALSE(PrefixOfMask(bad, false)) << bad;
  }
  EXPECT_FALSE(PrefixOfMask("255.255.255.0", true));
}

}  // namespace
}  // namespace tessel
