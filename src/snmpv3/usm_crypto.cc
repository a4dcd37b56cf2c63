#include "snmpv3/usm_crypto.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/params.h>
#include <openssl/provider.h>
#include <openssl/rand.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <ctime>
#include <initializer_list>
#include <memory>
#include <mutex>
#include <shared_mutex>
#include <unordered_map>

#include "engine/log.h"

namespace tessel {
namespace {

struct MdCtxFree {
  void operator()(EVP_MD_CTX* ctx) const { EVP_MD_CTX_free(ctx); }
};
struct MacCtxFree {
  void operator()(EVP_MAC_CTX* ctx) const { EVP_MAC_CTX_free(ctx); }
};
struct CipherCtxFree {
  void operator()(EVP_CIPHER_CTX* ctx) const { EVP_CIPHER_CTX_free(ctx); }
};
using MdCtxPtr = std::unique_ptr<EVP_MD_CTX, MdCtxFree>;
using MacCtxPtr = std::unique_ptr<EVP_MAC_CTX, MacCtxFree>;
using CipherCtxPtr = std::unique_ptr<EVP_CIPHER_CTX, CipherCtxFree>;

constexpr std::size_t kExpandedPasswordLength = 1048576;

// Algorithms fetched once from the default library context. They stay loaded for the life of the
// process (OpenSSL releases them at exit), so the struct has no destructor.
struct DefaultAlgorithms {
  EVP_MD* md5 = EVP_MD_fetch(nullptr, "MD5", nullptr);
  EVP_MD* sha1 = EVP_MD_fetch(nullptr, "SHA1", nullptr);
  EVP_CIPHER* aes128Cfb = EVP_CIPHER_fetch(nullptr, "AES-128-CFB", nullptr);
  // HMAC contexts with their digest already set; each digest duplicates one and adds the key.
  EVP_MAC_CTX* hmacMd5 = nullptr;
  EVP_MAC_CTX* hmacSha1 = nullptr;

  DefaultAlgorithms() {
    EVP_MAC* hmac = EVP_MAC_fetch(nullptr, "HMAC", nullptr);
    hmacMd5 = NewHmacTemplate(hmac, "MD5");
    hmacSha1 = NewHmacTemplate(hmac, "SHA1");
    EVP_MAC_free(hmac);  // the contexts hold their own references
    if (!md5 || !sha1 || !aes128Cfb || !hmacMd5 || !hmacSha1) {
      LOG_ERROR("USM: OpenSSL lacks MD5, SHA-1, AES-128-CFB or HMAC\n");
    }
  }

  static EVP_MAC_CTX* NewHmacTemplate(EVP_MAC* hmac, const char* digest) {
    if (hmac == nullptr) return nullptr;
    EVP_MAC_CTX* ctx = EVP_MAC_CTX_new(hmac);
    OSSL_PARAM params[] = {
        OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, const_cast<char*>(digest), 0),
        OSSL_PARAM_construct_end()};
    if (ctx != nullptr && EVP_MAC_CTX_set_params(ctx, params) != 1) {
      EVP_MAC_CTX_free(ctx);
      return nullptr;
    }
    return ctx;
  }
};

const DefaultAlgorithms& Algorithms() {
  static const DefaultAlgorithms algorithms;
  return algorithms;
}

// Single DES lives only in OpenSSL's legacy provider. Loading it into a private library context
// keeps it out of the default context that the rest of the process uses. Kept for the process.
struct DesAlgorithm {
  OSSL_LIB_CTX* context = nullptr;
  EVP_CIPHER* desCbc = nullptr;

