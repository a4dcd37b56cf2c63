#include "snmpv3/usm_users.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

class UsmUsersTest : public ::testing::Test {
 protected:
  void SetUp() override { FreeUsmUsers(); }
  void TearDown() override { FreeUsmUsers(); }
};

TEST_F(UsmUsersTest, FindsUsersByEngineIdAndExactName) {
  ASSERT_EQ(AddUSMUserEntry("alice", "MD5_AUTH", "authpass1", "CBC_DES", "privpass1", "engA"), 1);
  ASSERT_EQ(AddUSMUserEntry("alice", "SHA_AUTH", "authpass1", "CFB_AES_128", "privpass1", "engB"),
            1);
  EXPECT_EQ(GetUsmEntry("engA", "alice").value().priv, PrivProtocol::kDes);
  EXPECT_EQ(GetUsmEntry("engB", "alice").value().priv, PrivProtocol::kAes128);  // other engine
  for (auto [engine, name] : {std::pair{"engC", "alice"}, {"engA", "alic"}, {"eng", "Aalice"}})
    EXPECT_FALSE(GetUsmEntry(engine, name)) << engine << " " << name;
  FreeUsmUsers();
  EXPECT_FALSE(GetUsmEntry("engA", "alice"));
}

TEST_F(UsmUsersTest, ProtocolNamesAndPasswordsDecideLevelOrRefusal) {
  const struct {
    const char *name, *auth, *authPassword, *priv, *privPassword;
    int result;
    std::uint8_t level;
  } cases[] = {
      {"a", "NO_AUTH", "", "NO_PRIV", "", 1, kNoAuthNoPriv},
      {"b", "SHA_AUTH", "password1", "NO_PRIV", "", 1, kAuthNoPriv},
      {"c", "MD5_AUTH", "password1", "CFB_AES_128", "password2", 1, kAuthPriv},
      {"d", "NO_AUTH", "", "CBC_DES", "password2", 0, 0},  // privacy needs authentication
      {"e", "md5_auth", "password1", "NO_PRIV", "", 0, 0},
      {"f", "MD5_AUTH", "password1", "AES", "password2", 0, 0},
      {"g", "SHA_AUTH", "password1", "CBC_DES ", "password2", 0, 0},
      {"h", "MD5_AUTH", "", "NO_PRIV", "", 0, 0},
      {"i", "SHA_AUTH", "password1", "CBC_DES", "", 0, 0},
      {"b", "MD5_AUTH", "password2", "NO_PRIV", "", 0, 0},  // taken: the first one stays
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.name) + " " + c.auth + " " + c.priv);
    EXPECT_EQ(AddUSMUserEntry(c.name, c.auth, c.authPassword, c.priv, c.privPassword, "eng"),
              c.result);
    if (c.result != 1) continue;
    EXPECT_EQ(GetUsmEntry("eng", c.name).value().securityLevel, c.level);
  }
  EXPECT_EQ(UsmUserCount(), 3u);
  EXPECT_EQ(GetUsmEntry("eng", "b").value().auth, AuthProtocol::kSha);
}

}  // namespace
}  // namespace tessel
