#include "snmpv3/usm_crypto.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <mutex>
#include <set>
#include <thread>

#include "base/conversions.h"
#include "engine/log.h"

namespace tessel {
namespace {

// Octets from hexadecimal text; spaces are ignored.
std::string Octets(std::string_view hex) {
  std::string out;
  std::string digits;
  for (char c : hex) {
    if (c == ' ') continue;
    digits.push_back(c);
    if (digits.size() == 2) {
      out.push_back(static_cast<char>(std::stoi(digits, nullptr, 16)));
      digits.clear();
    }
  }
  return out;
}

std::vector<std::uint8_t> Bytes(std::string_view hex) {
  std::string octets = Octets(hex);
  return std::vector<std::uint8_t>(octets.begin(), octets.end());
}

std::string Hex(const std::uint8_t* data, std::size_t length) {
  std::string out;
  char buffer[3];
  for (std::size_t i = 0; i < length; ++i) {
    std::snprintf(buffer, sizeof buffer, "%02x", data[i]);
    out += buffer;
  }
  return out;
}

std::string Hex(std::string_view octets) {
  return Hex(reinterpret_cast<const std::uint8_t*>(octets.data()), octets.size());
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
  EXPECT_EQ(Hex(PasswordToLocalKey("newsyrup", AuthProtocol::kMd5, kRfcEngineId)),
            "87021d7bd9d101ba05ea6e3bf9d9bd4a");
  // A password longer than one hashing chunk, against an independent computation.
  std::string longPassword;
  for (int i = 0; i < 4099; ++i) longPassword.push_back(static_cast<char>((i * 7 + 3) % 256));
  EXPECT_EQ(Hex(PasswordToKey(longPassword, AuthProtocol::kSha)),
            "d36c78ebd2463a84826c59fe45409fce3e8f31b6");
  EXPECT_EQ(Hex(PasswordToLocalKey(longPassword, AuthProtocol::kSha, Octets("800007e580aabbccdd"))),
            "c80a5af865650ad83d7e70c940324f315f4f1ea7");

  EXPECT_TRUE(PasswordToKey("", AuthProtocol::kMd5).empty());
  EXPECT_TRUE(PasswordToKey("maplesyrup", AuthProtocol::kNone).empty());
  EXPECT_TRUE(LocalizeKey(md5Ku, AuthProtocol::kSha, kRfcEngineId).empty());
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
  EXPECT_NE(first, second);
  // The protocol is part of the key: SHA needs its own expansion and gives 20 octets.
  EXPECT_EQ(GetLocalKeyValue(password, AuthProtocol::kSha, "engine-A").size(), 20u);
  EXPECT_TRUE(GetLocalKeyValue("", AuthProtocol::kSha, "engine-A").empty());
}

TEST(UsmCryptoTest, ProtocolTypeGivesLevels) {
  AuthProtocol auth;
  PrivProtocol priv;
  EXPECT_EQ(GetProtocolType(kUsmNoAuthProtocol, kUsmDesPrivProtocol, &auth, &priv), kNoAuthNoPriv);
  EXPECT_EQ(auth, AuthProtocol::kNone);
  EXPECT_EQ(priv, PrivProtocol::kNone);
  EXPECT_EQ(GetProtocolType(kUsmHmacShaAuthProtocol, kUsmNoPrivProtocol, &auth, &priv),
            kAuthNoPriv);
  EXPECT_EQ(auth, AuthProtocol::kSha);
  EXPECT_EQ(GetProtocolType(kUsmHmacMd5AuthProtocol, kUsmAesCfb128Protocol, &auth, &priv),
            kAuthPriv);
  EXPECT_EQ(auth, AuthProtocol::kMd5);
  EXPECT_EQ(priv, PrivProtocol::kAes128);
  EXPECT_EQ(GetProtocolType(kUsmHmacMd5AuthProtocol, kUsmHmacMd5AuthProtocol, &auth, &priv),
            kInvalidSecurityLevel);
  Oid truncated(kUsmHmacMd5AuthProtocol.begin(), kUsmHmacMd5AuthProtocol.end() - 1);
  EXPECT_EQ(GetProtocolType(truncated, kUsmNoPrivProtocol, &auth, &priv), kInvalidSecurityLevel);
  EXPECT_EQ(AuthProtocolOid(AuthProtocol::kSha), kUsmHmacShaAuthProtocol);
  EXPECT_EQ(PrivProtocolOid(PrivProtocol::kAes128), kUsmAesCfb128Protocol);
}

struct HmacCase {
  AuthProtocol auth;
  std::string key;
  std::string data;
  const char* digest96;
};

TEST(UsmCryptoTest, DigestMatchesRfc2202) {
  const HmacCase cases[] = {
      {AuthProtocol::kMd5, std::string(16, '\x0b'), "Hi There", "9294727a3638bb1c13f48ef8"},
      {AuthProtocol::kMd5, std::string(16, '\xaa'), std::string(50, '\xdd'),
       "56be34521d144c88dbb8c733"},
      {AuthProtocol::kMd5, std::string(16, '\x0c'), "Test With Truncation",
       "56461ef2342edc00f9bab995"},
      {AuthProtocol::kSha, std::string(20, '\x0b'), "Hi There", "b617318655057264e28bc0b6"},
      {AuthProtocol::kSha, std::string(20, '\xaa'), std::string(50, '\xdd'),
       "125d7342b9ac11cd91a39af4"},
      {AuthProtocol::kSha, std::string(20, '\x0c'), "Test With Truncation",
       "4c1a03424b55e07fe7f27be1"},
  };
  for (const HmacCase& c : cases) {
    std::uint8_t digest[kUsmDigestLength] = {};
    ASSERT_TRUE(CalculateDigest(c.auth, c.key, reinterpret_cast<const std::uint8_t*>(c.data.data()),
                                c.data.size(), digest));
    EXPECT_EQ(Hex(digest, sizeof digest), c.digest96);
  }
}

TEST(UsmCryptoTest, DigestRefusesBadInputAndComparesAllOctets) {
  const std::uint8_t data[] = {1, 2, 3};
  std::uint8_t digest[kUsmDigestLength];
  EXPECT_FALSE(CalculateDigest(AuthProtocol::kMd5, std::string(20, 'k'), data, 3, digest));
  EXPECT_FALSE(CalculateDigest(AuthProtocol::kSha, std::string(16, 'k'), data, 3, digest));
  EXPECT_FALSE(CalculateDigest(AuthProtocol::kMd5, std::string(16, 'k'), data, 0, digest));
  EXPECT_FALSE(CalculateDigest(AuthProtocol::kNone, "", data, 3, digest));

  std::uint8_t a[kUsmDigestLength] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
  std::uint8_t b[kUsmDigestLength];
  std::copy(a, a + kUsmDigestLength, b);
  EXPECT_TRUE(DigestsEqual(a, b));
  b[11] ^= 1;
  EXPECT_FALSE(DigestsEqual(a, b));
}

TEST(UsmCryptoTest, DesDecryptsKnownVectorAndRoundTrips) {
  // DES key 0123456789abcdef, pre-IV 1234567890abcdef; a zero salt leaves the IV as the pre-IV.
  const std::string privKey = Octets("0123456789abcdef 1234567890abcdef");
  const std::uint8_t zeroSalt[kUsmSaltLength] = {};
  std::vector<std::uint8_t> cipher =
      Bytes("e5c7cdde872bf27c 43e934008c389c0f 683788499a7c05f6");
  std::vector<std::uint8_t> plain;
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kDes, privKey, 0, 0, zeroSalt, cipher.data(),
                               cipher.size(), &plain));
  EXPECT_EQ(std::string(plain.begin(), plain.end()), "Now is the time for all ");
  EXPECT_FALSE(DecryptScopedPdu(PrivProtocol::kDes, privKey, 0, 0, zeroSalt, cipher.data(),
                                cipher.size() - 1, &plain));

