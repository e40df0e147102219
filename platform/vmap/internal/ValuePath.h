// Where a value sits inside a document ("XOExtension.Attributes[2]"), so
// that a writing error can name the value that could not be written.
//
// Thread safety: a plain value type.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace platform::vmap::internal {

class ValuePath {
 public:
  // The key must outlive the path's use (it points into the value written).
  void pushKey(std::string_view key) { parts_.emplace_back(key); }
  void pushIndex(std::size_t index) { parts_.emplace_back(index); }
  void pop() { parts_.pop_back(); }
  std::size_t depth() const { return parts_.size(); }

  // "the root value" or "the value at A.B[2]".
  std::string describe() const;

 private:
  std::vector<std::variant<std::string_view, std::size_t>> parts_;
};

}  // namespace platform::vmap::internal
