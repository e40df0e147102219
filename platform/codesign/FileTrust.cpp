#include "platform/codesign/FileTrust.h"

#include <cstdio>

namespace platform::codesign {

std::optional<std::string> distrustReason(const struct stat& status, uid_t daemonUid) {
  char text[128];
  if (status.st_uid != 0 && status.st_uid != daemonUid) {
    std::snprintf(text, sizeof text, "owned by uid %u, neither root nor the daemon's uid %u",
                  static_cast<unsigned>(status.st_uid), static_cast<unsigned>(daemonUid));
    return std::string(text);
  }
  const unsigned mode = static_cast<unsigned>(status.st_mode) & 07777u;
  const bool byGroup = (status.st_mode & S_IWGRP) != 0;
  const bool byOthers = (status.st_mode & S_IWOTH) != 0;
  if (byGroup || byOthers) {
    std::snprintf(text, sizeof text, "writable by %s (mode %04o)",
                  byGroup && byOthers ? "group and others"
                  : byGroup           ? "group"
                                      : "others",
                  mode);
    return std::string(text);
  }
  return std::nullopt;
}

}  // namespace platform::codesign
