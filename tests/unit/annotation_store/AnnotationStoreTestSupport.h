// Helpers shared by the annotation store tests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/vmap/Reader.h"
#include "qvd/QVDAnnotated.h"

namespace platform {
inline void PrintTo(const Value& value, std::ostream* out) { *out << value.description(); }
inline void PrintTo(const Dictionary& value, std::ostream* out) {
  *out << Value(value).description();
}
}  // namespace platform

namespace qvd::testing {

class ScratchDirectory {
 public:
  ScratchDirectory() : path_((std::filesystem::temp_directory_path() / "annot-XXXXXX").string()) {
    if (::mkdtemp(path_.data()) == nullptr) ADD_FAILURE() << "mkdtemp " << path_;
  }
  ~ScratchDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

class FakePlugIn final : public QVDAnnotated {
 public:
  explicit FakePlugIn(std::string key) : key_(std::move(key)) {}
  std::string annotationKey() const override { return key_; }

 private:
  std::string key_;
};

inline void writeText(const std::string& path, const std::string& text) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

inline std::string readText(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

// An XML document holding `root`, written by hand, not by the store's writer.
inline std::string vmapDocument(const std::string& root) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n" + root +
         "\n</vmap>\n";
}

// The dictionary root of the document at `path`; fails the test otherwise.
inline platform::Dictionary rootOf(const std::string& path) {
  platform::Result<platform::Value> root = platform::vmap::readFile(path);
  if (!root.ok() || root->dictionary() == nullptr) {
    ADD_FAILURE() << path << (root.ok() ? " holds " + root->description()
                                        : ": " + root.error().description());
    return {};
  }
  return *root->dictionary();
}

}  // namespace qvd::testing
