// What a log call costs: disabled (the common case for debug), formatting
// alone, and a whole line written to /dev/null.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <string>

#include "platform/log/Format.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/log/internal/Output.h"
#include "platform/values/Value.h"

namespace {

using platform::log::LoggerRegistry;

const platform::log::Logger& opsLogger() {
  static const platform::log::Logger& l =
      *LoggerRegistry::shared().logger("com.corvane.Quorvex", "ops").value();
  return l;
}

void BM_DisabledLevel(benchmark::State& state) {
  LoggerRegistry::shared().applyFilterForTesting("default");
  const std::string path = "/var/db/quorvex/extensions.vmap";
  for (auto _ : state) {
    opsLogger().debug("loaded %{public}s: %d entries, %f s", path, 42, 0.25);
  }
}
BENCHMARK(BM_DisabledLevel);

void BM_FormatMessage(benchmark::State& state) {
  const std::string path = "/var/db/quorvex/extensions.vmap";
  const platform::Value id("com.example.provider");
  for (auto _ : state) {
    benchmark::DoNotOptimize(platform::log::formatMessage(
        platform::log::Redaction::On, "loaded %{public}s: %d entries, %.3f s, first %@", path, 42,
        0.25, id));
  }
}
BENCHMARK(BM_FormatMessage);

void BM_EnabledLineToDevNull(benchmark::State& state) {
  int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
  int previous = platform::log::internal::Output::shared().setDescriptorForTesting(null);
  const std::string path = "/var/db/quorvex/extensions.vmap";
  for (auto _ : state) {
    opsLogger().error("loaded %{public}s: %d entries, %f s", path, 42, 0.25);
  }
  platform::log::internal::Output::shared().setDescriptorForTesting(previous);
  close(null);
}
BENCHMARK(BM_EnabledLineToDevNull);

}  // namespace

BENCHMARK_MAIN();
