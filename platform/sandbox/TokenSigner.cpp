#include "platform/sandbox/TokenSigner.h"

#include <openssl/crypto.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>

#include <cerrno>

namespace platform::sandbox {

TokenSigner::~TokenSigner() { OPENSSL_cleanse(key_.data(), key_.size()); }

Result<TokenSignature> TokenSigner::signatureOf(std::string_view body) const {
  TokenSignature signature{};
  unsigned int length = 0;
  const unsigned char* made =
      HMAC(EVP_sha256(), key_.data(), static_cast<int>(key_.size()),
           reinterpret_cast<const unsigned char*>(body.data()), body.size(), signature.data(),
           &length);
  // HMAC fails only when libcrypto cannot allocate or lacks SHA-256.
  if (made == nullptr || length != signature.size()) {
    return Error::posix(EIO, "sandbox token: HMAC-SHA-256 failed");
  }
  return signature;
}

Result<std::string> TokenSigner::signedToken(std::string_view body) const {
  Result<TokenSignature> signature = signatureOf(body);
  if (!signature.ok()) return signature.error();
  return joinToken(body, *signature);
}

bool TokenSigner::verifies(const ParsedToken& token) const {
  Result<TokenSignature> expected = signatureOf(token.body);
  if (!expected.ok()) return false;
  return CRYPTO_memcmp(expected->data(), token.signature.data(), expected->size()) == 0;
}

}  // namespace platform::sandbox
