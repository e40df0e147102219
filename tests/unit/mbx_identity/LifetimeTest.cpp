// Peers that exit, exec or lose their pid while their identity is taken: each
// must give an error, never an identity of some other process. Every case
// runs with the pidfd from the socket and with pidfd_open (the fallback).
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::kPeerProgram;
using testing::PeerProcess;
using Reap = PeerProcess::Reap;

class PeerIdentityLifetimeTest : public ::testing::TestWithParam<PidfdSource> {};

TEST_P(PeerIdentityLifetimeTest, PeerThatIsGoneOrChangesIsAnError) {
  // What the peer is made to do before the identity is taken ('q' exit and be
  // reaped, 'z' exit as a zombie) or between its reads ('q', or 'e' exec),
  // and what the hook adds to the first and second start time read.
  const struct {
    const char* what;
    char before, between;
    std::uint64_t first, second;
    IdentityErrorCode code;
  } cases[] = {
      {"zombie", 'z', 0, 0, 0, IdentityErrorCode::PeerExited},
      {"exits during the reads", 0, 'q', 0, 0, IdentityErrorCode::PeerExited},
      {"execs during the reads", 0, 'e', 0, 0, IdentityErrorCode::ExecutableChanged},
      // As if the pid had passed to a new process between the two reads.
      {"start time moved between reads", 0, 0, 0, 1, IdentityErrorCode::StartTimeMismatch},
      {"started after the accept", 0, 0, 1'000'000, 1'000'000, IdentityErrorCode::PidReused},
  };
  const auto act = [](PeerProcess& peer, char what) {
    return what == 'e' ? peer.execTarget() : peer.quit(what == 'z' ? Reap::No : Reap::Yes);
  };
  for (const auto& c : cases) {
    std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
    ASSERT_NE(peer, nullptr);
    IdentityTestHooks hooks;
    hooks.pidfdSource = GetParam();
    ASSERT_TRUE(c.before == 0 || act(*peer, c.before)) << c.what;
    if (c.between != 0) hooks.betweenReads = [&](pid_t) { ASSERT_TRUE(act(*peer, c.between)); };
    hooks.startTime = [&c](StartTimeRead read, std::uint64_t t) {
      return t + (read == StartTimeRead::First ? c.first : c.second);
    };
    auto taken = PeerIdentity::fromSocketForTesting(peer->connection(), hooks);
    ASSERT_FALSE(taken.ok()) << c.what << ": " << (*taken)->description();
    EXPECT_TRUE(isIdentityError(taken.error(), c.code))
        << c.what << ": " << identityErrorCodeName(c.code) << " != " << taken.error().description();
    if (c.code == IdentityErrorCode::PeerExited) {
      EXPECT_EQ(taken.error().description(),
                "peer " + std::to_string(peer->pid()) + " exited before its identity was taken");
    }
  }
}

// Identities are shared between the connection's queues: reading one from
// several threads while its process exits must be safe (TSan checks this).
TEST(PeerIdentitySharingTest, ManyThreadsReadOneIdentityWhileThePeerExits) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto taken = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(taken.ok()) << taken.error().description();
  const std::shared_ptr<const PeerIdentity> shared = *taken;
  EXPECT_TRUE(shared->isAlive());
  std::atomic<bool> sawExit[4] = {};
  std::vector<std::thread> readers;
  for (std::atomic<bool>& saw : sawExit) {
    readers.emplace_back([shared, &saw] {
      const std::string expected = shared->description();
      const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
      while (!saw && std::chrono::steady_clock::now() < deadline) {
        EXPECT_EQ(shared->description(), expected);
        saw = !shared->isAlive();
      }
    });
  }
  // Not ASSERT: the readers must be joined whatever happens.
  EXPECT_TRUE(peer->quit(Reap::Yes));
  for (std::thread& reader : readers) reader.join();
  for (const std::atomic<bool>& saw : sawExit) EXPECT_TRUE(saw);
  EXPECT_FALSE(shared->isAlive());
}

INSTANTIATE_TEST_SUITE_P(PeerIdentitySources, PeerIdentityLifetimeTest,
                         ::testing::Values(PidfdSource::Automatic, PidfdSource::PidfdOpen),
                         [](const auto& info) {
                           return info.param == PidfdSource::Automatic ? "PeerPidfd" : "PidfdOpen";
                         });

}  // namespace
}  // namespace platform::mbx
