#include "platform/holvane/testing/FaultingSqliteVfs.h"

#include <sqlite3.h>

#include <algorithm>
#include <cstdlib>

namespace platform::holvane {
namespace {

struct ShimFile {
  sqlite3_file base;  // first: this is what SQLite sees
  FaultingSqliteVfs* owner;
  sqlite3_file* real;
};

// The wrapped file lives in the same allocation, after ours, 8-aligned as
// SQLite aligns its own.
constexpr int kHeaderSize = (sizeof(ShimFile) + 7) & ~7;

// The newest file-method version this layer forwards.
constexpr int kNewestIoVersion = 3;

}  // namespace

struct FaultingSqliteVfs::Shim {
  static FaultingSqliteVfs& self(sqlite3_vfs* vfs) {
    return *static_cast<FaultingSqliteVfs*>(vfs->pAppData);
  }
  static sqlite3_file* real(sqlite3_file* file) { return reinterpret_cast<ShimFile*>(file)->real; }
  static const sqlite3_io_methods& forward(sqlite3_file* file) { return *real(file)->pMethods; }
  static FaultingSqliteVfs& owner(sqlite3_file* file) {
    return *reinterpret_cast<ShimFile*>(file)->owner;
  }

  static int close(sqlite3_file* file) { return forward(file).xClose(real(file)); }

  static int read(sqlite3_file* file, void* buffer, int amount, sqlite3_int64 offset) {
    if (owner(file).nextCall(SqliteOperation::Read)) return SQLITE_IOERR_READ;
    return forward(file).xRead(real(file), buffer, amount, offset);
  }

  static int write(sqlite3_file* file, const void* buffer, int amount, sqlite3_int64 offset) {
    const std::optional<SqliteFault> fault = owner(file).nextCall(SqliteOperation::Write);
    if (!fault) return forward(file).xWrite(real(file), buffer, amount, offset);
    if (*fault == SqliteFault::Io) return SQLITE_IOERR_WRITE;
    // What a full disk does: the bytes that fitted are on it.
    if (amount / 2 > 0) (void)forward(file).xWrite(real(file), buffer, amount / 2, offset);
    return SQLITE_FULL;
  }

  static int truncate(sqlite3_file* file, sqlite3_int64 size) {
    if (const auto fault = owner(file).nextCall(SqliteOperation::Truncate)) {
      return *fault == SqliteFault::NoSpace ? SQLITE_FULL : SQLITE_IOERR_TRUNCATE;
    }
    return forward(file).xTruncate(real(file), size);
  }

  static int sync(sqlite3_file* file, int flags) {
    if (const auto fault = owner(file).nextCall(SqliteOperation::Sync)) {
      return *fault == SqliteFault::NoSpace ? SQLITE_FULL : SQLITE_IOERR_FSYNC;
    }
    return forward(file).xSync(real(file), flags);
  }

  static int fileSize(sqlite3_file* f, sqlite3_int64* size) {
    return forward(f).xFileSize(real(f), size);
  }
  static int lock(sqlite3_file* f, int level) { return forward(f).xLock(real(f), level); }
  static int unlock(sqlite3_file* f, int level) { return forward(f).xUnlock(real(f), level); }
  static int checkReservedLock(sqlite3_file* f, int* out) {
    return forward(f).xCheckReservedLock(real(f), out);
  }
  static int fileControl(sqlite3_file* f, int op, void* arg) {
    return forward(f).xFileControl(real(f), op, arg);
  }
  static int sectorSize(sqlite3_file* f) { return forward(f).xSectorSize(real(f)); }
  static int deviceCharacteristics(sqlite3_file* f) {
    return forward(f).xDeviceCharacteristics(real(f));
  }
  static int shmMap(sqlite3_file* f, int region, int size, int extend, void volatile** out) {
    return forward(f).xShmMap(real(f), region, size, extend, out);
  }
  static int shmLock(sqlite3_file* f, int offset, int n, int flags) {
    return forward(f).xShmLock(real(f), offset, n, flags);
  }
  static void shmBarrier(sqlite3_file* f) { forward(f).xShmBarrier(real(f)); }
  static int shmUnmap(sqlite3_file* f, int deleteFlag) {
    return forward(f).xShmUnmap(real(f), deleteFlag);
  }
  static int fetch(sqlite3_file* f, sqlite3_int64 offset, int amount, void** out) {
    return forward(f).xFetch(real(f), offset, amount, out);
  }
  static int unfetch(sqlite3_file* f, sqlite3_int64 offset, void* page) {
    return forward(f).xUnfetch(real(f), offset, page);
  }

