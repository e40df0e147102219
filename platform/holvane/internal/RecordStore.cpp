#include "platform/holvane/internal/RecordStore.h"

#include <sqlite3.h>
#include <stdlib.h>

#include "platform/holvane/RegistryError.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace platform::holvane::internal {
namespace {

constexpr std::string_view kSchemaVersion = "1";

constexpr std::string_view kSchema = R"sql(
CREATE TABLE IF NOT EXISTS meta(key TEXT PRIMARY KEY, value TEXT NOT NULL);
CREATE TABLE IF NOT EXISTS applications(
  path TEXT PRIMARY KEY,
  bundle_identifier TEXT,
  executable TEXT,
  registered REAL NOT NULL,
  info BLOB NOT NULL);
CREATE TABLE IF NOT EXISTS plugins(
  uuid TEXT PRIMARY KEY,
  path TEXT NOT NULL UNIQUE,
  identifier TEXT NOT NULL,
  original_identifier TEXT NOT NULL,
  bundle_identifier TEXT,
  version TEXT,
  extension_point TEXT,
  registered REAL NOT NULL,
  system_volume INTEGER NOT NULL,
  entitlements BLOB,
  data_container TEXT,
  info BLOB NOT NULL,
  application_path TEXT);
CREATE INDEX IF NOT EXISTS plugins_by_extension_point ON plugins(extension_point);
CREATE INDEX IF NOT EXISTS plugins_by_application ON plugins(application_path);
)sql";

constexpr std::string_view kPlugInColumns =
    "uuid, path, identifier, original_identifier, bundle_identifier, version, extension_point, "
    "registered, system_volume, entitlements, data_container, info, application_path";

// A stored dictionary was written by us, so these bounds only guard against
// a file edited behind our back.
constexpr vmap::ReadLimits kBlobLimits{.maxBytes = 4u << 20, .maxDepth = 40, .maxItems = 200'000};

Result<std::vector<std::uint8_t>> encode(const Dictionary& dictionary) {
  Result<std::string> bytes = vmap::write(Value(dictionary), vmap::Format::Binary);
  if (!bytes.ok()) return bytes.error();
  return std::vector<std::uint8_t>(bytes->begin(), bytes->end());
}

Result<Dictionary> decode(const std::vector<std::uint8_t>& bytes, std::string_view column) {
  Result<Value> value = vmap::read(bytes, kBlobLimits);
  if (!value.ok() || value->dictionary() == nullptr) {
    return registryError(RegistryErrorCode::Corrupt,
                         "stored " + std::string(column) + " is not a dictionary");
  }
  return *value->dictionary();
}

// SQLite's check reports a page it could not read as one more finding
// ("unable to get the page. error code=N", "failed to get page N") rather
// than failing. A read that failed says nothing about the file, so such a
// verdict must not get the file replaced.
bool checkCouldNotRead(const std::string& findings) {
  if (findings.find("failed to get page") != std::string::npos) return true;
  constexpr std::string_view kCode = "error code=";
  for (std::size_t at = findings.find(kCode); at != std::string::npos;
       at = findings.find(kCode, at + 1)) {
    const int primary = ::atoi(findings.c_str() + at + kCode.size()) & 0xff;
    if (primary != SQLITE_CORRUPT && primary != SQLITE_NOTADB) return true;
  }
  return false;
}

Error corruptRow(std::string_view what) {
  return registryError(RegistryErrorCode::Corrupt, "stored record with " + std::string(what));
}

Result<PlugInRecord> plugInFromRow(const Statement& row) {
  PlugInRecord record;
  std::optional<Uuid> uuid = Uuid::parse(row.columnText(0).value_or(""));
  if (!uuid) return corruptRow("an invalid UUID");
  record.uuid = *uuid;
  record.path = row.columnText(1).value_or("");
  record.identifier = row.columnText(2).value_or("");
  record.originalIdentifier = row.columnText(3).value_or("");
  if (record.path.empty() || record.identifier.empty()) return corruptRow("no path or identifier");
  record.bundleIdentifier = row.columnText(4);
  record.version = row.columnText(5);
  record.extensionPointName = row.columnText(6);
  record.registered = Date{row.columnReal(7)};
  record.volume = row.columnInt(8) != 0 ? Volume::System : Volume::Other;
  if (!row.columnIsNull(9)) {
    Result<Dictionary> entitlements = decode(row.columnBlob(9), "entitlements");
    if (!entitlements.ok()) return entitlements.error();
    record.entitlements = std::move(entitlements).value();
  }
  record.dataContainer = row.columnText(10);
  Result<Dictionary> info = decode(row.columnBlob(11), "info dictionary");
  if (!info.ok()) return info.error();
  record.info = std::move(info).value();
  record.containingApplicationPath = row.columnText(12);
  return record;
}

}  // namespace

