// Annotations, election and "find" against the real daemon: what is stored
// survives a restart, partial failures keep what was done and stay silent,
// and "find" ignores every gate a match applies.
#include <gtest/gtest.h>

#include <map>
#include <optional>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"

namespace qvd::integration {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;

Dictionary request(std::string_view name, Dictionary keys = {}) {
  keys.set(QVDRequestKey, std::string(name));
  if (keys.find(QVDVersionKey) == nullptr) keys.set(QVDVersionKey, 3);
  return keys;
}

class AnnotationFindTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const char* name : {"alpha", "beta", "gamma"})
      paths_[name] = writeSystemPlugIn(root_, name);
    paths_["auto"] =
        writeSystemPlugIn(root_, "auto", "com.example.point",
                          Dictionary{{"com.corvane.developer.auto-elect-plugin", true}});
    start();
  }
  void TearDown() override {
    if (daemon_) {
      EXPECT_EQ(daemon_->terminate(), 0) << daemon_->log();
    }
  }

  void start() {
    daemon_.emplace(root_, std::vector<std::string>{"-d", annotationFile()});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
  }
  void restart() {
    ASSERT_EQ(daemon_->terminate(), 0) << daemon_->log();
    daemon_.reset();
    start();
  }
  std::string annotationFile() const { return root_ / "annotations.vmap"; }

  Value send(const Dictionary& message) {
    ClientRun run = sendRequest(root_, message);
    EXPECT_EQ(run.finished.status, 0) << run.finished.err;
    return run.reply;
  }
  // The plug-in form "find" answers for the bundle at `path`.
  Dictionary formAt(const std::string& path) {
    Value reply = send(request(QVDFindRequest, {{std::string(QVDPathsKey), "file://" + path}}));
    const Dictionary* form =
        reply.dictionary() ? reply.dictionary()->get(QVDMatchesKey).dictionary() : nullptr;
    return form ? *form : Dictionary();
  }
  Uuid uuidOf(const std::string& name) {
    const Dictionary form = formAt(paths_[name]);
    const std::string* text = form.get(QVFormUUIDKey).string();
    return text ? Uuid::parse(*text).value_or(Uuid()) : Uuid();
  }
  Dictionary annotationsOf(const std::string& name) {
    const Dictionary form = formAt(paths_[name]);
    const Dictionary* annotations = form.get(QVAnnotationsFormKey).dictionary();
    return annotations ? *annotations : Dictionary{{"missing", true}};
  }

  TemporaryRoot root_;
  std::map<std::string, std::string> paths_;
  std::optional<Daemon> daemon_;
};

TEST_F(AnnotationFindTest, ElectionAndExtensionSurviveARestartAndEachChangeIsPosted) {
  const Uuid alpha = uuidOf("alpha");
  ASSERT_FALSE(alpha.isNull()) << daemon_->log();
  EXPECT_EQ(annotationsOf("alpha"), Dictionary()) << "an unannotated plug-in has an empty one";

  const std::uint64_t before = postCount(root_, kChange);
  Dictionary annotation{{"election", 1}, {"extension", Dictionary{{"k", "v"}}}, {"other", 5}};
  EXPECT_EQ(
      errorOf(send(request(QVDAnnotateRequest, {{std::string(QVDUUIDKey), Array{alpha}},
                                                {std::string(QVDAnnotationsKey), annotation}}))),
      kSuccess);
  EXPECT_EQ(postCount(root_, kChange), before + 1);

  restart();
  EXPECT_EQ(annotationsOf("alpha"),
            (Dictionary{{"election", 1}, {"extension", Dictionary{{"k", "v"}}}}))
      << "entries other than election and extension are dropped";
  EXPECT_EQ(annotationsOf("beta"), Dictionary());
}

