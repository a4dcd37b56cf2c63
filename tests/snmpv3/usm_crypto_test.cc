#include "snmpv3/usm_crypto.h"

#include <gtest/gtest.h>

#include <mutex>
#include <set>
#include <thread>

#include "base/conversions.h"

namespace tessel {
namespace {

// Octets from hexadecimal text; spaces are ignored.
std::string Octets(std::string_view hex) {
  std::string out;
  for (std::size_t i = 0; i + 1 < hex.size(); i += hex[i] == ' ' ? 1 : 2)
    if (hex[i] != ' ') out.push_back(static_cast<char>(HexTextToInt(hex.substr(i, 2))));
  return out;
}

const std::uint8_t* Data(std::string_view octets) {
  return reinterpret_cast<const std::uint8_t*>(octets.data());
}
std::string Hex(const std::uint8_t* data, std::size_t length) {
  return BytesToHex(std::string_view(reinterpret_cast<const char*>(data), length));
}

TEST(UsmCryptoTest, PasswordToKeyMatchesRfc3414Samples) {
  const std::string engineId = Octets("00 00 00 00 00 00 00 00 00 00 00 02");
  EXPECT_EQ(BytesToHex(LocalizeKey(PasswordToKey("maplesyrup", AuthProtocol::kMd5),
                                   AuthProtocol::kMd5, engineId)),
            "526f5eed9fcce26f8964c2930787d82b");
  EXPECT_EQ(BytesToHex(PasswordToLocalKey("maplesyrup", AuthProtocol::kSha, engineId)),
            "6695febc9288e36282235fc7151f128497b38f3f");
  // A password longer than one hashing chunk, against an independent computation.
  std::string longPassword;
  for (int i = 0; i < 4099; ++i) longPassword.push_back(static_cast<char>((i * 7 + 3) % 256));
  EXPECT_EQ(BytesToHex(PasswordToKey(longPassword, AuthProtocol::kSha)),
            "d36c78ebd2463a84826c59fe45409fce3e8f31b6");
  EXPECT_TRUE(PasswordToKey("", AuthProtocol::kMd5).empty());
}

TEST(UsmCryptoTest, KeyCacheLocalisesToNewEnginesWithoutExpandingAgain) {
  // Unique per run, so that a repeated run does not find its Ku cached already.
  const std::string password = "cache-test-" + std::to_string(KuComputationCount());
  const std::uint64_t before = KuComputationCount();
  std::string keyA = GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-A");
  std::string keyB = GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-B");
  ClearLocalKeyCache();
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-A"), keyA);
  EXPECT_EQ(KuComputationCount(), before + 1);  // one expansion served both engines
  EXPECT_EQ(keyA, PasswordToLocalKey(password, AuthProtocol::kMd5, "engine-A"));
  EXPECT_EQ(keyB, PasswordToLocalKey(password, AuthProtocol::kMd5, "engine-B"));
  // The protocol is part of the key: SHA needs its own expansion and gives 20 octets.
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kSha, "engine-A").size(), 20u);
}

// The digest in hexadecimal, or "<refused>".
std::string Digest(AuthProtocol auth, const std::string& key, std::string_view data) {
  std::uint8_t out[kUsmDigestLength];
  return CalculateDigest(auth, key, Data(data), data.size(), out) ? Hex(out, sizeof out)
                                                                  : "<refused>";
}

TEST(UsmCryptoTest, DigestMatchesRfc2202AndComparesAllOctets) {
  EXPECT_EQ(Digest(AuthProtocol::kMd5, std::string(16, '\x0b'), "Hi There"),
            "9294727a3638bb1c13f48ef8");
  EXPECT_EQ(Digest(AuthProtocol::kSha, std::string(20, '\xaa'), std::string(50, '\xdd')),
            "125d7342b9ac11cd91a39af4");
  EXPECT_EQ(Digest(AuthProtocol::kMd5, std::string(20, 'k'), "abc"), "<refused>");
  std::uint8_t a[kUsmDigestLength] = {}, b[kUsmDigestLength] = {};
  EXPECT_TRUE(DigestsEqual(a, b));
  b[11] ^= 1;
  EXPECT_FALSE(DigestsEqual(a, b));
}

