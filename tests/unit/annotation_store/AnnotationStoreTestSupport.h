// Helpers shared by the annotation store tests: a scratch directory, plug-ins
// that answer a chosen annotation key, and file contents in and out.
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
// Readable values in failure messages.
inline void PrintTo(const Value& value, std::ostream* out) { *out << value.description(); }
inline void PrintTo(const Dictionary& value, std::ostream* out) {
  *out << Value(value).description();
}
}  // namespace platform

namespace qvd::testing {

// A fresh directory, removed with everything in it afterwards.
class ScratchDirectory {
 public:
  ScratchDirectory() {
    std::string pattern =
        (std::filesystem::temp_directory_path() / "annotation-store-XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) ADD_FAILURE() << "mkdtemp " << pattern;
    path_ = pattern;
  }
  ~ScratchDirectory() {
    std::error_code ec;
    std::filesystem::remove_all(path_, ec);
  }
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;

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
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out << text;
  ASSERT_TRUE(out.good()) << path;
}

inline std::string readText(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

// An XML document holding `root`, written out by hand so that the tests do
// not depend on the store's own writer for their inputs.
inline std::string vmapDocument(const std::string& root) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n" + root +
         "\n</vmap>\n";
}

// The root dictionary of the document at `path`, failing the test when the
// file is not a complete document with a dictionary root.
inline platform::Dictionary rootOf(const std::string& path) {
  platform::Result<platform::Value> root = platform::vmap::readFile(path);
  if (!root.ok()) {
    ADD_FAILURE() << root.error().description();
    return {};
  }
  if (root->dictionary() == nullptr) {
    ADD_FAILURE() << path << " holds " << root->description();
    return {};
  }
  return *root->dictionary();
}

}  // namespace qvd::testing