Result<std::unique_ptr<RecordStore>> RecordStore::open(const std::string& path) {
  Result<std::unique_ptr<Database>> db = Database::open(path);
  if (!db.ok()) return db.error();
  // A file of garbage opens fine; the first statement is what finds out.
  {
    // Scoped: a statement still open keeps a read transaction, in which the
    // journal mode cannot change.
    Result<Statement> check = (*db)->prepare("PRAGMA quick_check");
    if (!check.ok()) return check.error();
    std::string findings;
    for (;;) {
      Result<StepResult> verdict = check->step();
      if (!verdict.ok()) return verdict.error();
      if (*verdict == StepResult::Done) break;
      const std::string finding = check->columnText(0).value_or("integrity check failed");
      if (finding != "ok") findings += (findings.empty() ? "" : "\n") + finding;
    }
    if (!findings.empty()) {
      return registryError(
          checkCouldNotRead(findings) ? RegistryErrorCode::Storage : RegistryErrorCode::Corrupt,
          path + ": " + findings);
    }
  }
  // Write-ahead logging with a sync at checkpoints rather than at every
  // commit: a crash can cost the last changes but never the file's
  // integrity, and whatever a crash loses lies in the scanned locations,
  // which the next start registers again. A commit then costs no journal
  // file and no fsync of its own.
  if (Status wal = (*db)->exec("PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL");
      !wal.ok()) {
    return wal.error();
  }
  if (Status made = (*db)->exec(kSchema); !made.ok()) return made.error();
  std::unique_ptr<RecordStore> store(new RecordStore(std::move(db).value()));
  Result<Statement> version = store->db_->prepare("SELECT value FROM meta WHERE key = 'schema'");
  if (!version.ok()) return version.error();
  Result<StepResult> row = version->step();
  if (!row.ok()) return row.error();
  if (*row == StepResult::Done) {
    Status set = store->db_->exec("INSERT INTO meta(key, value) VALUES('schema', '" +
                                  std::string(kSchemaVersion) + "')");
    if (!set.ok()) return set.error();
  } else if (version->columnText(0) != std::string(kSchemaVersion)) {
    // A newer or foreign layout: rebuilding beats misreading it.
    return registryError(RegistryErrorCode::Corrupt, path + ": unknown schema version");
  }
  return store;
}

Result<std::vector<PlugInRecord>> RecordStore::selectPlugIns(
    std::string_view whereClause, std::optional<std::string_view> parameter) {
  std::string sql = "SELECT " + std::string(kPlugInColumns) + " FROM plugins";
  if (!whereClause.empty()) sql += " WHERE " + std::string(whereClause);
  sql += " ORDER BY path";
  Result<Statement> select = db_->prepare(sql);
  if (!select.ok()) return select.error();
  if (parameter) {
    if (Status bound = select->bindText(1, *parameter); !bound.ok()) return bound.error();
  }
  std::vector<PlugInRecord> records;
  for (;;) {
    Result<StepResult> row = select->step();
    if (!row.ok()) return row.error();
    if (*row == StepResult::Done) break;
    Result<PlugInRecord> record = plugInFromRow(*select);
    if (!record.ok()) return record.error();
    records.push_back(std::move(record).value());
  }
  return records;
}

namespace {
Result<std::optional<PlugInRecord>> single(Result<std::vector<PlugInRecord>> rows) {
  if (!rows.ok()) return rows.error();
  if (rows->empty()) return std::optional<PlugInRecord>();
  return std::optional<PlugInRecord>(std::move(rows->front()));
}
}  // namespace

Result<std::optional<PlugInRecord>> RecordStore::plugInByPath(std::string_view path) {
  return single(selectPlugIns("path = ?1", path));
}

Result<std::optional<PlugInRecord>> RecordStore::plugInByUuid(const Uuid& uuid) {
  const std::string text = uuid.toString();
  return single(selectPlugIns("uuid = ?1", text));
}

Result<std::vector<PlugInRecord>> RecordStore::allPlugIns() { return selectPlugIns("", {}); }

Result<std::vector<PlugInRecord>> RecordStore::plugInsOfExtensionPoint(std::string_view name) {
  return selectPlugIns("extension_point = ?1", name);
}

Result<std::vector<PlugInRecord>> RecordStore::plugInsOfApplication(
    std::string_view applicationPath) {
  return selectPlugIns("application_path = ?1", applicationPath);
}

