// A SQLite file layer for tests that fails chosen calls the way a full or
// failing disk does. While one exists it is SQLite's default VFS, wrapping
// the default it replaced, so every database opened meanwhile (the
// registry's included) goes through it with no change to the code under
// test; the destructor puts the previous default back.
//
// Every call is forwarded to the wrapped VFS, and each file offers exactly
// the method version of the file it wraps, so SQLite keeps the same
// capabilities (write-ahead-log shared memory, memory mapping). Writes,
// syncs, truncates and reads of every file are counted. An armed fault makes
// the Nth call of one operation from then on fail:
//   NoSpace  a write puts the first half of its bytes through and returns
//            SQLITE_FULL, as a write that runs out of space part-way does;
//            a sync or truncate returns SQLITE_FULL.
//   Io       SQLITE_IOERR_WRITE / _FSYNC / _TRUNCATE / _READ.
// A read cannot run out of space: NoSpace fails it as Io.
//
// Thread safety: counting, arming and clearing are safe from any thread,
// also while SQLite calls the file methods on another (the registry's
// queue); the counters are atomic.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>

struct sqlite3_vfs;

namespace platform::holvane {

enum class SqliteOperation { Write, Sync, Truncate, Read };
enum class SqliteFault { NoSpace, Io };
enum class FaultPersistence { Once, UntilCleared };

class FaultingSqliteVfs {
 public:
  // REQUIRES: no other FaultingSqliteVfs exists; every connection opened
  // while this one lives is closed before it is destroyed.
  FaultingSqliteVfs();
  ~FaultingSqliteVfs();
  FaultingSqliteVfs(const FaultingSqliteVfs&) = delete;
  FaultingSqliteVfs& operator=(const FaultingSqliteVfs&) = delete;

  // Calls of `operation` since construction, failed ones included.
  std::uint64_t calls(SqliteOperation operation) const;
  // Calls that were made to fail, of any operation.
  std::uint64_t injected() const { return injected_.load(); }

  // Makes the `nth` call of `operation` from now (1: the next one) fail with
  // `fault`; with UntilCleared every later call of it fails too, until
  // clear(). Replaces whatever was armed for `operation` before.
  // REQUIRES: nth >= 1.
  void failAt(SqliteOperation operation, std::uint64_t nth, SqliteFault fault,
              FaultPersistence persistence);
  // Disarms every operation.
  void clear();

 private:
  struct Shim;  // SQLite's entry points, in the .cpp
  struct Counter {
    std::atomic<std::uint64_t> calls{0};
    std::atomic<std::uint64_t> failFrom{0};  // a call number; 0 when disarmed
    std::atomic<SqliteFault> fault{SqliteFault::Io};
    std::atomic<FaultPersistence> persistence{FaultPersistence::Once};
  };

  // Counts a call of `operation`; the fault it must fail with, if any.
  std::optional<SqliteFault> nextCall(SqliteOperation operation);

  sqlite3_vfs* const wrapped_;
  const std::unique_ptr<sqlite3_vfs> vfs_;
  std::array<Counter, 4> counters_;
  std::atomic<std::uint64_t> injected_{0};
};

}  // namespace platform::holvane
