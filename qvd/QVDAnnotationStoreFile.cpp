// The annotation file: reading it into the table and writing the table back.
#include <cerrno>
#include <cmath>
#include <cstdint>
#include <limits>
#include <optional>
#include <utility>

#include "Quorvex/QVErrors.h"
#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Reader.h"
#include "qvd/QVDAnnotationConstants.h"
#include "qvd/QVDAnnotationStore.h"
#include "qvd/QVDProbes.h"

namespace qvd {
namespace {

// The file's version as an integer; anything that is not a number counts as
// 0, as does a number no integer can hold.
std::int64_t versionOf(const platform::Value& root) {
  const platform::Dictionary* dictionary = root.dictionary();
  if (dictionary == nullptr) return 0;
  const platform::Value& version = dictionary->get(QVVersionAnnotationsKey);
  if (std::optional<std::int64_t> whole = version.int64()) return *whole;
  if (std::optional<double> real = version.real();
      real && std::isfinite(*real) && std::fabs(*real) < 9.2e18)
    return static_cast<std::int64_t>(*real);
  return 0;
}

// A missing file reports the one code the constructor stays silent about;
// every other failure keeps the reader's own domain and code.
platform::Error readError(const platform::Error& error) {
  if (error.is(platform::kPosixErrorDomain, ENOENT))
    return platform::Error(std::string(QVDFileErrorDomain), QVDFileNotFoundErrorCode,
                           error.description());
  return error;
}

platform::Status failedLoad(platform::Error error) {
  probes::dbLoad(error.domain(), static_cast<std::uint64_t>(error.code()));
  return error;
}

}  // namespace

platform::Status QVDAnnotationStore::loadDb(const std::string& path) {
  platform::Result<platform::Value> root = platform::vmap::readFile(path);
  if (!root.ok()) return failedLoad(readError(root.error()));

  const std::int64_t version = versionOf(*root);
  if (version != QVDAnnotationsVersion)
    return failedLoad(QVErrorWithCodeFormat(QVErrorVersionMismatch,
                                            "found database version %d needed version %d",
                                            version, QVDAnnotationsVersion));

  // A "data" entry of any other kind holds nothing usable: an empty table.
  const platform::Dictionary* data = root->dictionary()->get(QVDataAnnotationsKey).dictionary();
  platform::Dictionary table = data ? *data : platform::Dictionary();
  std::lock_guard write(writeMu_);
  std::lock_guard lock(tableMu_);
  table_ = std::move(table);
  return platform::okStatus();
}

platform::Status QVDAnnotationStore::saveDb() {
  std::lock_guard write(writeMu_);
  return saveHoldingWriteLock();
}

platform::Status QVDAnnotationStore::saveHoldingWriteLock() {
  platform::Dictionary root;
  {
    // The copy shares every annotation with the table, so the lock is held
    // only for the outer map; the file is written without it.
    std::lock_guard lock(tableMu_);
    root.set(QVVersionAnnotationsKey, platform::Value(QVDAnnotationsVersion));
    root.set(QVDataAnnotationsKey, platform::Value(table_));
  }
  return platform::vmap::writeFileAtomically(path_, platform::Value(std::move(root)),
                                             platform::vmap::Format::Xml, ops_);
}

}  // namespace qvd
