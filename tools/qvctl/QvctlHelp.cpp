#include "tools/qvctl/QvctlHelp.h"

#include <array>

namespace qvctl {

namespace {

constexpr std::array kCommands{
    CommandInfo{"add", Command::Add, "add PATH...", "register the plug-ins at PATH with the daemon",
                "Relative paths are made absolute against the current directory.\n"
                "Example: qvctl add /Applications/Maps.app/PlugIns/Share.ovx\n"},
    CommandInfo{"remove", Command::Remove, "remove PATH...", "unregister the plug-ins at PATH",
                "Example: qvctl remove ./Share.ovx\n"},
    CommandInfo{"bulk", Command::Bulk, "bulk [FLAGS]",
                "send bulk registration options (FLAGS: a number, default 0; none is supported yet)",
                "Example: qvctl bulk 0\n"},
    CommandInfo{"match", Command::Match,
                "match [--flags N] [--sync] [KEY=PATTERN... | --rules JSON | --rules-file FILE]",
                "find the plug-ins whose attributes match the rules",
                "  --flags N          discovery flags: 0x1 keep versions, 0x4 keep\n"
                "                     duplicates, 0x8 system only, 0x200 all\n"
                "  --sync             wait for the answer inside the request (adds 0x400)\n"
                "  KEY=PATTERN        one rule per argument, the pattern as text\n"
                "  --rules JSON       the rules as a JSON object instead\n"
                "  --rules-file FILE  the rules from a vmap or JSON file instead\n"
                "Example: qvctl match XOExtensionPointName=com.corvane.share\n"},
    CommandInfo{"find", Command::Find, "find UUID|PATH",
                "show the plug-in with this UUID, or at this path (or file:// URL)",
                "Example: qvctl find 6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F\n"},
    CommandInfo{"ready", Command::Ready,
                "ready [--sync] [--flags N] [--env KEY=VALUE]... UUID[=PATH]...",
                "prepare plug-ins to be launched for this host",
                "  --env KEY=VALUE  an environment entry for the plug-ins (repeatable)\n"
                "A UUID without =PATH is sent with an empty path.\n"
                "Example: qvctl ready --sync 6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F=./Share.ovx\n"},
    CommandInfo{"access", Command::Access, "access [--sync] [--flags N] UUID[=PATH]...",
                "get read tokens (sandbox extensions) for the plug-ins' files",
                "Prints one token per plug-in, in the order given.\n"
                "Example: qvctl access 6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F\n"},
    CommandInfo{"annotate", Command::Annotate,
                "annotate UUID... (--election 0|1 | --annotations JSON)",
                "set annotations of plug-ins",
                "  --election 0|1      the user's election: 1 elects the plug-ins, 0 leaves it undecided\n"
                "  --annotations JSON  any annotations, as a JSON object\n"
                "Example: qvctl annotate 6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F --election 1\n"},
    CommandInfo{"bulk-annotate", Command::BulkAnnotate, "bulk-annotate --annotations JSON",
                "set annotations of many plug-ins in one request",
                "Example: qvctl bulk-annotate --annotations \"$(cat annotations.json)\"\n"},
    CommandInfo{"hold", Command::Hold, "hold [--flags N] [--wait] PATH...",
                "put a hold on the plug-ins at PATH and print the hold's token",
                "  --flags N  0x1 PATHs are plug-ins (else applications), 0x2 refuse if\n"
                "             busy, 0x4 end the plug-ins' processes first\n"
                "  --wait     keep the hold until standard input ends, then release it\n"
                "A hold lasts as long as the connection that took it, so without --wait it\n"
                "ends when qvctl exits; 'qvctl release TOKEN' ends it earlier.\n"
                "Example: sleep 60 | qvctl hold --wait --flags 1 /Applications/Maps.app/PlugIns/Route.ovx\n"},
    CommandInfo{"release", Command::Release, "release TOKEN",
                "end the hold that 'qvctl hold' printed TOKEN for",
                "Example: qvctl release \"$token\"\n"},
    CommandInfo{"watch", Command::Watch, "watch [--count N]",
                "print a line each time annotations or holds change",
                "  --count N  stop after N lines\n"
                "Changes in quick succession may show as one line; the count it shows\n"
                "is the number of changes so far.\n"
                "Example: qvctl watch --count 1\n"},
    CommandInfo{"help", Command::Help, "help [COMMAND]", "show this help, or a command's", ""},
};

}  // namespace

const CommandInfo* commandNamed(std::string_view name) {
  for (const CommandInfo& info : kCommands) {
    if (info.name == name) return &info;
  }
  return nullptr;
}

const CommandInfo& commandInfo(Command command) {
  for (const CommandInfo& info : kCommands) {
    if (info.command == command) return info;
  }
  return kCommands.back();
}

std::string overviewHelp() {
  std::string text =
      "usage: qvctl [--service NAME] [--json] COMMAND [ARGUMENTS]\n"
      "\n"
      "Talks to qvd, the plug-in registry daemon.\n"
      "\n"
      "Options:\n"
      "  --service NAME  the daemon's service (default com.corvane.quorvex.qvd)\n"
      "  --json          print replies as JSON (dates ISO 8601, UUIDs upper case,\n"
      "                  data base64)\n"
      "  --help          this help; 'qvctl help COMMAND' for a command's\n"
      "\n"
      "Commands:\n";
  for (const CommandInfo& info : kCommands) {
    std::string name(info.name);
    name.resize(15, ' ');
    text += "  " + name + std::string(info.summary) + "\n";
  }
  text +=
      "\n"
      "Exit status: 0 success, 1 the daemon reported an error (or cannot be reached),\n"
      "2 a usage error.\n";
  return text;
}

std::string commandHelp(Command command) {
  const CommandInfo& info = commandInfo(command);
  return "usage: qvctl " + std::string(info.usage) + "\n\n" + std::string(info.summary) + ".\n" +
         std::string(info.details);
}

}  // namespace qvctl
