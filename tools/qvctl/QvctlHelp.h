// qvctl's commands by name, with the help a new user reads: what each
// command does, its usage line and an example.
//
// Thread safety: constants and pure functions.
#pragma once

#include <string>
#include <string_view>

#include "tools/qvctl/QvctlArguments.h"

namespace qvctl {

struct CommandInfo {
  std::string_view name;
  Command command;
  std::string_view usage;    // "add PATH..."
  std::string_view summary;  // one line
  std::string_view details;  // options, notes and an example; ends with a newline
};

// The command called `name`, or null.
const CommandInfo* commandNamed(std::string_view name);
const CommandInfo& commandInfo(Command command);

// The overview: global options and every command with its summary.
std::string overviewHelp();
// One command's usage, details and example.
std::string commandHelp(Command command);

}  // namespace qvctl
