// Shared pieces of the registry-backed plug-in tests.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "platform/holvane/testing/FakeRegistry.h"
#include "platform/locale/testing/FakeLocaleService.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"
#include "platform/vmap/Writer.h"
#include "qvd/QVDRegistryPlugIn.h"

namespace registry_plugin_test {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::holvane::PlugInRecord;
using platform::log::Level;
using qvd::QVDPlugIn;

// A plug-in dictionary that passes the base validation.
inline Dictionary validPlugInDictionary(std::string_view protocol = "com.example.proto") {
  return Dictionary{{"XOExtensionProtocol", Value(protocol)},
                    {"XOExtensionAttributes", Dictionary{{"XOExtensionVersion", "1"}}}};
}

class RegistryPlugInTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ::setenv("QV_LOG", "debug", 1);
    ::setenv("QV_LOG_PRIVATE", "1", 1);
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
    capture_ = std::make_unique<platform::log::LogCaptureForTesting>();
    char pattern[] = "/tmp/qvd-regplugin-XXXXXX";
    root_ = ::mkdtemp(pattern);
    platform::setRootDirectoryForTesting(root_);
  }
  void TearDown() override {
    capture_.reset();
    std::filesystem::remove_all(root_);
    ::unsetenv("QV_LOG");
    ::unsetenv("QV_LOG_PRIVATE");
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
  }

  PlugInRecord record(std::string_view relative, std::string identifier = "com.example.plugin",
                      Dictionary plugIn = validPlugInDictionary()) const {
    PlugInRecord r;
    r.uuid = platform::Uuid::generate();
    r.path = root_ + "/" + std::string(relative);
    r.identifier = identifier;
    r.originalIdentifier = identifier;
    r.bundleIdentifier = identifier;
    r.dataContainer = root_ + "/var/containers/Data/" + identifier;
    r.info = Dictionary{{"BXBundleIdentifier", identifier}, {"XOExtension", std::move(plugIn)}};
    return r;
  }

  std::shared_ptr<QVDPlugIn> make(const PlugInRecord& r) {
    registry_->put(r);
    return QVDPlugIn::initWithHVData(r, {registry_, locale_, extensions_});
  }

  static void writeTable(const std::string& bundle, std::string_view lang, std::string_view table,
                         const Dictionary& strings) {
    const std::string dir = bundle + "/locale/" + std::string(lang);
    std::filesystem::create_directories(dir);
    std::ofstream(dir + "/" + std::string(table) + ".vmap")
        << platform::vmap::write(Value(strings), platform::vmap::Format::Xml).value();
  }

  bool logged(std::string_view message, Level level, std::string_view category) const {
    for (const auto& l : capture_->lines())
      if (l.message == message && l.level == level && l.category == category) return true;
    return false;
  }
  std::size_t countLogged(std::string_view message) const {
    const auto messages = capture_->messages();
    return std::count(messages.begin(), messages.end(), message);
  }

  std::string root_;
  std::shared_ptr<platform::holvane::FakeRegistry> registry_ =
      std::make_shared<platform::holvane::FakeRegistry>();
  std::shared_ptr<platform::locale::FakeLocaleService> locale_ =
      std::make_shared<platform::locale::FakeLocaleService>("en");
  std::shared_ptr<platform::sandbox::FakeSandboxExtensions> extensions_ =
      std::make_shared<platform::sandbox::FakeSandboxExtensions>();
  std::unique_ptr<platform::log::LogCaptureForTesting> capture_;
};

}  // namespace registry_plugin_test
