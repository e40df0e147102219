// The "lock" request over a real connection to an in-process server with
// fake platform services: releases, a refusal part-way through the paths,
// application paths, and who is asked about busy plug-ins.
#include <thread>

#include "Quorvex/QVErrors.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/values/Array.h"
#include "tests/unit/holds/ServerHoldsFixture.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;

class LockRequestTest : public ServerHoldsFixture {
 protected:
  Dictionary lock(std::uint64_t flags, const std::vector<std::string>& paths) {
    Dictionary message = request(QVDLockdownRequest);
    message.set(QVDFlagsKey, flags);
    Array list;
    for (const std::string& path : paths) list.append(Value(path));
    message.set(QVDPathsKey, std::move(list));
    return message;
  }
  Value send(const Dictionary& message) {
    auto reply = client_.call(message);
    EXPECT_TRUE(reply.ok());
    return reply.ok() ? *reply : Value();
  }
  // The token of a granted hold, or the null UUID.
  Uuid tokenOf(const Value& reply) {
    const Dictionary* body = reply.dictionary();
    return body ? body->get(QVDUUIDKey).uuid().value_or(Uuid()) : Uuid();
  }
  bool held(const platform::holvane::PlugInRecord& record) {
    return server_.server()->holdOnPlugIn(*plugIn(record));
  }

  TestClient client_{server_};
};

TEST_F(LockRequestTest, ATokenListReleasesEvenBesidePathsAndSkipsWhatIsNoUuid) {
  const auto a = put("a");
  const auto b = put("b");
  const Uuid token = tokenOf(send(lock(0x1, {a.path})));
  ASSERT_FALSE(token.isNull());
  ASSERT_TRUE(held(a));
  const std::uint64_t before = posts();

  Dictionary release = request(QVDLockdownRequest);
  release.set(QVDUUIDKey, Array{Value(5), Value(token.toString()), Value(Uuid::generate())});
  release.set(QVDPathsKey, Array{Value(b.path)});
  EXPECT_EQ(errorOf(send(release)), ErrorReply{});
  EXPECT_TRUE(held(a)) << "a token sent as text names no hold";
  EXPECT_FALSE(held(b)) << "the paths beside a token list are not held";
  EXPECT_EQ(posts(), before);

  release.set(QVDUUIDKey, Array{Value(token)});
  EXPECT_EQ(errorOf(send(release)), ErrorReply{});
  EXPECT_TRUE(server_.server()->holds().empty());
  EXPECT_EQ(posts(), before + 1);
}

// (Each refusal on its own is shown against the real daemon.)
TEST_F(LockRequestTest, ARefusedPathAfterAGoodOneTakesNoHoldAndPostsNothing) {
  const auto a = put("a");
  const std::uint64_t before = posts();
  EXPECT_EQ(errorOf(send(lock(0x1, {a.path, "/nonexistent/x.ovx"}))),
            (ErrorReply{9, "invalid path: /nonexistent/x.ovx"}));
  EXPECT_TRUE(server_.server()->holds().empty());
  EXPECT_EQ(posts(), before);
}

TEST_F(LockRequestTest, AnApplicationPathHoldsEveryPlugInInsideEvenNone) {
  const std::string app = application("Maps");
  const auto x = put("x", std::nullopt, app);
  const auto y = put("y", std::nullopt, app);
  const auto outside = put("outside");
  const std::uint64_t before = posts();
  const Value reply = send(lock(0, {app}));
  EXPECT_EQ(errorOf(reply), ErrorReply{});
  EXPECT_FALSE(tokenOf(reply).isNull());
  EXPECT_TRUE(held(x));
  EXPECT_TRUE(held(y));
  EXPECT_FALSE(held(outside));
  EXPECT_EQ(posts(), before + 1);

  const Value none = send(lock(0, {application("Empty")}));
  EXPECT_FALSE(tokenOf(none).isNull()) << "a hold on nothing is still a hold";
  ASSERT_EQ(server_.server()->holds().size(), 2u);
  EXPECT_TRUE(server_.server()->holds()[1]->blocked().empty());
}

// (A busy plug-in with its conflicts is refused in the integration tests,
// against a real plug-in process.)
TEST_F(LockRequestTest, OnlyARefusingHoldAsksWhoIsBusyAndAnIncompleteInstanceIsNotBusy) {
  const auto a = put("a");
  server_.fakes().assertions->setInstances(
      "com.example.a", {platform::vouchd::ExtensionInstance{77, Dictionary{{"pid", 77}}}});
  EXPECT_FALSE(tokenOf(send(lock(0x1, {a.path}))).isNull());
  EXPECT_TRUE(server_.fakes().assertions->questions().empty());

  platform::log::LogCaptureForTesting capture;
  EXPECT_FALSE(tokenOf(send(lock(0x3, {a.path}))).isNull());
  EXPECT_EQ(server_.fakes().assertions->questions(),
            std::vector<std::set<std::string>>{{"com.example.a"}});
  bool logged = false;
  for (const std::string& line : capture.messages()) {
    logged |=
        line == "vouchd reported incomplete bundle for plug-in com.example.a/" + a.uuid.toString();
  }
  EXPECT_TRUE(logged);
}

}  // namespace
}  // namespace qvd::testing
