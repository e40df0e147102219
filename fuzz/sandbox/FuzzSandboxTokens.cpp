// Arbitrary bytes as a sandbox-extension token, through the parser and the
// signature check with a fixed key; and the same bytes as a grant's subject,
// through writing and reading back. Checks:
//  - parsing never accepts more than the limit, and an accepted token is
//    canonical: writing its grant again gives exactly its body;
//  - the signature verifies exactly when it is the key's signature of the
//    body (the fuzzer cannot find a forgery without finding the key);
//  - any subject that can be written reads back as the same grant and
//    verifies, and changing one byte of that token never still verifies.
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "platform/sandbox/SandboxToken.h"
#include "platform/sandbox/TokenSigner.h"

using namespace platform;
using namespace platform::sandbox;

namespace {

const SigningKey kKey = {0x51, 0x76, 0x78, 0x31, 0x2d, 0x66, 0x75, 0x7a, 0x7a, 0x2d, 0x6b,
                         0x65, 0x79, 0x00, 0xff, 0x10, 0x20, 0x30, 0x40, 0x50, 0x60, 0x70,
                         0x80, 0x90, 0xa0, 0xb0, 0xc0, 0xd0, 0xe0, 0xf0, 0x01, 0x02};

void check(bool condition) {
  if (!condition) std::abort();
}

void parseAsToken(const TokenSigner& signer, std::string_view text) {
  Result<ParsedToken> parsed = parseToken(text);
  if (!parsed.ok()) {
    check(parsed.error().code() == EINVAL);
    return;
  }
  check(text.size() <= kMaxTokenBytes);
  Result<std::string> body = tokenBody(parsed->grant);
  check(body.ok() && *body == parsed->body);
  Result<std::string> resigned = signer.signedToken(parsed->body);
  check(resigned.ok());
  check(signer.verifies(*parsed) == (*resigned == text));
}

void writeAsGrant(const TokenSigner& signer, std::string_view subject, std::uint8_t selector) {
  const ExtensionGrant grant{selector & 1 ? "com.corvane.quorvex.plugin-service"
                                          : "com.corvane.sandbox.read-only",
                             selector & 1 ? ExtensionKind::Service : ExtensionKind::File,
                             std::string(subject)};
  Result<std::string> body = tokenBody(grant);
  if (!body.ok()) return;
  Result<std::string> token = signer.signedToken(*body);
  check(token.ok());
  Result<ParsedToken> parsed = parseToken(*token);
  check(parsed.ok() && parsed->grant == grant && signer.verifies(*parsed));

  std::string altered = *token;
  const std::size_t at = (static_cast<std::size_t>(selector) * 7919u) % altered.size();
  altered[at] = static_cast<char>(altered[at] ^ (selector | 1));
  Result<ParsedToken> reparsed = parseToken(altered);
  check(!reparsed.ok() || !signer.verifies(*reparsed));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const TokenSigner signer(kKey);
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  parseAsToken(signer, text);
  if (size > 0) writeAsGrant(signer, text.substr(1), data[0]);
  return 0;
}
