// Clients that break the framing or the resource limits, against the real
// daemon: broken frames, bodies that are no map, bodies at the size limit,
// crowds of idle connections, and a peer that never reads. After each, a
// fresh well-behaved client must still be served, and the daemon must stop
// cleanly when told.
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <climits>

#include "tests/integration/HostileClientFixture.h"

namespace qvd::integration {
namespace {

// Under AddressSanitizer (the daemon is built with the tests) freed blocks sit
// in its quarantine, up to 256 MiB, whatever the daemon asks of glibc: the
// resident set says nothing about what the daemon keeps. A body leaked per
// request is then LeakSanitizer's to report, which fails the daemon's exit.
#if defined(__SANITIZE_ADDRESS__)
constexpr bool kResidentSetMeansWhatIsKept = false;
#else
constexpr bool kResidentSetMeansWhatIsKept = true;
#endif

TEST_F(HostileClientTest, BrokenFramesEndOnlyTheirConnection) {
  // Each framing rule has its own case in the message system's tests; here a
  // few of each family reach the real daemon, which must drop only the
  // connection that broke one.
  const std::vector<std::uint8_t> good = cborOf(Value(request(QVDMatchRequest)));
  const auto len = static_cast<std::uint32_t>(good.size());
  std::vector<std::uint8_t> cutBody = rawFrame(header(1, 1, len), good);
  cutBody.resize(cutBody.size() - 5);

  struct Case {
    const char* what;
    std::vector<std::uint8_t> bytes;
    bool thenEndStream;
    const char* fault;
  };
  const std::vector<Case> cases = {
      {"four bytes of another protocol", {'G', 'E', 'T', ' '}, false, "bad magic"},
      {"flags 0x3", rawFrame(header(0x3, 1, len), good), false, "conflicting flags"},
      {"length 16 MiB + 1, header only", rawFrame(header(1, 1, (16u << 20) + 1), {}), false,
       "body length over the limit"},
      {"body cut short, then end", cutBody, true, "stream ended inside a frame"},
      {"invalid UTF-8 key", requestFrame({0xa1, 0x62, 0xc3, 0x28, 0x00}), false,
       "undecodable body"},
      {"indefinite map", requestFrame({0xbf, 0xff}), false, "undecodable body"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    const std::string logged = std::string("closing: broken frame (") + c.fault + ")";
    const int before = daemon_->countLines(logged);
    std::optional<RawSocketClient> client = connect();
    ASSERT_TRUE(client.has_value());
    ASSERT_TRUE(client->send(c.bytes, 5s));
    if (c.thenEndStream) client->shutdownWrite();
    EXPECT_TRUE(client->waitUntilClosed(5s));
    EXPECT_TRUE(logGains(logged, before)) << daemon_->log();
    EXPECT_TRUE(stillServing());
  }

  // An id that does not increase breaks a connection that was serving.
  std::optional<RawSocketClient> client = connect();
  ASSERT_TRUE(client.has_value());
  ASSERT_NE(matchesOf(client->call(Value(request(QVDMatchRequest)))), nullptr);
  const int before = daemon_->countLines("broken frame (non-increasing message id)");
  ASSERT_TRUE(client->send(rawFrame(header(1, client->lastMessageId(), len), good), 5s));
  EXPECT_TRUE(client->waitUntilClosed(5s));
  EXPECT_TRUE(logGains("broken frame (non-increasing message id)", before)) << daemon_->log();
  EXPECT_TRUE(stillServing());
}

// A well-formed body that is no map is logged and dropped, unanswered; the
// connection goes on serving.
TEST_F(HostileClientTest, BodiesThatAreNoMapGetNoReplyAndTheConnectionServesOn) {
  std::optional<RawSocketClient> client = connect();
  ASSERT_TRUE(client.has_value());
  const int before = daemon_->countLines("unexpected message: ");
  ASSERT_NE(client->sendRequest(Value(Array{"match", 3})), 0u);
  ASSERT_NE(client->sendRequest(Value("match")), 0u);
  const std::uint64_t id = client->sendRequest(Value(request(QVDMatchRequest)));
  ASSERT_NE(id, 0u);
  RawSocketClient::Received reply = client->receive(10s);
  ASSERT_EQ(reply.outcome, RawSocketClient::Outcome::Frame);
  EXPECT_EQ(reply.header.inReplyTo, id) << "the first reply answers the map";
  EXPECT_EQ(identifiersIn(reply.body),
            (std::set<std::string>{"com.example.alpha", "com.example.beta", "com.example.linker"}));
  EXPECT_TRUE(eventually([&] { return daemon_->countLines("unexpected message: ") >= before + 2; }))
      << daemon_->log();
  // Each line names the sender: this process, the raw client's.
  EXPECT_GE(daemon_->countLines(" from: " + std::to_string(::getpid())), 2) << daemon_->log();
  EXPECT_TRUE(stillServing());
}

TEST_F(HostileClientTest, ASixteenMiBRequestIsServedAndItsMemoryDoesNotAccumulate) {
  Dictionary body = request(
      QVDMatchRequest,
      {{std::string(QVDRulesKey), Dictionary{{"XOExtensionIdentifier", "com.example.alpha"}}},
       {"padding", platform::Data()}});
  // The padding's head grows from one byte to five once it holds 64 KiB or more.
  const std::size_t padding = platform::mbx::kMaxBodyBytes - cborOf(Value(body)).size() - 4;
  body.set("padding", platform::Data(padding, 0x5a));
  const Value whole(body);
  ASSERT_EQ(cborOf(whole).size(), platform::mbx::kMaxBodyBytes);

  const int descriptors = settledDescriptors(pid_);
  auto roundTrip = [&] {
    std::optional<RawSocketClient> client = connect();
    ASSERT_TRUE(client.has_value());
    EXPECT_EQ(identifiersIn(client->call(whole, 30s)), std::set<std::string>{"com.example.alpha"});
  };
  const long baseline = residentKiB(pid_);
  // The daemon frees a request's memory on its own time once the reply is
  // out: on a loaded machine a reading taken when the connection has gone
  // may still count a body. So each reading is retried, for up to 10 s,
  // until the daemon is back under `boundKiB` above the baseline; what it
  // keeps for good never gets there.
  auto settledUnder = [&](long boundKiB) {
    if (!kResidentSetMeansWhatIsKept) boundKiB = LONG_MAX;
    long resident = 0;
    auto under = [&] {
      resident = residentKiB(pid_);
      return openDescriptors(pid_) <= descriptors && resident - baseline < boundKiB;
    };
    EXPECT_TRUE(eventually(under))
        << baseline << " -> " << resident << " KiB, " << openDescriptors(pid_) << " descriptors";
    return resident;
  };
  // Blocks of a body's size are mapped and unmapped, not kept by the
  // allocator: one request leaves less than a body's worth behind.
  roundTrip();
  settledUnder(16 * 1024);
  if (HasFailure()) return;
  // Many leave a little more in the per-thread arenas, at a level that stops
  // rising: a body kept per request would add 16 MiB each time. (Before the
  // daemon set its mmap threshold, glibc kept them: 130-155 MiB.) The lowest
  // reading of a series is what it kept; higher ones were still freeing.
  auto keptOver = [&](int rounds) {
    long kept = LONG_MAX;
    for (int i = 0; i < rounds; ++i) {
      roundTrip();
      kept = std::min(kept, settledUnder(48 * 1024));
      if (HasFailure()) break;  // each further round would wait its 10 s
    }
    return kept;
  };
  keptOver(2);
  const long early = keptOver(6);
  keptOver(10);
  const long late = keptOver(6);
  if (kResidentSetMeansWhatIsKept && !HasFailure()) {
    EXPECT_LT(late - early, 32 * 1024) << baseline << " -> " << early << " -> " << late << " KiB";
  }
  EXPECT_TRUE(stillServing());
}

TEST_F(HostileClientTest, AThousandSilentConnectionsStarveNobodyAndLeaveNoDescriptors) {
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  if (limit.rlim_cur < 1200) GTEST_SKIP() << "descriptor limit " << limit.rlim_cur;
  const int baseline = settledDescriptors(pid_);
  ASSERT_GT(baseline, 0);
  std::vector<RawSocketClient> silent;
  for (int i = 0; i < 1000; ++i) {
    std::optional<RawSocketClient> client = connect();
    ASSERT_TRUE(client.has_value()) << "connection " << i;
    silent.push_back(std::move(*client));
  }
  EXPECT_TRUE(eventually([&] { return openDescriptors(pid_) >= baseline + 1000; }, 20s))
      << openDescriptors(pid_) << " open, " << baseline << " before";
  EXPECT_TRUE(stillServing());
  silent.clear();
  EXPECT_TRUE(eventually([&] { return openDescriptors(pid_) <= baseline + 2; }, 20s))
      << openDescriptors(pid_) << " open, " << baseline << " before";
  EXPECT_TRUE(stillServing());
}

TEST_F(HostileClientTest, APeerThatNeverReadsIsDroppedWhileOthersAreServed) {
  // Eight plug-ins of 256 KiB each: every match of them is a 2 MiB reply.
  Array paths;
  for (int i = 0; i < 8; ++i) {
    const std::string bundle = root_ / ("System/Library/PlugIns/big" + std::to_string(i) + ".ovx");
    const Dictionary extension{{"XOExtensionPointIdentifier", "com.example.big"},
                               {"XOExtensionProtocol", Array{"QVWidget"}}};
    writeVmapFile(bundle + "/Info.vmap",
                  Dictionary{{"BXBundleIdentifier", "com.example.big" + std::to_string(i)},
                             {"BXExecutable", "Plug"},
                             {"Padding", std::string(256 * 1024, 'p')},
                             {"XOExtension", extension}});
    paths.append(bundle);
  }
  std::optional<RawSocketClient> setup = connect();
  ASSERT_TRUE(setup.has_value());
  ASSERT_EQ(
      errorOf(setup->call(Value(request(QVDAddRequest, {{std::string(QVDPathsKey), paths}})))),
      kSuccess);
  const Value big(request(
      QVDMatchRequest,
      {{std::string(QVDRulesKey), Dictionary{{"XOExtensionPointName", "com.example.big"}}}}));
  ASSERT_EQ(identifiersIn(setup->call(big)).size(), 8u);

  const std::string dropped = "closing: the peer does not read";
  std::optional<RawSocketClient> hog = connect();
  ASSERT_TRUE(hog.has_value());
  const auto deadline = std::chrono::steady_clock::now() + 30s;
  bool checkedWhileQueued = false;
  while (daemon_->countLines(dropped) == 0 && std::chrono::steady_clock::now() < deadline) {
    for (int i = 0; i < 4; ++i) {
      if (hog->sendRequest(big) == 0) break;  // the daemon has closed it
    }
    if (!checkedWhileQueued) {
      EXPECT_TRUE(stillServing()) << "while replies pile up for another peer";
      checkedWhileQueued = true;
    }
    eventually([&] { return daemon_->countLines(dropped) > 0; }, 300ms);
  }
  EXPECT_EQ(daemon_->countLines(dropped), 1) << daemon_->log();
  EXPECT_TRUE(hog->waitUntilClosed(15s));
  EXPECT_TRUE(stillServing());
  EXPECT_EQ(identifiersIn(setup->call(big)).size(), 8u) << "an older connection is served too";
}

}  // namespace
}  // namespace qvd::integration
