// Helpers shared by the platform-service tests: a scratch directory that is
// removed afterwards, and writing vmap documents and raw text into it.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "platform/values/Value.h"
#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Writer.h"

namespace platform::services_testing {

// A fresh temporary directory, by its canonical path.
class ScratchDirectory {
 public:
  ScratchDirectory() {
    std::string pattern = (std::filesystem::temp_directory_path() / "qv-services-XXXXXX").string();
    EXPECT_NE(::mkdtemp(pattern.data()), nullptr);
    path_ = std::filesystem::canonical(pattern).string();
  }
  ~ScratchDirectory() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }
  std::string operator/(const std::string& relative) const { return path_ + "/" + relative; }

 private:
  std::string path_;
};

inline void makeDirectories(const std::string& path) { std::filesystem::create_directories(path); }

// Writes `value` as an XML vmap document (mode 0644), making the directory.
inline void writeVmap(const std::string& path, const Value& value) {
  makeDirectories(std::filesystem::path(path).parent_path().string());
  Status written = vmap::writeFileAtomically(path, value, vmap::Format::Xml);
  ASSERT_TRUE(written.ok()) << written.error().description();
}

// Writes `text` in place: an existing file keeps its inode.
inline void writeText(const std::string& path, const std::string& text) {
  makeDirectories(std::filesystem::path(path).parent_path().string());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

// The XML text of `value`, to write in place with writeText.
inline std::string vmapText(const Value& value) {
  Result<std::string> text = vmap::write(value, vmap::Format::Xml);
  EXPECT_TRUE(text.ok());
  return text.ok() ? *text : std::string();
}

inline struct stat statOf(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
  return status;
}

inline mode_t modeOf(const std::string& path) { return statOf(path).st_mode & 07777; }

}  // namespace platform::services_testing