  DesAlgorithm() {
    context = OSSL_LIB_CTX_new();
    if (context != nullptr && OSSL_PROVIDER_load(context, "legacy") != nullptr &&
        OSSL_PROVIDER_load(context, "default") != nullptr) {
      desCbc = EVP_CIPHER_fetch(context, "DES-CBC", nullptr);
    }
    if (desCbc == nullptr) {
      LOG_ERROR("USM: DES-CBC is unavailable (OpenSSL legacy provider not loaded)\n");
    }
  }
};

const EVP_CIPHER* DesCbc() {
  static const DesAlgorithm des;
  return des.desCbc;
}

const EVP_MD* Hash(AuthProtocol auth) {
  if (auth == AuthProtocol::kMd5) return Algorithms().md5;
  if (auth == AuthProtocol::kSha) return Algorithms().sha1;
  return nullptr;
}

std::atomic<std::uint64_t> kuComputations{0};

// Hashes the concatenation of the parts. Empty on failure.
std::string HashParts(AuthProtocol auth, std::initializer_list<std::string_view> parts) {
  const EVP_MD* md = Hash(auth);
  MdCtxPtr ctx(EVP_MD_CTX_new());
  if (md == nullptr || !ctx || EVP_DigestInit_ex(ctx.get(), md, nullptr) != 1) return {};
  for (std::string_view part : parts) {
    if (EVP_DigestUpdate(ctx.get(), part.data(), part.size()) != 1) return {};
  }
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  if (EVP_DigestFinal_ex(ctx.get(), digest, &length) != 1) return {};
  return std::string(reinterpret_cast<const char*>(digest), length);
}

// A cache of keys by an opaque string. Readers share the lock; a miss is computed outside it, so
// two threads may both compute the same value once and the first insert wins.
class KeyCache {
 public:
  bool Find(const std::string& key, std::string* value) const {
    std::shared_lock lock(mutex_);
    auto it = entries_.find(key);
    if (it == entries_.end()) return false;
    *value = it->second;
    return true;
  }
  std::string Insert(std::string key, std::string value) {
    std::unique_lock lock(mutex_);
    return entries_.try_emplace(std::move(key), std::move(value)).first->second;
  }
  void Clear() {
    std::unique_lock lock(mutex_);
    entries_.clear();
  }

