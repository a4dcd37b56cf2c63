#include "snmp/value_adapters.h"

#include <gtest/gtest.h>

#include <utility>

#include "snmp/var_value.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

class ValueAdaptersTest : public ::testing::Test {
 protected:
  void SetUp() override { InstallHost(&host_); }
  void TearDown() override { InstallHost(nullptr); }

  static HostValueQuery SysName() {
    HostValueQuery query;
    query.objectOid = ".1.3.6.1.2.1.1";
    query.subId = "5";
    query.instance = ".0";
    return query;
  }

  MemoryHost host_;
  std::uint8_t errorCode_ = 0xEE;
};

TEST_F(ValueAdaptersTest, MissingAnswersAreNoSuchInstance) {
  EXPECT_EQ(AdapterGetOidVal(SysName(), &errorCode_), std::nullopt);  // the host answers null
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  host_.SetNullValue("1.3.6.1.2.1.1.5.0");
  errorCode_ = 0;
  EXPECT_EQ(AdapterTableGetOidVal(SysName(), &errorCode_), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  host_.SetValue("1.3.6.1.2.1.1.5.0", "x");
  InstallHost(nullptr);
  errorCode_ = 0;
  EXPECT_EQ(AdapterGetNextOidVal(SysName(), &errorCode_), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
}

TEST_F(ValueAdaptersTest, HostErrorDropsTheValue) {
  const std::pair<const char*, std::uint8_t> cases[] = {
      {"17", 17}, {"4", 3}, {"1", kNoSuchObject}, {"6", 5}, {"abc", 5}, {"017", 5}};
  for (const auto& [text, code] : cases) {
    host_.SetError("1.3.6.1.2.1.1.5.0", text);
    EXPECT_EQ(AdapterSetOidVal(SysName(), &errorCode_), std::nullopt) << text;
    EXPECT_EQ(errorCode_, code) << text;
  }
}

}  // namespace
}  // namespace tessel
