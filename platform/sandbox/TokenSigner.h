// Signs token bodies and checks token signatures with one key: HMAC-SHA-256
// from OpenSSL libcrypto, compared in constant time so that how much of a
// forged signature matched cannot be learnt from timing.
//
// Thread safety: immutable after construction; safe from any thread.
#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/sandbox/SandboxToken.h"

namespace platform::sandbox {

inline constexpr std::size_t kSigningKeyBytes = 32;
using SigningKey = std::array<std::uint8_t, kSigningKeyBytes>;

class TokenSigner {
 public:
  explicit TokenSigner(const SigningKey& key) : key_(key) {}
  ~TokenSigner();
  TokenSigner(const TokenSigner&) = default;
  TokenSigner& operator=(const TokenSigner&) = default;

  // Fails (EIO) only when libcrypto cannot compute the MAC.
  Result<TokenSignature> signatureOf(std::string_view body) const;

  // The whole token: `body`, ';' and its signature.
  Result<std::string> signedToken(std::string_view body) const;

  // Whether `token`'s signature is this key's signature of its body; false
  // also when the MAC cannot be computed, so that a failure never admits.
  bool verifies(const ParsedToken& token) const;

 private:
  SigningKey key_;
};

}  // namespace platform::sandbox
