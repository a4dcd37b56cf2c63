#include "snmpv3/usm_users.h"

#include <mutex>
#include <new>
#include <shared_mutex>
#include <unordered_map>
#include <vector>

#include "engine/log.h"

namespace tessel {
namespace {

// Users in the order they were added (the usmUserTable order of the host), with an index by
// (engine ID, user name). Rows are never removed one by one, so indexes stay valid.
struct UserTable {
  std::shared_mutex mutex;
  std::vector<UsmUser> users;
  std::unordered_map<std::string, std::size_t> index;
};

UserTable& Table() {
  static UserTable table;
  return table;
}

// The engine ID is length-prefixed so that no two (engine ID, name) pairs share a key.
std::string IndexKey(std::string_view engineId, std::string_view userName) {
  std::string key = std::to_string(engineId.size());
  key.push_back(':');
  key.append(engineId).append(userName);
  return key;
}

const ProtocolOid* AuthOidByName(std::string_view name) {
  if (name == "NO_AUTH") return &kUsmNoAuthProtocol;
  if (name == "MD5_AUTH") return &kUsmHmacMd5AuthProtocol;
  if (name == "SHA_AUTH") return &kUsmHmacShaAuthProtocol;
  return nullptr;
}

const ProtocolOid* PrivOidByName(std::string_view name) {
  if (name == "NO_PRIV") return &kUsmNoPrivProtocol;
  if (name == "CBC_DES") return &kUsmDesPrivProtocol;
  if (name == "CFB_AES_128") return &kUsmAesCfb128Protocol;
  return nullptr;
}

// Fills the protocols, level and keys from the names and passwords. False when the combination is
// unusable: an unknown name, privacy without authentication, or a needed password missing.
bool SetProtocols(UsmUser* user, std::string_view authName, std::string_view privName) {
  const ProtocolOid* authOid = AuthOidByName(authName);
  const ProtocolOid* privOid = PrivOidByName(privName);
  if (authOid == nullptr || privOid == nullptr) return false;
  // Privacy keys are localised with the authentication hash, so privacy needs authentication.
  if (*authOid == kUsmNoAuthProtocol && *privOid != kUsmNoPrivProtocol) return false;
  user->securityLevel = GetProtocolType(*authOid, *privOid, &user->auth, &user->priv);
  if (user->securityLevel == kInvalidSecurityLevel) return false;
  if (user->auth == AuthProtocol::kNone) return true;
  if (user->authPassword.empty()) return false;
  user->authKey = GetLocalKeyValue(user->authPassword, user->auth, user->engineId);
  if (user->authKey.empty()) return false;
  if (user->priv == PrivProtocol::kNone) return true;
  if (user->privPassword.empty()) return false;
  user->privKey =
      GetLocalKeyValue(user->privPassword, user->auth, user->engineId).substr(0, kUsmPrivKeyLength);
  return user->privKey.size() == kUsmPrivKeyLength;
}

}  // namespace

int AddUSMUserEntry(std::string_view userName, std::string_view authProtocolName,
                    std::string_view authPassword, std::string_view privProtocolName,
                    std::string_view privPassword, std::string_view engineId) {
  try {
    UsmUser user;
    user.engineId = engineId;
    user.userName = userName;
    user.securityName = userName;
    user.authPassword = authPassword;
    user.privPassword = privPassword;
    // Keys are localised before the lock is taken: a first localisation costs milliseconds.
    if (!SetProtocols(&user, authProtocolName, privProtocolName)) {
      LOG_ERROR("Invalid Protocol type\n");
      return kUsmUserRefused;
    }
    LOG_TRACE("The security level is %d\n", user.securityLevel);
    UserTable& table = Table();
    std::unique_lock lock(table.mutex);
    auto [it, inserted] = table.index.try_emplace(IndexKey(engineId, userName), table.users.size());
    if (!inserted) {
      LOG_ERROR("USM user %.*s already exists for this engine ID\n",
                static_cast<int>(userName.size()), userName.data());
      return kUsmUserRefused;
    }
    try {
      table.users.push_back(std::move(user));
    } catch (const std::bad_alloc&) {
      table.index.erase(it);
      throw;
    }
    return kUsmUserAdded;
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate buffer !!! \n");
    return kUsmUserOutOfMemory;
  }
}

std::optional<UsmUser> GetUsmEntry(std::string_view engineId, std::string_view userName) {
  UserTable& table = Table();
  std::string key = IndexKey(engineId, userName);
  std::shared_lock lock(table.mutex);
  auto it = table.index.find(key);
  if (it == table.index.end() || table.users[it->second].rowStatus != 1) return std::nullopt;
  return table.users[it->second];
}

std::size_t UsmUserCount() {
  UserTable& table = Table();
  std::shared_lock lock(table.mutex);
  return table.users.size();
}

void FreeUsmUsers() {
  UserTable& table = Table();
  {
    std::unique_lock lock(table.mutex);
    table.users.clear();
    table.index.clear();
  }
  ClearLocalKeyCache();
}

}  // namespace tessel
