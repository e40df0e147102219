// The text form of sandbox-extension tokens, without the key: what a token
// grants, how that is written, and how a token is split back into its parts.
//
//   qvx1;<class>;<kind>;<subject>;<signature>
//
// <kind> is "file" or "service"; <class> and <subject> (the path or the
// service name) are percent-encoded so that no field holds ';'; <signature>
// is the HMAC-SHA-256 of everything before the last ';', as 64 lower-case hex
// digits. Only the canonical encoding is accepted: every byte outside
// [A-Za-z0-9._~/-] is escaped, with upper-case hex, and nothing else is, so
// that one grant has exactly one body.
//
// Thread safety: pure functions.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::sandbox {

inline constexpr std::string_view kTokenVersion = "qvx1";
// Tokens arrive from other processes: anything longer is refused unread.
inline constexpr std::size_t kMaxTokenBytes = 8 * 1024;
// Limits on the decoded fields.
inline constexpr std::size_t kMaxExtensionClassBytes = 255;
inline constexpr std::size_t kMaxSubjectBytes = 4095;
inline constexpr std::size_t kSignatureBytes = 32;

enum class ExtensionKind { File, Service };

// What a token grants.
struct ExtensionGrant {
  std::string extensionClass;
  ExtensionKind kind = ExtensionKind::File;
  std::string subject;  // the absolute path or the service name

  bool operator==(const ExtensionGrant&) const = default;
};

using TokenSignature = std::array<std::uint8_t, kSignatureBytes>;

struct ParsedToken {
  ExtensionGrant grant;
  std::string body;  // the signed part: everything before the last ';'
  TokenSignature signature{};
};

std::string_view extensionKindName(ExtensionKind kind);

// The signed part of a token for `grant`. Fails with EINVAL for an empty
// class or subject, a NUL in either, or a file subject that is not absolute,
// and with ENAMETOOLONG past the limits or when the token would not fit in
// kMaxTokenBytes.
Result<std::string> tokenBody(const ExtensionGrant& grant);

// `body` followed by ';' and `signature` in hex.
std::string joinToken(std::string_view body, const TokenSignature& signature);

// Splits a token and checks its form (not its signature). Fails with EINVAL,
// naming what is wrong, for anything over kMaxTokenBytes, with the wrong
// number of fields, another version or kind, a bad or non-canonical escape,
// a field tokenBody would refuse, or a signature that is not 64 lower-case
// hex digits.
Result<ParsedToken> parseToken(std::string_view token);

}  // namespace platform::sandbox
