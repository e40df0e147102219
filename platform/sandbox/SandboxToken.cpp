#include "platform/sandbox/SandboxToken.h"

#include <cerrno>
#include <optional>
#include <vector>

namespace platform::sandbox {
namespace {

constexpr char kSeparator = ';';
constexpr std::string_view kFileKind = "file";
constexpr std::string_view kServiceKind = "service";
constexpr std::size_t kFieldCount = 5;
constexpr char kUpperHex[] = "0123456789ABCDEF";
constexpr char kLowerHex[] = "0123456789abcdef";

bool isUnreserved(unsigned char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '.' ||
         c == '_' || c == '~' || c == '/' || c == '-';
}

void appendEncoded(std::string& out, std::string_view field) {
  for (char ch : field) {
    const auto c = static_cast<unsigned char>(ch);
    if (isUnreserved(c)) {
      out.push_back(ch);
    } else {
      out.push_back('%');
      out.push_back(kUpperHex[c >> 4]);
      out.push_back(kUpperHex[c & 0xF]);
    }
  }
}

int hexValue(char c, const char* digits) {
  for (int i = 0; i < 16; ++i) {
    if (digits[i] == c) return i;
  }
  return -1;
}

// The decoded field, or none when it is not in canonical form.
std::optional<std::string> decodeCanonical(std::string_view field) {
  std::string out;
  out.reserve(field.size());
  for (std::size_t i = 0; i < field.size(); ++i) {
    const auto c = static_cast<unsigned char>(field[i]);
    if (isUnreserved(c)) {
      out.push_back(field[i]);
      continue;
    }
    if (c != '%' || i + 2 >= field.size()) return std::nullopt;
    const int high = hexValue(field[i + 1], kUpperHex);
    const int low = hexValue(field[i + 2], kUpperHex);
    if (high < 0 || low < 0) return std::nullopt;
    const auto decoded = static_cast<unsigned char>(high << 4 | low);
    // An escaped unreserved byte would give one grant two spellings.
    if (isUnreserved(decoded)) return std::nullopt;
    out.push_back(static_cast<char>(decoded));
    i += 2;
  }
  return out;
}

std::size_t encodedSize(std::string_view field) {
  std::size_t size = 0;
  for (char ch : field) size += isUnreserved(static_cast<unsigned char>(ch)) ? 1 : 3;
  return size;
}

Status checkGrant(const ExtensionGrant& grant) {
  if (grant.extensionClass.empty()) return Error::posix(EINVAL, "sandbox token: empty class");
  if (grant.subject.empty()) return Error::posix(EINVAL, "sandbox token: empty subject");
  if (grant.extensionClass.find('\0') != std::string::npos ||
      grant.subject.find('\0') != std::string::npos) {
    return Error::posix(EINVAL, "sandbox token: NUL in a field");
  }
  if (grant.kind == ExtensionKind::File && grant.subject.front() != '/') {
    return Error::posix(EINVAL, "sandbox token: file path is not absolute");
  }
  if (grant.extensionClass.size() > kMaxExtensionClassBytes) {
    return Error::posix(ENAMETOOLONG, "sandbox token: class too long");
  }
  if (grant.subject.size() > kMaxSubjectBytes) {
    return Error::posix(ENAMETOOLONG, "sandbox token: subject too long");
  }
  return okStatus();
}

std::vector<std::string_view> split(std::string_view token) {
  std::vector<std::string_view> fields;
  std::size_t start = 0;
  for (;;) {
    const std::size_t end = token.find(kSeparator, start);
    fields.push_back(token.substr(start, end == std::string_view::npos ? end : end - start));
    if (end == std::string_view::npos || fields.size() > kFieldCount) return fields;
    start = end + 1;
  }
}

Error malformed(std::string_view what) {
  return Error::posix(EINVAL, "sandbox token: " + std::string(what));
}

}  // namespace

std::string_view extensionKindName(ExtensionKind kind) {
  return kind == ExtensionKind::File ? kFileKind : kServiceKind;
}

Result<std::string> tokenBody(const ExtensionGrant& grant) {
  if (Status valid = checkGrant(grant); !valid.ok()) return valid.error();
  const std::string_view kind = extensionKindName(grant.kind);
  const std::size_t bodySize = kTokenVersion.size() + encodedSize(grant.extensionClass) +
                               kind.size() + encodedSize(grant.subject) + 3;
  if (bodySize + 1 + 2 * kSignatureBytes > kMaxTokenBytes) {
    return Error::posix(ENAMETOOLONG, "sandbox token: encoded token too long");
  }
  std::string body;
  body.reserve(bodySize);
  body.append(kTokenVersion);
  body.push_back(kSeparator);
  appendEncoded(body, grant.extensionClass);
  body.push_back(kSeparator);
  body.append(kind);
  body.push_back(kSeparator);
  appendEncoded(body, grant.subject);
  return body;
}

std::string joinToken(std::string_view body, const TokenSignature& signature) {
  std::string token;
  token.reserve(body.size() + 1 + 2 * signature.size());
  token.append(body);
  token.push_back(kSeparator);
  for (std::uint8_t byte : signature) {
    token.push_back(kLowerHex[byte >> 4]);
    token.push_back(kLowerHex[byte & 0xF]);
  }
  return token;
}

Result<ParsedToken> parseToken(std::string_view token) {
  if (token.size() > kMaxTokenBytes) return malformed("longer than 8192 bytes");
  const std::vector<std::string_view> fields = split(token);
  if (fields.size() != kFieldCount) return malformed("wrong number of fields");
  if (fields[0] != kTokenVersion) return malformed("unknown version");

  ParsedToken parsed;
  if (fields[2] == kFileKind) {
    parsed.grant.kind = ExtensionKind::File;
  } else if (fields[2] == kServiceKind) {
    parsed.grant.kind = ExtensionKind::Service;
  } else {
    return malformed("unknown kind");
  }
  std::optional<std::string> extensionClass = decodeCanonical(fields[1]);
  std::optional<std::string> subject = decodeCanonical(fields[3]);
  if (!extensionClass || !subject) return malformed("bad escape");
  parsed.grant.extensionClass = std::move(*extensionClass);
  parsed.grant.subject = std::move(*subject);
  if (Status valid = checkGrant(parsed.grant); !valid.ok()) {
    return Error::posix(EINVAL, *valid.error().localizedDescription());
  }

  const std::string_view hex = fields[4];
  if (hex.size() != 2 * kSignatureBytes) return malformed("bad signature length");
  for (std::size_t i = 0; i < kSignatureBytes; ++i) {
    const int high = hexValue(hex[2 * i], kLowerHex);
    const int low = hexValue(hex[2 * i + 1], kLowerHex);
    if (high < 0 || low < 0) return malformed("bad signature digit");
    parsed.signature[i] = static_cast<std::uint8_t>(high << 4 | low);
  }
  parsed.body = std::string(token.substr(0, token.size() - hex.size() - 1));
  return parsed;
}

}  // namespace platform::sandbox
