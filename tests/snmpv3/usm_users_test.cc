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
  std::optional<UsmUser> user = GetUsmEntry("engA", "alice");
  ASSERT_TRUE(user);
  EXPECT_EQ(user->securityName, "alice");
  EXPECT_EQ(user->auth, AuthProtocol::kMd5);
  EXPECT_EQ(user->priv, PrivProtocol::kDes);
  EXPECT_EQ(user->securityLevel, kAuthPriv);
  EXPECT_EQ(GetUsmEntry("engB", "alice")->auth, AuthProtocol::kSha);  // same name, other engine

  EXPECT_FALSE(GetUsmEntry("engC", "alice"));
  EXPECT_FALSE(GetUsmEntry("engA", "alic"));
  EXPECT_FALSE(GetUsmEntry("eng", "Aalice"));  // engine ID and name do not run together

  FreeUsmUsers();
  EXPECT_EQ(UsmUserCount(), 0u);
  EXPECT_FALSE(GetUsmEntry("engA", "alice"));
}

struct ProtocolCase {
  const char* auth;
  const char* priv;
  int result;
  std::uint8_t level;
};

TEST_F(UsmUsersTest, ProtocolNamesDecideLevelOrRefusal) {
  const ProtocolCase cases[] = {
      {"NO_AUTH", "NO_PRIV", 1, kNoAuthNoPriv},
      {"SHA_AUTH", "NO_PRIV", 1, kAuthNoPriv},
      {"MD5_AUTH", "CFB_AES_128", 1, kAuthPriv},
      {"NO_AUTH", "CBC_DES", 0, 0},
      {"md5_auth", "NO_PRIV", 0, 0},
      {"MD5_AUTH", "AES", 0, 0},
      {"SHA_AUTH", "CBC_DES ", 0, 0},
  };
  int n = 0;
  for (const ProtocolCase& c : cases) {
    std::string name = "user" + std::to_string(n++);
    SCOPED_TRACE(name);
    EXPECT_EQ(AddUSMUserEntry(name, c.auth, "password1", c.priv, "password2", "eng"), c.result);
    std::optional<UsmUser> user = GetUsmEntry("eng", name);
    ASSERT_EQ(user.has_value(), c.result == 1);
    if (!user) continue;
    EXPECT_EQ(user->securityLevel, c.level);
  }
  EXPECT_EQ(UsmUserCount(), 3u);
}

TEST_F(UsmUsersTest, RefusesMissingPasswordsAndDuplicates) {
  EXPECT_EQ(AddUSMUserEntry("a", "MD5_AUTH", "", "NO_PRIV", "", "eng"), 0);
  EXPECT_EQ(AddUSMUserEntry("b", "SHA_AUTH", "password1", "CBC_DES", "", "eng"), 0);
  EXPECT_EQ(AddUSMUserEntry("c", "NO_AUTH", "", "NO_PRIV", "", "eng"), 1);
  EXPECT_EQ(AddUSMUserEntry("d", "SHA_AUTH", "password1", "NO_PRIV", "", "eng"), 1);
  EXPECT_EQ(AddUSMUserEntry("d", "MD5_AUTH", "password2", "NO_PRIV", "", "eng"), 0);
  EXPECT_EQ(UsmUserCount(), 2u);
  EXPECT_EQ(GetUsmEntry("eng", "d")->auth, AuthProtocol::kSha);  // the first one stays
}

}  // namespace
}  // namespace tessel
