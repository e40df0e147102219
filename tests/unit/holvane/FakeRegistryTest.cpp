// The in-memory registry behaves as the real one where callers can tell:
// generations, observers, narrowing and filtering.
#include <gtest/gtest.h>

#include "platform/holvane/RegistryError.h"
#include "platform/holvane/testing/FakeRegistry.h"

namespace platform::holvane {
namespace {

PlugInRecord record(const std::string& path, const std::string& point) {
  PlugInRecord r;
  r.uuid = Uuid::generate();
  r.path = path;
  r.identifier = r.originalIdentifier = "id" + path;
  r.extensionPointName = point;
  return r;
}

TEST(FakeRegistryTest, ActsLikeTheRegistry) {
  FakeRegistry fake;
  std::vector<std::string> events;
  fake.addInstallObserver([&](const PlugInRecord& r) { events.push_back("+" + r.path); });
  fake.addUninstallObserver([&](const PlugInRecord& r) {
    events.push_back("-" + r.path + (fake.plugInByPath(r.path)->has_value() ? " stored" : ""));
  });
  const Uuid start = fake.generation();
  fake.put(record("/a", "p"));
  fake.put(record("/b", "q"));
  EXPECT_NE(fake.generation(), start);

  int asked = 0;
  Result<std::vector<PlugInRecord>> ofP = fake.queryPlugIns(std::string("p"), [&](const PlugInRecord&) {
    ++asked;
    return FilterVerdict::Keep;
  });
  ASSERT_TRUE(ofP.ok());
  ASSERT_EQ(ofP->size(), 1u);
  EXPECT_EQ(asked, 1);

  const Uuid before = fake.generation();
  ASSERT_TRUE(fake.unregisterPlugIn("/a").ok());
  EXPECT_NE(fake.generation(), before);
  EXPECT_TRUE(isRegistryError(fake.unregisterPlugIn("/a").error(), RegistryErrorCode::NotFound));
  ASSERT_TRUE(fake.registerPlugIn("/a").ok());
  EXPECT_FALSE(fake.registerPlugIn("/never").ok());
  EXPECT_EQ(events, (std::vector<std::string>{"+/a", "+/b", "-/a stored", "+/a"}));

  fake.failQueries(Error("test", 1, "down"));
  EXPECT_FALSE(fake.plugInByPath("/a").ok());
  EXPECT_FALSE(fake.queryPlugIns(std::nullopt, nullptr).ok());
}

}  // namespace
}  // namespace platform::holvane
