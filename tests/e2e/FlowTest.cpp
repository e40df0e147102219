// The life of a plug-in, end to end: an installer adds it, hosts with
// different entitlements find and match it and are allowed it or not, a
// user's election shows in the next match and outlives the daemon, a host
// gets it ready and asks for access, and its removal ends its running
// process and takes it out of every host's view.
#include <signal.h>

#include <chrono>
#include <string>

#include "platform/sandbox/LinuxSandboxExtensions.h"
#include "tests/e2e/EndToEnd.h"

namespace qvd::e2e {
namespace {

using holds_testing::PlugInProcess;
using namespace std::chrono_literals;

std::string deniedTo(const PlugIn& plugIn) {
  return "access to plugin " + plugIn.identifier + " denied: the host does not have the \"" +
         kMayHost + "\" entitlement";
}

TEST_F(EndToEnd, AnAddedPlugInIsFoundByEveryHostAndMatchedByThoseItAllows) {
  const PlugIn open = writeBundle("open");
  const PlugIn guarded = guardedBundle("guarded");
  EXPECT_EQ(uuidOf(plain_, open.path), "") << "on disk, but not added yet";
  EXPECT_EQ(matched(entitled_), Ids{});

  install({open, guarded});
  const std::string openUuid = uuidOf(installer_, open.path);
  const std::string guardedUuid = uuidOf(installer_, guarded.path);
  ASSERT_NE(openUuid, "") << daemon_->log();
  ASSERT_NE(guardedUuid, "");
  EXPECT_NE(openUuid, guardedUuid);
  // "find" asks for no permission: every host finds both, by path or UUID.
  for (const std::string& host : {entitled_, plain_}) {
    EXPECT_EQ(uuidOf(host, open.path), openUuid);
    EXPECT_EQ(uuidOf(host, guarded.path), guardedUuid);
    EXPECT_EQ(found(host, guardedUuid).value("identifier", ""), guarded.identifier);
  }

  // A match shows a host only what it may use.
  EXPECT_EQ(matched(entitled_), (Ids{open.identifier, guarded.identifier}));
  EXPECT_EQ(matched(plain_), Ids{open.identifier});
  EXPECT_EQ(matched(plain_, {"XOExtensionIdentifier=" + guarded.identifier}), Ids{});
  EXPECT_EQ(matched(entitled_, {"XOExtensionIdentifier=" + guarded.identifier}),
            Ids{guarded.identifier});

  // Asking to use it says the same, with the reason.
  const Finished refused = run(plain_, {"ready", openUuid, guardedUuid});
  EXPECT_TRUE(refusedWith(refused, 11, deniedTo(guarded))) << refused.err;
  EXPECT_FALSE(fs::exists(root_ / "run/quorvex/lumend")) << "nothing is enabled for a refusal";
  const Finished allowed = run(entitled_, {"ready", openUuid, guardedUuid});
  EXPECT_EQ(allowed.status, 0) << allowed.err << daemon_->log();
  EXPECT_EQ(run(plain_, {"ready", openUuid}).status, 0);
}

TEST_F(EndToEnd, AnElectionShowsInTheNextMatchAndOutlivesTheDaemon) {
  const PlugIn chosen = writeBundle("chosen");
  const PlugIn other = writeBundle("other");
  install({chosen, other});
  const std::string uuid = uuidOf(plain_, chosen.path);
  ASSERT_NE(uuid, "");
  const std::vector<std::string> electedOnly{"XOUserElection=1"};
  EXPECT_EQ(matched(plain_, electedOnly), Ids{});

  const Finished annotated = run(plain_, {"annotate", uuid, "--election", "1"});
  ASSERT_EQ(annotated.status, 0) << annotated.err;
  EXPECT_EQ(matched(plain_, electedOnly), Ids{chosen.identifier});
  EXPECT_EQ(matched(entitled_, electedOnly), Ids{chosen.identifier}) << "the user's, not a host's";
  EXPECT_EQ(matched(plain_), (Ids{chosen.identifier, other.identifier}));
  EXPECT_EQ(found(entitled_, uuid)["annotations"], nlohmann::json({{"election", 1}}));

  restart();
  EXPECT_EQ(uuidOf(plain_, chosen.path), uuid) << "the registration outlives the daemon too";
  EXPECT_EQ(matched(entitled_, electedOnly), Ids{chosen.identifier}) << daemon_->log();
  EXPECT_EQ(found(plain_, uuid)["annotations"], nlohmann::json({{"election", 1}}));

  // Taking the election back is kept as well.
  ASSERT_EQ(run(entitled_, {"annotate", uuid, "--election", "0"}).status, 0);
  EXPECT_EQ(matched(plain_, electedOnly), Ids{});
  restart();
  EXPECT_EQ(matched(plain_, electedOnly), Ids{});
  EXPECT_EQ(matched(plain_), (Ids{chosen.identifier, other.identifier}));
}

TEST_F(EndToEnd, AReadyPlugInIsRecordedForItsHostAndItsAccessTokensAreConsumable) {
  const PlugIn open = writeBundle("open");
  const PlugIn guarded = guardedBundle("guarded");
  install({open, guarded});
  const std::string openUuid = uuidOf(entitled_, open.path);
  const std::string guardedUuid = uuidOf(entitled_, guarded.path);

  // The shell reports its pid, then becomes the host.
  auto readyWithPid = [&](const std::string& host, std::vector<std::string> uuids) {
    std::vector<std::string> arguments{"-c", "echo $$; exec \"$0\" \"$@\"", host, "ready"};
    arguments.insert(arguments.end(), uuids.begin(), uuids.end());
    const Finished done = run("/bin/sh", arguments);
    return std::make_pair(done, done.out.substr(0, done.out.find('\n')));
  };
  const auto [ready, hostPid] = readyWithPid(entitled_, {guardedUuid, openUuid});
  ASSERT_EQ(ready.status, 0) << ready.err << daemon_->log();
  const std::string records = root_ / ("run/quorvex/lumend/" + hostPid);
  for (const PlugIn& plugIn : {open, guarded}) {
    const platform::Value record =
        integration::readVmapFile(records + "/" + plugIn.identifier + ".vmap");
    ASSERT_NE(record.dictionary(), nullptr) << records << " for " << plugIn.identifier;
    EXPECT_EQ(record.dictionary()->get("executable"), platform::Value(plugIn.path + "/Plug"));
    EXPECT_NE(record.dictionary()->get("overlay").dictionary(), nullptr);
  }
  EXPECT_EQ(std::distance(fs::directory_iterator(records), fs::directory_iterator()), 2);

  const auto [refused, refusedPid] = readyWithPid(plain_, {guardedUuid});
  EXPECT_TRUE(refusedWith(refused, 11, deniedTo(guarded))) << refused.err;
  EXPECT_FALSE(fs::exists(root_ / ("run/quorvex/lumend/" + refusedPid)));

  // One token per plug-in, in the order asked, each opening its bundle to
  // whoever consumes it (here the test process, standing in for the host).
  const nlohmann::json access = json(entitled_, {"access", guardedUuid, openUuid});
  ASSERT_TRUE(access.contains("extensions") && access["extensions"].size() == 2) << access;
  platform::sandbox::LinuxSandboxExtensions consumer(
      root_ / std::string(platform::sandbox::kSigningKeyRelativePath));
  const std::vector<std::string> expected{guarded.path, open.path};
  for (std::size_t i = 0; i < expected.size(); ++i) {
    auto handle = consumer.consume(access["extensions"][i].get<std::string>());
    ASSERT_TRUE(handle.ok()) << handle.error().description();
    const auto grant = platform::sandbox::LinuxSandboxExtensions::grantForHandle(*handle);
    ASSERT_TRUE(grant.has_value());
    EXPECT_EQ(grant->subject, expected[i]);
    EXPECT_TRUE(consumer.release(*handle).ok());
  }
}

TEST_F(EndToEnd, RemovalEndsTheRunningPlugInAndHostsNoLongerSeeIt) {
  const PlugIn doomed = guardedBundle("doomed");
  const PlugIn kept = writeBundle("kept");
  install({doomed, kept});
  const std::string uuid = uuidOf(entitled_, doomed.path);
  ASSERT_EQ(run(entitled_, {"ready", uuid}).status, 0);
  auto serviceRecords = [&] {
    int count = 0;
    for (const auto& file : fs::recursive_directory_iterator(root_ / "run/quorvex/lumend")) {
      count += file.path().filename() == doomed.identifier + ".vmap";
    }
    return count;
  };
  ASSERT_EQ(serviceRecords(), 1);
  auto running = PlugInProcess::start(doomed.path + "/Plug");
  auto bystander = PlugInProcess::start(kept.path + "/Plug");
  ASSERT_TRUE(running && bystander);

  // Only an installer may remove: a host is refused and nothing changes.
  const Finished refused = run(entitled_, {"remove", doomed.path});
  EXPECT_TRUE(refusedWith(refused, 11, "caller lacks entitlement for this operation"))
      << refused.err;
  EXPECT_FALSE(running->exited(50ms));
  EXPECT_EQ(matched(entitled_), (Ids{doomed.identifier, kept.identifier}));

  const Finished removed = run(installer_, {"remove", doomed.path});
  ASSERT_EQ(removed.status, 0) << removed.err << daemon_->log();
  EXPECT_TRUE(running->exited(10s)) << daemon_->log();
  EXPECT_EQ(running->terminatingSignal(), SIGTERM);
  EXPECT_FALSE(bystander->exited(50ms)) << "another plug-in's process is left alone";
  EXPECT_EQ(serviceRecords(), 0) << "its service record went with it";

  EXPECT_EQ(matched(entitled_), Ids{kept.identifier});
  EXPECT_EQ(matched(plain_), Ids{kept.identifier});
  const Finished gone = run(plain_, {"find", uuid});
  EXPECT_TRUE(refusedWith(gone, 15, "Cannot locate PlugIn")) << gone.out << gone.err;
  EXPECT_EQ(uuidOf(entitled_, doomed.path), "");
}

}  // namespace
}  // namespace qvd::e2e