  // One table per version: SQLite calls no method newer than iVersion.
  static const sqlite3_io_methods* methodsOfVersion(int version) {
    static const auto tables = [] {
      std::array<sqlite3_io_methods, kNewestIoVersion> made{};
      for (int v = 1; v <= kNewestIoVersion; ++v) {
        sqlite3_io_methods& m = made[v - 1];
        m.iVersion = v;
        m.xClose = close;
        m.xRead = read;
        m.xWrite = write;
        m.xTruncate = truncate;
        m.xSync = sync;
        m.xFileSize = fileSize;
        m.xLock = lock;
        m.xUnlock = unlock;
        m.xCheckReservedLock = checkReservedLock;
        m.xFileControl = fileControl;
        m.xSectorSize = sectorSize;
        m.xDeviceCharacteristics = deviceCharacteristics;
        m.xShmMap = shmMap;
        m.xShmLock = shmLock;
        m.xShmBarrier = shmBarrier;
        m.xShmUnmap = shmUnmap;
        m.xFetch = fetch;
        m.xUnfetch = unfetch;
      }
      return made;
    }();
    return &tables[std::clamp(version, 1, kNewestIoVersion) - 1];
  }

  static int open(sqlite3_vfs* vfs, const char* name, sqlite3_file* file, int flags,
                  int* outFlags) {
    FaultingSqliteVfs& faulting = self(vfs);
    ShimFile* shim = reinterpret_cast<ShimFile*>(file);
    shim->owner = &faulting;
    shim->real = reinterpret_cast<sqlite3_file*>(reinterpret_cast<char*>(file) + kHeaderSize);
    shim->real->pMethods = nullptr;
    const int code = faulting.wrapped_->xOpen(faulting.wrapped_, name, shim->real, flags, outFlags);
    // SQLite closes a file whose methods are set, even after a failed open,
    // so ours are set exactly when the wrapped file's are.
    shim->base.pMethods = shim->real->pMethods == nullptr
                              ? nullptr
                              : methodsOfVersion(shim->real->pMethods->iVersion);
    return code;
  }

