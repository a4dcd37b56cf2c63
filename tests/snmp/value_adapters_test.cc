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

TEST(GetSnmpErrorStatusTest, MapsHostNumbersToEngineCodes) {
  const std::pair<const char*, std::uint8_t> cases[] = {{"-1", 0},
                                                        {"0", 1},
                                                        {"1", kNoSuchObject},
                                                        {"2", kNoSuchInstance},
                                                        {"3", kEndOfMibView},
                                                        {"4", 3},
                                                        {"5", 4},
                                                        {"6", 5},
                                                        {"7", 6},
                                                        {"8", 8},
                                                        {"13", 13},
                                                        {"18", 18},
                                                        {"19", 5},
                                                        {"abc", 5},
                                                        {"", 5},
                                                        {"-2", 5},
                                                        {"017", 5},
                                                        {"99999999999999999999", 5}};
  for (const auto& [text, code] : cases) EXPECT_EQ(GetSnmpErrorStatus(text), code) << text;
}

TEST_F(ValueAdaptersTest, ValueWithoutErrorIsUsed) {
  host_.SetValue("1.3.6.1.2.1.1.5.0", "x");
  EXPECT_EQ(AdapterGetOidVal(SysName(), &errorCode_), "x");
  EXPECT_EQ(errorCode_, 0);
}

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
  const std::pair<const char*, std::uint8_t> cases[] = {{"17", 17}, {"6", 5}, {"abc", 5}};
  for (const auto& [text, code] : cases) {
    host_.SetError("1.3.6.1.2.1.1.5.0", text);
    EXPECT_EQ(AdapterSetOidVal(SysName(), &errorCode_), std::nullopt) << text;
    EXPECT_EQ(errorCode_, code) << text;
  }
}

TEST_F(ValueAdaptersTest, TableGetNextGivesColumnAndInstance) {
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.3", "7");
  HostValueQuery query;
  query.objectOid = ".1.3.6.1.2.1.2.2.1";
  query.column = 2;
  std::string answered;
  EXPECT_EQ(AdapterTableGetNextOidVal(query, &answered, &errorCode_), "7");
  EXPECT_EQ(answered, "2.3");
  EXPECT_EQ(errorCode_, 0);

  host_.SetError("1.3.6.1.2.1.2.2.1.2.3", "5");  // the error is the third element
  EXPECT_EQ(AdapterTableGetNextOidVal(query, &answered, &errorCode_), std::nullopt);
  EXPECT_EQ(errorCode_, 4);
  EXPECT_EQ(answered, "");
}

}  // namespace
}  // namespace tessel
