// The plug-ins every input can name. Each one is there to open a path
// through the handlers: a plain system plug-in (alpha, auto-elected), an
// older version of it that claims to replace beta (epsilon), one that
// demands a host entitlement (beta), a busy one, a data one, one whose
// bundle the sandbox refuses to hand out, and a keyboard inside an
// application (gamma). UUIDs are F022A000-0000-4000-8000-00000000000N, N
// in catalogue order from 1; paths are under $ROOT/System/Library/PlugIns
// and $ROOT/Applications/Host.app/PlugIns.
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "fuzz/transaction/FuzzDaemon.h"
#include "platform/root/Root.h"
#include "platform/vmap/AtomicFile.h"

namespace qvd::fuzzing {

namespace {

using platform::Dictionary;
using platform::Value;
using platform::holvane::PlugInRecord;

struct PlugInShape {
  std::string name;
  std::string identifier;
  std::string version = "1.0";
  std::string point = "com.example.point";
  Dictionary extension{};   // extra XOExtension entries
  Dictionary attributes{};  // extra XOExtensionAttributes entries
  Dictionary entitlements{};
  Dictionary service{};  // MBXService, when not empty
  bool inApplication = false;
  bool data = false;
};

void writeOrDie(const std::string& path, const Value& value) {
  auto written = platform::vmap::writeFileAtomically(path, value, platform::vmap::Format::Xml);
  if (!written.ok()) {
    std::fprintf(stderr, "fuzz_transaction: cannot write %s\n", path.c_str());
    std::abort();
  }
}

std::string applicationPath() {
  return platform::rootPath("Applications/Host.app");
}

void writeApplication() {
  const std::string app = applicationPath();
  std::filesystem::create_directories(app + "/PlugIns");
  writeOrDie(app + "/Info.vmap", Value(Dictionary{{"BXBundleIdentifier", "com.example.host"},
                                                  {"BXExecutable", "Host"}}));
  std::ofstream(app + "/Host") << "#!/bin/sh\n";
}

PlugInRecord writePlugIn(const PlugInShape& s, int serial) {
  const std::string path = (s.inApplication ? applicationPath() + "/PlugIns/"
                                            : platform::rootPath("System/Library/PlugIns/")) +
                           s.name + ".ovx";
  std::filesystem::create_directories(path);
  Dictionary attributes{
      {"XOExtensionPointName", s.point}, {"XOExtensionVersion", s.version}, {"Name", s.name}};
  for (const auto& [key, value] : s.attributes) attributes.set(key, value);
  Dictionary extension{{"XOExtensionPointIdentifier", s.point},
                       {"XOExtensionAttributes", attributes}};
  if (s.data) extension.set("XOExtensionProtocol", std::string(QVDataProtocol));
  for (const auto& [key, value] : s.extension) extension.set(key, value);
  Dictionary info{{"BXBundleIdentifier", s.identifier},
                  {"BXBundleVersion", s.version},
                  {"BXExecutable", "Run"},
                  {"XOExtension", extension}};
  if (!s.service.empty()) info.set("MBXService", s.service);
  writeOrDie(path + "/Info.vmap", Value(info));
  std::ofstream(path + "/Run") << "#!/bin/sh\n";

  char uuid[40];
  std::snprintf(uuid, sizeof uuid, "F022A000-0000-4000-8000-%012d", serial);
  PlugInRecord r;
  r.uuid = *platform::Uuid::parse(uuid);
  r.path = path;
  r.identifier = s.identifier;
  r.originalIdentifier = s.identifier;
  r.bundleIdentifier = s.identifier;
  r.version = s.version;
  r.extensionPointName = s.point;
  r.registered = platform::Date{1000.0 + serial};
  r.volume = s.inApplication ? platform::holvane::Volume::Other : platform::holvane::Volume::System;
  r.entitlements = s.entitlements;
  if (!s.data) r.dataContainer = platform::rootPath("var/containers/Data/" + s.identifier);
  if (s.inApplication) r.containingApplicationPath = applicationPath();
  r.info = info;
  return r;
}

}  // namespace

std::vector<PlugInRecord> makePlugInCatalogue() {
  writeApplication();
  const Dictionary environment{{"TMPDIR", "/own"}, {"LANG", "C"}};
  const std::vector<PlugInShape> shapes = {
      {.name = "alpha",
       .identifier = "com.example.alpha",
       .entitlements = {{std::string(QVAutoElectEntitlement), true}},
       .service = {{"EnvironmentVariables", environment}, {"Label", "alpha"}}},
      {.name = "beta",
       .identifier = "com.example.beta",
       .version = "2.0",
       .extension = {{std::string(QVHostEntitlementInfoKey), "com.example.flag"}}},
      {.name = "epsilon",
       .identifier = "com.example.alpha",
       .version = "0.9",
       .entitlements = {{std::string(QVOverrideEntitlement), "com.example.beta"}}},
      {.name = "busy", .identifier = "com.example.busy"},
      {.name = "delta", .identifier = "com.example.delta", .data = true},
      {.name = "denied", .identifier = "com.example.denied", .point = "com.example.other"},
      {.name = "gamma",
       .identifier = "com.example.gamma",
       .point = "com.corvane.keyboard-service",
       .extension = {{std::string(QVDedicatedKey), true}},
       .attributes = {{"RequestsOpenAccess", true}},
       .inApplication = true},
  };
  std::vector<PlugInRecord> records;
  int serial = 0;
  for (const PlugInShape& shape : shapes) records.push_back(writePlugIn(shape, ++serial));
  return records;
}

}  // namespace qvd::fuzzing
