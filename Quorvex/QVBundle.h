// A small read-only view of a bundle on disk (an application or plug-in
// directory): where it is, its executable, its support-files directory and
// its info dictionary. It never reads or writes bundle contents itself.
//
// Thread safety: immutable after construction apart from the support-path
// cache, which is filled once under a once-flag; any thread may use it.
#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/bundle/Bundle.h"

class QVBundle {
 public:
  // Every other constructor ends here.
  static std::shared_ptr<QVBundle> initWithMBXBundle(platform::bundle::Bundle bundle);
  // The bundle of the running program.
  static std::shared_ptr<QVBundle> initForMainBundle();
  // The bundle whose directory is the given location; none for a relative
  // path or a URL that is not a file URL.
  static std::shared_ptr<QVBundle> initWithPath(std::string_view path);
  static std::shared_ptr<QVBundle> initWithURL(std::string_view fileURL);
  // The bundle that contains the given executable; a path that is itself a
  // bundle directory (not an executable) gives that bundle.
  static std::shared_ptr<QVBundle> initWithExecutablePath(std::string_view path);
  static std::shared_ptr<QVBundle> initWithExecutableURL(std::string_view fileURL);

  // The numbered path property of the underlying bundle object, or none.
  std::optional<std::string> stringProperty(int number) const;

  std::optional<std::string> path() const;  // property 2
  // A file URL whose path equals path().
  std::optional<std::string> url() const;
  // Property 3, or path() when the bundle has no executable.
  std::optional<std::string> executablePath() const;
  // The support-files directory (property 9), cached after the first call.
  std::optional<std::string> supportPath() const;
  // supportPath() with `name` appended as one more path component.
  std::optional<std::string> bundleDirectory(std::string_view name) const;
  // Where an application keeps its plug-ins.
  std::optional<std::string> plugInsPath() const { return bundleDirectory("PlugIns"); }

  // The info dictionary, or none (logged at info level, category "ops").
  std::optional<platform::Dictionary> infoDictionary() const;
  // "BXBundleIdentifier" of the info dictionary, or none.
  std::optional<std::string> bundleIdentifier() const;

  const platform::bundle::Bundle& mbxBundle() const { return bundle_; }
  std::string description() const;

 private:
  explicit QVBundle(platform::bundle::Bundle bundle) : bundle_(std::move(bundle)) {}

  const platform::bundle::Bundle bundle_;
  mutable std::once_flag supportPathOnce_;
  mutable std::optional<std::string> supportPath_;
};
