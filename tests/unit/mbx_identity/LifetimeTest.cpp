// Peers that exit, exec or lose their pid while their identity is taken: each
// must give an error, never an identity of some other process. Every case
// runs with the pidfd from the socket and with pidfd_open, the fallback for
// kernels without SO_PEERPIDFD.
#include <atomic>
#include <chrono>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::kPeerProgram;
using testing::PeerProcess;
using Reap = PeerProcess::Reap;

class PeerIdentityLifetimeTest : public ::testing::TestWithParam<PidfdSource> {
 protected:
  void SetUp() override {
    peer_ = PeerProcess::start(kPeerProgram, "plain");
    ASSERT_NE(peer_, nullptr);
    hooks_.pidfdSource = GetParam();
  }

  Result<std::shared_ptr<const PeerIdentity>> take() {
    return PeerIdentity::fromSocketForTesting(peer_->connection(), hooks_);
  }

  void expectError(const Result<std::shared_ptr<const PeerIdentity>>& taken,
                   IdentityErrorCode code) {
    ASSERT_FALSE(taken.ok()) << (*taken)->description();
    EXPECT_TRUE(isIdentityError(taken.error(), code))
        << "wanted " << identityErrorCodeName(code) << ", got " << taken.error().description();
  }

  std::unique_ptr<PeerProcess> peer_;
  IdentityTestHooks hooks_;
};

TEST_P(PeerIdentityLifetimeTest, TakesTheIdentityOfALivePeer) {
  auto taken = take();
  ASSERT_TRUE(taken.ok()) << taken.error().description();
  EXPECT_EQ((*taken)->pid(), peer_->pid());
  EXPECT_TRUE((*taken)->isAlive());
}

TEST_P(PeerIdentityLifetimeTest, PeerReapedBeforehandIsAnError) {
  ASSERT_TRUE(peer_->quit(Reap::Yes));
  auto taken = take();
  expectError(taken, IdentityErrorCode::PeerExited);
  if (!taken.ok()) {
    EXPECT_EQ(taken.error().description(),
              "peer " + std::to_string(peer_->pid()) + " exited before its identity was taken");
  }
}

TEST_P(PeerIdentityLifetimeTest, ZombiePeerIsAnError) {
  ASSERT_TRUE(peer_->quit(Reap::No));
  expectError(take(), IdentityErrorCode::PeerExited);
}

TEST_P(PeerIdentityLifetimeTest, IsAliveTurnsFalseWhenThePeerExits) {
  auto taken = take();
  ASSERT_TRUE(taken.ok()) << taken.error().description();
  ASSERT_TRUE((*taken)->isAlive());
  ASSERT_TRUE(peer_->quit(Reap::No));
  EXPECT_FALSE((*taken)->isAlive());
  ASSERT_TRUE(peer_->quit(Reap::Yes));
  EXPECT_FALSE((*taken)->isAlive());
}

TEST_P(PeerIdentityLifetimeTest, PeerThatExitsDuringTheReadsIsAnError) {
  hooks_.betweenReads = [this](pid_t) { ASSERT_TRUE(peer_->quit(Reap::Yes)); };
  expectError(take(), IdentityErrorCode::PeerExited);
}

TEST_P(PeerIdentityLifetimeTest, PeerThatExecsDuringTheReadsIsAnError) {
  hooks_.betweenReads = [this](pid_t) { ASSERT_TRUE(peer_->execTarget()); };
  expectError(take(), IdentityErrorCode::ExecutableChanged);
}

TEST_P(PeerIdentityLifetimeTest, StartTimeChangedBetweenReadsIsAnError) {
  // As if the pid had passed to a new process between the two reads.
  hooks_.startTime = [](StartTimeRead read, std::uint64_t t) {
    return read == StartTimeRead::Second ? t + 1 : t;
  };
  expectError(take(), IdentityErrorCode::StartTimeMismatch);
}

TEST_P(PeerIdentityLifetimeTest, ProcessStartedAfterTheAcceptIsPidReuse) {
  hooks_.startTime = [](StartTimeRead, std::uint64_t t) { return t + 1'000'000; };
  expectError(take(), IdentityErrorCode::PidReused);
}

// Identities are shared between the connection's queues: reading one from
// several threads while its process exits must be safe (TSan checks this).
TEST(PeerIdentitySharingTest, ManyThreadsReadOneIdentityWhileThePeerExits) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto taken = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(taken.ok()) << taken.error().description();
  const std::shared_ptr<const PeerIdentity> shared = *taken;

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
}

INSTANTIATE_TEST_SUITE_P(PeerIdentitySources, PeerIdentityLifetimeTest,
                         ::testing::Values(PidfdSource::Automatic, PidfdSource::PidfdOpen),
                         [](const ::testing::TestParamInfo<PidfdSource>& info) {
                           return info.param == PidfdSource::Automatic ? "PeerPidfd" : "PidfdOpen";
                         });

}  // namespace
}  // namespace platform::mbx
