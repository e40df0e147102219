// A temporary platform root shared with the spawned helper, and an
// unredacted log capture.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <memory>
#include <string>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"

namespace sandbox_testing {

// A new directory under /tmp, made the platform root of this process for the
// test's duration and removed afterwards.
class TemporaryRoot {
 public:
  TemporaryRoot() {
    std::string pattern = (std::filesystem::temp_directory_path() / "qv-sbx-XXXXXX").string();
    EXPECT_NE(::mkdtemp(pattern.data()), nullptr);
    path_ = pattern;
    platform::setRootDirectoryForTesting(path_);
  }
  ~TemporaryRoot() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  TemporaryRoot(const TemporaryRoot&) = delete;
  TemporaryRoot& operator=(const TemporaryRoot&) = delete;

  const std::string& path() const { return path_; }
  std::string keyPath() const { return path_ + "/run/quorvex/sandbox/key"; }

 private:
  std::string path_;
};

// Captures every line, debug included, with values not redacted; puts the
// usual filter and redaction back afterwards.
class VerboseCapture {
 public:
  VerboseCapture() {
    ::setenv("QV_LOG_PRIVATE", "1", 1);
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
    platform::log::LoggerRegistry::shared().applyFilterForTesting("debug");
    capture_ = std::make_unique<platform::log::LogCaptureForTesting>();
  }
  ~VerboseCapture() {
    capture_.reset();
    ::unsetenv("QV_LOG_PRIVATE");
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
  }
  VerboseCapture(const VerboseCapture&) = delete;
  VerboseCapture& operator=(const VerboseCapture&) = delete;

  platform::log::LogCaptureForTesting& lines() { return *capture_; }

 private:
  std::unique_ptr<platform::log::LogCaptureForTesting> capture_;
};

}  // namespace sandbox_testing
