// The token's text form without a key file: encoding, parsing, signing.
#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>
#include <string>

#include "platform/sandbox/SandboxToken.h"
#include "platform/sandbox/TokenSigner.h"

namespace platform::sandbox {
namespace {

const SigningKey kKey = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16,
                         17, 18, 19, 20, 21, 22, 23, 24, 25, 26, 27, 28, 29, 30, 31, 32};
const std::string kZeroSignature(64, '0');

std::string tokenFor(const ExtensionGrant& grant) {
  Result<std::string> body = tokenBody(grant);
  EXPECT_TRUE(body.ok()) << (body.ok() ? "" : body.error().description());
  return body.ok() ? *TokenSigner(kKey).signedToken(*body) : std::string();
}

TEST(SandboxTokenForm, AwkwardSubjectsSurviveTheRoundTrip) {
  const ExtensionGrant grants[] = {
      {"com.corvane.sandbox.read-only", ExtensionKind::File, "/semi;colon/per%cent/sp ace"},
      {"com.corvane.sandbox.read-only", ExtensionKind::File, "/new\nline/\xC3\xA9t\xC3\xA9/~x"},
      {"com.corvane.quorvex.plugin-service", ExtensionKind::Service, "com.example.a;b"},
      {"class with ; and %", ExtensionKind::Service, "\x01\x7F\xFF"},
  };
  for (const ExtensionGrant& grant : grants) {
    const std::string token = tokenFor(grant);
    Result<ParsedToken> parsed = parseToken(token);
    ASSERT_TRUE(parsed.ok()) << token << ": " << parsed.error().description();
    EXPECT_EQ(parsed->grant, grant) << token;
    EXPECT_EQ(parsed->body, *tokenBody(grant));
    EXPECT_TRUE(TokenSigner(kKey).verifies(*parsed));
    // Five fields exactly: nothing in a field can pass for a separator.
    EXPECT_EQ(std::count(token.begin(), token.end(), ';'), 4) << token;
  }
}

TEST(SandboxTokenForm, KnownSpelling) {
  const std::string token =
      tokenFor({"cls", ExtensionKind::File, "/a b/c;d"});
  EXPECT_EQ(token.substr(0, token.rfind(';')), "qvx1;cls;file;/a%20b/c%3Bd");
}

TEST(SandboxTokenForm, MalformedTokensAreRefusedWithEinval) {
  const std::string sig = ";" + kZeroSignature;
  const std::string cases[] = {
      "",
      "qvx1;c;file;/p",                          // no signature
      "qvx2;c;file;/p" + sig,                    // another version
      "qvx1;c;folder;/p" + sig,                  // unknown kind
      "qvx1;c;file;rel" + sig,                   // relative path
      "qvx1;c;file;/a%2Fb" + sig,                // escaped unreserved byte
      "qvx1;c;file;/a%3bb" + sig,                // lower-case escape
      "qvx1;c;file;/a%00" + sig,                 // NUL
      "qvx1;c;file;/a b" + sig,                  // raw byte that must be escaped
      "qvx1;c;file;/p;" + kZeroSignature.substr(1),         // 63 digits
      "qvx1;c;file;/" + std::string(kMaxTokenBytes, 'p') + sig,  // over the limit
  };
  for (const std::string& token : cases) {
    Result<ParsedToken> parsed = parseToken(token);
    ASSERT_FALSE(parsed.ok()) << token.substr(0, 80);
    EXPECT_EQ(parsed.error().code(), EINVAL) << token.substr(0, 80);
  }
}

}  // namespace
}  // namespace platform::sandbox
