#include "snmp/mib_tree.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "snmp/handlers.h"
#include "snmp/pdu.h"

namespace tessel {
namespace {

const Oid kSystem = {1, 3, 6, 1, 2, 1, 1};
const Oid kIfTable = {1, 3, 6, 1, 2, 1, 2, 2};

Oid Append(Oid base, std::initializer_list<std::uint32_t> tail) {
  base.insert(base.end(), tail);
  return base;
}

TreeCellRegistration Cell(std::string label, std::string oidText, std::vector<std::uint32_t> subIds,
                          bool isTable, std::uint32_t dataType = kAsnInteger,
                          std::optional<std::vector<std::string>> syntaxes = std::nullopt) {
  TreeCellRegistration r{std::move(label), "SNMPV2", std::move(oidText), {}, {}, {},
                         isTable,          0,        std::move(syntaxes)};
  for (std::uint32_t subId : subIds) {
    r.subIds.push_back(std::to_string(subId));
    r.dataTypes.push_back(std::to_string(dataType));
    r.access.push_back("43690");
  }
  return r;
}

std::vector<std::uint32_t> Range(std::uint32_t first, std::uint32_t last) {
  std::vector<std::uint32_t> ids;
  for (std::uint32_t id = first; id <= last; ++id) ids.push_back(id);
  return ids;
}

class MibTreeTest : public ::testing::Test {
 protected:
  void SetUp() override { FreeTreeCells(); }
  void TearDown() override { FreeTreeCells(); }

