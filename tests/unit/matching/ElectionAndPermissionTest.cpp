// What needs a running server: the user's election as a rule reads it, a
// host's permission (its entitlements come through its connection), and
// the global exclusions as the preferences hold them now.
#include <filesystem>
#include <fstream>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "platform/prefs/LinuxPreferenceStore.h"
#include "platform/vmap/Writer.h"
#include "qvd/QVDUserPrefs.h"
#include "tests/unit/matching/MatchingTestSupport.h"

namespace matching_test {
namespace {

using qvd::testing::TestClient;
using qvd::testing::TestServer;

class ServedMatchingTest : public MatchingTest {
 protected:
  std::shared_ptr<QVDPlugIn> served(const PlugInRecord& record) {
    server_.fakes().registry->put(record);
    std::shared_ptr<QVDPlugIn> plugIn = server_.server()->findPlugIn(record.uuid);
    EXPECT_NE(plugIn, nullptr) << record.path;
    return plugIn;
  }
  // The connection's client object, once a request has gone through.
  std::shared_ptr<qvd::QVDMbxClient> connect() {
    client_ = std::make_unique<TestClient>(server_);
    EXPECT_TRUE(client_->call(qvd::testing::request("nope")).ok());
    return server_.clients().back();
  }
  void grant(Dictionary entitlements) {
    server_.fakes().entitlements->setExecutableEntitlements(self_, std::move(entitlements));
  }

  const std::string self_ = std::filesystem::canonical("/proc/self/exe").string();
  TestServer server_;
  std::unique_ptr<TestClient> client_;
};

TEST_F(ServedMatchingTest, ElectionRulesReadTheAnnotationStore) {
  // {stored election (none: no annotation), the text a rule compares}.
  const std::vector<std::pair<Value, std::string>> cases = {
      {Value(), "0"}, {Value(1), "1"}, {Value(0), "0"}, {Value(255), "255"},
      // Bits 8 to 15 are cleared, the others kept.
      {Value(257), "1"}, {Value(-1), "-65281"}, {Value(0x10203), "65539"},
  };
  int serial = 0;
  for (const auto& [election, text] : cases) {
    const auto p = served(plugInRecord("elect" + std::to_string(++serial)));
    if (!election.isNone()) {
      server_.server()->setAnnotationForPlugIn(
          Dictionary{{std::string(QVAnnotationElectionKey), election}}, *p);
    }
    EXPECT_TRUE(p->match(Dictionary{{"XOUserElection", text}})) << election.description();
    EXPECT_FALSE(p->match(Dictionary{{"XOUserElection", "<>" + text}})) << election.description();
  }
}

TEST_F(ServedMatchingTest, HostPermission) {
  const std::string restriction(QVAllowedPlugInsEntitlement);
  const std::string kDenied = "the host's plug-in entitlement does not allow this plug-in";
  const std::string kInvalid = "invalid host restriction entitlement";
  const std::string kNoFlag = "the host does not have the \"com.example.host-flag\" entitlement";
  const auto a = served(plugInRecord("a"));
  PlugInRecord demanding = plugInRecord("b");
  demanding.info.set("XOExtension",
                     Dictionary{{"XOExtensionProtocol", "com.example.proto"},
                                {"XOExtensionAttributes", Dictionary{{"XOExtensionVersion", "1"}}},
                                {"XOExtensionHostEntitlement", "com.example.host-flag"}});
  const auto b = served(demanding);
  const auto client = connect();
  struct Case {
    Dictionary entitlements;
    std::optional<std::string> forA, forB;
  };
  const Dictionary onlyA{{"XOExtensionIdentifier", Array{"com.example.a"}}};
  const std::vector<Case> cases = {
      {{}, std::nullopt, kNoFlag},
      {{{"com.example.host-flag", true}}, std::nullopt, std::nullopt},
      {{{"com.example.host-flag", false}}, std::nullopt, kNoFlag},
      {{{restriction, Array{onlyA}}}, kInvalid, kInvalid},
      {{{restriction, Dictionary{}}, {"com.example.host-flag", 1}}, std::nullopt, std::nullopt},
      {{{restriction, onlyA}, {"com.example.host-flag", true}}, std::nullopt, kDenied},
      // Failing both, a host hears about its own restriction first.
      {{{restriction, onlyA}}, std::nullopt, kDenied},
  };
  for (const Case& c : cases) {
    grant(c.entitlements);
    EXPECT_EQ(a->allowForClient(*client), c.forA) << Value(c.entitlements).description();
    EXPECT_EQ(b->allowForClient(*client), c.forB) << Value(c.entitlements).description();
  }
}

TEST_F(ServedMatchingTest, ExclusionRuleSetsIgnoreWhatIsNoRuleSet) {
  const auto& prefs = server_.server()->userPrefs();
  const auto setExclusions = [&](Value value) {
    server_.fakes().preferences->setValue(QVPreferenceDomain, QVExclusionsPreferenceKey,
                                          std::move(value));
  };
  EXPECT_TRUE(prefs.exclusionRuleSets().empty()) << "unset";
  const Dictionary banA{{"XOExtensionIdentifier", "com.example.a"}};
  setExclusions(Array{banA, "com.example.b", 3});
  EXPECT_EQ(prefs.exclusionRuleSets(), std::vector<Dictionary>{banA});
  std::size_t lines = 0;
  for (const std::string& message : capture_->messages()) lines += message.starts_with("exclusions");
  EXPECT_EQ(lines, 1u) << "one line per call";
  EXPECT_TRUE(logged("exclusions ignored: 2 entries that are not rule sets: " +
                         Value(Array{"com.example.b", 3}).description(),
                     Level::Debug, "ops"));
  capture_->clear();
  setExclusions(banA);
  EXPECT_TRUE(prefs.exclusionRuleSets().empty()) << "a lone rule set is not a list";
  EXPECT_TRUE(logged("exclusions ignored: a dictionary, not a list of rule sets", Level::Debug,
                     "ops"));
}

// The Linux store looks at its file at every question; two writes within one
// tick of the file clock must still be told apart.
TEST(UserPrefsOnDisk, ChangedExclusionsApplyAtTheNextCall) {
  char pattern[] = "/tmp/qvd-prefs-XXXXXX";
  const std::string directory = ::mkdtemp(pattern);
  const std::string file = directory + "/" + std::string(QVPreferenceDomain) + ".vmap";
  const auto write = [&](const std::string& identifier) {
    const Dictionary document{{std::string(QVExclusionsPreferenceKey),
                               Array{Dictionary{{"XOExtensionIdentifier", identifier}}}}};
    std::ofstream(file, std::ios::trunc)
        << platform::vmap::write(Value(document), platform::vmap::Format::Xml).value();
  };
  const qvd::QVDUserPrefs prefs(std::make_shared<platform::prefs::LinuxPreferenceStore>(directory));
  EXPECT_TRUE(prefs.exclusions().isNone());
  const std::vector<std::string> identifiers = {"com.example.a", "com.example.b", "com.example.cc"};
  for (const std::string& identifier : identifiers) {
    write(identifier);
    const std::vector<Dictionary> ruleSets = prefs.exclusionRuleSets();
    ASSERT_EQ(ruleSets.size(), 1u);
    EXPECT_EQ(ruleSets[0].get("XOExtensionIdentifier"), Value(identifier));
  }
  std::filesystem::remove(file);
  EXPECT_TRUE(prefs.exclusions().isNone()) << "removed";
  std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace matching_test
