#include "platform/values/Uuid.h"

#include <uuid/uuid.h>

#include <cstring>

namespace platform {

Uuid Uuid::generate() {
  Uuid u;
  uuid_generate_random(u.bytes.data());
  return u;
}

std::optional<Uuid> Uuid::parse(std::string_view text) {
  // libuuid wants a NUL-terminated 36-character string; anything longer or
  // shorter is refused before it sees it.
  if (text.size() != 36) return std::nullopt;
  char buf[37];
  std::memcpy(buf, text.data(), 36);
  buf[36] = '\0';
  Uuid u;
  if (uuid_parse(buf, u.bytes.data()) != 0) return std::nullopt;
  return u;
}

Uuid Uuid::fromBytes(const std::uint8_t* sixteen) {
  Uuid u;
  std::memcpy(u.bytes.data(), sixteen, 16);
  return u;
}

std::string Uuid::toString() const {
  char buf[37];
  uuid_unparse_upper(bytes.data(), buf);
  return std::string(buf, 36);
}

bool Uuid::isNull() const {
  for (auto b : bytes)
    if (b != 0) return false;
  return true;
}

std::size_t UuidHash::operator()(const Uuid& u) const {
  std::uint64_t a, b;
  std::memcpy(&a, u.bytes.data(), 8);
  std::memcpy(&b, u.bytes.data() + 8, 8);
  return static_cast<std::size_t>(a ^ (b * 0x9E3779B97F4A7C15ull));
}

}  // namespace platform
