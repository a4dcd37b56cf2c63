#include "snmpv3/vacm.h"

#include <gtest/gtest.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include "snmp/pdu.h"

namespace tessel {
namespace {

const Oid kSysDescr = {1, 3, 6, 1, 2, 1, 1, 1, 0};
const Oid kEnterprise = {1, 3, 6, 1, 4, 1, 9, 1};

class VacmTest : public ::testing::Test {
 protected:
  void SetUp() override { FreeVacmTables(); }
  void TearDown() override { FreeVacmTables(); }

  // User "alice" in group "g"; context "ctx"; view "all" = 1.3.6.1 minus 1.3.6.1.4.
  static void AddBase() {
    CreateAndAddSnmpVacmContextTableEntry("ctx");
    CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, "alice", "g", 3);
    CreateAndAddNewSnmpVacmAccessTableEntry("g", "ctx", 3, 1, 1, "all", "w", "n", 3);
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("all", "1.3.6.1", "", 1, 3);
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("all", ".1.3.6.1.4", "", 2, 3);
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("w", ".1.3.6.1.2.1.1", "", 1, 3);
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("n", ".1.3.6.1.6", "", 1, 3);
    Rebuild();
  }
  static void Rebuild() {
    CreateLCDVacmAccessTable();
    CreateLCDVacmViewTreeFamilyTable();
  }
  static int Decide(std::uint8_t pdu, const Oid& oid, std::string_view context = "ctx",
                    int level = 1, std::string* cache = nullptr) {
    return IsAccessAllowed(context, "alice", 3, level, pdu, oid, cache);
  }
  static std::string ReadViewOf(std::string_view group, std::string_view context, int model,
                                int level) {
    VacmAccessEntry entry;
    return IsHaveAccess(group, context, model, level, &entry) == 1 ? entry.readViewName : "-";
  }
};

TEST_F(VacmTest, RefusesBadRowValues) {
  const std::string name32(32, 'g'), name33(33, 'g'), mask16(16, 'F');
  EXPECT_EQ(CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, "u", "g", 3, 4), 0);
  EXPECT_EQ(CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, "u", name33, 3), 0);
  EXPECT_EQ(CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, "u", name32, 3, 5), 1);
  EXPECT_EQ(CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 3, 2, 1, "r", "", "", 3), 0);
  EXPECT_EQ(CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 3, 3, 2, name33, "", "", 3), 0);
  EXPECT_EQ(CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 3, 3, 2, "r", "", "", 3, 0), 0);
  for (const char* subtree : {"", ".", "1..3", "1.3.", "1.x.6"})
    EXPECT_EQ(CreateAndAddSnmpVacmViewTreeFamilyTableEntry("v", subtree, "", 1, 3), 0) << subtree;
  EXPECT_EQ(CreateAndAddSnmpVacmViewTreeFamilyTableEntry("v", "1.3", "fg", 1, 3), 0);
  EXPECT_EQ(CreateAndAddSnmpVacmViewTreeFamilyTableEntry("v", "1.3", "", 3, 3), 0);
  EXPECT_EQ(CreateAndAddSnmpVacmViewTreeFamilyTableEntry("v", "1", mask16, 2, 3, 2), 1);
}

TEST_F(VacmTest, FamilyMembershipFollowsMask) {
  VacmViewTreeFamilyEntry family;
  family.subtree = {1, 3, 6, 1, 2, 1, 2, 2}, family.mask = "fe";
  EXPECT_TRUE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2, 7, 1}, family));
  EXPECT_FALSE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 3, 2, 1}, family));
  family.mask = "";  // all ones
  EXPECT_FALSE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2, 7, 1}, family));
  EXPECT_TRUE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2, 2}, family));
  EXPECT_FALSE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2}, family));  // shorter
  family.subtree = {9, 3, 6, 1, 2, 1, 2, 2, 5, 6};
  family.mask = "7f";  // first sub-identifier free; the ninth and tenth padded significant
  EXPECT_TRUE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2, 2, 5, 6, 0}, family));
  EXPECT_FALSE(CheckForOidInFamilyOfViews(Oid{1, 3, 6, 1, 2, 1, 2, 2, 5, 7}, family));
  family.mask = "FF3";  // upper case; the ninth and tenth are free
  EXPECT_TRUE(CheckForOidInFamilyOfViews(Oid{9, 3, 6, 1, 2, 1, 2, 2, 8, 8}, family));
}

