#include "platform/vmap/internal/ErrorText.h"

#include <cstdio>

#include "platform/vmap/internal/Utf8.h"

namespace platform::vmap::internal {
namespace {

constexpr std::size_t kMaxQuotedBytes = 64;

Error makeError(ErrorCode code, std::string message, Dictionary info) {
  info.set(kLocalizedDescriptionKey, Value(std::move(message)));
  return Error(std::string(kErrorDomain), static_cast<std::int64_t>(code), std::move(info));
}

}  // namespace

Error errorAtLine(ErrorCode code, std::uint64_t line, std::uint64_t column, std::string_view what) {
  Dictionary info;
  info.set(kErrorLineKey, Value(line));
  info.set(kErrorColumnKey, Value(column));
  return makeError(code, std::to_string(line) + ":" + std::to_string(column) + ": " +
                             std::string(what),
                   std::move(info));
}

Error errorAtOffset(ErrorCode code, std::uint64_t offset, std::string_view what) {
  Dictionary info;
  info.set(kErrorOffsetKey, Value(offset));
  return makeError(code, "offset " + std::to_string(offset) + ": " + std::string(what),
                   std::move(info));
}

Error errorPlain(ErrorCode code, std::string_view what) {
  return makeError(code, std::string(what), Dictionary{});
}

Error withPath(const Error& error, std::string_view path) {
  Dictionary info = error.userInfo() ? *error.userInfo() : Dictionary{};
  const std::string description = error.description();
  // A line-and-column location joins the path like a compiler's; anything
  // else is set off by a space.
  const char* joint = info.contains(kErrorLineKey) ? ":" : ": ";
  info.set(kErrorPathKey, Value(path));
  info.set(kLocalizedDescriptionKey, Value(std::string(path) + joint + description));
  return Error(error.domain(), error.code(), std::move(info));
}

std::string quoted(std::string_view text) {
  std::string out = "\"";
  std::size_t shown = text.size() <= kMaxQuotedBytes ? text.size() : kMaxQuotedBytes;
  // Do not cut a UTF-8 sequence in half.
  while (shown < text.size() && shown > 0 &&
         (static_cast<unsigned char>(text[shown]) & 0xC0) == 0x80)
    --shown;
  for (std::size_t i = 0; i < shown; ++i) {
    const unsigned char c = static_cast<unsigned char>(text[i]);
    if (c >= 0x80) {
      // Messages end up in logs and replies that must be UTF-8 themselves.
      char32_t codePoint;
      const std::size_t n = decodeUtf8(text.substr(0, shown), i, codePoint);
      if (n == 0) {
        char buf[8];
        std::snprintf(buf, sizeof buf, "\\x%02X", c);
        out += buf;
      } else {
        out.append(text.substr(i, n));
        i += n - 1;
      }
      continue;
    }
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\n': out += "\\n"; break;
      case '\r': out += "\\r"; break;
      case '\t': out += "\\t"; break;
      default:
        if (c < 0x20 || c == 0x7F) {
          char buf[8];
          std::snprintf(buf, sizeof buf, "\\x%02X", c);
          out += buf;
        } else {
          out.push_back(static_cast<char>(c));
        }
    }
  }
  if (shown < text.size()) out += "...";
  out += "\"";
  return out;
}

}  // namespace platform::vmap::internal
