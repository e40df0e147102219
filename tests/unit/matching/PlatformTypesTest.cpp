// The types layer on its own: declarations read from disk (limits, bad
// files, duplicates, cycles) and activation rules at their edges.
#include <gtest/gtest.h>
#include <stdlib.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <limits>
#include <vector>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/types/ActivationRule.h"
#include "platform/types/LinuxTypeRegistry.h"
#include "platform/vmap/Writer.h"

namespace types_test {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using namespace platform::types;

Dictionary declaration(const std::string& identifier, Array conformsTo) {
  return Dictionary{{"identifier", identifier}, {"conformsTo", std::move(conformsTo)}};
}

class TypeDeclarationsOnDisk : public ::testing::Test {
 protected:
  void SetUp() override {
    char pattern[] = "/tmp/qvd-types-XXXXXX";
    directory_ = ::mkdtemp(pattern);
  }
  void TearDown() override { std::filesystem::remove_all(directory_); }

  void write(const std::string& name, const Value& document) const {
    std::ofstream(directory_ + "/" + name)
        << platform::vmap::write(document, platform::vmap::Format::Xml).value();
  }
  std::size_t skipped(const platform::log::LogCaptureForTesting& capture) const {
    std::size_t n = 0;
    for (const auto& line : capture.lines()) {
      n += line.category == "types" && line.message.starts_with("type declarations");
    }
    return n;
  }

  std::string directory_;
};

TEST_F(TypeDeclarationsOnDisk, GoodFilesCountBadOnesAreSkippedWhole) {
  write("10-base.vmap", Value(Array{declaration("com.example.parent", {}),
                                    declaration("com.example.child", {"com.example.parent"})}));
  write("20-more.vmap",
        Value(Array{declaration("com.example.loop-a", {"com.example.loop-b"}),
                    declaration("com.example.loop-b", {"com.example.loop-a", "com.example.child"}),
                    // Already declared: the first declaration stands.
                    declaration("com.example.child", {"com.example.loop-a"})}));
  // One bad declaration poisons its whole file.
  write("30-bad.vmap", Value(Array{declaration("com.example.bad", {}),
                                   declaration("com.example.worse", {"", "x"})}));
  write("40-dict.vmap", Value(Dictionary{{"identifier", "com.example.dict"}}));
  write("50-long.vmap", Value(Array{declaration("com.example.long", Array{"a", "b", "c"})}));
  write("60-text.vmap", Value("not a document at all"));
  std::ofstream(directory_ + "/70-garbage.vmap") << "<vmap";
  write(".hidden.vmap", Value(Array{declaration("com.example.hidden", {})}));
  write("80-other.txt", Value(Array{declaration("com.example.txt", {})}));

  platform::log::LogCaptureForTesting capture;
  TypeRegistryLimits limits;
  limits.declarations.maxConformsTo = 2;
  const LinuxTypeRegistry registry(directory_, limits);
  EXPECT_EQ(registry.typeCount(), 4u);
  EXPECT_EQ(skipped(capture), 5u);
  struct Case {
    const char* type;
    const char* other;
    bool conforms;
  };
  const std::vector<Case> cases = {
      {"com.example.child", "com.example.parent", true},
      {"com.example.child", "com.example.loop-a", false},
      {"com.example.loop-a", "com.example.parent", true},
      {"com.example.loop-a", "com.example.loop-a", true},
      // A cycle neither loops nor invents conformances.
      {"com.example.loop-b", "com.example.undeclared", false},
      {"com.example.parent", "com.example.child", false},
      {"com.example.bad", "com.example.bad", true},  // equal, though never declared
      {"com.example.hidden", "com.example.parent", false},
      {"", "", false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(registry.conformsTo(c.type, c.other), c.conforms) << c.type << " " << c.other;
  }
}

TEST_F(TypeDeclarationsOnDisk, LimitsOnFilesAndTypes) {
  for (int i = 0; i < 4; ++i) {
    write("t" + std::to_string(i) + ".vmap",
          Value(Array{declaration("com.example.t" + std::to_string(i) + "a", {}),
                      declaration("com.example.t" + std::to_string(i) + "b", {})}));
  }
  platform::log::LogCaptureForTesting capture;
  TypeRegistryLimits limits;
  limits.maxFiles = 3;
  limits.maxTypes = 5;
  const LinuxTypeRegistry registry(directory_, limits);
  // t0 and t1 fit; t2 would pass five types; t3 lies past three files.
  EXPECT_EQ(registry.typeCount(), 4u);
  EXPECT_TRUE(registry.conformsTo("com.example.t1b", "com.example.t1b"));
  EXPECT_EQ(skipped(capture), 1u);

  limits = {};
  limits.declarations.maxDeclarations = 1;
  EXPECT_EQ(LinuxTypeRegistry(directory_, limits).typeCount(), 0u);
  limits = {};
  limits.file.maxBytes = 64;
  EXPECT_EQ(LinuxTypeRegistry(directory_, limits).typeCount(), 0u);
  EXPECT_EQ(LinuxTypeRegistry(directory_ + "/missing").typeCount(), 0u);
}

TEST(ActivationRule, Edges) {
  const double nan = std::numeric_limits<double>::quiet_NaN();
  struct Case {
    Value rule;
    Dictionary items;
    bool accepted;
  };
  const std::vector<Case> cases = {
      {Dictionary{{"k", 2.5}}, {{"k", 2}}, true},
      {Dictionary{{"k", 2.5}}, {{"k", 3}}, false},
      {Dictionary{{"k", -1}}, {{"k", 1}}, false},
      {Dictionary{{"k", false}}, {{"k", 1}}, false},
      {Dictionary{{"k", nan}}, {{"k", 1}}, false},
      {Dictionary{{"k", "5"}}, {{"k", 1}}, false},
      {Dictionary{{"k", std::numeric_limits<std::uint64_t>::max()}},
       {{"k", std::numeric_limits<std::uint64_t>::max()}},
       true},
      {Dictionary{{"k", true}}, {{"k", -1}}, false},
      {Dictionary{{"k", true}}, {{"k", true}}, false},
      {Dictionary{{"k", true}}, {{"k", 1.0}}, false},
      {Dictionary{}, {{"k", 0}}, true},
      {Array{Dictionary{{"k", true}}}, {{"k", 1}}, false},
      {Value("TRUEPREDICATE"), {}, false},
      {Value(), {}, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(evaluateActivationRule(c.rule, c.items), c.accepted)
        << c.rule.description() << " " << Value(c.items).description();
  }
}

}  // namespace
}  // namespace types_test
