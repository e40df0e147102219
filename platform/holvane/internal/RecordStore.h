// The registration database's tables and the rows of records in them. It
// knows SQL and the encoding of records; what to store, and when, is
// LinuxRegistry's business.
//
// Schema (version 1):
//   meta(key TEXT PRIMARY KEY, value TEXT)      "schema", "generation"
//   applications(path PRIMARY KEY, bundle_identifier, executable, registered, info BLOB)
//   plugins(uuid PRIMARY KEY, path UNIQUE, identifier, original_identifier,
//           bundle_identifier, version, extension_point, registered, system_volume,
//           entitlements BLOB, data_container, info BLOB, application_path)
//   index plugins_by_extension_point(extension_point), plugins_by_application(application_path)
// Dictionaries are stored as binary vmap documents.
//
// Thread safety: none; confined to the registry's serial queue.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/holvane/RegistrationRecord.h"
#include "platform/holvane/internal/Sqlite.h"

namespace platform::holvane::internal {

class RecordStore {
 public:
  // Opens the file, creates the schema when missing and checks that the file
  // is sound; a damaged file or an unknown schema version fails as Corrupt.
  static Result<std::unique_ptr<RecordStore>> open(const std::string& path);

  Result<Transaction> begin() { return Transaction::begin(*db_); }

  Result<std::optional<PlugInRecord>> plugInByPath(std::string_view path);
  Result<std::optional<PlugInRecord>> plugInByUuid(const Uuid& uuid);
  Result<std::vector<PlugInRecord>> allPlugIns();
  // Uses the extension-point index.
  Result<std::vector<PlugInRecord>> plugInsOfExtensionPoint(std::string_view name);
  Result<std::vector<PlugInRecord>> plugInsOfApplication(std::string_view applicationPath);
  Result<std::optional<ApplicationRecord>> applicationByPath(std::string_view path);

  // Inserts or replaces the row of record.path.
  Status putPlugIn(const PlugInRecord& record);
  Status putApplication(const ApplicationRecord& record);
  // Removes the row of `path` and, when it was the last plug-in of its
  // application, that application's row too.
  Status removePlugIn(std::string_view path);

  // None before the first change was ever stored.
  Result<std::optional<Uuid>> generation();
  Status setGeneration(const Uuid& generation);

 private:
  explicit RecordStore(std::unique_ptr<Database> db) : db_(std::move(db)) {}
  Result<std::vector<PlugInRecord>> selectPlugIns(std::string_view whereClause,
                                                  std::optional<std::string_view> parameter);
  std::unique_ptr<Database> db_;
};

}  // namespace platform::holvane::internal
