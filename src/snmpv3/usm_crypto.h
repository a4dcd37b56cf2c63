// The cryptography of the user-based security model (RFC 3414, RFC 3826): protocol codes and
// identifiers, password-to-key localisation with a key cache, HMAC-MD5-96 / HMAC-SHA-96 digests,
// DES-CBC and AES-128-CFB privacy with a salt that is unique per encryption.
// Every function is safe to call concurrently from any thread; nothing here keeps a pointer to
// its arguments. Keys and ciphertexts are returned as owned values.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {

// Codes as held in a user entry. The privacy codes continue the authentication codes so that the
// two never collide.
enum class AuthProtocol : std::uint8_t { kNone = 0, kMd5 = 1, kSha = 2 };
enum class PrivProtocol : std::uint8_t { kNone = 3, kDes = 4, kAes128 = 6 };

// Security levels (msgFlags auth and priv bits).
inline constexpr std::uint8_t kNoAuthNoPriv = 0;
inline constexpr std::uint8_t kAuthNoPriv = 1;
inline constexpr std::uint8_t kAuthPriv = 3;
inline constexpr std::uint8_t kInvalidSecurityLevel = 5;

inline constexpr std::size_t kUsmDigestLength = 12;   // msgAuthenticationParameters
inline constexpr std::size_t kUsmSaltLength = 8;      // msgPrivacyParameters
inline constexpr std::size_t kUsmPrivKeyLength = 16;  // DES key + pre-IV, or the AES key

using ProtocolOid = std::array<std::uint32_t, 10>;
inline constexpr ProtocolOid kUsmNoAuthProtocol = {1, 3, 6, 1, 6, 3, 10, 1, 1, 1};
inline constexpr ProtocolOid kUsmHmacMd5AuthProtocol = {1, 3, 6, 1, 6, 3, 10, 1, 1, 2};
inline constexpr ProtocolOid kUsmHmacShaAuthProtocol = {1, 3, 6, 1, 6, 3, 10, 1, 1, 3};
inline constexpr ProtocolOid kUsmNoPrivProtocol = {1, 3, 6, 1, 6, 3, 10, 1, 2, 1};
inline constexpr ProtocolOid kUsmDesPrivProtocol = {1, 3, 6, 1, 6, 3, 10, 1, 2, 2};
inline constexpr ProtocolOid kUsmAesCfb128Protocol = {1, 3, 6, 1, 6, 3, 10, 1, 2, 4};

// Maps the protocol identifiers to codes and returns the security level they allow:
// usmNoAuthProtocol gives kNone/kNone and level 0 whatever the privacy identifier; MD5 or SHA with
// usmNoPrivProtocol gives 1; MD5 or SHA with DES or AES gives 3. Any other identifier gives
// kInvalidSecurityLevel (5); the codes are then kNone.
std::uint8_t GetProtocolType(std::span<const std::uint32_t> authOid,
                             std::span<const std::uint32_t> privOid, AuthProtocol* auth,
                             PrivProtocol* priv);
// The identifiers of the codes (usmUserAuthProtocol, usmUserPrivProtocol column values).
const ProtocolOid& AuthProtocolOid(AuthProtocol auth);
const ProtocolOid& PrivProtocolOid(PrivProtocol priv);

// Key and full digest length of the hash: 16 for MD5, 20 for SHA-1, 0 for none.
std::size_t AuthKeyLength(AuthProtocol auth);

// Ku of RFC 3414 A.2: the password repeated over 1,048,576 octets, hashed. Empty for kNone or an
// empty password (the algorithm is undefined for it).
std::string PasswordToKey(std::string_view password, AuthProtocol auth);
// Kul = H(Ku || engineId || Ku). Empty when Ku does not have the hash's length.
std::string LocalizeKey(std::string_view ku, AuthProtocol auth, std::string_view engineId);
// LocalizeKey(PasswordToKey(...)), uncached.
std::string PasswordToLocalKey(std::string_view password, AuthProtocol auth,
                               std::string_view engineId);

// The localised key through two caches: Kul by (engine ID, password, code), and Ku by (password,
// code), so that localising a known password to a new engine ID costs one small hash instead of
// the 1 MB expansion. Entries live until ClearLocalKeyCache (Kul) or the process ends (Ku).
std::string GetLocalKeyValue(std::string_view password, AuthProtocol auth,
                             std::string_view engineId);
// Forgets the localised keys; the Ku cache depends on nothing else and stays.
void ClearLocalKeyCache();
// How many times PasswordToKey has run the 1 MB expansion in this process (for tests).
std::uint64_t KuComputationCount();

// HMAC-MD5-96 / HMAC-SHA-96: the first 12 octets of the HMAC of data under key. False for kNone,
// a key whose length is not the hash's (16 or 20), or empty data.
bool CalculateDigest(AuthProtocol auth, std::string_view key, const std::uint8_t* data,
                     std::size_t length, std::uint8_t out[kUsmDigestLength]);
// Constant-time comparison of two digests.
bool DigestsEqual(const std::uint8_t a[kUsmDigestLength], const std::uint8_t b[kUsmDigestLength]);

// Encrypts a scoped PDU (privKey: at least 16 octets, the first 16 used) and produces the salt to
// send as msgPrivacyParameters. The salt comes from a process-wide counter that starts at a random
// value, so no two encryptions in a process share one: DES takes boots (big-endian) and the low 32
// bits of the counter, AES the 64-bit counter. DES-CBC pads the plaintext with zero octets to a
// multiple of 8; AES-128-CFB does not pad. engineBoots/engineTime are the values written in the
// message's msgAuthoritativeEngineBoots/Time (they enter the AES IV). False for kNone, a short key,
// empty plaintext, or a cipher that is unavailable (DES without OpenSSL's legacy provider).
bool EncryptScopedPdu(PrivProtocol priv, std::string_view privKey, std::uint32_t engineBoots,
                      std::uint32_t engineTime, const std::uint8_t* plain, std::size_t length,
                      std::vector<std::uint8_t>* cipher, std::uint8_t salt[kUsmSaltLength]);
// The reverse, with boots, time and salt as received. DES refuses a length that is not a multiple
// of 8 (a decryption error). A wrong key yields garbage, not a failure: the caller's parse of the
// plaintext decides.
bool DecryptScopedPdu(PrivProtocol priv, std::string_view privKey, std::uint32_t engineBoots,
                      std::uint32_t engineTime, const std::uint8_t salt[kUsmSaltLength],
                      const std::uint8_t* cipher, std::size_t length,
                      std::vector<std::uint8_t>* plain);

}  // namespace tessel
