// Shared pieces of the record tests: a log capture that sees debug lines and
// unredacted values, and a builder for manifests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVPlugInCore.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"

namespace plugin_record_test {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::log::CapturedLine;
using platform::log::Level;

// Every test runs with all levels on and values shown, and captures lines.
class RecordTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ::setenv("QV_LOG", "debug", 1);
    ::setenv("QV_LOG_PRIVATE", "1", 1);
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
    capture_ = std::make_unique<platform::log::LogCaptureForTesting>();
  }
  void TearDown() override {
    capture_.reset();
    ::unsetenv("QV_LOG");
    ::unsetenv("QV_LOG_PRIVATE");
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
  }

  // Whether a line with exactly this message, level and category was logged.
  bool logged(std::string_view message, Level level, std::string_view category) const {
    const std::vector<CapturedLine> lines = capture_->lines();
    return std::any_of(lines.begin(), lines.end(), [&](const CapturedLine& l) {
      return l.message == message && l.level == level && l.category == category &&
             l.subsystem == "com.corvane.Quorvex";
    });
  }
  bool loggedStartingWith(std::string_view prefix, Level level, std::string_view category) const {
    const std::vector<CapturedLine> lines = capture_->lines();
    return std::any_of(lines.begin(), lines.end(), [&](const CapturedLine& l) {
      return l.message.starts_with(prefix) && l.level == level && l.category == category;
    });
  }
  bool loggedAnything(std::string_view fragment) const {
    for (const std::string& m : capture_->messages()) {
      if (m.find(fragment) != std::string::npos) return true;
    }
    return false;
  }
  void clearLog() { capture_->clear(); }

  std::unique_ptr<platform::log::LogCaptureForTesting> capture_;
};

inline std::string url(std::string_view path) {
  return QVFileURLFromPath(path);
}

// An info dictionary whose plug-in dictionary is `plugIn`.
inline Dictionary infoWith(Dictionary plugIn, Dictionary extra = {}) {
  Dictionary info = std::move(extra);
  info.set("XOExtension", std::move(plugIn));
  return info;
}

// A set-up record at `path` with the given info dictionary.
inline std::shared_ptr<QVPlugInCore> recordAt(std::string_view path, const Dictionary& info,
                                              std::string name = "com.example.plugin") {
  return QVPlugInCore::initWithName(std::move(name), url(path), Value(info), std::nullopt,
                                    std::nullopt);
}

}  // namespace plugin_record_test