 private:
  mutable std::shared_mutex mutex_;
  std::unordered_map<std::string, std::string> entries_;
};

KeyCache& KuCache() {
  static KeyCache cache;
  return cache;
}
KeyCache& LocalKeyCache() {
  static KeyCache cache;
  return cache;
}

std::string CachedPasswordToKey(std::string_view password, AuthProtocol auth) {
  std::string cacheKey(1, static_cast<char>(auth));
  cacheKey.append(password);
  std::string ku;
  if (KuCache().Find(cacheKey, &ku)) return ku;
  ku = PasswordToKey(password, auth);
  if (ku.empty()) return ku;
  return KuCache().Insert(std::move(cacheKey), std::move(ku));
}

void PutBigEndian32(std::uint32_t value, std::uint8_t* out) {
  out[0] = static_cast<std::uint8_t>(value >> 24);
  out[1] = static_cast<std::uint8_t>(value >> 16);
  out[2] = static_cast<std::uint8_t>(value >> 8);
  out[3] = static_cast<std::uint8_t>(value);
}

// The next salt counter value. Starting from a random value makes a salt repeat across restarts
// (engine boots unchanged) unlikely; the increment makes it impossible within the process.
std::uint64_t NextSaltCounter() {
  static std::atomic<std::uint64_t> counter{[] {
    std::uint64_t start = 0;
    if (RAND_bytes(reinterpret_cast<unsigned char*>(&start), sizeof start) != 1) {
      LOG_ERROR("USM: RAND_bytes failed; the salt counter starts from the clock\n");
      start = static_cast<std::uint64_t>(std::time(nullptr)) << 32;
    }
    return start;
  }()};
  return counter.fetch_add(1, std::memory_order_relaxed);
}

// One pass of a cipher without padding. The output has the input's length.
bool RunCipher(const EVP_CIPHER* cipher, bool encrypt, const std::uint8_t* key,
               const std::uint8_t* iv, const std::uint8_t* in, std::size_t length,
               std::vector<std::uint8_t>* out) {
  CipherCtxPtr ctx(EVP_CIPHER_CTX_new());
  if (cipher == nullptr || !ctx || length > static_cast<std::size_t>(INT32_MAX)) return false;
  if (EVP_CipherInit_ex2(ctx.get(), cipher, key, iv, encrypt ? 1 : 0, nullptr) != 1) return false;
  EVP_CIPHER_CTX_set_padding(ctx.get(), 0);
  out->resize(length + static_cast<std::size_t>(EVP_CIPHER_get_block_size(cipher)));
  int written = 0;
  int finalWritten = 0;
  if (EVP_CipherUpdate(ctx.get(), out->data(), &written, in, static_cast<int>(length)) != 1 ||
      EVP_CipherFinal_ex(ctx.get(), out->data() + written, &finalWritten) != 1) {
    out->clear();
    return false;
  }
  out->resize(static_cast<std::size_t>(written) + static_cast<std::size_t>(finalWritten));
  return out->size() == length;
}

// DES-CBC: key = privKey[0..8), IV = privKey[8..16) XOR salt.
bool DesCipher(bool encrypt, std::string_view privKey, const std::uint8_t salt[kUsmSaltLength],
               const std::uint8_t* in, std::size_t length, std::vector<std::uint8_t>* out) {
  const auto* key = reinterpret_cast<const std::uint8_t*>(privKey.data());
  std::uint8_t iv[8];
  for (std::size_t i = 0; i < 8; ++i) iv[i] = key[8 + i] ^ salt[i];
  return RunCipher(DesCbc(), encrypt, key, iv, in, length, out);
}

// AES-128-CFB: IV = boots || time (big-endian) || salt.
bool AesCipher(bool encrypt, std::string_view privKey, std::uint32_t boots, std::uint32_t time,
               const std::uint8_t salt[kUsmSaltLength], const std::uint8_t* in, std::size_t length,
               std::vector<std::uint8_t>* out) {
  std::uint8_t iv[16];
  PutBigEndian32(boots, iv);
  PutBigEndian32(time, iv + 4);
  std::copy(salt, salt + kUsmSaltLength, iv + 8);
  return RunCipher(Algorithms().aes128Cfb, encrypt,
                   reinterpret_cast<const std::uint8_t*>(privKey.data()), iv, in, length, out);
}

// Writes "00 " for every two hex digits the value lacks to reach 8, then the value and a space.
void WritePaddedHex(std::FILE* file, std::uint32_t value, const char* format) {
  int digits = std::snprintf(nullptr, 0, "%x", value);
  for (int i = 0; i < (8 - digits) / 2; ++i) std::fputs("00 ", file);
  std::fprintf(file, format, value);
  std::fputc(' ', file);
}

// At debug level 3, records the last AES IV in ./IV.txt for whoever debugs a peer's decryption.
void TraceAesIv(std::uint32_t boots, std::uint32_t time, const std::uint8_t salt[kUsmSaltLength]) {
  if (DebugLevel() != 3) return;
  static std::mutex fileMutex;
  std::lock_guard<std::mutex> lock(fileMutex);
  std::FILE* file = std::fopen("IV.txt", "w+");
  if (file == nullptr) return;
  WritePaddedHex(file, boots, "%02x");
  WritePaddedHex(file, time, "%x");
  for (std::size_t i = 0; i < kUsmSaltLength; ++i) std::fprintf(file, "%02x ", salt[i]);
  std::fclose(file);
}

bool IsPrivacyUsable(PrivProtocol priv, std::string_view privKey, std::size_t length) {
  if (priv != PrivProtocol::kDes && priv != PrivProtocol::kAes128) return false;
  if (privKey.size() < kUsmPrivKeyLength) {
    LOG_ERROR("USM: privacy key of %zu octets is too short\n", privKey.size());
    return false;
  }
  return length > 0;
}

bool SameOid(std::span<const std::uint32_t> oid, const ProtocolOid& expected) {
  return std::equal(oid.begin(), oid.end(), expected.begin(), expected.end());
}

}  // namespace