TEST_F(AnnotationFindTest, AnnotateRefusalsChangeNothingAndPostNothing) {
  const Uuid alpha = uuidOf("alpha");
  const std::uint64_t before = postCount(root_, kChange);
  struct Case {
    Dictionary keys;
    std::pair<std::uint64_t, std::string> error;
  };
  const std::vector<Case> cases = {
      {{{std::string(QVDUUIDKey), Array{alpha}}, {std::string(QVDAnnotationsKey), "x"}},
       {4, "invalid request format (bad annotations dictionary)"}},
      {{{std::string(QVDUUIDKey), Array{alpha}},
        {std::string(QVDAnnotationsKey), Dictionary{{"election", "1"}}}},
       {4, "invalid request format (annotation election)"}},
      {{{std::string(QVDUUIDKey), Array{alpha}},
        {std::string(QVDAnnotationsKey), Dictionary{{"election", 1}, {"extension", 3}}}},
       {4, "invalid request format (annotation extension)"}},
      // Nothing to apply: success, and the (bad) plug-in list is never read.
      {{{std::string(QVDUUIDKey), "not a list"},
        {std::string(QVDAnnotationsKey), Dictionary{{"other", 1}}}},
       kSuccess},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(errorOf(send(request(QVDAnnotateRequest, c.keys))), c.error)
        << Value(c.keys).description();
  }
  EXPECT_EQ(postCount(root_, kChange), before);
  EXPECT_EQ(annotationsOf("alpha"), Dictionary());
}

TEST_F(AnnotationFindTest, AnUnknownUuidStopsTheListButKeepsEarlierChanges) {
  const Uuid alpha = uuidOf("alpha");
  const Uuid gamma = uuidOf("gamma");
  const std::uint64_t before = postCount(root_, kChange);
  Value reply = send(
      request(QVDAnnotateRequest, {{std::string(QVDUUIDKey), Array{alpha, Uuid::generate(), gamma}},
                                   {std::string(QVDAnnotationsKey), Dictionary{{"election", 1}}}}));
  EXPECT_EQ(errorOf(reply),
            (std::pair<std::uint64_t, std::string>{4, "no such plugin (uuid not found)"}));
  EXPECT_EQ(postCount(root_, kChange), before);
  EXPECT_EQ(annotationsOf("alpha"), (Dictionary{{"election", 1}}));
  EXPECT_EQ(annotationsOf("gamma"), Dictionary());
}

TEST_F(AnnotationFindTest, BulkReplacesExtensionWholeAndKeepsElection) {
  const Uuid alpha = uuidOf("alpha");
  const Uuid beta = uuidOf("beta");
  ASSERT_EQ(
      errorOf(send(request(
          QVDAnnotateRequest,
          {{std::string(QVDUUIDKey), Array{alpha}},
           {std::string(QVDAnnotationsKey),
            Dictionary{{"election", 1}, {"extension", Dictionary{{"old", 1}, {"keep", 2}}}}}}))),
      kSuccess);
  std::uint64_t before = postCount(root_, kChange);
  const Dictionary bulk{{alpha.toString(), Dictionary{{"new", 3}}},
                        {beta.toString(), Dictionary{{"b", true}}}};
  EXPECT_EQ(
      errorOf(send(request(QVDBulkAnnotateRequest, {{std::string(QVDAnnotationsKey), bulk}}))),
      kSuccess);
  EXPECT_EQ(postCount(root_, kChange), before + 1);
  EXPECT_EQ(annotationsOf("alpha"),
            (Dictionary{{"election", 1}, {"extension", Dictionary{{"new", 3}}}}));
  EXPECT_EQ(annotationsOf("beta"), (Dictionary{{"extension", Dictionary{{"b", true}}}}));

  // An empty bulk still posts; each refusal posts nothing.
  before = postCount(root_, kChange);
  EXPECT_EQ(errorOf(send(
                request(QVDBulkAnnotateRequest, {{std::string(QVDAnnotationsKey), Dictionary()}}))),
            kSuccess);
  EXPECT_EQ(postCount(root_, kChange), before + 1);
  const std::vector<std::pair<Value, std::pair<std::uint64_t, std::string>>> refusals = {
      {Value("x"), {4, "invalid request format (bad annotations dictionary)"}},
      {Dictionary{{alpha.toString(), 1}}, {18, "annotations values must be dictionaries"}},
      {Dictionary{{"not-a-uuid", Dictionary()}}, {18, "invalid plug-in UUID value"}},
      {Dictionary{{Uuid::generate().toString(), Dictionary()}},
       {2, "no plug-in with the requested uuid"}},
  };
  for (const auto& [annotations, error] : refusals) {
    EXPECT_EQ(errorOf(send(request(QVDBulkAnnotateRequest,
                                   {{std::string(QVDAnnotationsKey), annotations}}))),
              error)
        << annotations.description();
  }
  EXPECT_EQ(postCount(root_, kChange), before + 1);
}

