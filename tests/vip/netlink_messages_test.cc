#include "vip/netlink_messages.h"

#include <gtest/gtest.h>
#include <libmnl/libmnl.h>
#include <linux/if_addr.h>
#include <linux/rtnetlink.h>

#include <cerrno>
#include <cstring>

namespace tessel {
namespace {

TEST(NetlinkMessagesTest, AcknowledgmentsMapToStatuses) {
  const AddressOperation add = AddressOperation::kAdd;
  const AddressOperation remove = AddressOperation::kDelete;
  EXPECT_EQ(StatusOfAcknowledgment(add, 0), 1);
  EXPECT_EQ(StatusOfAcknowledgment(add, EEXIST), -2);
  EXPECT_EQ(StatusOfAcknowledgment(add, ENODEV), -3);
  EXPECT_EQ(StatusOfAcknowledgment(add, EINVAL), 87);
  EXPECT_EQ(StatusOfAcknowledgment(add, EPERM), 0);
  EXPECT_EQ(StatusOfAcknowledgment(add, EADDRNOTAVAIL), 0);
  // An address already gone counts as removed.
  EXPECT_EQ(StatusOfAcknowledgment(remove, 0), 1);
  EXPECT_EQ(StatusOfAcknowledgment(remove, EADDRNOTAVAIL), 1);
  EXPECT_EQ(StatusOfAcknowledgment(remove, ENODEV), -3);
  EXPECT_EQ(StatusOfAcknowledgment(remove, EPERM), 0);
}

TEST(NetlinkMessagesTest, InterfaceNamesThatCouldNameSomethingElseAreRefused) {
  for (const char* good : {"eth0", "veth-a_1", "enp0s31f6", "a", "abcdefghijklmno", "..."}) {
    EXPECT_TRUE(IsValidInterfaceName(good)) << good;
  }
  for (const char* bad : {"", ".", "..", "abcdefghijklmnop", "eth0; rm -rf /", "a/b", "eth0:1",
                          "eth\t0", "eth 0", "eth0\n"}) {
    EXPECT_FALSE(IsValidInterfaceName(bad)) << bad;
  }
}

TEST(NetlinkMessagesTest, AddressesParseWithAnOptionalPrefixOfTheirFamily) {
  std::optional<IpAddress> v4 = ParseIpAddress("10.1.2.3", false);
  ASSERT_TRUE(v4);
  EXPECT_EQ(v4->prefix, 32);
  EXPECT_EQ(IpAddressText(*v4), "10.1.2.3");
  std::optional<IpAddress> v6 = ParseIpAddress("fd00:0:0::5/64", true);
  ASSERT_TRUE(v6);
  EXPECT_EQ(v6->prefix, 64);
  EXPECT_EQ(IpAddressText(*v6), "fd00::5");
  EXPECT_EQ(ParseIpAddress("fd00::5", true)->prefix, 128);
  for (const char* bad : {"10.1.2.3/33", "10.1.2.3/0", "10.1.2.3/", "10.1.2.3/2x", "fd00::5",
                          "10.1.2", "10.1.2.3 "}) {
    EXPECT_FALSE(ParseIpAddress(bad, false)) << bad;
  }
  EXPECT_FALSE(ParseIpAddress("fd00::5/129", true));
  EXPECT_FALSE(ParseIpAddress("10.1.2.3", true));
}

std::vector<AddressRequest> Requests(std::size_t count, bool isIPv6) {
  std::vector<AddressRequest> requests;
  for (std::size_t i = 0; i < count; ++i) {
    IpAddress address = *ParseIpAddress(isIPv6 ? "fd00::/64" : "10.0.0.0/24", isIPv6);
    address.bytes[address.Length() - 2] = static_cast<std::uint8_t>(i >> 8);
    address.bytes[address.Length() - 1] = static_cast<std::uint8_t>(i);
    requests.push_back({address, 7});
  }
  return requests;
}

// Walks every message of every batch and checks it against the request it was built from.
void ExpectBatchesCarry(const std::vector<AddressBatch>& batches,
                        const std::vector<AddressRequest>& requests, AddressOperation operation,
                        std::uint32_t firstSequence) {
  const bool add = operation == AddressOperation::kAdd;
  std::size_t k = 0;
  for (const AddressBatch& batch : batches) {
    int remaining = static_cast<int>(batch.bytes.size());
    std::size_t inBatch = 0;
    for (auto* header = reinterpret_cast<const nlmsghdr*>(batch.bytes.data());
         mnl_nlmsg_ok(header, remaining); header = mnl_nlmsg_next(header, &remaining)) {
      ASSERT_LT(k, requests.size());
      EXPECT_EQ(header->nlmsg_type, add ? RTM_NEWADDR : RTM_DELADDR);
      const int flags = NLM_F_REQUEST | NLM_F_ACK | (add ? NLM_F_CREATE | NLM_F_EXCL : 0);
      EXPECT_EQ(header->nlmsg_flags, flags);
      EXPECT_EQ(header->nlmsg_seq, firstSequence + k);
      const auto* message = static_cast<const ifaddrmsg*>(mnl_nlmsg_get_payload(header));
      const IpAddress& address = requests[k].address;
      EXPECT_EQ(message->ifa_family, address.family);
      EXPECT_EQ(message->ifa_prefixlen, address.prefix);
      EXPECT_EQ(message->ifa_index, 7u);
      bool local = false;
      std::uint32_t addressFlags = 0;
      const auto* tail = static_cast<const char*>(mnl_nlmsg_get_payload_tail(header));
      for (auto* attribute =
               static_cast<const nlattr*>(mnl_nlmsg_get_payload_offset(header, sizeof(ifaddrmsg)));
           mnl_attr_ok(attribute,
                       static_cast<int>(tail - reinterpret_cast<const char*>(attribute)));
           attribute = mnl_attr_next(attribute)) {
        if (mnl_attr_get_type(attribute) == IFA_FLAGS) addressFlags = mnl_attr_get_u32(attribute);
        if (mnl_attr_get_type(attribute) == IFA_LOCAL) {
          local = mnl_attr_get_payload_len(attribute) == address.Length() &&
                  std::memcmp(mnl_attr_get_payload(attribute), address.bytes.data(),
                              address.Length()) == 0;
        }
      }
      EXPECT_TRUE(local) << k;
      const bool wantsNoDad = add && address.family == AF_INET6;
      EXPECT_EQ(addressFlags, wantsNoDad ? std::uint32_t{IFA_F_NODAD} : 0u) << k;
      ++k;
      ++inBatch;
    }
    EXPECT_EQ(remaining, 0);
    EXPECT_EQ(inBatch, batch.count);
  }
  EXPECT_EQ(k, requests.size());
}

TEST(NetlinkMessagesTest, ManyAddressesGoInNumberedBatchesOfAcknowledgedMessages) {
  for (bool isIPv6 : {false, true}) {
    const std::vector<AddressRequest> requests = Requests(2001, isIPv6);
    for (AddressOperation operation : {AddressOperation::kAdd, AddressOperation::kDelete}) {
      const std::vector<AddressBatch> batches = BuildAddressBatches(operation, requests, 500);
      ASSERT_EQ(batches.size(), 3u);
      EXPECT_EQ(batches[0].count, 1000u);
      EXPECT_EQ(batches[1].count, 1000u);
      EXPECT_EQ(batches[2].count, 1u);
      EXPECT_EQ(batches[2].firstSequence, 2500u);
      ExpectBatchesCarry(batches, requests, operation, 500);
    }
  }
  EXPECT_EQ(BuildAddressBatches(AddressOperation::kAdd, Requests(64, false), 1, 16).size(), 4u);
  EXPECT_TRUE(BuildAddressBatches(AddressOperation::kAdd, {}, 1).empty());
}

}  // namespace
}  // namespace tessel
