// A bundle: a directory whose manifest is Info.vmap at its top, optionally
// with an executable the manifest names (BXExecutable). The shared QVBundle
// class is built on this. Applications are bundles named *.app; plug-ins
// are bundles whose manifest holds an XOExtension dictionary (or the
// old-style Quorvex key), application extensions being named *.ovx. A
// plug-in ships in <app>/PlugIns/, so its containing application is the
// nearest enclosing *.app whose PlugIns/ holds it.
//
// A Bundle is a snapshot: the paths and manifest are read once, at create().
// Every path it reports is canonical and absolute (links resolved, no
// trailing separator).
//
// Thread safety: immutable after creation; copies may be used anywhere.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Error.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::bundle {

// What the path given to create() names.
enum class BundlePathKind {
  Directory,   // the bundle directory itself
  Executable,  // a file inside a bundle: the bundle is the first directory,
               // from the file's own upwards, that holds Info.vmap
};

// The numbered path properties QVBundle asks for.
enum class BundleProperty : int {
  BundleDirectory = 2,
  Executable = 3,
  SupportFilesDirectory = 9,
};

class Bundle {
 public:
  // Bounds on Info.vmap.
  static constexpr std::size_t kMaxInfoBytes = 1u << 20;
  static constexpr std::size_t kMaxInfoDepth = 32;
  static constexpr std::size_t kMaxInfoItems = 100'000;

  // Fails (InvalidPath) only when `path` is not absolute. A path that names
  // no bundle still makes a Bundle, one without a bundle directory.
  static Result<Bundle> create(std::string_view path, BundlePathKind kind);

  // None when no bundle directory was found.
  const std::optional<std::string>& bundleDirectory() const { return directory_; }
  // <bundle>/<BXExecutable>, when the manifest names one and it is a regular
  // file inside the bundle.
  const std::optional<std::string>& executablePath() const { return executable_; }
  // Where the bundle's support files live: the bundle directory, for
  // applications, plug-ins and other bundles alike.
  const std::optional<std::string>& supportFilesDirectory() const { return directory_; }

  // The path property numbered `number` (see BundleProperty) as a string
  // Value, or none when it is unknown or has no value.
  Value property(int number) const;
  Value property(BundleProperty which) const { return property(static_cast<int>(which)); }

  // The manifest, or null when it is missing or malformed; infoError() then
  // says why (a POSIX, vmap or BundleError error), for logging.
  const Dictionary* infoDictionary() const { return info_.dictionary(); }
  const std::optional<Error>& infoError() const { return infoError_; }

  bool isApplication() const;
  bool isPlugIn() const;
  // A plug-in named *.ovx.
  bool isApplicationExtension() const;

  // The nearest enclosing *.app (as a Directory bundle) whose PlugIns/
  // directory holds this bundle, at any depth; none when there is none.
  std::optional<Bundle> containingApplication() const;

 private:
  Bundle() = default;
  void readInfo();

  std::optional<std::string> directory_;
  std::optional<std::string> executable_;
  Value info_;
  std::optional<Error> infoError_;
};

}  // namespace platform::bundle
