// What a stat says about a file that matters for caching what was read from
// it: which file it is, its size and times, and (for the trust rule) its
// owner and mode. Equal signatures let a cached reading stand.
//
// Thread safety: a plain value.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>

namespace platform::codesign::internal {

struct FileSignature {
  dev_t device = 0;
  ino_t inode = 0;
  off_t size = 0;
  std::int64_t mtimeNs = 0;
  std::int64_t ctimeNs = 0;  // moves on chmod and chown too
  mode_t mode = 0;
  uid_t owner = 0;

  static FileSignature of(const struct stat& status);

  // True when the file was modified so recently that a second change within
  // the same tick of the kernel's coarse file clock could leave every field
  // above unchanged; such a reading is not trusted to stay current.
  bool isRecent() const;

  bool operator==(const FileSignature&) const = default;
};

}  // namespace platform::codesign::internal
