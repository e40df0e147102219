// Requests that are well framed but hostile, against the real daemon: keys
// of the wrong kind, paths that climb out or are relative, and a bundle whose
// shared entries link outside it. After each, a fresh well-behaved client
// must still be served.
#include <gtest/gtest.h>

#include "tests/integration/HostileClientFixture.h"

namespace qvd::integration {
namespace {

TEST_F(HostileClientTest, KeysOfTheWrongKindAreRefusedOrIgnoredAsDocumented) {
  std::optional<RawSocketClient> client = connect();
  ASSERT_TRUE(client.has_value());
  const std::string paths(QVDPathsKey), uuids(QVDUUIDKey), flags(QVDFlagsKey);
  const Dictionary aMap{{"a", 1}};
  struct Case {
    Dictionary request;
    Error error;
  };
  // (The envelope, rules, annotations and "find" paths of the wrong kind have
  // their cases in tests/unit/qvd and AnnotationFindTest.)
  const std::vector<Case> cases = {
      {{{std::string(QVDRequestKey), Array{"match"}}, {std::string(QVDVersionKey), 3}},
       {4, "invalid request format (missing type)"}},
      {request(QVDFindRequest, {{uuids, aMap}}), {15, "Cannot locate PlugIn"}},
      {request(QVDAccessRequest, {{uuids, aMap}}), {4, "invalid request format (uuid)"}},
      {request(QVDReadyRequest, {{uuids, aMap}}), {4, "invalid request format (uuid)"}},
      {request(QVDAnnotateRequest,
               {{uuids, aMap}, {std::string(QVDAnnotationsKey), Dictionary{{"election", 1}}}}),
       {4, "invalid request format (uuid)"}},
      {request(QVDLockdownRequest, {{uuids, aMap}}), {4, "invalid request format"}},
      {request(QVDAddRequest, {{paths, 7}}), {4, "invalid request format"}},
      {request(QVDLockdownRequest, {{paths, 7}}), {4, "invalid request format"}},
      {request(QVDBulkRequest, {{flags, "x"}}), kSuccess},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(errorOf(client->call(Value(c.request))), c.error) << Value(c.request).description();
  }
  // Flags as text count as absent: not the privileged 0x200 they spell.
  const Value asText = client->call(Value(request(QVDMatchRequest, {{flags, "0x200"}})));
  EXPECT_EQ(errorOf(asText), kSuccess);
  EXPECT_EQ(identifiersIn(asText), identifiersIn(client->call(Value(request(QVDMatchRequest)))));
  EXPECT_EQ(identifiersIn(asText).size(), 3u);
  EXPECT_TRUE(stillServing());
}

TEST_F(HostileClientTest, PathsThatClimbOutOrAreRelativeRegisterAndHoldNothing) {
  std::optional<RawSocketClient> client = connect();
  ASSERT_TRUE(client.has_value());
  const std::set<std::string> before = identifiersIn(client->call(Value(request(QVDMatchRequest))));
  const std::uint64_t posts = postCount(root_, kChange);
  const std::string paths(QVDPathsKey), flags(QVDFlagsKey);
  const std::string climbing = root_ / "System/Library/PlugIns/../../../../../../../../etc";
  const std::string missingParent = "/a/../../etc/passwd";
  char resolved[PATH_MAX];
  // Resolved only on a machine that has a /a; the daemon sees what realpath sees.
  const bool parentExists = ::realpath(missingParent.c_str(), resolved) != nullptr;
  const Error addMissingParent =
      parentExists ? Error{2, "unable to register plug-in at " + std::string(resolved)}
                   : Error{9, "invalid plugin path: " + missingParent};
  const Error lockMissingParent = parentExists
                                      ? Error{9, "no plug-in at path:" + std::string(resolved)}
                                      : Error{9, "invalid path: " + missingParent};
  struct Case {
    Dictionary request;
    Error error;
  };
  std::vector<Case> cases;
  for (const char* text : {"../../etc", "relative/path", "file:///../../etc"}) {
    const Error notAbsolute{9, std::string("absolute path required: ") + text};
    cases.push_back({request(QVDAddRequest, {{paths, Array{text}}}), notAbsolute});
    cases.push_back({request(QVDLockdownRequest, {{paths, Array{text}}, {flags, 1}}), notAbsolute});
  }
  cases.push_back({request(QVDAddRequest, {{paths, Array{missingParent}}}), addMissingParent});
  cases.push_back({request(QVDLockdownRequest, {{paths, Array{missingParent}}, {flags, 1}}),
                   lockMissingParent});
  cases.push_back({request(QVDAddRequest, {{paths, Array{climbing}}}),
                   {2, "unable to register plug-in at /etc"}});
  cases.push_back({request(QVDLockdownRequest, {{paths, Array{climbing}}, {flags, 1}}),
                   {9, "no plug-in at path:/etc"}});
  for (const char* text : {"../../etc", "relative/path", "/a/../../etc/passwd", "file:///../../etc",
                           "file:///etc", "file:///etc/passwd"}) {
    cases.push_back({request(QVDFindRequest, {{paths, text}}), {15, "Cannot locate PlugIn"}});
  }
  cases.push_back(
      {request(QVDFindRequest, {{paths, "file://" + climbing}}), {15, "Cannot locate PlugIn"}});
  for (const Case& c : cases) {
    EXPECT_EQ(errorOf(client->call(Value(c.request))), c.error) << Value(c.request).description();
  }
  EXPECT_EQ(identifiersIn(client->call(Value(request(QVDMatchRequest)))), before);
  EXPECT_EQ(postCount(root_, kChange), posts) << "no hold was taken";
  EXPECT_TRUE(stillServing());
}

TEST_F(HostileClientTest, SharedEntriesThatLinkOutOfTheBundleGetNoToken) {
  const std::string bundle = std::filesystem::canonical(linker_);
  const int before = daemon_->countLines("failed to make extension for");
  ClientRun run = sendRequest(
      root_, Value(request(QVDFindRequest, {{std::string(QVDPathsKey), "file://" + bundle}})));
  ASSERT_EQ(run.finished.status, 0) << run.finished.err;
  const Dictionary* form =
      run.reply.dictionary() ? run.reply.dictionary()->get(QVDMatchesKey).dictionary() : nullptr;
  ASSERT_NE(form, nullptr) << run.reply.description();
  const Dictionary* tokens = form->get(QVExtensionsFormKey).dictionary();
  ASSERT_NE(tokens, nullptr) << form->get(QVExtensionsFormKey).description();
  // The real directory and the link that stays inside are shared; links to
  // the other plug-in, its file and /etc, and the climbing entry, are not.
  EXPECT_EQ(tokens->keys(), (std::vector<std::string>{"Resources", "inner"}));
  for (const auto& [entry, token] : *tokens) {
    const std::string* text = token.string();
    ASSERT_NE(text, nullptr) << entry;
    auto parsed = platform::sandbox::parseToken(*text);
    ASSERT_TRUE(parsed.ok()) << entry << ": " << *text;
    EXPECT_EQ(parsed->grant.subject, bundle + "/Resources") << entry;
  }
  EXPECT_GE(daemon_->countLines("failed to make extension for"), before + 4) << daemon_->log();
  EXPECT_TRUE(stillServing());
}

}  // namespace
}  // namespace qvd::integration
