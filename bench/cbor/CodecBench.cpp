// Decode and encode of a typical request: our codec against libcbor. The
// libcbor figures come in two forms: its own item tree (less work than ours,
// since no Value is built) and converted to/from Values (the same work).
#include <benchmark/benchmark.h>

#include <cstdio>
#include <map>
#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/oracle/LibcborOracle.h"

namespace {

using platform::Array;
using platform::Date;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
namespace cbor = platform::cbor;
namespace oracle = platform::cbor::oracle;

// A registration request as the daemon's clients send it: a name, version,
// flags, a rules dictionary and a dozen plug-in forms.
Value sampleMessage() {
  Dictionary rules;
  rules.set("matchProtocols",
            Value(Array{Value("com.example.render"), Value("com.example.export")}));
  rules.set("allowUnsigned", Value(false));
  rules.set("maxInstances", Value(8));
  rules.set("scope", Value(Dictionary{{"user", Value(501)}, {"session", Value("console")}}));
  Array forms;
  for (int i = 0; i < 12; ++i) {
    Dictionary form;
    form.set("identifier", Value("com.example.plugin.renderer" + std::to_string(i)));
    form.set("uuid",
             Value(*Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E" + std::to_string(10 + i))));
    form.set("version", Value("2.4." + std::to_string(i)));
    form.set("registered", Value(Date{1717171717.25 + i}));
    form.set("protocol", Value("com.example.render"));
    form.set("priority", Value(i * 10 - 40));
    form.set("enabled", Value(i % 3 != 0));
    forms.append(Value(std::move(form)));
  }
  Dictionary message;
  message.set("request", Value("registerPlugins"));
  message.set("version", Value(3));
  message.set("flags", Value(0x15));
  message.set("rules", Value(std::move(rules)));
  message.set("forms", Value(std::move(forms)));
  return Value(std::move(message));
}

const Value& message() {
  static const Value value = sampleMessage();
  return value;
}

const std::vector<std::uint8_t>& messageBytes() {
  static const std::vector<std::uint8_t> bytes = *cbor::encode(message());
  return bytes;
}

void setBytes(benchmark::State& state) {
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * messageBytes().size()));
}

void BM_DecodeOurs(benchmark::State& state) {
  for (auto _ : state) {
    auto value = cbor::decode(messageBytes());
    benchmark::DoNotOptimize(value);
  }
  setBytes(state);
}

void BM_DecodeLibcborTree(benchmark::State& state) {
  for (auto _ : state) {
    auto item = oracle::libcborLoad(messageBytes());
    benchmark::DoNotOptimize(item.get());
  }
  setBytes(state);
}

void BM_DecodeLibcborToValue(benchmark::State& state) {
  for (auto _ : state) {
    auto item = oracle::libcborLoad(messageBytes());
    auto value = oracle::valueFromItem(*item);
    benchmark::DoNotOptimize(value);
  }
  setBytes(state);
}

void BM_EncodeOurs(benchmark::State& state) {
  for (auto _ : state) {
    auto bytes = cbor::encode(message());
    benchmark::DoNotOptimize(bytes);
  }
  setBytes(state);
}

void BM_EncodeOursReusedBuffer(benchmark::State& state) {
  std::vector<std::uint8_t> out;
  for (auto _ : state) {
    out.clear();
    auto status = cbor::encode(message(), out);
    benchmark::DoNotOptimize(out.data());
    benchmark::DoNotOptimize(status);
  }
  setBytes(state);
}

void BM_EncodeLibcborTree(benchmark::State& state) {
  auto item = oracle::itemFromValue(message());
  std::vector<unsigned char> buffer(messageBytes().size() * 2);
  for (auto _ : state) {
    std::size_t n = cbor_serialize(item.get(), buffer.data(), buffer.size());
    benchmark::DoNotOptimize(n);
  }
  setBytes(state);
}

void BM_EncodeLibcborFromValue(benchmark::State& state) {
  for (auto _ : state) {
    auto item = oracle::itemFromValue(message());
    auto bytes = oracle::libcborSerialize(*item);
    benchmark::DoNotOptimize(bytes);
  }
  setBytes(state);
}

BENCHMARK(BM_DecodeOurs);
BENCHMARK(BM_DecodeLibcborTree);
BENCHMARK(BM_DecodeLibcborToValue);
BENCHMARK(BM_EncodeOurs);
BENCHMARK(BM_EncodeOursReusedBuffer);
BENCHMARK(BM_EncodeLibcborTree);
BENCHMARK(BM_EncodeLibcborFromValue);

// Prints the usual table, then keeps each benchmark's throughput for the
// summary of ratios.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& run : runs) {
      // With repetitions, the mean stands for the benchmark.
      if (run.run_type == Run::RT_Aggregate && run.aggregate_name != "mean") continue;
      auto it = run.counters.find("bytes_per_second");
      if (it != run.counters.end())
        megabytesPerSecond[run.run_name.function_name] = it->second.value / 1e6;
    }
    ConsoleReporter::ReportRuns(runs);
  }
  std::map<std::string, double> megabytesPerSecond;
};

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  // Sanity first: the codec and libcbor must agree on this very message.
  auto item = oracle::libcborLoad(messageBytes());
  if (!item) {
    std::fprintf(stderr, "libcbor refuses the sample message\n");
    return 1;
  }
  if (auto mismatch = oracle::itemMismatch(*item, message())) {
    std::fprintf(stderr, "libcbor reads the sample message differently: %s\n", mismatch->c_str());
    return 1;
  }
  RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  auto& mbs = reporter.megabytesPerSecond;
  auto show = [&](const char* what, const char* ours, const char* theirs) {
    if (!mbs.count(ours) || !mbs.count(theirs)) return;
    std::printf("%-34s ours %8.1f MB/s  libcbor %8.1f MB/s  ratio %.2fx\n", what, mbs[ours],
                mbs[theirs], mbs[ours] / mbs[theirs]);
  };
  std::printf("\nmessage: %zu bytes\n", messageBytes().size());
  show("decode (to Value / to Value)", "BM_DecodeOurs", "BM_DecodeLibcborToValue");
  show("decode (to Value / item tree)", "BM_DecodeOurs", "BM_DecodeLibcborTree");
  show("encode (from Value / from Value)", "BM_EncodeOurs", "BM_EncodeLibcborFromValue");
  show("encode (from Value / item tree)", "BM_EncodeOurs", "BM_EncodeLibcborTree");
  return 0;
}