// The plaintext, or "<refused>" when decryption fails.
std::string Decrypt(PrivProtocol priv, std::string_view key, std::uint32_t boots,
                    std::uint32_t time, const std::uint8_t* salt, std::string_view cipher) {
  std::vector<std::uint8_t> plain;
  return DecryptScopedPdu(priv, key, boots, time, salt, Data(cipher), cipher.size(), &plain)
             ? std::string(plain.begin(), plain.end())
             : "<refused>";
}

struct Encryption {
  std::uint8_t salt[kUsmSaltLength];
  std::string cipher;
};
Encryption Encrypt(PrivProtocol priv, std::string_view key, std::uint32_t boots, std::uint32_t time,
                   std::string_view plain) {
  Encryption result{};
  std::vector<std::uint8_t> cipher;
  EXPECT_TRUE(
      EncryptScopedPdu(priv, key, boots, time, Data(plain), plain.size(), &cipher, result.salt));
  result.cipher.assign(cipher.begin(), cipher.end());
  return result;
}

TEST(UsmCryptoTest, CiphersDecryptKnownVectors) {
  // DES key 0123456789abcdef, pre-IV 1234567890abcdef; a zero salt leaves the IV as the pre-IV.
  const std::string desKey = Octets("0123456789abcdef 1234567890abcdef");
  const std::uint8_t zeroSalt[kUsmSaltLength] = {};
  const std::string des = Octets("e5c7cdde872bf27c 43e934008c389c0f 683788499a7c05f6");
  EXPECT_EQ(Decrypt(PrivProtocol::kDes, desKey, 0, 0, zeroSalt, des), "Now is the time for all ");
  EXPECT_EQ(Decrypt(PrivProtocol::kDes, desKey, 0, 0, zeroSalt, des.substr(1)), "<refused>");
  // CFB128-AES128 encryption sample; its IV 000102..0f is boots 00010203, time 04050607, salt.
  const std::string aesKey = Octets("2b7e151628aed2a6abf7158809cf4f3c");
  const std::uint8_t aesSalt[kUsmSaltLength] = {8, 9, 10, 11, 12, 13, 14, 15};
  const std::string aes = Octets(
      "3b3fd92eb72dad20333449f8e83cfb4a c8a64537a0b3a93fcde3cdad9f1ce58b"
      "26751f67a3cbb140b1808cf187a4f4df c04b05357c5d1c0eeac4c66f9ff7f2e6");
  EXPECT_EQ(
      BytesToHex(Decrypt(PrivProtocol::kAes128, aesKey, 0x00010203, 0x04050607, aesSalt, aes)),
      "6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
      "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710");
}

// Both ciphers from several threads at once: every encryption decrypts again, and no two share a
// salt.
TEST(UsmCryptoTest, ConcurrentEncryptionsRoundTripWithSaltsOfTheirOwn) {
  const std::string key(20, 'p');  // a SHA-localised key: the first 16 octets are used
  const std::string plain = "scoped pdu 13";
  std::mutex mutex;
  std::set<std::string> salts;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, des = t % 2 == 1] {
      const PrivProtocol priv = des ? PrivProtocol::kDes : PrivProtocol::kAes128;
      for (int i = 0; i < 200; ++i) {
        Encryption e = Encrypt(priv, key, 0x01020304, 77, plain);
        // DES pads to whole blocks and starts its salt with the boots; AES takes boots and time
        // into its IV instead, so that another time decrypts to something else.
        const std::string decrypted = Decrypt(priv, key, 0x01020304, 77, e.salt, e.cipher);
        EXPECT_EQ(decrypted, des ? plain + std::string(3, '\0') : plain);
        EXPECT_EQ(Hex(e.salt, 4) == "01020304", des);
        EXPECT_EQ(Decrypt(priv, key, 0x01020304, 78, e.salt, e.cipher) == decrypted, des);
        std::lock_guard<std::mutex> lock(mutex);
        salts.insert(Hex(e.salt + 4, 4));  // the part DES and AES both count
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(salts.size(), 800u);
}

}  // namespace
}  // namespace tessel