  const std::string message = "scoped pdu 13";
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(message.data());
  std::uint8_t salt1[kUsmSaltLength];
  std::uint8_t salt2[kUsmSaltLength];
  std::vector<std::uint8_t> cipher2;
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kDes, privKey, 0x01020304, 77, bytes, message.size(),
                               &cipher, salt1));
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kDes, privKey, 0x01020304, 77, bytes, message.size(),
                               &cipher2, salt2));
  EXPECT_EQ(Hex(salt1, 4), "01020304");
  EXPECT_NE(Hex(salt1, 8), Hex(salt2, 8));
  EXPECT_NE(cipher, cipher2);
  ASSERT_EQ(cipher.size(), 16u);
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kDes, privKey, 0, 0, salt2, cipher2.data(),
                               cipher2.size(), &plain));
  EXPECT_EQ(std::string(plain.begin(), plain.end()), message + std::string(3, '\0'));

  std::string wrongKey = privKey;
  wrongKey[0] ^= 0x10;  // flips a key bit that parity does not discard
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kDes, wrongKey, 0, 0, salt2, cipher2.data(),
                               cipher2.size(), &plain));
  EXPECT_NE(std::string(plain.begin(), plain.begin() + 13), message);
}

TEST(UsmCryptoTest, AesDecryptsKnownVectorAndRoundTrips) {
  // CFB128-AES128 encryption sample; its IV 000102..0f is boots 00010203, time 04050607, salt.
  const std::string privKey = Octets("2b7e151628aed2a6abf7158809cf4f3c");
  const std::uint8_t vectorSalt[kUsmSaltLength] = {8, 9, 10, 11, 12, 13, 14, 15};
  std::vector<std::uint8_t> cipher = Bytes(
      "3b3fd92eb72dad20333449f8e83cfb4a c8a64537a0b3a93fcde3cdad9f1ce58b"
      "26751f67a3cbb140b1808cf187a4f4df c04b05357c5d1c0eeac4c66f9ff7f2e6");
  std::vector<std::uint8_t> plain;
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kAes128, privKey, 0x00010203, 0x04050607, vectorSalt,
                               cipher.data(), cipher.size(), &plain));
  EXPECT_EQ(Hex(plain.data(), plain.size()),
            "6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
            "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710");

  const std::string message = "an odd-length scoped PDU";
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(message.data());
  std::uint8_t salt1[kUsmSaltLength];
  std::uint8_t salt2[kUsmSaltLength];
  std::vector<std::uint8_t> cipher2;
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kAes128, privKey, 9, 1000, bytes, message.size(),
                               &cipher, salt1));
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kAes128, privKey, 9, 1000, bytes, message.size(),
                               &cipher2, salt2));
  EXPECT_NE(Hex(salt1, 8), Hex(salt2, 8));
  EXPECT_NE(cipher, cipher2);
  ASSERT_EQ(cipher.size(), message.size());
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kAes128, privKey, 9, 1000, salt1, cipher.data(),
                               cipher.size(), &plain));
  EXPECT_EQ(std::string(plain.begin(), plain.end()), message);
  // Boots and time are part of the IV: a different time does not decrypt.
  ASSERT_TRUE(DecryptScopedPdu(PrivProtocol::kAes128, privKey, 9, 1001, salt1, cipher.data(),
                               cipher.size(), &plain));
  EXPECT_NE(std::string(plain.begin(), plain.end()), message);

  EXPECT_FALSE(EncryptScopedPdu(PrivProtocol::kAes128, privKey.substr(0, 15), 9, 1000, bytes,
                                message.size(), &cipher, salt1));
  EXPECT_FALSE(EncryptScopedPdu(PrivProtocol::kNone, privKey, 9, 1000, bytes, message.size(),
                                &cipher, salt1));
}

