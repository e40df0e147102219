// A 128-bit UUID value.
//
// Thread safety: a plain value; safe to copy and read from any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace platform {

struct Uuid {
  std::array<std::uint8_t, 16> bytes{};

  // A new random (version 4) UUID.
  static Uuid generate();
  // Parses the 36-character text form, either case. Anything else: none.
  static std::optional<Uuid> parse(std::string_view text);
  static Uuid fromBytes(const std::uint8_t* sixteen);

  // Upper-case text form: "E621E1F8-C36C-495A-93FC-0C247A3E6E5F".
  std::string toString() const;
  bool isNull() const;

  auto operator<=>(const Uuid&) const = default;
};

struct UuidHash {
  std::size_t operator()(const Uuid& u) const;
};

}  // namespace platform
