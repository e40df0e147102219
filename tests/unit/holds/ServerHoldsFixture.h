// An in-process server over fake platform services, with plug-in bundles
// that exist on disk (so that "lock" paths resolve) and records of them in
// the fake registry.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <string>

#include "Quorvex/QVDConstants.h"
#include "platform/holvane/RegistrationRecord.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {

class ServerHoldsFixture : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_NE(server_.server(), nullptr);
    // Log lines are compared as written, arguments included.
    ::setenv("QV_LOG_PRIVATE", "1", 1);
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
    platform::log::LoggerRegistry::shared().applyFilterForTesting("debug");
  }
  void TearDown() override { platform::log::LoggerRegistry::shared().applyFilterForTesting(""); }

  // A plug-in bundle directory on disk and its record, identifier and
  // bundle identifier "com.example.<name>", in `application` when given
  // (else on the system volume). Each fixture gets bundles of its own.
  platform::holvane::PlugInRecord put(const std::string& name,
                                      std::optional<std::string> bundleVersion = std::nullopt,
                                      const std::string& application = "") {
    platform::holvane::PlugInRecord r;
    r.uuid = platform::Uuid::generate();
    r.path = application.empty()
                 ? platform::rootPath("System/Library/PlugIns/" + unique_ + name + ".ovx")
                 : application + "/PlugIns/" + name + ".ovx";
    std::filesystem::create_directories(r.path);
    r.identifier = "com.example." + name;
    r.originalIdentifier = r.identifier;
    r.bundleIdentifier = r.identifier;
    r.version = "1.0";
    r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
    r.entitlements = platform::Dictionary();
    r.volume =
        application.empty() ? platform::holvane::Volume::System : platform::holvane::Volume::Other;
    if (!application.empty()) r.containingApplicationPath = application;
    platform::Dictionary info{
        {"BXBundleIdentifier", r.identifier},
        {"XOExtension",
         platform::Dictionary{
             {"XOExtensionPointIdentifier", "p"},
             {"XOExtensionAttributes", platform::Dictionary{{"XOExtensionPointName", "p"}}}}}};
    if (bundleVersion) info.set("BXBundleVersion", *bundleVersion);
    r.info = std::move(info);
    server_.fakes().registry->put(r);
    return r;
  }
  // An application directory of this fixture and its record.
  std::string application(const std::string& name) {
    const std::string path = platform::rootPath("Applications/" + unique_ + name + ".app");
    std::filesystem::create_directories(path);
    platform::holvane::ApplicationRecord record;
    record.path = path;
    record.bundleIdentifier = "com.example.app." + name;
    server_.fakes().registry->putApplication(record);
    return path;
  }
  std::shared_ptr<QVDPlugIn> plugIn(const platform::holvane::PlugInRecord& record) {
    return server_.server()->findPlugIn(record.uuid);
  }
  std::uint64_t posts() {
    return server_.fakes().notifications->currentCount(QVNotifyAnnotationChange).value();
  }

  TestServer server_;
  // Bundles of one fixture never collide with another's in the shared root.
  const std::string unique_ = platform::Uuid::generate().toString() + "-";
};

}  // namespace qvd::testing
