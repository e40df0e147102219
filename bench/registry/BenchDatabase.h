// The daemon's parts as the benchmark drives them: a LinuxRegistry over a
// synthetic root, and the plug-in database over that registry with the
// Linux locale, notification, container and sandbox-extension services on
// the same root.
// The database is used directly, without a server: nothing here needs the
// listener or the request queues, and the daemon's queries run the same
// code either way.
//
// Thread safety: as the registry and the database themselves.
#pragma once

#include <memory>
#include <string>

#include "platform/holvane/LinuxRegistry.h"
#include "platform/values/Result.h"
#include "qvd/Platform.h"
#include "qvd/QVDatabase.h"

namespace bench::registry {

// Opens (creating when missing) the registration database of `root` and
// runs the start-up pass, as the daemon does at start.
platform::Result<std::shared_ptr<platform::holvane::LinuxRegistry>> openRegistry(
    const std::string& root);

class BenchDatabase final : public qvd::QVDatabase {
 public:
  // A database over `registry` whose annotation file lies in `root`. The
  // cache limit is left at its default, well above the plug-ins here.
  static platform::Result<std::unique_ptr<BenchDatabase>> open(
      std::shared_ptr<platform::holvane::Registry> registry, const std::string& root);

 private:
  BenchDatabase() = default;

  qvd::Platform services_;
};

}  // namespace bench::registry
