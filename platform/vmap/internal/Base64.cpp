#include "platform/vmap/internal/Base64.h"

#include <array>
#include <cstdio>

namespace platform::vmap::internal {
namespace {

constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr std::uint8_t kSpace = 0xFE;
constexpr std::uint8_t kInvalid = 0xFF;

constexpr std::array<std::uint8_t, 256> makeDecodeTable() {
  std::array<std::uint8_t, 256> table{};
  for (auto& entry : table) entry = kInvalid;
  for (std::uint8_t i = 0; i < 64; ++i) table[static_cast<unsigned char>(kAlphabet[i])] = i;
  table[' '] = table['\t'] = table['\n'] = table['\r'] = kSpace;
  return table;
}

constexpr std::array<std::uint8_t, 256> kDecode = makeDecodeTable();

}  // namespace

void appendBase64(std::string& out, std::span<const std::uint8_t> bytes) {
  out.reserve(out.size() + (bytes.size() + 2) / 3 * 4);
  std::size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    const std::uint32_t n = (bytes[i] << 16) | (bytes[i + 1] << 8) | bytes[i + 2];
    out.push_back(kAlphabet[n >> 18]);
    out.push_back(kAlphabet[(n >> 12) & 63]);
    out.push_back(kAlphabet[(n >> 6) & 63]);
    out.push_back(kAlphabet[n & 63]);
  }
  const std::size_t rest = bytes.size() - i;
  if (rest == 0) return;
  std::uint32_t n = bytes[i] << 16;
  if (rest == 2) n |= bytes[i + 1] << 8;
  out.push_back(kAlphabet[n >> 18]);
  out.push_back(kAlphabet[(n >> 12) & 63]);
  out.push_back(rest == 2 ? kAlphabet[(n >> 6) & 63] : '=');
  out.push_back('=');
}

bool decodeBase64(std::string_view text, Data& out, std::string& why) {
  out.clear();
  out.reserve(text.size() / 4 * 3);
  std::uint32_t group = 0;
  std::size_t inGroup = 0;  // sextets gathered for the current group
  std::size_t padding = 0;
  for (unsigned char c : text) {
    const std::uint8_t v = kDecode[c];
    if (v == kSpace) continue;
    if (c == '=') {
      // Padding fills the last one or two places of the final group.
      if (inGroup < 2 || padding == 2) {
        why = "misplaced padding";
        return false;
      }
      ++padding;
      if (inGroup + padding == 4) {
        out.push_back(static_cast<std::uint8_t>(group >> (inGroup == 2 ? 4 : 10)));
        if (inGroup == 3) out.push_back(static_cast<std::uint8_t>(group >> 2));
        inGroup = 0;
        group = 0;
      }
      continue;
    }
    if (v == kInvalid) {
      char shown[8];
      std::snprintf(shown, sizeof shown, c >= 0x20 && c < 0x7F ? "'%c'" : "\\x%02X", c);
      why = std::string("character ") + shown + " is not base64";
      return false;
    }
    if (padding > 0) {
      why = "data after the padding";
      return false;
    }
    group = (group << 6) | v;
    if (++inGroup == 4) {
      out.push_back(static_cast<std::uint8_t>(group >> 16));
      out.push_back(static_cast<std::uint8_t>(group >> 8));
      out.push_back(static_cast<std::uint8_t>(group));
      inGroup = 0;
      group = 0;
    }
  }
  if (inGroup != 0) {
    why = "length is not a multiple of four";
    return false;
  }
  return true;
}

}  // namespace platform::vmap::internal
