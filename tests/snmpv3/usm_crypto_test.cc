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
  for (std::size_t i = 0; i + 1 < hex.size(); ++i) {
    if (hex[i] == ' ') continue;
    out.push_back(static_cast<char>(std::stoi(std::string(hex.substr(i++, 2)), nullptr, 16)));
  }
  return out;
}

std::string Hex(std::string_view octets) { return BytesToHex(octets); }
std::string Hex(const std::uint8_t* data, std::size_t length) {
  return BytesToHex(std::string_view(reinterpret_cast<const char*>(data), length));
}

const std::string kRfcEngineId = Octets("00 00 00 00 00 00 00 00 00 00 00 02");

TEST(UsmCryptoTest, PasswordToKeyMatchesRfc3414Samples) {
  std::string md5Ku = PasswordToKey("maplesyrup", AuthProtocol::kMd5);
  EXPECT_EQ(Hex(md5Ku), "9faf3283884e92834ebc9847d8edd963");
  EXPECT_EQ(Hex(LocalizeKey(md5Ku, AuthProtocol::kMd5, kRfcEngineId)),
            "526f5eed9fcce26f8964c2930787d82b");
  std::string shaKu = PasswordToKey("maplesyrup", AuthProtocol::kSha);
  EXPECT_EQ(Hex(shaKu), "9fb5cc0381497b3793528939ff788d5d79145211");
  EXPECT_EQ(Hex(PasswordToLocalKey("maplesyrup", AuthProtocol::kSha, kRfcEngineId)),
            "6695febc9288e36282235fc7151f128497b38f3f");
  // A password longer than one hashing chunk, against an independent computation.
  std::string longPassword;
  for (int i = 0; i < 4099; ++i) longPassword.push_back(static_cast<char>((i * 7 + 3) % 256));
  EXPECT_EQ(Hex(PasswordToKey(longPassword, AuthProtocol::kSha)),
            "d36c78ebd2463a84826c59fe45409fce3e8f31b6");
  EXPECT_TRUE(PasswordToKey("", AuthProtocol::kMd5).empty());
}

TEST(UsmCryptoTest, KeyCacheLocalisesToNewEnginesWithoutExpandingAgain) {
  // Unique per run, so that a repeated run does not find its Ku cached already.
  const std::string password = "cache-test-" + std::to_string(KuComputationCount());
  std::uint64_t before = KuComputationCount();
  std::string first = GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-A");
  EXPECT_EQ(KuComputationCount(), before + 1);
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-A"), first);
  std::string second = GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-B");
  ClearLocalKeyCache();
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kMd5, "engine-A"), first);
  EXPECT_EQ(KuComputationCount(), before + 1);

  EXPECT_EQ(first, PasswordToLocalKey(password, AuthProtocol::kMd5, "engine-A"));
  EXPECT_EQ(second, PasswordToLocalKey(password, AuthProtocol::kMd5, "engine-B"));
  // The protocol is part of the key: SHA needs its own expansion and gives 20 octets.
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kSha, "engine-A").size(), 20u);
}

TEST(UsmCryptoTest, DigestMatchesRfc2202AndComparesAllOctets) {
  std::uint8_t md5[kUsmDigestLength];
  ASSERT_TRUE(CalculateDigest(AuthProtocol::kMd5, std::string(16, '\x0b'),
                              reinterpret_cast<const std::uint8_t*>("Hi There"), 8, md5));
  EXPECT_EQ(Hex(md5, sizeof md5), "9294727a3638bb1c13f48ef8");
  const std::string data(50, '\xdd');
  std::uint8_t sha[kUsmDigestLength];
  ASSERT_TRUE(CalculateDigest(AuthProtocol::kSha, std::string(20, '\xaa'),
                              reinterpret_cast<const std::uint8_t*>(data.data()), 50, sha));
  EXPECT_EQ(Hex(sha, sizeof sha), "125d7342b9ac11cd91a39af4");
  EXPECT_FALSE(CalculateDigest(AuthProtocol::kMd5, std::string(20, 'k'), sha, 3, md5));
  std::copy(md5, md5 + kUsmDigestLength, sha);
  EXPECT_TRUE(DigestsEqual(md5, sha));
  sha[11] ^= 1;
  EXPECT_FALSE(DigestsEqual(md5, sha));
}