TEST_F(VacmTest, ViewDecisionLongestThenGreatestSubtree) {
  AddBase();
  EXPECT_EQ(IsHaveView("all", kEnterprise), 5);
  EXPECT_EQ(IsHaveView("all", Oid{1, 3, 7}), 16);
  EXPECT_EQ(IsHaveView("none", kSysDescr), 16);
  // Equal lengths with wildcards: the greater subtree decides, whatever the type order.
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("tie", "1.3.6.1.2", "e8", 2, 3);
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("tie", "1.3.6.9.2", "e8", 1, 3);
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("same", "1.3.6", "", 1, 3);
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("same", "1.3.6", "", 2, 3);
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("same", "1.3.6.1", "", 1, 3, 2);  // inactive
  Rebuild();
  EXPECT_EQ(IsHaveView("tie", Oid{1, 3, 6, 5, 2, 1}), 1);
  EXPECT_EQ(IsHaveView("same", kSysDescr), 5);  // excluded families are listed first
}

TEST_F(VacmTest, AccessRowSelection) {
  CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 3, 3, 1, "usm-priv", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 0, 0, 1, "any-model", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("h", "", 3, 0, 1, "h0", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("h", "", 3, 1, 1, "h1", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("p", "ab", 3, 0, 2, "ab", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("p", "abc", 3, 0, 2, "abc", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("p", "abcd", 3, 0, 1, "exact", "", "", 3);
  Rebuild();
  EXPECT_EQ(ReadViewOf("g", "", 3, 3), "usm-priv");
  EXPECT_EQ(ReadViewOf("g", "", 3, 1), "any-model");  // authNoPriv cannot use a level-3 row
  EXPECT_EQ(ReadViewOf("g", "x", 3, 3), "-");
  EXPECT_EQ(ReadViewOf("h", "", 3, 3), "h1");  // the higher level sorts first
  EXPECT_EQ(ReadViewOf("h", "", 3, 1), "h1");
  EXPECT_EQ(ReadViewOf("h", "", 3, 0), "h0");
  EXPECT_EQ(ReadViewOf("h", "", 2, 3), "-");
  EXPECT_EQ(ReadViewOf("p", "abcd", 3, 0), "exact");
  EXPECT_EQ(ReadViewOf("p", "abcx", 3, 0), "abc");
  EXPECT_EQ(ReadViewOf("p", "abx", 3, 0), "ab");
  EXPECT_EQ(ReadViewOf("p", "a", 3, 0), "-");
}

TEST_F(VacmTest, AccessListOrder) {
  VacmAccessEntry a;
  a.contextPrefix = "ab", a.securityModel = 3, a.securityLevel = 1;
  VacmAccessEntry b = a;
  b.contextPrefix = std::string("a\0", 2);  // "a" continued by a zero octet
  EXPECT_TRUE(VacmAccessEntryGoesAfter(b, a));
  b.contextPrefix = "\xff";  // octets compare unsigned
  EXPECT_FALSE(VacmAccessEntryGoesAfter(b, a));
  EXPECT_FALSE(VacmAccessEntryGoesAfter(a, a));  // never equal: goes before
  // The ordering does not rank these three consistently; rows are placed by binary probing as in
  // an ordered Vector, which leaves the exact row last (a scan from the head would put it first).
  CreateAndAddNewSnmpVacmAccessTableEntry("o", "a", 0, 0, 2, "prefix-a", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("o", "", 0, 3, 2, "prefix-empty", "", "", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("o", "a", 0, 0, 1, "exact", "", "", 3);
  Rebuild();
  EXPECT_EQ(ReadViewOf("o", "a", 3, 3), "prefix-a");
}

TEST_F(VacmTest, DecisionByPduTypeAndContext) {
  AddBase();
  EXPECT_EQ(Decide(kGetRequest, kSysDescr), 1);
  EXPECT_EQ(Decide(kGetBulkRequest, kEnterprise), 16);
  EXPECT_EQ(Decide(kSetRequest, kSysDescr), 1);
  EXPECT_EQ(Decide(kSetRequest, Oid{1, 3, 6, 1, 2, 1, 2, 1, 0}), 16);
  EXPECT_EQ(Decide(kTrapV2, Oid{1, 3, 6, 1, 6, 3, 1}), 1);
  EXPECT_EQ(Decide(kInformRequest, kSysDescr), 16);
  EXPECT_EQ(Decide(kReport, kSysDescr), 16);
  EXPECT_EQ(Decide(kGetRequest, kSysDescr, "ctx", 0), 16);  // level below the row's
  EXPECT_EQ(IsAccessAllowed("ctx", "bob", 3, 3, kGetRequest, kSysDescr, nullptr), 16);
  EXPECT_EQ(Decide(kGetRequest, kSysDescr, ""), 16);
  CreateAndAddNewSnmpVacmAccessTableEntry("g", "", 3, 0, 1, "all", "", "", 3);
  Rebuild();
  EXPECT_EQ(Decide(kGetRequest, kSysDescr, ""), 16);  // no "" context yet
  CreateAndAddSnmpVacmContextTableEntry("");
  EXPECT_EQ(Decide(kGetRequest, kSysDescr, ""), 1);
  EXPECT_EQ(Decide(kSetRequest, kSysDescr, ""), 16);  // empty write view
}

TEST_F(VacmTest, ViewCacheDecidesLaterVarbinds) {
  AddBase();
  std::string cache;
  EXPECT_EQ(Decide(kGetRequest, kEnterprise, "ctx", 1, &cache), 16);
  EXPECT_EQ(cache, "all");  // kept although the view refused the OID
  EXPECT_EQ(Decide(kSetRequest, Oid{1, 3, 6, 1, 2, 1, 2, 1}, "nowhere", 0, &cache), 1);
  cache = "w";
  EXPECT_EQ(Decide(kGetRequest, Oid{1, 3, 6, 1, 2, 1, 2, 1}, "ctx", 1, &cache), 16);
}

TEST_F(VacmTest, RowsCountAfterRebuildAndSurviveInit) {
  CreateAndAddSnmpVacmContextTableEntry("ctx");
  InitVacmTables();  // the service starts after the host's first rows
  EXPECT_TRUE(IsValidContext("ctx"));
  AddBase();
  CreateAndAddSnmpVacmViewTreeFamilyTableEntry("all", "1.3.6.1.2.1.1", "", 2, 3);
  CreateAndAddNewSnmpVacmAccessTableEntry("g", "ctx", 3, 1, 1, "", "", "", 3);
  EXPECT_EQ(Decide(kGetRequest, kSysDescr), 1);
  CreateLCDVacmViewTreeFamilyTable();
  EXPECT_EQ(Decide(kGetRequest, kSysDescr), 16);
  EXPECT_EQ(Decide(kGetRequest, Oid{1, 3, 6, 1, 2, 1, 2}), 1);
  CreateLCDVacmAccessTable();  // the new row sorts first and has no read view
  EXPECT_EQ(Decide(kGetRequest, Oid{1, 3, 6, 1, 2, 1, 2}), 16);
  FreeVacmTables();
  EXPECT_FALSE(VacmTablesExist());
  EXPECT_EQ(Decide(kGetRequest, kSysDescr), 16);
}

TEST_F(VacmTest, DecisionsRunWhileTheHostAddsRows) {
  AddBase();
  std::atomic<int> wrong{0};
  std::vector<std::thread> readers;
  for (int t = 0; t < 3; ++t)
    readers.emplace_back([&] {
      for (int i = 0; i < 3000; ++i) wrong += Decide(kGetRequest, kSysDescr) != 1;
    });
  for (int i = 0; i < 200; ++i) {
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("v" + std::to_string(i), "1.3.6", "", 2, 3);
    CreateAndAddNewSnmpVacmAccessTableEntry("other", "", 0, 0, 2, "v", "", "", 3);
    Rebuild();
  }
  for (std::thread& reader : readers) reader.join();
  EXPECT_EQ(wrong.load(), 0);
}

}  // namespace
}  // namespace tessel
