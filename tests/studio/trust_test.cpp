#include "studio/server/trust.h"

namespace calmframe::studio {
namespace {

TEST(StudioTrustTest, HostsThatAPersonMayTypeAndNoOthers) {
  for (const char* host : {"localhost", "LOCALHOST:80", "127.0.0.1:8080", "[::1]:9", "192.168.1.4",
                           "studio.home:8080"}) {
    EXPECT_TRUE(IsOwnHost(host, "studio.home")) << host;
  }
  // A name of somebody else may stand for this machine by now.
  for (const char* host :
       {"", "evil.example", "evil.example:8080", "localhost.evil.example", "127.0.0.1.evil.example",
        "[", "[evil]:1", "[::1].evil.example:1", "127.0.0.1x", "studio.home.", ":8080"}) {
    EXPECT_FALSE(IsOwnHost(host, "studio.home")) << host;
  }
  EXPECT_FALSE(IsOwnHost("studio.home", ""));
}

TEST(StudioTrustTest, OriginsAreThePageItself) {
  EXPECT_TRUE(IsOwnOrigin("http://127.0.0.1:8080", "127.0.0.1:8080"));
  for (const char* origin :
       {"http://127.0.0.1:8081", "https://127.0.0.1:8080", "null", "",
        "http://127.0.0.1:8080.evil.example", "http://127.0.0.1:808", "http://"}) {
    EXPECT_FALSE(IsOwnOrigin(origin, "127.0.0.1:8080")) << origin;
  }
  EXPECT_FALSE(IsOwnOrigin("http://", ""));
}

TEST(StudioTrustTest, CookiesAndFieldsOfDamagedText) {
  EXPECT_TRUE(BringsCookie("a=1; c_80=secret; b=2", "c_80", "secret"));
  EXPECT_TRUE(BringsCookie("c_80=another's; c_80=secret", "c_80", "secret"));
  EXPECT_TRUE(BringsCookie(";;=;c_80=a=b", "c_80", "a=b"));
  for (const char* header : {"", "xc_80=secret;c_80", "c_80=secre", "c_80=secret2", "c_80="}) {
    EXPECT_FALSE(BringsCookie(header, "c_80", "secret")) << header;
  }
  EXPECT_FALSE(BringsCookie("c_80=", "c_80", ""));
  EXPECT_EQ(FieldOf("path=%2Fa+b%2f%C3%A9&x=1", "path"), "/a b/\xC3\xA9");
  EXPECT_EQ(FieldOf("x=1&path=", "path"), "");
  // Cut, no digits, and a zero that would end a name early.
  for (const char* form : {"path=%", "path=%4", "path=%zz", "path=a%00b"}) {
    EXPECT_EQ(FieldOf(form, "path"), "") << form;
  }
}

TEST(StudioTrustTest, SecretsDifferAndEmptyOnesLetNobodyIn) {
  const std::string secret = NewSecret();
  EXPECT_EQ(secret.size(), 64u);
  EXPECT_NE(secret, NewSecret());
  EXPECT_TRUE(IsSame(secret, std::string(secret)));
  EXPECT_FALSE(IsSame(secret, secret + "0"));
  EXPECT_FALSE(IsSame(secret.substr(0, 32), secret));
  EXPECT_FALSE(IsSame("", ""));
  EXPECT_FALSE(IsSame("a", ""));
}

}  // namespace
}  // namespace calmframe::studio
