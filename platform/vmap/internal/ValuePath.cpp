#include "platform/vmap/internal/ValuePath.h"

#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/Utf8.h"

namespace platform::vmap::internal {

std::string ValuePath::describe() const {
  if (parts_.empty()) return "the root value";
  std::string out = "the value at ";
  bool first = true;
  for (const auto& part : parts_) {
    if (const auto* key = std::get_if<std::string_view>(&part)) {
      if (!first) out.push_back('.');
      // Keys are shown as they are unless they could be misread.
      bool plain = !key->empty() && findInvalidUtf8(*key) == key->size();
      for (char c : *key)
        plain = plain && c != '.' && c != '[' && c != '"' && static_cast<unsigned char>(c) >= 0x20;
      out += plain ? std::string(*key) : quoted(*key);
    } else {
      out += '[';
      out += std::to_string(std::get<std::size_t>(part));
      out += ']';
    }
    first = false;
  }
  return out;
}

}  // namespace platform::vmap::internal
