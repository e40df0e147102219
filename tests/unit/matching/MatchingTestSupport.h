// Plug-ins for the match-rule and permission tests: records put into a fake
// registration service and made into QVDPlugIn with fake services, either
// alone or through a running in-process server (for the election, which
// the rules read from the server's annotation store).
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <memory>
#include <string>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "qvd/QVDRegistryPlugIn.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace matching_test {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::holvane::PlugInRecord;
using platform::log::Level;
using qvd::QVDPlugIn;

// A record on the system volume that passes validation. `attributes` go to
// "XOExtensionAttributes" (with the version "1" unless they state one),
// `info` to the top of the info dictionary.
inline PlugInRecord plugInRecord(const std::string& name, Dictionary attributes = {},
                                 Dictionary info = {}) {
  PlugInRecord r;
  r.uuid = platform::Uuid::generate();
  r.path = platform::rootPath("System/Library/PlugIns/" + name + ".ovx");
  r.identifier = "com.example." + name;
  r.originalIdentifier = r.identifier;
  r.bundleIdentifier = r.identifier;
  r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
  if (!attributes.contains("XOExtensionVersion")) attributes.set("XOExtensionVersion", "1");
  info.set("XOExtension", Dictionary{{"XOExtensionProtocol", "com.example.proto"},
                                     {"XOExtensionAttributes", std::move(attributes)}});
  r.info = std::move(info);
  return r;
}

// Debug lines of every category are captured with their private values.
class MatchingTest : public ::testing::Test {
 protected:
  void SetUp() override {
    (void)qvd::testing::testRoot();
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

  // A plug-in of `record` outside any server.
  std::shared_ptr<QVDPlugIn> make(const PlugInRecord& record) {
    fakes_.registry->put(record);
    std::shared_ptr<QVDPlugIn> plugIn = QVDPlugIn::initWithHVData(
        record, {fakes_.registry, fakes_.locale, fakes_.extensions, fakes_.types});
    EXPECT_NE(plugIn, nullptr) << record.path;
    return plugIn;
  }

  bool logged(std::string_view message, Level level, std::string_view category) const {
    for (const auto& line : capture_->lines()) {
      if (line.message == message && line.level == level && line.category == category) return true;
    }
    return false;
  }

  qvd::testing::FakePlatform fakes_;
  std::unique_ptr<platform::log::LogCaptureForTesting> capture_;
};

}  // namespace matching_test
