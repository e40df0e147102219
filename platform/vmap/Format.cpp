#include "platform/vmap/Format.h"

#include <algorithm>

namespace platform::vmap {

std::optional<Format> detectFormat(std::span<const std::uint8_t> bytes) {
  if (bytes.size() >= kBinaryMagic.size() &&
      std::equal(kBinaryMagic.begin(), kBinaryMagic.end(), bytes.begin()))
    return Format::Binary;
  std::size_t i = 0;
  if (bytes.size() >= 3 && bytes[0] == 0xEF && bytes[1] == 0xBB && bytes[2] == 0xBF) i = 3;
  while (i < bytes.size() &&
         (bytes[i] == ' ' || bytes[i] == '\t' || bytes[i] == '\n' || bytes[i] == '\r'))
    ++i;
  if (i < bytes.size() && bytes[i] == '<') return Format::Xml;
  return std::nullopt;
}

const char* formatName(Format format) { return format == Format::Xml ? "xml" : "binary"; }

}  // namespace platform::vmap