std::uint8_t GetProtocolType(std::span<const std::uint32_t> authOid,
                             std::span<const std::uint32_t> privOid, AuthProtocol* auth,
                             PrivProtocol* priv) {
  *auth = AuthProtocol::kNone;
  *priv = PrivProtocol::kNone;
  if (SameOid(authOid, kUsmNoAuthProtocol)) return kNoAuthNoPriv;
  AuthProtocol foundAuth;
  if (SameOid(authOid, kUsmHmacMd5AuthProtocol)) {
    foundAuth = AuthProtocol::kMd5;
  } else if (SameOid(authOid, kUsmHmacShaAuthProtocol)) {
    foundAuth = AuthProtocol::kSha;
  } else {
    return kInvalidSecurityLevel;
  }
  PrivProtocol foundPriv;
  if (SameOid(privOid, kUsmNoPrivProtocol)) {
    foundPriv = PrivProtocol::kNone;
  } else if (SameOid(privOid, kUsmDesPrivProtocol)) {
    foundPriv = PrivProtocol::kDes;
  } else if (SameOid(privOid, kUsmAesCfb128Protocol)) {
    foundPriv = PrivProtocol::kAes128;
  } else {
    return kInvalidSecurityLevel;
  }
  *auth = foundAuth;
  *priv = foundPriv;
  return foundPriv == PrivProtocol::kNone ? kAuthNoPriv : kAuthPriv;
}

const ProtocolOid& AuthProtocolOid(AuthProtocol auth) {
  if (auth == AuthProtocol::kMd5) return kUsmHmacMd5AuthProtocol;
  if (auth == AuthProtocol::kSha) return kUsmHmacShaAuthProtocol;
  return kUsmNoAuthProtocol;
}

const ProtocolOid& PrivProtocolOid(PrivProtocol priv) {
  if (priv == PrivProtocol::kDes) return kUsmDesPrivProtocol;
  if (priv == PrivProtocol::kAes128) return kUsmAesCfb128Protocol;
  return kUsmNoPrivProtocol;
}

std::size_t AuthKeyLength(AuthProtocol auth) {
  if (auth == AuthProtocol::kMd5) return 16;
  if (auth == AuthProtocol::kSha) return 20;
  return 0;
}

std::string PasswordToKey(std::string_view password, AuthProtocol auth) {
  const EVP_MD* md = Hash(auth);
  if (md == nullptr || password.empty()) return {};
  kuComputations.fetch_add(1, std::memory_order_relaxed);
  // The expansion is the password repeated; hashing whole repetitions in large chunks gives the
  // same stream as the RFC's 64-octet steps at a fraction of the calls.
  std::string chunk;
  std::size_t repetitions = std::max<std::size_t>(1, 4096 / password.size());
  chunk.reserve(repetitions * password.size());
  for (std::size_t i = 0; i < repetitions; ++i) chunk.append(password);
  MdCtxPtr ctx(EVP_MD_CTX_new());
  if (!ctx || EVP_DigestInit_ex(ctx.get(), md, nullptr) != 1) return {};
  for (std::size_t done = 0; done < kExpandedPasswordLength;) {
    std::size_t step = std::min(chunk.size(), kExpandedPasswordLength - done);
    if (EVP_DigestUpdate(ctx.get(), chunk.data(), step) != 1) return {};
    done += step;
  }
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  if (EVP_DigestFinal_ex(ctx.get(), digest, &length) != 1) return {};
  return std::string(reinterpret_cast<const char*>(digest), length);
}

std::string LocalizeKey(std::string_view ku, AuthProtocol auth, std::string_view engineId) {
  if (ku.size() != AuthKeyLength(auth) || ku.empty()) return {};
  return HashParts(auth, {ku, engineId, ku});
}

std::string PasswordToLocalKey(std::string_view password, AuthProtocol auth,
                               std::string_view engineId) {
  return LocalizeKey(PasswordToKey(password, auth), auth, engineId);
}

std::string GetLocalKeyValue(std::string_view password, AuthProtocol auth,
                             std::string_view engineId) {
  if (AuthKeyLength(auth) == 0 || password.empty()) return {};
  // Length-prefixed engine ID: no two (engine ID, password) pairs share a cache key.
  std::string cacheKey(1, static_cast<char>(auth));
  std::uint8_t engineIdLength[4];
  PutBigEndian32(static_cast<std::uint32_t>(engineId.size()), engineIdLength);
  cacheKey.append(reinterpret_cast<const char*>(engineIdLength), 4);
  cacheKey.append(engineId).append(password);
  std::string key;
  if (LocalKeyCache().Find(cacheKey, &key)) return key;
  key = LocalizeKey(CachedPasswordToKey(password, auth), auth, engineId);
  if (key.empty()) return key;
  return LocalKeyCache().Insert(std::move(cacheKey), std::move(key));
}

