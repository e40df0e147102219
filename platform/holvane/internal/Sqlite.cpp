#include "platform/holvane/internal/Sqlite.h"

#include <sqlite3.h>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/holvane/RegistryError.h"

namespace platform::holvane::internal {
namespace {

bool isCorruption(int code) {
  const int primary = code & 0xff;
  return primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB;
}

Error sqliteError(sqlite3* db, int code, std::string_view what) {
  std::string message(what);
  message += ": ";
  message += db != nullptr ? sqlite3_errmsg(db) : sqlite3_errstr(code);
  return registryError(isCorruption(code) ? RegistryErrorCode::Corrupt : RegistryErrorCode::Storage,
                       std::move(message));
}

}  // namespace

Result<std::unique_ptr<Database>> Database::open(const std::string& path) {
  dispatch::ScopedBlockingCall blocking;
  sqlite3* db = nullptr;
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX;
  const int code = sqlite3_open_v2(path.c_str(), &db, flags, nullptr);
  if (code != SQLITE_OK) {
    Error error = sqliteError(db, code, "open " + path);
    sqlite3_close(db);
    return error;
  }
  sqlite3_extended_result_codes(db, 1);
  // Another process holding the file briefly should not fail a change.
  sqlite3_busy_timeout(db, 5000);
  return std::unique_ptr<Database>(new Database(db, path));
}

Database::~Database() {
  for (auto& [sql, stmt] : cache_) sqlite3_finalize(stmt);
  sqlite3_close(db_);
}

Status Database::exec(std::string_view sql) {
  dispatch::ScopedBlockingCall blocking;
  const std::string text(sql);
  const int code = sqlite3_exec(db_, text.c_str(), nullptr, nullptr, nullptr);
  if (code != SQLITE_OK) return sqliteError(db_, code, path_);
  return okStatus();
}

Result<Statement> Database::prepare(std::string_view sql) {
  const std::string text(sql);
  if (Cache::node_type kept = cache_.extract(text)) return Statement(*this, std::move(kept));
  sqlite3_stmt* stmt = nullptr;
  const int code =
      sqlite3_prepare_v2(db_, sql.data(), static_cast<int>(sql.size()), &stmt, nullptr);
  if (code != SQLITE_OK) {
    sqlite3_finalize(stmt);
    return sqliteError(db_, code, path_);
  }
  // A fresh entry, not yet in the cache: the Statement puts it there when
  // it is done with it.
  Cache staging;
  staging.emplace(text, stmt);
  return Statement(*this, staging.extract(staging.begin()));
}

Error Database::lastError(std::string_view what) const {
  return sqliteError(db_, sqlite3_extended_errcode(db_), what);
}

Statement::Statement(Statement&& other) noexcept
    : db_(other.db_), stmt_(other.stmt_), entry_(std::move(other.entry_)) {
  other.stmt_ = nullptr;
}

Statement::~Statement() {
  if (stmt_ == nullptr) return;
  sqlite3_reset(stmt_);
  sqlite3_clear_bindings(stmt_);
  // Already there when the same text was prepared while this one was in
  // use: the spare copy goes.
  if (!db_->cache_.insert(std::move(entry_)).inserted) sqlite3_finalize(stmt_);
}

Status Statement::check(int code, std::string_view what) {
  if (code == SQLITE_OK) return okStatus();
  return sqliteError(db_->db_, code, std::string(what) + " " + db_->path_);
}

Status Statement::bindText(int index, std::string_view text) {
  return check(sqlite3_bind_text64(stmt_, index, text.data(), text.size(), SQLITE_TRANSIENT,
                                   SQLITE_UTF8),
               "bind");
}

Status Statement::bindInt(int index, std::int64_t value) {
  return check(sqlite3_bind_int64(stmt_, index, value), "bind");
}

Status Statement::bindReal(int index, double value) {
  return check(sqlite3_bind_double(stmt_, index, value), "bind");
}

Status Statement::bindBlob(int index, std::span<const std::uint8_t> bytes) {
  return check(sqlite3_bind_blob64(stmt_, index, bytes.data(), bytes.size(), SQLITE_TRANSIENT),
               "bind");
}

Status Statement::bindNull(int index) { return check(sqlite3_bind_null(stmt_, index), "bind"); }

Status Statement::bindOptionalText(int index, const std::optional<std::string>& text) {
  return text ? bindText(index, *text) : bindNull(index);
}

Result<StepResult> Statement::step() {
  dispatch::ScopedBlockingCall blocking;
  const int code = sqlite3_step(stmt_);
  if (code == SQLITE_ROW) return StepResult::Row;
  if (code == SQLITE_DONE) return StepResult::Done;
  return sqliteError(db_->db_, code, "step " + db_->path_);
}

Status Statement::run() {
  Result<StepResult> stepped = step();
  if (!stepped.ok()) return stepped.error();
  if (*stepped == StepResult::Row) {
    return registryError(RegistryErrorCode::Storage, "statement unexpectedly returned rows");
  }
  return okStatus();
}

void Statement::reset() {
  sqlite3_reset(stmt_);
  sqlite3_clear_bindings(stmt_);
}

std::optional<std::string> Statement::columnText(int column) const {
  const unsigned char* text = sqlite3_column_text(stmt_, column);
  if (text == nullptr) return std::nullopt;
  return std::string(reinterpret_cast<const char*>(text),
                     static_cast<std::size_t>(sqlite3_column_bytes(stmt_, column)));
}

std::int64_t Statement::columnInt(int column) const { return sqlite3_column_int64(stmt_, column); }

double Statement::columnReal(int column) const { return sqlite3_column_double(stmt_, column); }

std::vector<std::uint8_t> Statement::columnBlob(int column) const {
  const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(stmt_, column));
  const int size = sqlite3_column_bytes(stmt_, column);
  if (bytes == nullptr || size <= 0) return {};
  return std::vector<std::uint8_t>(bytes, bytes + size);
}

bool Statement::columnIsNull(int column) const {
  return sqlite3_column_type(stmt_, column) == SQLITE_NULL;
}

Result<Transaction> Transaction::begin(Database& db) {
  Status begun = db.exec("BEGIN IMMEDIATE");
  if (!begun.ok()) return begun.error();
  return Transaction(db);
}

Transaction::Transaction(Transaction&& other) noexcept : db_(other.db_) { other.db_ = nullptr; }

Transaction::~Transaction() {
  if (db_ != nullptr) (void)db_->exec("ROLLBACK");
}

Status Transaction::commit() {
  Status committed = db_->exec("COMMIT");
  if (committed.ok()) db_ = nullptr;
  return committed;
}

}  // namespace platform::holvane::internal