// The plaintext, or "<refused>" when decryption fails.
std::string Decrypt(PrivProtocol priv, std::string_view key, std::uint32_t boots,
                    std::uint32_t time, const std::uint8_t* salt, std::string_view cipher) {
  std::vector<std::uint8_t> plain;
  if (!DecryptScopedPdu(priv, key, boots, time, salt,
                        reinterpret_cast<const std::uint8_t*>(cipher.data()), cipher.size(),
                        &plain)) {
    return "<refused>";
  }
  return std::string(plain.begin(), plain.end());
}

struct Encryption {
  std::uint8_t salt[kUsmSaltLength];
  std::string cipher;
};

Encryption Encrypt(PrivProtocol priv, std::string_view key, std::uint32_t boots, std::uint32_t time,
                   std::string_view plain) {
  Encryption result{};
  std::vector<std::uint8_t> cipher;
  EXPECT_TRUE(EncryptScopedPdu(priv, key, boots, time,
                               reinterpret_cast<const std::uint8_t*>(plain.data()), plain.size(),
                               &cipher, result.salt));
  result.cipher.assign(cipher.begin(), cipher.end());
  return result;
}

TEST(UsmCryptoTest, DesDecryptsKnownVectorAndRoundTrips) {
  // DES key 0123456789abcdef, pre-IV 1234567890abcdef; a zero salt leaves the IV as the pre-IV.
  const std::string key = Octets("0123456789abcdef 1234567890abcdef");
  const std::uint8_t zeroSalt[kUsmSaltLength] = {};
  const std::string vector = Octets("e5c7cdde872bf27c 43e934008c389c0f 683788499a7c05f6");
  EXPECT_EQ(Decrypt(PrivProtocol::kDes, key, 0, 0, zeroSalt, vector), "Now is the time for all ");
  EXPECT_EQ(Decrypt(PrivProtocol::kDes, key, 0, 0, zeroSalt, vector.substr(1)), "<refused>");

  // The salt starts with the engine boots; the plaintext is padded to whole blocks.
  Encryption encrypted = Encrypt(PrivProtocol::kDes, key, 0x01020304, 77, "scoped pdu 13");
  EXPECT_EQ(Hex(encrypted.salt, 4), "01020304");
  EXPECT_EQ(Decrypt(PrivProtocol::kDes, key, 0, 0, encrypted.salt, encrypted.cipher),
            std::string("scoped pdu 13\0\0\0", 16));
}

TEST(UsmCryptoTest, AesDecryptsKnownVectorAndRoundTrips) {
  // CFB128-AES128 encryption sample; its IV 000102..0f is boots 00010203, time 04050607, salt.
  const std::string key = Octets("2b7e151628aed2a6abf7158809cf4f3c");
  const std::uint8_t vectorSalt[kUsmSaltLength] = {8, 9, 10, 11, 12, 13, 14, 15};
  const std::string vector = Octets(
      "3b3fd92eb72dad20333449f8e83cfb4a c8a64537a0b3a93fcde3cdad9f1ce58b"
      "26751f67a3cbb140b1808cf187a4f4df c04b05357c5d1c0eeac4c66f9ff7f2e6");
  EXPECT_EQ(Hex(Decrypt(PrivProtocol::kAes128, key, 0x00010203, 0x04050607, vectorSalt, vector)),
            "6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
            "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710");

  const std::string message = "an odd-length scoped PDU";
  Encryption first = Encrypt(PrivProtocol::kAes128, key, 9, 1000, message);
  EXPECT_EQ(first.cipher.size(), message.size());
  EXPECT_EQ(Decrypt(PrivProtocol::kAes128, key, 9, 1000, first.salt, first.cipher), message);
  // Boots and time are part of the IV: another time does not decrypt.
  EXPECT_NE(Decrypt(PrivProtocol::kAes128, key, 9, 1001, first.salt, first.cipher), message);
}

TEST(UsmCryptoTest, ConcurrentEncryptionsNeverShareASalt) {
  const std::string key(20, 'p');  // a SHA-localised key: the first 16 octets are used
  std::mutex mutex;
  std::set<std::string> salts;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      PrivProtocol priv = t % 2 ? PrivProtocol::kDes : PrivProtocol::kAes128;
      for (int i = 0; i < 200; ++i) {
        Encryption encryption = Encrypt(priv, key, 1, 2, "01234567");
        EXPECT_EQ(Decrypt(priv, key, 1, 2, encryption.salt, encryption.cipher), "01234567");
        std::lock_guard<std::mutex> lock(mutex);
        salts.insert(Hex(encryption.salt + 4, 4));  // the part DES and AES both count
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(salts.size(), 800u);
}

}  // namespace
}  // namespace tessel