  static sqlite3_vfs* wrapped(sqlite3_vfs* vfs) { return self(vfs).wrapped_; }
  static int remove(sqlite3_vfs* v, const char* name, int syncDir) {
    return wrapped(v)->xDelete(wrapped(v), name, syncDir);
  }
  static int access(sqlite3_vfs* v, const char* name, int flags, int* out) {
    return wrapped(v)->xAccess(wrapped(v), name, flags, out);
  }
  static int fullPathname(sqlite3_vfs* v, const char* name, int size, char* out) {
    return wrapped(v)->xFullPathname(wrapped(v), name, size, out);
  }
  static void* dlOpen(sqlite3_vfs* v, const char* name) {
    return wrapped(v)->xDlOpen(wrapped(v), name);
  }
  static void dlError(sqlite3_vfs* v, int size, char* out) {
    wrapped(v)->xDlError(wrapped(v), size, out);
  }
  static void (*dlSym(sqlite3_vfs* v, void* handle, const char* symbol))(void) {
    return wrapped(v)->xDlSym(wrapped(v), handle, symbol);
  }
  static void dlClose(sqlite3_vfs* v, void* handle) { wrapped(v)->xDlClose(wrapped(v), handle); }
  static int randomness(sqlite3_vfs* v, int size, char* out) {
    return wrapped(v)->xRandomness(wrapped(v), size, out);
  }
  static int sleep(sqlite3_vfs* v, int micros) { return wrapped(v)->xSleep(wrapped(v), micros); }
  static int currentTime(sqlite3_vfs* v, double* out) {
    return wrapped(v)->xCurrentTime(wrapped(v), out);
  }
  static int lastError(sqlite3_vfs* v, int size, char* out) {
    return wrapped(v)->xGetLastError(wrapped(v), size, out);
  }
  static int currentTimeInt64(sqlite3_vfs* v, sqlite3_int64* out) {
    return wrapped(v)->xCurrentTimeInt64(wrapped(v), out);
  }
  static int setSystemCall(sqlite3_vfs* v, const char* name, sqlite3_syscall_ptr call) {
    return wrapped(v)->xSetSystemCall(wrapped(v), name, call);
  }
  static sqlite3_syscall_ptr getSystemCall(sqlite3_vfs* v, const char* name) {
    return wrapped(v)->xGetSystemCall(wrapped(v), name);
  }
  static const char* nextSystemCall(sqlite3_vfs* v, const char* name) {
    return wrapped(v)->xNextSystemCall(wrapped(v), name);
  }
};

FaultingSqliteVfs::FaultingSqliteVfs()
    : wrapped_(sqlite3_vfs_find(nullptr)), vfs_(std::make_unique<sqlite3_vfs>()) {
  if (wrapped_ == nullptr) std::abort();  // a SQLite without files: no test could run
  sqlite3_vfs& vfs = *vfs_;
  vfs.iVersion = std::min(wrapped_->iVersion, 3);
  vfs.szOsFile = kHeaderSize + wrapped_->szOsFile;
  vfs.mxPathname = wrapped_->mxPathname;
  vfs.zName = "qv-faulting";
  vfs.pAppData = this;
  vfs.xOpen = Shim::open;
  vfs.xDelete = Shim::remove;
  vfs.xAccess = Shim::access;
  vfs.xFullPathname = Shim::fullPathname;
  vfs.xDlOpen = wrapped_->xDlOpen ? Shim::dlOpen : nullptr;
  vfs.xDlError = wrapped_->xDlError ? Shim::dlError : nullptr;
  vfs.xDlSym = wrapped_->xDlSym ? Shim::dlSym : nullptr;
  vfs.xDlClose = wrapped_->xDlClose ? Shim::dlClose : nullptr;
  vfs.xRandomness = Shim::randomness;
  vfs.xSleep = Shim::sleep;
  vfs.xCurrentTime = Shim::currentTime;
  vfs.xGetLastError = Shim::lastError;
  if (vfs.iVersion >= 2) vfs.xCurrentTimeInt64 = Shim::currentTimeInt64;
  if (vfs.iVersion >= 3) {
    vfs.xSetSystemCall = Shim::setSystemCall;
    vfs.xGetSystemCall = Shim::getSystemCall;
    vfs.xNextSystemCall = Shim::nextSystemCall;
  }
  sqlite3_vfs_register(vfs_.get(), 1);
}

FaultingSqliteVfs::~FaultingSqliteVfs() {
  sqlite3_vfs_unregister(vfs_.get());
  sqlite3_vfs_register(wrapped_, 1);  // already registered: only made the default again
}

std::uint64_t FaultingSqliteVfs::calls(SqliteOperation operation) const {
  return counters_[static_cast<std::size_t>(operation)].calls.load();
}

void FaultingSqliteVfs::failAt(SqliteOperation operation, std::uint64_t nth, SqliteFault fault,
                               FaultPersistence persistence) {
  Counter& counter = counters_[static_cast<std::size_t>(operation)];
  counter.failFrom.store(0);  // no call sees half of the new setting
  counter.fault.store(fault);
  counter.persistence.store(persistence);
  counter.failFrom.store(counter.calls.load() + nth);
}

void FaultingSqliteVfs::clear() {
  for (Counter& counter : counters_) counter.failFrom.store(0);
}

std::optional<SqliteFault> FaultingSqliteVfs::nextCall(SqliteOperation operation) {
  Counter& counter = counters_[static_cast<std::size_t>(operation)];
  const std::uint64_t call = counter.calls.fetch_add(1) + 1;
  const std::uint64_t from = counter.failFrom.load();
  if (from == 0 || call < from) return std::nullopt;
  if (call > from && counter.persistence.load() == FaultPersistence::Once) return std::nullopt;
  injected_.fetch_add(1);
  return counter.fault.load();
}

}  // namespace platform::holvane
