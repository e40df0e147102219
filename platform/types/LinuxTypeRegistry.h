// Types as the system volume declares them: every `*.vmap` file in
// <root>/System/Library/Types holds a list of type declarations
// (TypeDeclarations.h). The files are read once, when the registry is
// made: they ship with the system volume, which changes only with a system
// update (and the daemon with it), and conformance is asked once per
// plug-in and rule, so a question never touches the file system.
//
// Files are read in name order; a file that cannot be read, is malformed or
// exceeds a limit is logged and skipped whole (category "types" of
// "com.corvane.platform"), and the others still count. When two files
// declare one identifier the first declaration stands (logged). Hidden
// files (".name") are never read: they are editors' and installers'
// temporaries.
//
// Thread safety: immutable after construction; safe to call from any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/types/TypeDeclarations.h"
#include "platform/types/TypeHierarchy.h"
#include "platform/types/TypeRegistry.h"
#include "platform/vmap/Reader.h"

namespace platform::types {

struct TypeRegistryLimits {
  // One file: a declaration needs three levels (list, dictionary, list).
  vmap::ReadLimits file{.maxBytes = 1u << 20, .maxDepth = 8, .maxItems = 100'000};
  DeclarationLimits declarations;
  // Declaration files read; past this the rest (by name) are skipped.
  std::size_t maxFiles = 1'000;
  // Declared types in all files together; a file that would pass it is
  // skipped.
  std::size_t maxTypes = 50'000;
  // A directory with more entries than this is not read at all.
  std::size_t maxDirectoryEntries = 100'000;
};

class LinuxTypeRegistry final : public TypeRegistry {
 public:
  // Reads rootPath("System/Library/Types").
  LinuxTypeRegistry();
  // REQUIRES: directory is absolute.
  explicit LinuxTypeRegistry(std::string directory, TypeRegistryLimits limits = {});

  bool conformsTo(std::string_view type, std::string_view other) const override;
  bool evaluateActivationRule(const Value& rule, const Dictionary& items) const override;

  const std::string& directory() const { return directory_; }
  // The number of declared types.
  std::size_t typeCount() const { return hierarchy_.size(); }

 private:
  static TypeHierarchy load(const std::string& directory, const TypeRegistryLimits& limits);

  const std::string directory_;
  const TypeHierarchy hierarchy_;
};

}  // namespace platform::types