  // System group and ifTable, searchable.
  void RegisterStandard() {
    ASSERT_TRUE(CreateAndRegisterCell(Cell("ifEntry", "1.3.6.1.2.1.2.2.1", Range(1, 22), true)));
    ASSERT_TRUE(CreateAndRegisterCell(Cell("system", ".1.3.6.1.2.1.1.1", Range(1, 7), false)));
    ASSERT_EQ(StoreTreeCellsRefInArray(), 2);
  }
  const TreeCell* Lookup(std::uint8_t type, const Oid& oid, std::uint8_t* code) {
    MibTreeReadLock lock;
    return GetTreeCell(type, oid, code);
  }
};

TEST_F(MibTreeTest, LookupFindsTheCellOrSaysWhatIsMissing) {
  std::uint8_t code = 0;
  EXPECT_EQ(Lookup(kGetNextRequest, Oid{}, &code), nullptr);  // empty tree
  EXPECT_EQ(code, kNoSuchInstance);
  ASSERT_TRUE(CreateAndRegisterCell(Cell("ifEntry", "1.3.6.1.2.1.2.2.1", Range(1, 22), true)));
  EXPECT_EQ(Lookup(kGetRequest, Append(kIfTable, {1, 2, 5}), &code), nullptr);  // not searchable
  EXPECT_EQ(code, kNoSuchInstance);
  FreeTreeCells();
  RegisterStandard();
  // A scalar group that follows does not make an unknown object a missing instance.
  ASSERT_TRUE(CreateAndRegisterCell(Cell("interfaces", "1.3.6.1.2.1.2.1", Range(1, 1), false)));
  StoreTreeCellsRefInArray();
  EXPECT_EQ(GetTreeCellByName("ifEntry")->oid, kIfTable);
  struct Case {
    std::uint8_t type;
    Oid oid;
    const char* cell;  // nullptr: none, and code says why
    std::uint8_t code;
  } cases[] = {
      {kGetRequest, Append(kIfTable, {1, 2, 5}), "ifEntry", 0},
      {kGetRequest, kIfTable, nullptr, kNoSuchInstance},
      {kGetRequest, Append(kSystem, {3, 0}), "system", 0},
      {kSetRequest, Append(kSystem, {4, 0}), "system", 0},
      {kGetRequest, Append(kSystem, {3, 0, 1}), nullptr, kNoSuchInstance},
      {kGetRequest, Append(kSystem, {99, 0}), nullptr, kNoSuchObject},
      {kGetNextRequest, Oid{}, "system", 0},
      {kGetRequest, Oid(kMaxOidLength, 0xFFFFFFFFu), nullptr, kNoSuchObject},
      {kGetNextRequest, Append(kIfTable, {1, 22, 0xFFFFFFFFu}), "ifEntry", 0},
      {kGetNextRequest, Append(kIfTable, {1, 23}), nullptr, kNoSuchObject},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(OidToPlainText(c.oid));
    code = 0;
    const TreeCell* found = Lookup(c.type, c.oid, &code);
    EXPECT_EQ(found, c.cell ? GetTreeCellByName(c.cell) : nullptr);
    EXPECT_EQ(c.cell ? c.code : code, c.code);
  }
  EXPECT_EQ(GetNextGroupOid("1.3.6.1.2.1.1.3.0"), ".1.3.6.1.2.1.2.1");
  EXPECT_EQ(GetNextGroupOid("1.3.6.1.2.1.2.2.1.1.1"), std::nullopt);  // the last cell
  EXPECT_EQ(GetNextGroupOid("1..3"), std::nullopt);
}

TEST_F(MibTreeTest, ReRegistrationKeepsOneCellAndMergesColumns) {
  ASSERT_TRUE(CreateAndRegisterCell(Cell("ifEntry", "1.3.6.1.2.1.2.2.1", Range(1, 22), true)));
  ASSERT_TRUE(CreateAndRegisterCell(Cell("ifEntry", "1.3.6.1.2.1.2.2.1", Range(1, 22), true)));
  EXPECT_EQ(RegisteredCellCount(), 1);
  const TreeCell* table = GetTreeCellByName("ifEntry");

  // A column defined again with another type changes nothing.
  ASSERT_TRUE(
      CreateAndRegisterCell(Cell("ifEntry", "1.3.6.1.2.1.2.2.1", {3}, true, kAsnOctetString)));
  EXPECT_EQ(table->subIds, Range(1, 22));
  EXPECT_EQ(table->dataTypes[2], kAsnInteger);

  // Columns the new definition lacks are merged in order.
  ASSERT_TRUE(CreateAndRegisterCell(Cell("t", "1.3.6.1.9.1", {1, 2, 3}, true)));
  ASSERT_TRUE(CreateAndRegisterCell(
      Cell("t", "1.3.6.1.9.1", {5, 2}, true, kAsnInteger, {{"DateAndTime", "DisplayString"}})));
  const TreeCell* merged = GetTreeCellByName("t");
  EXPECT_EQ(merged->subIds, (std::vector<std::uint32_t>{1, 2, 3, 5}));
  EXPECT_EQ(merged->syntaxes, (std::vector<std::string>{"", "DisplayString", "", "DateAndTime"}));

  // A scalar group is kept as first registered.
  ASSERT_TRUE(CreateAndRegisterCell(Cell("system", "1.3.6.1.2.1.1.1", Range(1, 7), false)));
  ASSERT_TRUE(CreateAndRegisterCell(Cell("system", "1.3.6.1.2.1.1.1", Range(1, 9), false)));
  EXPECT_EQ(GetTreeCellByName("system")->subIds, Range(1, 7));
  EXPECT_EQ(RegisteredCellCount(), 3);
}

TEST_F(MibTreeTest, ScalarGroupWithSyntaxesSplitsAtGaps) {
  ASSERT_TRUE(CreateAndRegisterCell(Cell("grp", "1.3.6.1.4.1.9", {1, 2, 5, 6, 9}, false,
                                         kAsnInteger, {{"a", "b", "c", "d", "e"}})));
  ASSERT_EQ(StoreTreeCellsRefInArray(), 3);
  const Oid base = {1, 3, 6, 1, 4, 1};
  const TreeCell* first = GetTreeCellByName("grp");
  ASSERT_NE(first, nullptr);
  ASSERT_NE(first->next, nullptr);
  EXPECT_EQ(first->subIds, (std::vector<std::uint32_t>{1, 2}));
  EXPECT_EQ(first->next->syntaxes, (std::vector<std::string>{"c", "d"}));
  std::uint8_t code = 0;
  EXPECT_EQ(Lookup(kGetRequest, Append(base, {1, 0}), &code), first);
  EXPECT_EQ(Lookup(kGetRequest, Append(base, {6, 0}), &code), first->next);
  EXPECT_EQ(Lookup(kGetRequest, Append(base, {9, 0}), &code), first->next->next);
  EXPECT_EQ(Lookup(kGetRequest, Append(base, {3, 0}), &code), nullptr);

  // Named by its first scalar, the last run still sorts after the others and answers.
  ASSERT_TRUE(CreateAndRegisterCell(
      Cell("byFirst", "1.3.6.1.4.3.1", {1, 2, 5}, false, kAsnInteger, {{"a", "b", "c"}})));
  StoreTreeCellsRefInArray();
  const TreeCell* found = Lookup(kGetRequest, Oid{1, 3, 6, 1, 4, 3, 5, 0}, &code);
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->subIds, (std::vector<std::uint32_t>{5}));

