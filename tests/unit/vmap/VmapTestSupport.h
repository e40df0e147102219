// Helpers shared by the vmap tests: reading text, checking error locations,
// comparing values kind by kind, and a scratch directory.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "platform/vmap/Reader.h"
#include "platform/vmap/VmapError.h"

namespace platform::vmap::testing {

inline Result<Value> readText(std::string_view s, const ReadLimits& limits = {}) {
  return read({reinterpret_cast<const std::uint8_t*>(s.data()), s.size()}, limits);
}

inline bool hasCode(const Error& e, ErrorCode code) {
  return e.is(kErrorDomain, static_cast<std::int64_t>(code));
}

inline std::int64_t infoNumber(const Error& e, std::string_view key) {
  return e.userInfo() ? e.userInfo()->get(key).int64().value_or(-1) : -1;
}

// Equal by ==, and of the same kinds all the way down (== alone would let
// true pass for 1), except that an Unsigned may come back as an Integer.
inline ::testing::AssertionResult identical(const Value& a, const Value& b) {
  if (!(a == b)) return ::testing::AssertionFailure() << a.description() << " != " << b.description();
  const bool narrowed = a.type() == ValueType::Unsigned && b.type() == ValueType::Integer;
  if (a.type() != b.type() && !narrowed)
    return ::testing::AssertionFailure() << valueTypeName(a.type()) << " came back as "
                                         << valueTypeName(b.type()) << ": " << a.description();
  if (const Array* x = a.array()) {
    for (std::size_t i = 0; i < x->size(); ++i)
      if (auto r = identical((*x)[i], (*b.array())[i]); !r) return r << " at [" << i << "]";
  } else if (const Dictionary* x = a.dictionary()) {
    for (const auto& [key, item] : *x)
      if (auto r = identical(item, b.dictionary()->get(key)); !r) return r << " at " << key;
  }
  return ::testing::AssertionSuccess();
}

// A fresh directory, removed with everything in it afterwards.
class ScratchDirectory {
 public:
  ScratchDirectory() {
    std::string pattern = (std::filesystem::temp_directory_path() / "vmap-test-XXXXXX").string();
    path_ = ::mkdtemp(pattern.data());
  }
  ~ScratchDirectory() { std::filesystem::remove_all(path_); }
  std::string file(std::string_view name) const { return path_ + "/" + std::string(name); }
  const std::string& path() const { return path_; }
  std::vector<std::string> names() const {
    std::vector<std::string> out;
    for (const auto& entry : std::filesystem::directory_iterator(path_))
      out.push_back(entry.path().filename().string());
    std::sort(out.begin(), out.end());
    return out;
  }

 private:
  std::string path_;
};

inline void writeText(const std::string& path, std::string_view text) {
  std::ofstream(path, std::ios::binary) << text;
}

inline std::string readAll(const std::string& path) {
  std::stringstream s;
  s << std::ifstream(path, std::ios::binary).rdbuf();
  return s.str();
}

}  // namespace platform::vmap::testing
