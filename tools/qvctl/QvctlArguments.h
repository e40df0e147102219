// What a qvctl command line asks for, parsed and checked before anything is
// sent: global options, the command, and that command's arguments with paths
// made absolute and JSON turned into values.
//
// Thread safety: pure functions over plain values.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "Quorvex/QVDaemonClient.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace qvctl {

enum class Command {
  Help,
  Add,
  Remove,
  Bulk,
  Match,
  Find,
  Ready,
  Access,
  Annotate,
  BulkAnnotate,
  Hold,
  Release,
  Watch,
};

enum class OutputFormat { Human, Json };

// The domain of usage errors (the message says what is wrong).
inline constexpr std::string_view kUsageErrorDomain = "qvctl.usage";

struct Invocation {
  std::optional<std::string> service;  // --service
  OutputFormat format = OutputFormat::Human;
  Command command = Command::Help;
  // Help: the command asked about; none for the overview.
  std::optional<Command> helpTopic;

  // Each command fills only what it takes.
  std::vector<std::string> paths;  // add, remove, hold: absolute
  std::uint64_t flags = 0;  // bulk, match (QVDiscoverSynchronous with --sync), ready, access, hold
  QVDSending sending = QVDSending::Asynchronous;    // ready, access
  bool waitForEndOfInput = false;                   // hold --wait
  platform::Dictionary rules;                       // match
  std::optional<platform::Dictionary> environment;  // ready
  QVDPlugInMap plugIns;                             // ready, access
  std::vector<platform::Uuid> uuids;                // annotate; release: the token
  platform::Dictionary annotations;                 // annotate, bulk-annotate
  std::optional<platform::Uuid> findUuid;           // find by UUID ...
  std::string findUrl;                              // ... or by file URL
  std::optional<std::uint64_t> count;               // watch
};

// REQUIRES: currentDirectory is absolute, or empty when unknown (relative
// paths are then refused).
platform::Result<Invocation> parseArguments(std::span<const std::string_view> args,
                                            std::string_view currentDirectory);

// Pieces of the parser, for the commands' own use and for tests.

// Decimal, or hexadecimal after "0x"; nothing else, no sign.
std::optional<std::uint64_t> parseNumber(std::string_view text);
// `path` made absolute against `currentDirectory` and lexically tidied
// ("a/../b/" -> "<cwd>/b"); an absolute path is kept as typed.
platform::Result<std::string> absolutePath(std::string_view path,
                                           std::string_view currentDirectory);

}  // namespace qvctl