  // Without syntaxes the group stays whole.
  ASSERT_TRUE(CreateAndRegisterCell(Cell("whole", "1.3.6.1.4.2.9", {1, 2, 5}, false)));
  EXPECT_EQ(GetTreeCellByName("whole")->subIds.size(), 3u);
}

TEST_F(MibTreeTest, RegistrationConvertsAndValidatesHostTexts) {
  TreeCellRegistration r = Cell("acc", "1.3.6.1.4.1.1", {1, 2, 3, 4, 5, 6}, true);
  r.versionText = "SNMPV1";
  r.access = {"0", "1", "43690", "43706", "43708", "7"};
  r.dataTypes[0] = "70";
  ASSERT_TRUE(CreateAndRegisterCell(r));
  const TreeCell* cell = GetTreeCellByName("acc");
  EXPECT_EQ(cell->access, (std::vector<std::uint8_t>{0, 5, 1, 2, 4, 0}));
  EXPECT_EQ(cell->dataTypes[0], kAsnCounter64);
  EXPECT_EQ(cell->smiVersion, 0);

  std::string longOid = "1";
  for (std::size_t i = 1; i < kMaxOidLength + 1; ++i) longOid += ".1";
  EXPECT_FALSE(CreateAndRegisterCell(Cell("long", longOid, {1}, false)));
  EXPECT_FALSE(CreateAndRegisterCell(Cell("entry", "5", {1}, true)));  // no table OID left
  TreeCellRegistration bad = Cell("bad", "1.3.6.1.4.1.2", {1, 2}, false);
  bad.subIds[1] = "x";
  EXPECT_FALSE(CreateAndRegisterCell(bad));
  bad = Cell("bad", "1.3.6.1.4.1.2", {1, 2}, false);
  bad.access.pop_back();
  EXPECT_FALSE(CreateAndRegisterCell(bad));
  EXPECT_EQ(RegisteredCellCount(), 1);
}

// New cells take the handlers from their registration on; these are the cells already there.
TEST_F(MibTreeTest, DefaultHandlersReachCellsRegisteredBefore) {
  ASSERT_TRUE(CreateAndRegisterCell(Cell("c", "1.3.6.1.3.1", {1}, false)));
  ASSERT_TRUE(CreateAndRegisterCell(Cell("b", "1.3.6.1.2.1.1", {1}, true)));
  SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, nullptr, nullptr);
  EXPECT_EQ(GetTreeCellByName("c")->writeHandler, ScalarProcessWriteReq);
  EXPECT_EQ(GetTreeCellByName("b")->readHandler, nullptr);
  SetDefaultCellHandlers(nullptr, nullptr, nullptr, nullptr);
}

TEST_F(MibTreeTest, LookupsRunWhileCellsAreRegistered) {
  RegisterStandard();
  std::atomic<bool> stop{false};
  std::thread reader([&] {
    for (int i = 0; i < 20000 && !stop; ++i) {
      std::uint8_t code = 0;
      MibTreeReadLock lock;
      const TreeCell* cell = GetTreeCell(kGetRequest, Append(kSystem, {3, 0}), &code);
      ASSERT_NE(cell, nullptr);
      ASSERT_EQ(cell->label, "system");
    }
  });
  for (std::uint32_t n = 200; n >= 1; --n) {  // descending: every insertion walks the list
    CreateAndRegisterCell(
        Cell("t" + std::to_string(n), "1.3.6.1.4.1." + std::to_string(n) + ".1", {1, 2}, true));
    if (n % 20 == 0) StoreTreeCellsRefInArray();
  }
  stop = true;
  reader.join();
  EXPECT_EQ(RegisteredCellCount(), 202);
}

}  // namespace
}  // namespace tessel
