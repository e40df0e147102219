// Hosts matching while an installer puts a plug-in on hold and releases it,
// all at once and each in a process of its own (qvd_e2e_concurrent_client):
// every reply must be a well-formed answer, a hold acknowledged before a
// match started must hide the plug-in from it, a release acknowledged
// before must bring it back, each host must keep seeing exactly what its
// entitlements allow, and the daemon must come through it unharmed.
#include <fstream>
#include <future>
#include <map>
#include <regex>

#include "tests/e2e/EndToEnd.h"

namespace qvd::e2e {
namespace {

constexpr int kCycles = 30;

// The "name=number" counts on the first line a loop client printed.
std::map<std::string, long> countsOf(const Finished& run) {
  std::map<std::string, long> counts;
  const std::string line = run.out.substr(0, run.out.find('\n'));
  const std::regex pair("([a-z]+)=([0-9]+)");
  for (auto it = std::sregex_iterator(line.begin(), line.end(), pair); it != std::sregex_iterator();
       ++it) {
    counts[(*it)[1]] = std::stol((*it)[2]);
  }
  return counts;
}

TEST_F(EndToEnd, HostsMatchingWhileAnInstallerHoldsAndReleasesSeeOnlyWhatTheyShould) {
  // Enough plug-ins that one match exports several batches in parallel.
  std::vector<PlugIn> plugIns;
  std::vector<std::string> fillers;
  for (int i = 0; i < 20; ++i) {
    plugIns.push_back(writeBundle("filler" + std::to_string(i), {}, false));
    fillers.push_back(plugIns.back().identifier);
  }
  const PlugIn open = writeBundle("open");
  const PlugIn guarded = guardedBundle("guarded");
  const PlugIn swapped = writeBundle("swapped");
  plugIns.insert(plugIns.end(), {open, guarded, swapped});
  install(plugIns);

  const std::string board = root_ / "board";
  std::ofstream(board) << std::string(64, '\0');
  struct Host {
    std::string name;
    Dictionary entitlements;
    std::vector<std::string> expected;  // besides the held plug-in
  };
  std::vector<std::string> everything = fillers, allowed = fillers;
  everything.push_back(guarded.identifier);
  for (auto* list : {&everything, &allowed}) list->push_back(open.identifier);
  const std::vector<Host> hosts{
      {"entitled-loop", Dictionary{{kMayHost, true}}, everything},
      {"plain-loop", Dictionary{}, allowed},
      // Its own restriction, not the plug-in's demand, keeps "guarded" out.
      {"restricted-loop",
       Dictionary{{kMayHost, true},
                  {std::string(QVAllowedPlugInsEntitlement),
                   Dictionary{{std::string(QVIdentifierAttribute),
                               platform::Array{open.identifier, swapped.identifier}}}}},
       {open.identifier}},
  };

  // Every copy is written before any process starts: a child started while
  // a copy is still open for writing would make that copy unrunnable.
  std::vector<std::vector<std::string>> commands;
  for (const Host& host : hosts) {
    commands.push_back({grantedCopy(host.name, CONCURRENT_CLIENT_PATH, host.entitlements), "match",
                        "--board", board, "--point", kPoint, "--held", swapped.identifier});
    for (const std::string& id : host.expected)
      commands.back().insert(commands.back().end(), {"--expect", id});
  }
  const std::string installer = grantedCopy("installer-loop", CONCURRENT_CLIENT_PATH,
                                            Dictionary{{std::string(QVManagerEntitlement), true}});
  std::vector<std::future<Finished>> matching;
  for (const std::vector<std::string>& command : commands) {
    matching.push_back(std::async(std::launch::async, [this, command] {
      return integration::runProcess(command, root_.path());
    }));
  }
  const std::uint64_t posted = integration::postCount(root_, std::string(QVNotifyAnnotationChange));
  const Finished holding =
      run(installer, {"hold", "--board", board, "--path", swapped.path, "--cycles",
                      std::to_string(kCycles), "--hosts", std::to_string(hosts.size())});
  EXPECT_EQ(holding.status, 0) << holding.err;
  EXPECT_EQ(countsOf(holding), (std::map<std::string, long>{{"cycles", kCycles}, {"failures", 0}}))
      << holding.out << holding.err;

  for (std::size_t i = 0; i < hosts.size(); ++i) {
    const Finished done = matching[i].get();
    std::map<std::string, long> counts = countsOf(done);
    SCOPED_TRACE(hosts[i].name + ": " + done.out + done.err);
    EXPECT_EQ(done.status, 0);
    EXPECT_EQ(counts["errors"], 0);
    EXPECT_EQ(counts["failures"], 0);
    // Both states were seen whole, or the run proved nothing.
    EXPECT_GT(counts["held"], 0);
    EXPECT_GT(counts["free"], 0);
    EXPECT_EQ(counts["matches"],
              counts["held"] + counts["free"] + counts["either"] + counts["errors"]);
  }

  // Every hold was granted, half of them after ending the (absent) plug-in
  // processes, and each released by its token.
  EXPECT_EQ(daemon_->countLines("] hold request granted uuid:"), kCycles / 2);
  EXPECT_EQ(daemon_->countLines("forced termination complete; hold request granted"), kCycles / 2);
  EXPECT_EQ(daemon_->countLines("at client's request"), kCycles);
  EXPECT_EQ(integration::postCount(root_, std::string(QVNotifyAnnotationChange)),
            posted + 2 * kCycles)
      << "observers hear of each hold and each release once";
  // Still serving, with nothing held any more.
  Ids afterwards(allowed.begin(), allowed.end());
  afterwards.insert(swapped.identifier);
  EXPECT_EQ(matched(plain_), afterwards);
}

}  // namespace
}  // namespace qvd::e2e