// (Which stored elections a build overrides is shown on the database alone.)
TEST_F(AnnotationFindTest, AutoElectionIsWrittenToTheFileWhenTheRecordIsBuilt) {
  EXPECT_EQ(readVmapFile(annotationFile()).dictionary(), nullptr) << "nothing built yet";
  ASSERT_FALSE(uuidOf("auto").isNull());
  const Value file = readVmapFile(annotationFile());
  ASSERT_NE(file.dictionary(), nullptr);
  EXPECT_EQ(file.dictionary()->get("data").dictionary()->get("com.example.auto"),
            Value(Dictionary{{"election", 1}}));
}

TEST_F(AnnotationFindTest, FindByPathOrUuidWithWireTypesAndVersions) {
  const Uuid alpha = uuidOf("alpha");
  const Uuid beta = uuidOf("beta");
  auto identifierFound = [&](Dictionary keys) -> std::string {
    Value reply = send(request(QVDFindRequest, std::move(keys)));
    const Dictionary* body = reply.dictionary();
    if (body == nullptr) return "no reply";
    if (const Dictionary* form = body->get(QVDMatchesKey).dictionary()) {
      const std::string* identifier = form->get(QVFormIdentifierKey).string();
      return identifier ? *identifier : "no identifier";
    }
    auto [code, message] = errorOf(reply);
    return code ? std::to_string(code) + " " + message : "no matches";
  };
  const std::string path = std::string(QVDPathsKey);
  const std::string uuids = std::string(QVDUUIDKey);
  const std::string notFound = "15 Cannot locate PlugIn";
  EXPECT_EQ(identifierFound({{uuids, alpha}}), "com.example.alpha");
  EXPECT_EQ(identifierFound({{uuids, alpha}, {path, "file://" + paths_["beta"]}}),
            "com.example.beta")
      << "a usable path decides over the UUID";
  EXPECT_EQ(identifierFound({{uuids, alpha}, {path, "file://" + root_.path() + "/nothing.ovx"}}),
            notFound);
  EXPECT_EQ(identifierFound({{uuids, alpha}, {path, 7}}), "com.example.alpha")
      << "a path of the wrong type is absent";
  EXPECT_EQ(identifierFound({{uuids, alpha.toString()}}), notFound)
      << "a UUID sent as text is absent";
  EXPECT_EQ(identifierFound({{uuids, Uuid::generate()}}), notFound);
  EXPECT_EQ(identifierFound({}), notFound);
  EXPECT_EQ(identifierFound({{uuids, beta}, {std::string(QVDVersionKey), 2}}), "no matches")
      << "a version-2 request succeeds without a form";
}

TEST_F(AnnotationFindTest, QvctlToursAnnotateBulkAndFind) {
  const std::string alpha = uuidOf("alpha").toString();
  Finished annotated = runQvctl(root_, {"annotate", alpha, "--election", "1"});
  EXPECT_EQ(annotated.status, 0) << annotated.err;
  Finished bulk = runQvctl(
      root_, {"bulk-annotate", "--annotations", "{\"" + alpha + "\": {\"color\": \"red\"}}"});
  EXPECT_EQ(bulk.status, 0) << bulk.err;
  Finished found = runQvctl(root_, {"find", paths_["alpha"]});
  EXPECT_EQ(found.status, 0) << found.err;
  for (const std::string& shown :
       {std::string("com.example.alpha"), alpha, std::string("election"), std::string("red")}) {
    EXPECT_NE(found.out.find(shown), std::string::npos) << shown << " in\n" << found.out;
  }
  Finished missing = runQvctl(root_, {"find", Uuid::generate().toString()});
  EXPECT_EQ(missing.status, 1);
  EXPECT_NE(missing.err.find("error 15: Cannot locate PlugIn"), std::string::npos) << missing.err;
}

}  // namespace
}  // namespace qvd::integration
