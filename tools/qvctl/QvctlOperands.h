// The pieces qvctl's parser is built from: splitting a command's arguments
// into options and operands, and reading numbers, UUIDs, KEY=VALUE pairs,
// JSON objects and paths out of them. Every failure is a usage error
// (kUsageErrorDomain) that says what was wrong.
//
// Thread safety: pure functions over plain values.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "tools/qvctl/QvctlArguments.h"

namespace qvctl::internal {

platform::Error usageError(std::string message);

// One command's arguments: options by name ("" as the value of a switch),
// in the order given, and the operands.
struct Scanned {
  std::multimap<std::string, std::string, std::less<>> options;
  std::vector<std::string_view> operands;

  std::size_t count(std::string_view name) const;
  // The value of an option that may be given once.
  std::optional<std::string> single(std::string_view name) const;
};

// `valued` options take a value ("--flags 4" or "--flags=4"), `switches` do
// not; only those in `repeatable` may come more than once. "--" ends the
// options; a lone "-" is an operand.
platform::Result<Scanned> scan(std::span<const std::string_view> args,
                               std::initializer_list<std::string_view> valued,
                               std::initializer_list<std::string_view> switches,
                               std::initializer_list<std::string_view> repeatable = {});

inline constexpr std::size_t kAnyNumber = SIZE_MAX;
platform::Status needOperands(const Scanned& scanned, std::size_t least, std::size_t most);

platform::Result<std::uint64_t> numberOption(std::string_view name, std::string_view text);
platform::Result<platform::Uuid> uuidOperand(std::string_view text);
// "KEY=VALUE" with a non-empty key.
platform::Result<std::pair<std::string, std::string>> keyValue(std::string_view what,
                                                               std::string_view text);
// The dictionary in the file at `path`: a vmap document, else JSON text
// (at most 1 MiB). Refusals are usage errors naming the option and file.
platform::Result<platform::Dictionary> dictionaryFileOption(std::string_view name,
                                                            const std::string& path);
platform::Result<platform::Dictionary> jsonObjectOption(std::string_view name,
                                                        std::string_view text);
platform::Result<std::vector<std::string>> absolutePaths(
    const std::vector<std::string_view>& operands, std::string_view cwd);
// "UUID" or "UUID=PATH" each; a plug-in named by UUID alone goes with an
// empty path, and the daemon finds it by the UUID.
platform::Result<QVDPlugInMap> plugInOperands(const std::vector<std::string_view>& operands,
                                              std::string_view cwd);

// Fills in the arguments of invocation.command from `args` (what follows
// the command's name).
platform::Status parseCommandArguments(Invocation& invocation,
                                       std::span<const std::string_view> args,
                                       std::string_view cwd);

}  // namespace qvctl::internal
