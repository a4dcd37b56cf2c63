// View-based access control for SNMPv3 (RFC 3415): the context, security-to-group, access and
// view tree family tables that the host fills, the two ordered decision lists rebuilt from the
// access and view tables on the host's request, and the decision whether a principal may read,
// write or be notified of one object instance.
//
// Threading: one reader-writer lock guards everything. Decisions take it shared and run from
// any number of request threads at once; adding rows, rebuilding the lists and freeing take it
// exclusively. Returned values are copies, never pointers into the tables.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "base/conversions.h"

namespace tessel {

// Security levels as held everywhere in these tables.
inline constexpr int kVacmNoAuthNoPriv = 0;
inline constexpr int kVacmAuthNoPriv = 1;
inline constexpr int kVacmAuthPriv = 3;
// Security model 0 in an access row serves every model; 3 is USM.
inline constexpr int kVacmAnySecurityModel = 0;
inline constexpr int kVacmUsmSecurityModel = 3;
inline constexpr int kVacmContextExact = 1;
inline constexpr int kVacmContextPrefix = 2;
inline constexpr int kVacmViewIncluded = 1;
inline constexpr int kVacmViewExcluded = 2;
// Only rows with this rowStatus take part in decisions.
inline constexpr int kVacmRowActive = 1;

// Results of the decision and of the table operations.
inline constexpr int kVacmAllowed = 1;
inline constexpr int kVacmRowAdded = 1;
inline constexpr int kVacmRefused = 0;  // a table row with a bad value
inline constexpr int kVacmGenErr = 5;   // also "excluded" from IsHaveView
inline constexpr int kVacmAuthorizationError = 16;
inline constexpr int kVacmOutOfMemory = 99;

// Names are octet strings: std::string holds any octets, the empty name included.
struct VacmContextEntry {
  std::string contextName;
};

struct VacmSecurityToGroupEntry {
  std::int32_t securityModel = 0;
  std::string securityName;
  std::string groupName;  // 1 to 32 octets
  std::int32_t storageType = 0;
  std::int32_t rowStatus = kVacmRowActive;
};

struct VacmAccessEntry {
  std::string groupName;
  std::string contextPrefix;
  std::int32_t securityModel = 0;
  std::int32_t securityLevel = kVacmNoAuthNoPriv;
  std::int32_t contextMatch = kVacmContextExact;
  std::string readViewName;  // each view name 0 to 32 octets; empty = no access
  std::string writeViewName;
  std::string notifyViewName;
  std::int32_t storageType = 0;
  std::int32_t rowStatus = kVacmRowActive;
};

struct VacmViewTreeFamilyEntry {
  std::string viewName;
  Oid subtree;
  std::string mask;  // at most 16 hexadecimal digits; missing digits count as 'f'
  std::int32_t type = kVacmViewIncluded;
  std::int32_t storageType = 0;
  std::int32_t rowStatus = kVacmRowActive;
};

// --- Table life cycle -------------------------------------------------------------------------

bool VacmTablesExist();
// Creates the four tables and the two lists empty unless they exist already: the host may add
// rows before the SNMP service starts, and those rows are kept.
void InitVacmTables();
// Drops every row and both lists; the tables no longer exist afterwards.
void FreeVacmTables();

// --- Adding rows (the tables are created on the first row) -------------------------------------
// Each returns 1 when the row was appended, 0 when a value is refused (logged), 99 when memory
// ran out. rowStatus must be 1, 2, 3 or 5; rows that are not active (1) are kept but never used.

int CreateAndAddSnmpVacmContextTableEntry(std::string_view contextName);
// groupName must have 1 to 32 octets.
int CreateAndAddSnmpVacmSecurityToGroupTableEntry(int securityModel, std::string_view securityName,
                                                  std::string_view groupName, int storageType,
                                                  int rowStatus = kVacmRowActive);
// securityLevel 0, 1 or 3; contextMatch 1 (exact) or 2 (prefix); groupName 1 to 32 octets; view
// names at most 32 octets.
int CreateAndAddNewSnmpVacmAccessTableEntry(std::string_view groupName,
                                            std::string_view contextPrefix, int securityModel,
                                            int securityLevel, int contextMatch,
                                            std::string_view readView, std::string_view writeView,
                                            std::string_view notifyView, int storageType,
                                            int rowStatus = kVacmRowActive);
// subtreeText is dotted ("1.3.6.1" or ".1.3.6.1"); maskHex is at most 16 hexadecimal digits, ""
// meaning all ones; type 1 (included) or 2 (excluded).
int CreateAndAddSnmpVacmViewTreeFamilyTableEntry(std::string_view viewName,
                                                 std::string_view subtreeText,
                                                 std::string_view maskHex, int type,
                                                 int storageType, int rowStatus = kVacmRowActive);

// --- Decision lists ---------------------------------------------------------------------------
// Rebuild the access list and the view list from their tables. Access and view rows added after
// the last rebuild take part in decisions only after the next one; contexts and groups are read
// from their tables directly and count at once. On memory exhaustion the old list stays.

void CreateLCDVacmAccessTable();
void CreateLCDVacmViewTreeFamilyTable();

// --- Decisions --------------------------------------------------------------------------------

// May the principal touch the object instance `oid` with a PDU of pduType (0xA0..0xA7)?
// Returns 1 (allowed), 16 (authorizationError) or 5 (genErr: memory ran out).
// viewCache carries the view chosen for an earlier varbind of the same request: when it is
// non-empty on entry, the context, group, access and view-name steps are skipped and that view
// alone decides; otherwise the chosen view name is stored there (even when the view then
// refuses the OID). nullptr means no cache.
int IsAccessAllowed(std::string_view contextName, std::string_view securityName, int securityModel,
                    int securityLevel, std::uint8_t pduType, std::span<const std::uint32_t> oid,
                    std::string* viewCache);

// True when the context table holds exactly this name.
bool IsValidContext(std::string_view contextName);
// True, with the group of the first active row of that model and name in table order.
bool IsValidSecurityToGroupName(int securityModel, std::string_view securityName,
                                std::string* groupName);
// The first active row of the access list for the group whose model is the message's or 0,
// whose context prefix matches (exactly or as a prefix, as the row says) and whose level is at
// most the message's. 1 found (copied to *accessEntry when not null), 0 none, 99 out of memory.
int IsHaveAccess(std::string_view groupName, std::string_view contextName, int securityModel,
                 int securityLevel, VacmAccessEntry* accessEntry);
// Among the active families of the view in the view list that contain the OID, the one with the
// longest subtree decides (ties: the lexicographically greatest subtree, then list order).
// 1 included, 5 excluded, 16 no family contains the OID, 99 out of memory.
int IsHaveView(std::string_view viewName, std::span<const std::uint32_t> oid);
// True when the OID lies in the family: it is at least as long as the subtree, and agrees with
// it wherever the mask bit is 1 (bit i = sub-identifier i, bit 0 the most significant bit of the
// first mask octet; missing mask digits are 'f').
bool CheckForOidInFamilyOfViews(std::span<const std::uint32_t> oid,
                                const VacmViewTreeFamilyEntry& family);

// Access-list ordering: true when `added` is placed after `existing`. Exposed for tests.
bool VacmAccessEntryGoesAfter(const VacmAccessEntry& added, const VacmAccessEntry& existing);

}  // namespace tessel
