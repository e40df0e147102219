// The shared request inputs over real connections: "paths" resolved on the
// file system, and "uuids" resolved to plug-ins, by path when unknown.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "Quorvex/QVDConstants.h"
#include "platform/root/Root.h"
#include "qvd/Transaction.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;

class InputsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // "paths": each element the callback saw, as [path, resolved].
    Transaction::addRequestForTesting("paths", [](Transaction& t) {
      auto seen = std::make_shared<Array>();
      auto transaction = t.shared_from_this();
      t.processPaths([seen, transaction](const std::string& path, PathResolution resolution) {
        seen->append(Array{path, resolution == PathResolution::Resolved});
        transaction->reply().set("seen", *seen);
        return true;
      });
    });
    // "uuids": the plug-ins found, by path.
    Transaction::addRequestForTesting("uuids", [](Transaction& t) {
      Array found;
      if (t.processUuidList([&](const std::shared_ptr<const QVDPlugIn>& plugIn) {
            found.append(plugIn->path().value_or(""));
            return true;
          })) {
        t.reply().set("found", found);
        t.done();
      }
    });
    (void)testRoot();
    dir_ = platform::rootPath("inputs-" + std::to_string(::getpid()));
    std::filesystem::create_directories(dir_ + "/real");
    std::ofstream(dir_ + "/real/file") << "x";
    std::filesystem::create_symlink(dir_ + "/real", dir_ + "/link");
  }
  void TearDown() override {
    Transaction::removeRequestsForTesting();
    std::filesystem::remove_all(dir_);
  }

  Value call(Dictionary request) { return TestClient(server_).call(request).value(); }

  // Registers a valid plug-in at `path`; answers its UUID.
  Uuid registerPlugIn(const std::string& path) {
    platform::holvane::PlugInRecord record;
    record.uuid = Uuid::generate();
    record.path = path;
    record.identifier = "com.example.inputs." + std::filesystem::path(path).stem().string();
    record.dataContainer = platform::rootPath("var/containers/Data/" + record.identifier);
    record.info = Dictionary{{"XOExtension", Dictionary{{"XOExtensionProtocol", "p"},
                                                        {"XOExtensionAttributes", Dictionary{}}}}};
    server_.fakes().registry->put(record);
    return record.uuid;
  }

  TestServer server_;
  std::string dir_;
};

TEST_F(InputsTest, Paths) {
  const std::string real = std::filesystem::canonical(dir_ + "/real").string();
  struct Case {
    const char* what;
    Value paths;
    Value seen;  // none: nothing reached the callback
    ErrorReply error;
  };
  const std::vector<Case> cases = {
      {"a single text is not a list", Value(dir_), Value(), {4, "invalid request format"}},
      {"an element not text", Array{dir_, 7}, Array{Array{dir_, true}},
       {4, "invalid request format"}},
      {"relative after absolute", Array{dir_ + "/real", "rel/x"}, Array{Array{real, true}},
       {9, "absolute path required: rel/x"}},
      {"missing path handed on unresolved", Array{dir_ + "/nothing/here"},
       Array{Array{dir_ + "/nothing/here", false}}, {}},
      {"link resolved to its target", Array{dir_ + "/link/file"},
       Array{Array{real + "/file", true}}, {}},
  };
  for (const Case& c : cases) {
    Dictionary r = request("paths");
    r.set(QVDPathsKey, c.paths);
    Value reply = call(r);
    EXPECT_EQ(errorOf(reply), c.error) << c.what;
    EXPECT_EQ(reply.dictionary()->get("seen"), c.seen) << c.what;
  }
}

TEST_F(InputsTest, Uuids) {
  const Uuid unknown = Uuid::generate();
  const std::string knownPath = platform::rootPath("System/Known.ovx");
  const std::string byPathPath = platform::rootPath("System/ByPath.ovx");
  const Uuid known = registerPlugIn(knownPath);
  registerPlugIn(byPathPath);
  struct Case {
    const char* what;
    Value uuids;
    Value paths;
    Value found;
    ErrorReply error;
  };
  const std::vector<Case> cases = {
      {"one UUID, not a list", Value(known), Value(), Value(), {4, "invalid request format (uuid)"}},
      {"an element not a UUID", Array{known, known.toString()}, Value(), Value(),
       {4, "invalid request (bad uuid array)"}},
      {"unknown without paths", Array{unknown}, Value(), Value(),
       {4, "no such plugin (uuid not found)"}},
      {"known", Array{known, known}, Value(), Array{knownPath, knownPath}, {}},
      {"unknown found by its parallel path", Array{known, unknown},
       Array{knownPath, byPathPath},
       Array{knownPath, byPathPath}, {}},
      {"paths of another length are ignored", Array{known, unknown, known},
       Array{byPathPath, byPathPath}, Value(),
       {4, "no such plugin (uuid not found)"}},
  };
  for (const Case& c : cases) {
    Dictionary r = request("uuids");
    r.set(QVDUUIDKey, c.uuids);
    r.set(QVDPathsKey, c.paths);
    Value reply = call(r);
    EXPECT_EQ(errorOf(reply), c.error) << c.what;
    EXPECT_EQ(reply.dictionary()->get("found"), c.found) << c.what;
  }
}

}  // namespace
}  // namespace qvd::testing
