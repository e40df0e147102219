// A thin RAII layer over SQLite: a connection, prepared statements and a
// transaction that rolls back unless committed. Errors come back as values
// of the holvane domain (Storage) carrying SQLite's own message; a file that
// is not a database, or is damaged, is reported as Corrupt.
//
// Thread safety: none. A Database and its statements belong to one serial
// queue (the registry's); SQLite is opened without its own mutexes.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/values/Result.h"

struct sqlite3;
struct sqlite3_stmt;

namespace platform::holvane::internal {

class Statement;

class Database {
 public:
  // Opens (creating when missing) the database file at `path`.
  // REQUIRES: path is absolute; its directory exists.
  static Result<std::unique_ptr<Database>> open(const std::string& path);
  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  // Runs one or more statements that take no parameters and return no rows.
  Status exec(std::string_view sql);
  // A statement for `sql`. Compiled statements are kept for reuse, since the
  // registry asks the same few questions thousands of times: a statement
  // goes back to the cache, reset, when the Statement is destroyed. A
  // statement still in use when the same text is prepared again gets a
  // fresh compilation. REQUIRES: `sql` comes from code, not from input, so
  // that the cache stays small.
  Result<Statement> prepare(std::string_view sql);
  // Error for the last failed call, named by `what`.
  Error lastError(std::string_view what) const;

  const std::string& path() const { return path_; }

 private:
  using Cache = std::unordered_map<std::string, sqlite3_stmt*>;
  Database(sqlite3* db, std::string path) : db_(db), path_(std::move(path)) {}
  friend class Statement;
  sqlite3* db_;
  const std::string path_;
  // Compiled statements not in use, by their text.
  Cache cache_;
};

enum class StepResult { Row, Done };

class Statement {
 public:
  Statement(Statement&& other) noexcept;
  Statement& operator=(Statement&&) = delete;
  Statement(const Statement&) = delete;
  ~Statement();

  // Parameters are numbered from 1, as in SQL. Text and blobs are copied.
  Status bindText(int index, std::string_view text);
  Status bindInt(int index, std::int64_t value);
  Status bindReal(int index, double value);
  Status bindBlob(int index, std::span<const std::uint8_t> bytes);
  Status bindNull(int index);
  Status bindOptionalText(int index, const std::optional<std::string>& text);

  Result<StepResult> step();
  // Steps to completion; a statement that yields rows is an error here.
  Status run();
  // Lets the statement run again with new parameters.
  void reset();

  // Columns are numbered from 0. A NULL column reads as none.
  std::optional<std::string> columnText(int column) const;
  std::int64_t columnInt(int column) const;
  double columnReal(int column) const;
  std::vector<std::uint8_t> columnBlob(int column) const;
  bool columnIsNull(int column) const;

 private:
  friend class Database;
  Statement(Database& db, Database::Cache::node_type entry)
      : db_(&db), stmt_(entry.mapped()), entry_(std::move(entry)) {}
  Status check(int code, std::string_view what);
  Database* db_;
  sqlite3_stmt* stmt_;
  // The cache entry the statement returns to; its value is stmt_.
  Database::Cache::node_type entry_;
};

// BEGIN IMMEDIATE at construction; ROLLBACK at destruction unless commit()
// succeeded, so that an early error return leaves the file as it was.
class Transaction {
 public:
  static Result<Transaction> begin(Database& db);
  Transaction(Transaction&& other) noexcept;
  Transaction& operator=(Transaction&&) = delete;
  ~Transaction();
  Status commit();

 private:
  explicit Transaction(Database& db) : db_(&db) {}
  Database* db_;
};

}  // namespace platform::holvane::internal
