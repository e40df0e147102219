// One domain's preferences file and what was last read from it. current()
// stats the file and reads it again unless the device, inode, size, mtime
// (to the nanosecond) and ctime are all unchanged and the file did not change
// in the last two seconds (a second write within one tick of the kernel's
// coarse file clock can leave all of those unchanged). A fault is logged
// once per change of the file, not at every question.
//
// Thread safety: not thread-safe; LinuxPreferenceStore serialises calls.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/values/Value.h"
#include "platform/vmap/Reader.h"

namespace platform::prefs::internal {

class DomainFile {
 public:
  // REQUIRES: path is absolute.
  DomainFile(std::string path, const vmap::ReadLimits& limits);

  // The domain's preferences dictionary (a Value holding one), or none when
  // the file is missing, unreadable or malformed.
  const Value& current();

  std::size_t readsForTesting() const { return reads_; }

 private:
  struct Signature {
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    std::int64_t mtimeNs = 0;
    std::int64_t ctimeNs = 0;
    bool operator==(const Signature&) const = default;
  };
  static Signature signatureOf(const struct stat& status);
  static bool isRecent(const Signature& signature);
  void read(const Signature& seen);
  // Logs `problem` unless it was the last one logged; "" clears.
  void note(const std::string& problem);

  const std::string path_;
  const vmap::ReadLimits limits_;
  bool cached_ = false;  // signature_ and value_ describe a completed read
  bool recent_ = false;
  Signature signature_;
  Value value_;
  std::string lastNoted_;
  std::size_t reads_ = 0;
};

}  // namespace platform::prefs::internal