TEST(UsmCryptoTest, ConcurrentEncryptionsNeverShareASalt) {
  const std::string privKey(20, 'p');  // a SHA-localised key: the first 16 octets are used
  const std::uint8_t data[] = {0x30, 0x03, 0x04, 0x01, 0x00};
  std::mutex mutex;
  std::set<std::string> salts;
  bool allRoundTripped = true;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&, t] {
      PrivProtocol priv = t % 2 ? PrivProtocol::kDes : PrivProtocol::kAes128;
      for (int i = 0; i < 200; ++i) {
        std::uint8_t salt[kUsmSaltLength];
        std::vector<std::uint8_t> cipher;
        std::vector<std::uint8_t> plain;
        bool ok = EncryptScopedPdu(priv, privKey, 1, 2, data, sizeof data, &cipher, salt) &&
                  DecryptScopedPdu(priv, privKey, 1, 2, salt, cipher.data(), cipher.size(),
                                   &plain) &&
                  std::equal(data, data + sizeof data, plain.begin());
        std::lock_guard<std::mutex> lock(mutex);
        allRoundTripped = allRoundTripped && ok;
        salts.insert(Hex(salt + 4, 4));  // the part that DES and AES both take from the counter
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_TRUE(allRoundTripped);
  EXPECT_EQ(salts.size(), 800u);
}

TEST(UsmCryptoTest, AesIvFileWrittenOnlyAtDebugLevelThree) {
  char directory[] = "/tmp/usm_iv_XXXXXX";
  ASSERT_NE(mkdtemp(directory), nullptr);
  char previous[4096];
  ASSERT_NE(getcwd(previous, sizeof previous), nullptr);
  ASSERT_EQ(chdir(directory), 0);
  const std::string privKey(16, 'k');
  const std::uint8_t data[] = {1, 2, 3};
  std::uint8_t salt[kUsmSaltLength];
  std::vector<std::uint8_t> cipher;
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kAes128, privKey, 5, 0x1234, data, 3, &cipher, salt));
  EXPECT_FALSE(std::ifstream("IV.txt").good());

  ASSERT_TRUE(OpenEngineLog({3, std::string(directory) + "/engine.log", 0}));
  ASSERT_TRUE(EncryptScopedPdu(PrivProtocol::kAes128, privKey, 5, 0x1234, data, 3, &cipher, salt));
  CloseEngineLog();
  OpenEngineLog({0, "", 0});
  std::ifstream file("IV.txt");
  std::string text((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  std::string expected = "00 00 00 05 00 00 1234 ";
  for (std::uint8_t octet : salt) expected += Hex(&octet, 1) + " ";
  EXPECT_EQ(text, expected);

  ASSERT_EQ(chdir(previous), 0);
  std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace tessel