Result<std::optional<ApplicationRecord>> RecordStore::applicationByPath(std::string_view path) {
  Result<Statement> select = db_->prepare(
      "SELECT path, bundle_identifier, executable, registered, info FROM applications "
      "WHERE path = ?1");
  if (!select.ok()) return select.error();
  if (Status bound = select->bindText(1, path); !bound.ok()) return bound.error();
  Result<StepResult> row = select->step();
  if (!row.ok()) return row.error();
  if (*row == StepResult::Done) return std::optional<ApplicationRecord>();
  ApplicationRecord record;
  record.path = select->columnText(0).value_or("");
  record.bundleIdentifier = select->columnText(1);
  record.executablePath = select->columnText(2);
  record.registered = Date{select->columnReal(3)};
  Result<Dictionary> info = decode(select->columnBlob(4), "application info dictionary");
  if (!info.ok()) return info.error();
  record.info = std::move(info).value();
  return std::optional<ApplicationRecord>(std::move(record));
}

Status RecordStore::putPlugIn(const PlugInRecord& record) {
  Result<std::vector<std::uint8_t>> info = encode(record.info);
  if (!info.ok()) return info.error();
  std::optional<std::vector<std::uint8_t>> entitlements;
  if (record.entitlements) {
    Result<std::vector<std::uint8_t>> encoded = encode(*record.entitlements);
    if (!encoded.ok()) return encoded.error();
    entitlements = std::move(encoded).value();
  }
  Result<Statement> insert = db_->prepare(
      "INSERT OR REPLACE INTO plugins(" + std::string(kPlugInColumns) +
      ") VALUES(?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13)");
  if (!insert.ok()) return insert.error();
  Statement& s = *insert;
  for (Status bound : {s.bindText(1, record.uuid.toString()), s.bindText(2, record.path),
                       s.bindText(3, record.identifier), s.bindText(4, record.originalIdentifier),
                       s.bindOptionalText(5, record.bundleIdentifier),
                       s.bindOptionalText(6, record.version),
                       s.bindOptionalText(7, record.extensionPointName),
                       s.bindReal(8, record.registered.secondsSince1970),
                       s.bindInt(9, record.volume == Volume::System ? 1 : 0),
                       entitlements ? s.bindBlob(10, *entitlements) : s.bindNull(10),
                       s.bindOptionalText(11, record.dataContainer), s.bindBlob(12, *info),
                       s.bindOptionalText(13, record.containingApplicationPath)}) {
    if (!bound.ok()) return bound.error();
  }
  return s.run();
}

Status RecordStore::putApplication(const ApplicationRecord& record) {
  Result<std::vector<std::uint8_t>> info = encode(record.info);
  if (!info.ok()) return info.error();
  Result<Statement> insert = db_->prepare(
      "INSERT OR REPLACE INTO applications(path, bundle_identifier, executable, registered, info) "
      "VALUES(?1, ?2, ?3, ?4, ?5)");
  if (!insert.ok()) return insert.error();
  Statement& s = *insert;
  for (Status bound : {s.bindText(1, record.path), s.bindOptionalText(2, record.bundleIdentifier),
                       s.bindOptionalText(3, record.executablePath),
                       s.bindReal(4, record.registered.secondsSince1970), s.bindBlob(5, *info)}) {
    if (!bound.ok()) return bound.error();
  }
  return s.run();
}

Status RecordStore::removePlugIn(std::string_view path) {
  Result<Statement> remove = db_->prepare("DELETE FROM plugins WHERE path = ?1");
  if (!remove.ok()) return remove.error();
  if (Status bound = remove->bindText(1, path); !bound.ok()) return bound;
  if (Status removed = remove->run(); !removed.ok()) return removed;
  // An application is known only through its plug-ins.
  return db_->exec(
      "DELETE FROM applications WHERE path NOT IN "
      "(SELECT application_path FROM plugins WHERE application_path IS NOT NULL)");
}

Result<std::optional<Uuid>> RecordStore::generation() {
  Result<Statement> select = db_->prepare("SELECT value FROM meta WHERE key = 'generation'");
  if (!select.ok()) return select.error();
  Result<StepResult> row = select->step();
  if (!row.ok()) return row.error();
  if (*row == StepResult::Done) return std::optional<Uuid>();
  std::optional<Uuid> uuid = Uuid::parse(select->columnText(0).value_or(""));
  if (!uuid) return registryError(RegistryErrorCode::Corrupt, "stored generation is not a UUID");
  return uuid;
}

Status RecordStore::setGeneration(const Uuid& generation) {
  Result<Statement> set =
      db_->prepare("INSERT OR REPLACE INTO meta(key, value) VALUES('generation', ?1)");
  if (!set.ok()) return set.error();
  if (Status bound = set->bindText(1, generation.toString()); !bound.ok()) return bound;
  return set->run();
}

}  // namespace platform::holvane::internal
