#include <gtest/gtest.h>

#include <set>
#include <string>

#include "qvd/QVDProbes.h"

namespace qvd::probes {
namespace {

constexpr Probe kAll[] = {Probe::ClientNew,   Probe::ClientDone,    Probe::RequestInput,
                          Probe::Request,     Probe::RequestOutput, Probe::DbLoad,
                          Probe::DiscoverRaw, Probe::PluginAdd,     Probe::PluginReady,
                          Probe::PluginRemove};

TEST(ProbesTest, TenDistinctProbesAllDisabledWhileUntraced) {
  std::set<std::string> names;
  for (Probe p : kAll) {
    names.insert(probeName(p));
    EXPECT_FALSE(isEnabled(p)) << probeName(p);
  }
  EXPECT_EQ(names.size(), static_cast<std::size_t>(kProbeCount));
  EXPECT_TRUE(names.count("request-output"));
  EXPECT_TRUE(names.count("discover-raw"));
}

TEST(ProbesTest, DescriptionsAreBuiltOnlyWhileTheProbeIsEnabled) {
  int built = 0;
  auto describe = [&] {
    ++built;
    return std::string("{reply}");
  };
  requestOutput(42, describe);
  requestInput(42, describe);
  EXPECT_EQ(built, 0);

  setEnabledForTesting(Probe::RequestOutput, true);
  requestOutput(42, describe);
  requestInput(42, describe);  // still disabled
  EXPECT_EQ(built, 1);
  setEnabledForTesting(Probe::RequestOutput, false);
  EXPECT_FALSE(isEnabled(Probe::RequestOutput));

  setEnabledForTesting(Probe::RequestInput, true);
  requestInput(42, describe);
  setEnabledForTesting(Probe::RequestInput, false);
  EXPECT_EQ(built, 2);
}

}  // namespace
}  // namespace qvd::probes
