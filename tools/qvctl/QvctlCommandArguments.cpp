// Each command's own arguments: the options it takes and what its operands
// mean. Global options were taken out before.
#include <utility>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "tools/qvctl/QvctlHelp.h"
#include "tools/qvctl/QvctlOperands.h"

namespace qvctl::internal {

using platform::Dictionary;
using platform::Result;
using platform::Status;
using platform::Uuid;
using platform::Value;

namespace {

// --sync and --flags, shared by hold, match, ready and access.
Status syncAndFlags(const Scanned& scanned, Invocation& invocation) {
  if (auto text = scanned.single("--flags")) {
    Result<std::uint64_t> flags = numberOption("--flags", *text);
    if (!flags.ok()) return flags.error();
    invocation.flags = flags.value();
  }
  if (scanned.count("--sync") > 0) invocation.sending = QVDSending::Synchronous;
  return platform::okStatus();
}

}  // namespace

Status parseCommandArguments(Invocation& invocation, std::span<const std::string_view> args,
                             std::string_view cwd) {
  switch (invocation.command) {
    case Command::Help: {
      Result<Scanned> s = scan(args, {}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 0, 1); !n.ok()) return n;
      if (s.value().operands.empty()) return platform::okStatus();
      const CommandInfo* topic = commandNamed(s.value().operands[0]);
      if (topic == nullptr)
        return usageError("unknown command " + std::string(s.value().operands[0]));
      invocation.helpTopic = topic->command;
      return platform::okStatus();
    }
    case Command::Add:
    case Command::Remove:
    case Command::Hold: {
      Result<Scanned> s =
          invocation.command == Command::Hold ? scan(args, {"--flags"}, {"--wait"}) : scan(args, {}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 1, kAnyNumber); !n.ok()) return n;
      if (Status f = syncAndFlags(s.value(), invocation); !f.ok()) return f;
      invocation.waitForEndOfInput = s.value().count("--wait") > 0;
      Result<std::vector<std::string>> paths = absolutePaths(s.value().operands, cwd);
      if (!paths.ok()) return paths.error();
      invocation.paths = std::move(paths).value();
      return platform::okStatus();
    }
    case Command::Bulk: {
      Result<Scanned> s = scan(args, {}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 0, 1); !n.ok()) return n;
      if (s.value().operands.empty()) return platform::okStatus();
      Result<std::uint64_t> flags = numberOption("FLAGS", std::string(s.value().operands[0]));
      if (!flags.ok()) return flags.error();
      invocation.flags = flags.value();
      return platform::okStatus();
    }
    case Command::Match: {
      Result<Scanned> s = scan(args, {"--flags", "--rules", "--rules-file"}, {"--sync"});
      if (!s.ok()) return s.error();
      if (Status f = syncAndFlags(s.value(), invocation); !f.ok()) return f;
      // The client library sends "match" synchronously when this bit is set.
      if (invocation.sending == QVDSending::Synchronous) invocation.flags |= QVDiscoverSynchronous;
      auto json = s.value().single("--rules");
      auto file = s.value().single("--rules-file");
      if (json || file) {
        if (!s.value().operands.empty() || (json && file))
          return usageError("give one of --rules, --rules-file and KEY=PATTERN rules");
        Result<Dictionary> rules = json ? jsonObjectOption("--rules", *json)
                                        : dictionaryFileOption("--rules-file", std::string(*file));
        if (!rules.ok()) return rules.error();
        invocation.rules = std::move(rules).value();
      }
      for (std::string_view operand : s.value().operands) {
        auto rule = keyValue("rule", operand);
        if (!rule.ok()) return rule.error();
        invocation.rules.set(rule.value().first, Value(rule.value().second));
      }
      return platform::okStatus();
    }
    case Command::Find: {
      Result<Scanned> s = scan(args, {}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 1, 1); !n.ok()) return n;
      std::string_view target = s.value().operands[0];
      if (std::optional<Uuid> uuid = Uuid::parse(target)) {
        invocation.findUuid = *uuid;
      } else if (target.starts_with("file:")) {
        invocation.findUrl = std::string(target);
      } else {
        Result<std::string> path = absolutePath(target, cwd);
        if (!path.ok()) return path.error();
        invocation.findUrl = QVFileURLFromPath(path.value());
      }
      return platform::okStatus();
    }
    case Command::Ready:
    case Command::Access: {
      const bool ready = invocation.command == Command::Ready;
      Result<Scanned> s = ready ? scan(args, {"--flags", "--env"}, {"--sync"}, {"--env"})
                                : scan(args, {"--flags"}, {"--sync"});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 1, kAnyNumber); !n.ok()) return n;
      if (Status f = syncAndFlags(s.value(), invocation); !f.ok()) return f;
      if (s.value().count("--env") > 0) {
        Dictionary environment;
        auto [from, to] = s.value().options.equal_range("--env");
        for (auto it = from; it != to; ++it) {
          auto entry = keyValue("--env", it->second);
          if (!entry.ok()) return entry.error();
          environment.set(entry.value().first, Value(entry.value().second));
        }
        invocation.environment = std::move(environment);
      }
      Result<QVDPlugInMap> plugIns = plugInOperands(s.value().operands, cwd);
      if (!plugIns.ok()) return plugIns.error();
      invocation.plugIns = std::move(plugIns).value();
      return platform::okStatus();
    }
    case Command::Annotate: {
      Result<Scanned> s = scan(args, {"--election", "--annotations"}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 1, kAnyNumber); !n.ok()) return n;
      auto election = s.value().single("--election");
      auto json = s.value().single("--annotations");
      if (election.has_value() == json.has_value()) {
        return usageError("give exactly one of --election 0|1 and --annotations JSON");
      }
      if (election) {
        if (*election != "0" && *election != "1") return usageError("--election: expected 0 or 1");
        invocation.annotations.set(QVAnnotationElectionKey, Value(*election == "1" ? 1 : 0));
      } else {
        Result<Dictionary> annotations = jsonObjectOption("--annotations", *json);
        if (!annotations.ok()) return annotations.error();
        invocation.annotations = std::move(annotations).value();
      }
      for (std::string_view operand : s.value().operands) {
        Result<Uuid> uuid = uuidOperand(operand);
        if (!uuid.ok()) return uuid.error();
        invocation.uuids.push_back(uuid.value());
      }
      return platform::okStatus();
    }
    case Command::BulkAnnotate: {
      Result<Scanned> s = scan(args, {"--annotations"}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 0, 0); !n.ok()) return n;
      auto json = s.value().single("--annotations");
      if (!json) return usageError("--annotations JSON is required");
      Result<Dictionary> annotations = jsonObjectOption("--annotations", *json);
      if (!annotations.ok()) return annotations.error();
      invocation.annotations = std::move(annotations).value();
      return platform::okStatus();
    }
    case Command::Release: {
      Result<Scanned> s = scan(args, {}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 1, 1); !n.ok()) return n;
      Result<Uuid> token = uuidOperand(s.value().operands[0]);
      if (!token.ok()) return token.error();
      invocation.uuids = {token.value()};
      return platform::okStatus();
    }
    case Command::Watch: {
      Result<Scanned> s = scan(args, {"--count"}, {});
      if (!s.ok()) return s.error();
      if (Status n = needOperands(s.value(), 0, 0); !n.ok()) return n;
      if (auto text = s.value().single("--count")) {
        Result<std::uint64_t> count = numberOption("--count", *text);
        if (!count.ok()) return count.error();
        if (count.value() == 0) return usageError("--count: must be at least 1");
        invocation.count = count.value();
      }
      return platform::okStatus();
    }
  }
  return usageError("unknown command");
}

}  // namespace qvctl::internal
