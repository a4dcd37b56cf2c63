// SNMPv3 for the load generator: engine discovery, key localisation and User-based Security
// Model requests (HMAC-SHA-96 authentication, AES-128-CFB privacy) whose answers are checked and
// decrypted. The message codec is the generator's own, like its v1/v2c codec; OpenSSL's libcrypto
// does the hashing and the cipher.
#pragma once

#include <openssl/evp.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "snmp_wire.h"

namespace tessel::bench::v3 {

using Bytes = std::vector<std::uint8_t>;

// The msgFlags bits a level sets (the reportable bit aside).
enum class Level : std::uint8_t { kNoAuthNoPriv = 0, kAuthNoPriv = 1, kAuthPriv = 3 };

inline constexpr std::size_t kDigestSize = 12;  // HMAC-SHA-96

// The password repeated to 1 MiB and hashed with SHA-1 (20 octets); once per password.
Bytes PasswordToKey(std::string_view password);
// The key for one authoritative engine: SHA-1(key ‖ engineID ‖ key), 20 octets.
Bytes LocalizeKey(const Bytes& key, const Bytes& engineId);

struct Engine {
  Bytes id;
  std::int64_t boots = 0;
  std::int64_t time = 0;
};

// A discovery request: empty engine ID and user, noAuthNoPriv, reportable, a Get of no objects
// whose request-id is the msgID.
Bytes EncodeDiscovery(std::uint32_t messageId);
// The msgID and the authoritative engine of an SNMPv3 message (the Report that answers a
// discovery), without any security check; false when malformed or the engine ID is empty.
bool DecodeEngine(const std::uint8_t* data, std::size_t length, std::uint32_t* messageId,
                  Engine* engine);

// The msgID of an SNMPv3 message, unchecked: which request an answer claims to be for.
bool DecodeMessageId(const std::uint8_t* data, std::size_t length, std::uint32_t* messageId);

struct User {
  std::string name;
  Level level = Level::kAuthPriv;
  Bytes authKey;  // PasswordToKey of the passwords; unused below the level
  Bytes privKey;
};

// One agent's security state: its engine, the keys localised for it, the scoped PDU and the
// OpenSSL contexts reused from message to message. Not thread-safe.
class Peer {
 public:
  // pdu: EncodePduTemplate's request; engineClockNs: when the engine's boots and time were
  // learnt (the caller's monotonic clock). False when a key or context cannot be set up.
  bool Init(const User& user, const Engine& engine, const RequestTemplate& pdu,
            std::int64_t engineClockNs);

  // The request whose msgID and request-id are requestId, engine time advanced to nowNs, salt
  // as the privacy parameters. Returns its size, or 0 when it does not fit capacity.
  std::size_t Encode(std::uint32_t requestId, std::int64_t nowNs, std::uint64_t salt,
                     std::uint8_t* out, std::size_t capacity);

  // An answer: its digest checked, decrypted, decoded up to its error-status. A Report that the
  // agent could not send at the request's level (unauthenticated) is accepted, with the msgID
  // as its request-id, and so is any Report; a Response must carry the request's level and
  // request-id = msgID. reportOid, when given, receives a Report's first variable name.
  bool Decode(const std::uint8_t* data, std::size_t length, ReplySummary* out,
              std::vector<std::uint32_t>* reportOid = nullptr);

 private:
  struct Free {
    void operator()(EVP_MAC_CTX* context) const { EVP_MAC_CTX_free(context); }
    void operator()(EVP_CIPHER_CTX* context) const { EVP_CIPHER_CTX_free(context); }
  };
  bool Digest(const std::uint8_t* data, std::size_t length, std::size_t digestOffset,
              std::uint8_t* digest);
  bool Crypt(EVP_CIPHER_CTX* context, std::int64_t boots, std::int64_t time,
             const std::uint8_t* salt, const std::uint8_t* in, std::size_t length,
             std::uint8_t* out);

  User user_;
  Engine engine_;
  std::int64_t engineClockNs_ = 0;
  RequestTemplate scoped_;  // the scoped PDU, request-id patched per request
  std::unique_ptr<EVP_MAC_CTX, Free> mac_;
  std::unique_ptr<EVP_CIPHER_CTX, Free> encrypt_;
  std::unique_ptr<EVP_CIPHER_CTX, Free> decrypt_;
  Bytes scratch_;
};

}  // namespace tessel::bench::v3
