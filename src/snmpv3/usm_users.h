// The process-wide table of USM users (usmUserTable rows) that the host configures. Safe from any
// thread: adds and lookups take the table's lock, and lookups return copies, so a caller never
// holds a reference into the table. Entries live until FreeUsmUsers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "snmpv3/usm_crypto.h"

namespace tessel {

struct UsmUser {
  std::string engineId;
  std::string userName;
  std::string securityName;
  // Kept so that keys can be localised to other engine IDs.
  std::string authPassword;
  std::string privPassword;
  AuthProtocol auth = AuthProtocol::kNone;
  PrivProtocol priv = PrivProtocol::kNone;
  std::uint8_t securityLevel = kNoAuthNoPriv;  // the highest level the user supports
  // Localised to engineId: authKey has the hash's length (16 or 20), privKey the 16 octets used by
  // DES or AES (localised from privPassword with the authentication hash). Empty when unused.
  std::string authKey;
  std::string privKey;
  std::int32_t storageType = 3;  // nonVolatile
  std::int32_t rowStatus = 1;    // active
};

// Results of AddUSMUserEntry.
inline constexpr int kUsmUserAdded = 1;
inline constexpr int kUsmUserRefused = 0;
inline constexpr int kUsmUserOutOfMemory = 99;

// Adds a host-configured user under engineId with securityName = userName. Protocol names are
// exactly "NO_AUTH", "MD5_AUTH", "SHA_AUTH" and "NO_PRIV", "CBC_DES", "CFB_AES_128". Refused (0,
// "Invalid Protocol type" in the log): an unknown name, privacy without authentication, an empty
// password for a protocol that needs one, or a user name already present under engineId.
// Returns 1 when added, 99 when memory ran out.
int AddUSMUserEntry(std::string_view userName, std::string_view authProtocolName,
                    std::string_view authPassword, std::string_view privProtocolName,
                    std::string_view privPassword, std::string_view engineId);

// A copy of the active user with exactly this name under exactly this engine ID.
std::optional<UsmUser> GetUsmEntry(std::string_view engineId, std::string_view userName);

std::size_t UsmUserCount();
// Empties the table and the localised-key cache.
void FreeUsmUsers();

}  // namespace tessel
