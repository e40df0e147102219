#include "platform/types/LinuxTypeRegistry.h"

#include <algorithm>
#include <filesystem>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "platform/types/ActivationRule.h"

namespace platform::types {
namespace {

const log::Logger& typesLog() {
  static const log::Logger& logger = log::platformLog("types");
  return logger;
}

// The declaration files of `directory`, by name; empty (logged) when the
// directory cannot be listed or is unreasonably large.
std::vector<std::string> declarationFiles(const std::string& directory,
                                          const TypeRegistryLimits& limits) {
  std::vector<std::string> names;
  std::error_code error;
  std::filesystem::directory_iterator entries(directory, error);
  if (error) {
    if (error == std::errc::no_such_file_or_directory) {
      typesLog().debug("no type declarations: %{public}s does not exist", directory);
    } else {
      typesLog().error("cannot list type declarations in %{public}s: %{public}s", directory,
                       error.message());
    }
    return {};
  }
  std::size_t seen = 0;
  for (; entries != std::filesystem::directory_iterator(); entries.increment(error)) {
    if (++seen > limits.maxDirectoryEntries) {
      typesLog().error("%{public}s has more than %u entries; no type declarations read", directory,
                       static_cast<unsigned>(limits.maxDirectoryEntries));
      return {};
    }
    std::string name = entries->path().filename().string();
    if (name.starts_with('.') || !name.ends_with(".vmap")) continue;
    names.push_back(std::move(name));
  }
  if (error) {
    typesLog().error("cannot list type declarations in %{public}s: %{public}s", directory,
                     error.message());
    return {};
  }
  std::sort(names.begin(), names.end());
  if (names.size() > limits.maxFiles) {
    typesLog().error("%{public}s holds %u declaration files; only the first %u are read",
                     directory, static_cast<unsigned>(names.size()),
                     static_cast<unsigned>(limits.maxFiles));
    names.resize(limits.maxFiles);
  }
  return names;
}

}  // namespace

LinuxTypeRegistry::LinuxTypeRegistry() : LinuxTypeRegistry(rootPath("System/Library/Types")) {}

LinuxTypeRegistry::LinuxTypeRegistry(std::string directory, TypeRegistryLimits limits)
    : directory_(std::move(directory)), hierarchy_(load(directory_, limits)) {}

TypeHierarchy LinuxTypeRegistry::load(const std::string& directory,
                                      const TypeRegistryLimits& limits) {
  TypeHierarchy hierarchy;
  std::size_t files = 0;
  for (const std::string& name : declarationFiles(directory, limits)) {
    const std::string path = directory + "/" + name;
    Result<Value> document = vmap::readFile(path, limits.file);
    if (!document.ok()) {
      typesLog().error("type declarations %{public}s skipped: %@", path, document.error());
      continue;
    }
    Result<std::vector<TypeDeclaration>> declarations =
        parseTypeDeclarations(*document, limits.declarations);
    if (!declarations.ok()) {
      typesLog().error("type declarations %{public}s skipped: %@", path, declarations.error());
      continue;
    }
    if (hierarchy.size() + declarations->size() > limits.maxTypes) {
      typesLog().error("type declarations %{public}s skipped: more than %u types in all",
                       path, static_cast<unsigned>(limits.maxTypes));
      continue;
    }
    for (TypeDeclaration& declaration : *declarations) {
      const std::string identifier = declaration.identifier;
      if (!hierarchy.declare(std::move(declaration))) {
        typesLog().notice("type %{public}s declared again in %{public}s; the first declaration "
                          "stands",
                          identifier, path);
      }
    }
    ++files;
  }
  typesLog().info("%u types declared in %u files of %{public}s",
                  static_cast<unsigned>(hierarchy.size()), static_cast<unsigned>(files), directory);
  return hierarchy;
}

bool LinuxTypeRegistry::conformsTo(std::string_view type, std::string_view other) const {
  return hierarchy_.conformsTo(type, other);
}

bool LinuxTypeRegistry::evaluateActivationRule(const Value& rule, const Dictionary& items) const {
  return types::evaluateActivationRule(rule, items);
}

}  // namespace platform::types
