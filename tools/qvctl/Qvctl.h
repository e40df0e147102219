// The qvctl command line: one subcommand per request of the daemon's
// protocol, plus "watch" for the annotation-change notification. main()
// only gathers its surroundings and calls runQvctl().
//
// Thread safety: runQvctl may run on any thread; it writes to the given
// streams, so run one at a time per pair of streams.
#pragma once

#include <cstdio>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "platform/notify/NotificationCenter.h"

namespace qvctl {

// Exit statuses: 0 success, 1 an error reply (or one the tool met talking
// to the daemon), 2 a usage error.
enum ExitStatus : int { kExitOk = 0, kExitError = 1, kExitUsage = 2 };

struct Environment {
  std::FILE* out = stdout;
  std::FILE* err = stderr;
  // Relative paths on the command line are made absolute against it.
  std::string currentDirectory;
  // For "watch"; null: a LinuxNotificationCenter under the platform root.
  std::shared_ptr<platform::notify::NotificationCenter> notifications;
};

// Runs the tool on `args` (without the program name).
int runQvctl(std::span<const std::string_view> args, const Environment& environment);

}  // namespace qvctl
