#include "snmpv3/vacm.h"

#include <algorithm>
#include <memory>
#include <mutex>
#include <new>
#include <shared_mutex>
#include <vector>

#include "engine/log.h"
#include "snmp/pdu.h"

namespace tessel {
namespace {

constexpr std::size_t kMaxAdminNameLength = 32;
constexpr std::size_t kMaxMaskDigits = 16;

// Access and view rows live behind unique_ptr so that the decision lists can point at them
// while later rows are appended.
struct VacmTables {
  std::vector<VacmContextEntry> contexts;
  std::vector<VacmSecurityToGroupEntry> groups;
  std::vector<std::unique_ptr<VacmAccessEntry>> access;
  std::vector<std::unique_ptr<VacmViewTreeFamilyEntry>> views;
  std::vector<const VacmAccessEntry*> accessList;
  std::vector<const VacmViewTreeFamilyEntry*> viewList;
};

std::shared_mutex g_vacmMutex;
std::unique_ptr<VacmTables> g_vacmTables;

// Decisions before the tables exist see empty tables and refuse everything.
const VacmTables& TablesForReading() {
  static const VacmTables kEmpty;
  return g_vacmTables ? *g_vacmTables : kEmpty;
}

// Appends a row built by `append` under the exclusive lock, creating the tables on first use.
template <typename Append>
int ChangeTables(Append append) {
  try {
    std::unique_lock lock(g_vacmMutex);
    if (!g_vacmTables) g_vacmTables = std::make_unique<VacmTables>();
    append(*g_vacmTables);
    return kVacmRowAdded;
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate memory for a VACM table row\n");
    return kVacmOutOfMemory;
  }
}

bool CheckColumn(bool valid, const char* column) {
  if (!valid) LOG_ERROR("Wrong Value for %s Column!!!\n", column);
  return valid;
}

bool IsValidRowStatus(int rowStatus) {
  return CheckColumn(rowStatus == 1 || rowStatus == 2 || rowStatus == 3 || rowStatus == 5,
                     "RowStatus");
}

bool IsValidGroupName(std::string_view groupName) {
  return CheckColumn(!groupName.empty() && groupName.size() <= kMaxAdminNameLength, "GroupName");
}

bool IsValidViewName(std::string_view viewName, const char* column) {
  return CheckColumn(viewName.size() <= kMaxAdminNameLength, column);
}

bool IsValidMask(std::string_view maskHex) {
  bool hex =
      std::all_of(maskHex.begin(), maskHex.end(), [](char c) { return HexDigitValue(c) >= 0; });
  return CheckColumn(hex && maskHex.size() <= kMaxMaskDigits, "Mask");
}

// The host may write the subtree with or without the leading dot.
bool ParseSubtree(std::string_view text, Oid* subtree) {
  std::string dotted;
  if (text.empty() || text.front() != '.') dotted.push_back('.');
  dotted.append(text);
  int count = ParseDottedText(subtree, dotted, false);
  return CheckColumn(count > 0 && subtree->size() <= kMaxOidLength, "Subtree");
}

// Octet comparison over the longer prefix, the shorter one continued by zero octets.
int ComparePrefix(std::string_view a, std::string_view b) {
  std::size_t length = std::max(a.size(), b.size());
  for (std::size_t i = 0; i < length; ++i) {
    unsigned ca = i < a.size() ? static_cast<unsigned char>(a[i]) : 0U;
    unsigned cb = i < b.size() ? static_cast<unsigned char>(b[i]) : 0U;
    if (ca != cb) return ca < cb ? -1 : 1;
  }
  return 0;
}

bool ViewFamilyGoesAfter(const VacmViewTreeFamilyEntry& added,
                         const VacmViewTreeFamilyEntry& existing) {
  return added.type < existing.type;
}

// Places `row` with the same probing as an ordered Vector's AddElement (binary search driven by
// the ordering function), so that rows the ordering function does not rank consistently land
// where the engine's ordered lists put them.
template <typename Entry, typename GoesAfter>
void InsertOrdered(std::vector<const Entry*>* list, const Entry* row, GoesAfter goesAfter) {
  std::size_t lo = 0;
  std::size_t hi = list->size();
  while (hi - lo > 1) {
    std::size_t mid = lo + (hi - lo + 1) / 2;
    if (goesAfter(*row, *(*list)[mid])) {
      lo = mid;
    } else {
      hi = mid;
    }
  }
  std::size_t at = !list->empty() && goesAfter(*row, *(*list)[lo]) ? lo + 1 : lo;
  list->insert(list->begin() + static_cast<std::ptrdiff_t>(at), row);
}

// Builds the new list aside and swaps it in, so that memory exhaustion keeps the old one.
template <typename Entry, typename GoesAfter>
void RebuildList(const std::vector<std::unique_ptr<Entry>> VacmTables::*rows,
                 std::vector<const Entry*> VacmTables::*list, GoesAfter goesAfter,
                 const char* what) {
  try {
    std::unique_lock lock(g_vacmMutex);
    if (!g_vacmTables) return;
    std::vector<const Entry*> rebuilt;
    rebuilt.reserve((*g_vacmTables.*rows).size());
    for (const auto& row : *g_vacmTables.*rows) InsertOrdered(&rebuilt, row.get(), goesAfter);
    (*g_vacmTables.*list).swap(rebuilt);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate memory for the VACM %s list\n", what);
  }
}

bool ContextExists(const VacmTables& tables, std::string_view contextName) {
  return std::any_of(tables.contexts.begin(), tables.contexts.end(),
                     [&](const VacmContextEntry& e) { return e.contextName == contextName; });
}

const VacmSecurityToGroupEntry* FindGroup(const VacmTables& tables, int securityModel,
                                          std::string_view securityName) {
  for (const VacmSecurityToGroupEntry& entry : tables.groups) {
    if (entry.rowStatus == kVacmRowActive && entry.securityModel == securityModel &&
        entry.securityName == securityName)
      return &entry;
  }
  return nullptr;
}

bool ContextMatches(const VacmAccessEntry& entry, std::string_view contextName) {
  if (entry.contextMatch == kVacmContextExact) return entry.contextPrefix == contextName;
  return contextName.substr(0, entry.contextPrefix.size()) == entry.contextPrefix;
}

const VacmAccessEntry* FindAccess(const VacmTables& tables, std::string_view groupName,
                                  std::string_view contextName, int securityModel,
                                  int securityLevel) {
  for (const VacmAccessEntry* entry : tables.accessList) {
    if (entry->rowStatus != kVacmRowActive || entry->groupName != groupName) continue;
    if (entry->securityModel != securityModel && entry->securityModel != kVacmAnySecurityModel)
      continue;
    if (ContextMatches(*entry, contextName) && entry->securityLevel <= securityLevel) {
      LOG_TRACE("Access is found. !!!\n");
      return entry;
    }
  }
  return nullptr;
}

// RFC 3415: the longest subtree wins; among equal lengths the lexicographically greatest.
bool Outranks(const VacmViewTreeFamilyEntry& candidate, const VacmViewTreeFamilyEntry& best) {
  if (candidate.subtree.size() != best.subtree.size())
    return candidate.subtree.size() > best.subtree.size();
  return CompareOid(candidate.subtree, best.subtree) > 0;
}

void TraceName(const char* label, std::string_view name) {
  LOG_TRACE("%s%.*s\n", label, static_cast<int>(name.size()), name.data());
}

int DecideByView(const VacmTables& tables, std::string_view viewName,
                 std::span<const std::uint32_t> oid) {
  if (LogEnabled(kLogTrace)) {
    LOG_TRACE("\n************ Snmpv3 VACM Parameters for viewTreeFamily  Table **********\n");
    TraceName("View Name\t: ", viewName);
    LOG_TRACE("Oid is\t\t: %s\n", OidToText(oid).c_str());
  }
  const VacmViewTreeFamilyEntry* best = nullptr;
  for (const VacmViewTreeFamilyEntry* family : tables.viewList) {
    if (family->rowStatus != kVacmRowActive || family->viewName != viewName ||
        !CheckForOidInFamilyOfViews(oid, *family))
      continue;
    if (best == nullptr || Outranks(*family, *best)) best = family;
  }
  if (best == nullptr) {
    LOG_ERROR("View is not available in the table !!!\n");
    return kVacmAuthorizationError;
  }
  return best->type == kVacmViewIncluded ? kVacmAllowed : kVacmGenErr;
}

std::string_view ViewNameForPdu(const VacmAccessEntry& access, std::uint8_t pduType) {
  switch (pduType) {
    case kGetRequest:
    case kGetNextRequest:
    case kGetBulkRequest:
      return access.readViewName;
    case kSetRequest:
      return access.writeViewName;
    case kGetResponse:
    case kTrapV1:
    case kInformRequest:
    case kTrapV2:
      return access.notifyViewName;
    default:
      LOG_ERROR("Invalid View Type. !!!\n");
      return {};
  }
}

void TraceAccessParameters(std::string_view contextName, std::string_view securityName,
                           int securityModel, int securityLevel, std::uint8_t pduType,
                           std::span<const std::uint32_t> oid) {
  if (!LogEnabled(kLogTrace)) return;
  LOG_TRACE("\n************ Snmpv3 VACM Parameters for Context Table **********\n");
  TraceName("Context Name\t: ", contextName);
  TraceName("Security Name\t: ", securityName);
  LOG_TRACE("Security Model\t: %d\nSecurity Level\t: %d\nPDU Type\t: 0x%02x\n", securityModel,
            securityLevel, pduType);
  LOG_TRACE("Oid is\t\t: %s\n", OidToText(oid).c_str());
}

// Context, group, access row and view name for the request; the name goes into *viewName.
int ChooseView(const VacmTables& tables, std::string_view contextName,
               std::string_view securityName, int securityModel, int securityLevel,
               std::uint8_t pduType, std::string* viewName) {
  if (!ContextExists(tables, contextName)) {
    LOG_ERROR("No valid Context Name. !!!\n");
    return kVacmAuthorizationError;
  }
  const VacmSecurityToGroupEntry* group = FindGroup(tables, securityModel, securityName);
  if (group == nullptr) {
    LOG_ERROR("No valid Group Name. !!!\n");
    return kVacmAuthorizationError;
  }
  const VacmAccessEntry* access =
      FindAccess(tables, group->groupName, contextName, securityModel, securityLevel);
  if (access == nullptr) {
    LOG_ERROR("No valid access. !!!\n");
    return kVacmAuthorizationError;
  }
  std::string_view view = ViewNameForPdu(*access, pduType);
  if (view.empty()) {
    LOG_ERROR("Empty view. !!!\n");
    return kVacmAuthorizationError;
  }
  viewName->assign(view);
  return kVacmAllowed;
}

}  // namespace

bool VacmTablesExist() {
  std::shared_lock lock(g_vacmMutex);
  return g_vacmTables != nullptr;
}

void InitVacmTables() {
  try {
    std::unique_lock lock(g_vacmMutex);
    if (!g_vacmTables) g_vacmTables = std::make_unique<VacmTables>();
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate memory for the VACM tables\n");
  }
}

void FreeVacmTables() {
  std::unique_ptr<VacmTables> freed;
  std::unique_lock lock(g_vacmMutex);
  freed.swap(g_vacmTables);
}

int CreateAndAddSnmpVacmContextTableEntry(std::string_view contextName) {
  return ChangeTables([&](VacmTables& t) { t.contexts.push_back({std::string(contextName)}); });
}

int CreateAndAddSnmpVacmSecurityToGroupTableEntry(int securityModel, std::string_view securityName,
                                                  std::string_view groupName, int storageType,
                                                  int rowStatus) {
  if (!IsValidRowStatus(rowStatus) || !IsValidGroupName(groupName)) return kVacmRefused;
  return ChangeTables([&](VacmTables& t) {
    t.groups.push_back(
        {securityModel, std::string(securityName), std::string(groupName), storageType, rowStatus});
  });
}

int CreateAndAddNewSnmpVacmAccessTableEntry(std::string_view groupName,
                                            std::string_view contextPrefix, int securityModel,
                                            int securityLevel, int contextMatch,
                                            std::string_view readView, std::string_view writeView,
                                            std::string_view notifyView, int storageType,
                                            int rowStatus) {
  bool valid = IsValidRowStatus(rowStatus) && IsValidGroupName(groupName) &&
               CheckColumn(securityLevel == kVacmNoAuthNoPriv || securityLevel == kVacmAuthNoPriv ||
                               securityLevel == kVacmAuthPriv,
                           "SecurityLevel") &&
               CheckColumn(contextMatch == kVacmContextExact || contextMatch == kVacmContextPrefix,
                           "ContextMatch") &&
               IsValidViewName(readView, "ReadViewName") &&
               IsValidViewName(writeView, "WriteViewName") &&
               IsValidViewName(notifyView, "NotifyViewName");
  if (!valid) return kVacmRefused;
  return ChangeTables([&](VacmTables& t) {
    t.access.push_back(std::make_unique<VacmAccessEntry>(
        VacmAccessEntry{std::string(groupName), std::string(contextPrefix), securityModel,
                        securityLevel, contextMatch, std::string(readView), std::string(writeView),
                        std::string(notifyView), storageType, rowStatus}));
  });
}

int CreateAndAddSnmpVacmViewTreeFamilyTableEntry(std::string_view viewName,
                                                 std::string_view subtreeText,
                                                 std::string_view maskHex, int type,
                                                 int storageType, int rowStatus) {
  try {
    Oid subtree;
    bool valid = IsValidRowStatus(rowStatus) && IsValidViewName(viewName, "ViewName") &&
                 ParseSubtree(subtreeText, &subtree) && IsValidMask(maskHex) &&
                 CheckColumn(type == kVacmViewIncluded || type == kVacmViewExcluded, "Type");
    if (!valid) return kVacmRefused;
    return ChangeTables([&](VacmTables& t) {
      t.views.push_back(std::make_unique<VacmViewTreeFamilyEntry>(
          VacmViewTreeFamilyEntry{std::string(viewName), std::move(subtree), std::string(maskHex),
                                  type, storageType, rowStatus}));
    });
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate memory for a VACM table row\n");
    return kVacmOutOfMemory;
  }
}

bool VacmAccessEntryGoesAfter(const VacmAccessEntry& added, const VacmAccessEntry& existing) {
  if (added.securityModel < existing.securityModel) return true;
  if (added.contextMatch > existing.contextMatch) return true;
  if (ComparePrefix(added.contextPrefix, existing.contextPrefix) < 0) return true;
  return added.securityLevel < existing.securityLevel;
}

void CreateLCDVacmAccessTable() {
  RebuildList(&VacmTables::access, &VacmTables::accessList, VacmAccessEntryGoesAfter, "access");
}

void CreateLCDVacmViewTreeFamilyTable() {
  RebuildList(&VacmTables::views, &VacmTables::viewList, ViewFamilyGoesAfter, "view");
}

int IsAccessAllowed(std::string_view contextName, std::string_view securityName, int securityModel,
                    int securityLevel, std::uint8_t pduType, std::span<const std::uint32_t> oid,
                    std::string* viewCache) {
  try {
    std::shared_lock lock(g_vacmMutex);
    const VacmTables& tables = TablesForReading();
    TraceAccessParameters(contextName, securityName, securityModel, securityLevel, pduType, oid);
    std::string requestView;
    std::string* view = viewCache != nullptr ? viewCache : &requestView;
    if (view->empty()) {
      int chosen = ChooseView(tables, contextName, securityName, securityModel, securityLevel,
                              pduType, view);
      if (chosen != kVacmAllowed) return chosen;
    }
    if (DecideByView(tables, *view, oid) == kVacmAllowed) return kVacmAllowed;
    LOG_ERROR("No valid view. !!!\n");
    return kVacmAuthorizationError;
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate memory for the VACM decision\n");
    return kVacmGenErr;
  }
}

bool IsValidContext(std::string_view contextName) {
  std::shared_lock lock(g_vacmMutex);
  return ContextExists(TablesForReading(), contextName);
}

bool IsValidSecurityToGroupName(int securityModel, std::string_view securityName,
                                std::string* groupName) {
  try {
    std::shared_lock lock(g_vacmMutex);
    const VacmSecurityToGroupEntry* group =
        FindGroup(TablesForReading(), securityModel, securityName);
    if (group == nullptr) return false;
    if (groupName != nullptr) *groupName = group->groupName;
    return true;
  } catch (const std::bad_alloc&) {
    return false;
  }
}

int IsHaveAccess(std::string_view groupName, std::string_view contextName, int securityModel,
                 int securityLevel, VacmAccessEntry* accessEntry) {
  try {
    std::shared_lock lock(g_vacmMutex);
    const VacmAccessEntry* found =
        FindAccess(TablesForReading(), groupName, contextName, securityModel, securityLevel);
    if (found == nullptr) return 0;
    if (accessEntry != nullptr) *accessEntry = *found;
    return 1;
  } catch (const std::bad_alloc&) {
    return kVacmOutOfMemory;
  }
}

int IsHaveView(std::string_view viewName, std::span<const std::uint32_t> oid) {
  try {
    std::shared_lock lock(g_vacmMutex);
    return DecideByView(TablesForReading(), viewName, oid);
  } catch (const std::bad_alloc&) {
    return kVacmOutOfMemory;
  }
}

bool CheckForOidInFamilyOfViews(std::span<const std::uint32_t> oid,
                                const VacmViewTreeFamilyEntry& family) {
  const Oid& subtree = family.subtree;
  if (oid.size() < subtree.size()) return false;
  for (std::size_t i = 0; i < subtree.size(); ++i) {
    std::size_t digit = i / 4;
    // Digits past the end of the mask count as 'f': every such sub-identifier is significant.
    bool significant = digit >= family.mask.size() ||
                       ((HexDigitValue(family.mask[digit]) >> (3 - i % 4)) & 1) != 0;
    if (significant && subtree[i] != oid[i]) return false;
  }
  return true;
}

}  // namespace tessel