void ClearLocalKeyCache() { LocalKeyCache().Clear(); }

std::uint64_t KuComputationCount() { return kuComputations.load(); }

bool CalculateDigest(AuthProtocol auth, std::string_view key, const std::uint8_t* data,
                     std::size_t length, std::uint8_t out[kUsmDigestLength]) {
  const EVP_MAC_CTX* hmacTemplate = auth == AuthProtocol::kMd5   ? Algorithms().hmacMd5
                                    : auth == AuthProtocol::kSha ? Algorithms().hmacSha1
                                                                 : nullptr;
  if (hmacTemplate == nullptr || key.size() != AuthKeyLength(auth) || data == nullptr ||
      length == 0) {
    LOG_ERROR("Insufficient parameters to calculate Digest. !!!\n");
    return false;
  }
  MacCtxPtr ctx(EVP_MAC_CTX_dup(hmacTemplate));
  unsigned char digest[EVP_MAX_MD_SIZE];
  std::size_t digestLength = 0;
  if (!ctx ||
      EVP_MAC_init(ctx.get(), reinterpret_cast<const unsigned char*>(key.data()), key.size(),
                   nullptr) != 1 ||
      EVP_MAC_update(ctx.get(), data, length) != 1 ||
      EVP_MAC_final(ctx.get(), digest, &digestLength, sizeof digest) != 1 ||
      digestLength < kUsmDigestLength) {
    LOG_ERROR("Digest calculation is failed.\n");
    return false;
  }
  std::copy(digest, digest + kUsmDigestLength, out);
  return true;
}

bool DigestsEqual(const std::uint8_t a[kUsmDigestLength], const std::uint8_t b[kUsmDigestLength]) {
  return CRYPTO_memcmp(a, b, kUsmDigestLength) == 0;
}

bool EncryptScopedPdu(PrivProtocol priv, std::string_view privKey, std::uint32_t engineBoots,
                      std::uint32_t engineTime, const std::uint8_t* plain, std::size_t length,
                      std::vector<std::uint8_t>* cipher, std::uint8_t salt[kUsmSaltLength]) {
  if (!IsPrivacyUsable(priv, privKey, length)) return false;
  std::uint64_t counter = NextSaltCounter();
  if (priv == PrivProtocol::kDes) {
    PutBigEndian32(engineBoots, salt);
    PutBigEndian32(static_cast<std::uint32_t>(counter), salt + 4);
    std::vector<std::uint8_t> padded(plain, plain + length);
    padded.resize((length + 7) / 8 * 8, 0);
    if (DesCipher(true, privKey, salt, padded.data(), padded.size(), cipher)) return true;
    LOG_ERROR("USM: DES encryption failed\n");
    return false;
  }
  PutBigEndian32(static_cast<std::uint32_t>(counter >> 32), salt);
  PutBigEndian32(static_cast<std::uint32_t>(counter), salt + 4);
  TraceAesIv(engineBoots, engineTime, salt);
  if (AesCipher(true, privKey, engineBoots, engineTime, salt, plain, length, cipher)) return true;
  LOG_ERROR("USM: AES encryption failed\n");
  return false;
}

bool DecryptScopedPdu(PrivProtocol priv, std::string_view privKey, std::uint32_t engineBoots,
                      std::uint32_t engineTime, const std::uint8_t salt[kUsmSaltLength],
                      const std::uint8_t* cipher, std::size_t length,
                      std::vector<std::uint8_t>* plain) {
  if (!IsPrivacyUsable(priv, privKey, length)) return false;
  if (priv == PrivProtocol::kDes) {
    if (length % 8 != 0) {
      LOG_ERROR("Decrypt is failed !!!\n");
      return false;
    }
    return DesCipher(false, privKey, salt, cipher, length, plain);
  }
  return AesCipher(false, privKey, engineBoots, engineTime, salt, cipher, length, plain);
}

}  // namespace tessel
