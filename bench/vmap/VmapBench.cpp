// Reading and writing a plug-in manifest in both forms, beside a bare expat
// parse of the same text with empty handlers: the cost of building values
// and checking the document is the gap between the two.
#include <benchmark/benchmark.h>
#include <expat.h>

#include <cstdio>
#include <map>
#include <string>

#include "bench/vmap/Manifest.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace platform::vmap::bench {
namespace {

std::span<const std::uint8_t> bytesOf(std::string_view s) {
  return {reinterpret_cast<const std::uint8_t*>(s.data()), s.size()};
}

const Value& manifest() {
  static const Value value = *read(bytesOf(kManifestXml));
  return value;
}

const std::string& manifestBinary() {
  static const std::string bytes = *write(manifest(), Format::Binary);
  return bytes;
}

void count(benchmark::State& state, std::size_t bytesPerDocument) {
  state.SetBytesProcessed(static_cast<std::int64_t>(state.iterations() * bytesPerDocument));
  state.SetItemsProcessed(static_cast<std::int64_t>(state.iterations()));  // documents
}

void BM_ReadXml(benchmark::State& state) {
  for (auto _ : state) {
    Result<Value> v = read(bytesOf(kManifestXml));
    if (!v.ok()) state.SkipWithError(v.error().description().c_str());
    benchmark::DoNotOptimize(v);
  }
  count(state, kManifestXml.size());
}

void BM_ReadBinary(benchmark::State& state) {
  const std::string& bytes = manifestBinary();
  for (auto _ : state) {
    Result<Value> v = read(bytesOf(bytes));
    if (!v.ok()) state.SkipWithError(v.error().description().c_str());
    benchmark::DoNotOptimize(v);
  }
  count(state, bytes.size());
}

void BM_WriteXml(benchmark::State& state) {
  std::size_t size = 0;
  for (auto _ : state) {
    Result<std::string> text = write(manifest(), Format::Xml);
    size = text->size();
    benchmark::DoNotOptimize(text);
  }
  count(state, size);
}

void BM_WriteBinary(benchmark::State& state) {
  std::size_t size = 0;
  for (auto _ : state) {
    Result<std::string> bytes = write(manifest(), Format::Binary);
    size = bytes->size();
    benchmark::DoNotOptimize(bytes);
  }
  count(state, size);
}

void XMLCALL ignoreStart(void*, const XML_Char*, const XML_Char**) {}
void XMLCALL ignoreEnd(void*, const XML_Char*) {}
void XMLCALL ignoreText(void*, const XML_Char*, int) {}

// The floor: expat alone, reporting every event to handlers that do nothing.
void BM_ExpatOnly(benchmark::State& state) {
  for (auto _ : state) {
    XML_Parser parser = XML_ParserCreate("UTF-8");
    XML_SetElementHandler(parser, ignoreStart, ignoreEnd);
    XML_SetCharacterDataHandler(parser, ignoreText);
    const auto status = XML_Parse(parser, kManifestXml.data(), static_cast<int>(kManifestXml.size()), 1);
    if (status != XML_STATUS_OK) state.SkipWithError("expat refused the manifest");
    XML_ParserFree(parser);
  }
  count(state, kManifestXml.size());
}

BENCHMARK(BM_ReadXml);
BENCHMARK(BM_ReadBinary);
BENCHMARK(BM_WriteXml);
BENCHMARK(BM_WriteBinary);
BENCHMARK(BM_ExpatOnly);

// Prints the usual table, then how our XML read compares with bare expat.
class RatioReporter : public benchmark::ConsoleReporter {
 public:
  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& run : runs)
      if (run.run_type == Run::RT_Iteration) nanos_[run.benchmark_name()] = run.GetAdjustedRealTime();
    ConsoleReporter::ReportRuns(runs);
  }

  void printRatio() const {
    const auto ours = nanos_.find("BM_ReadXml");
    const auto floor = nanos_.find("BM_ExpatOnly");
    if (ours == nanos_.end() || floor == nanos_.end() || floor->second <= 0) return;
    std::printf("XML read / bare expat parse: %.2fx the time (%zu-byte manifest)\n",
                ours->second / floor->second, kManifestXml.size());
  }

 private:
  std::map<std::string, double> nanos_;
};

}  // namespace
}  // namespace platform::vmap::bench

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  platform::vmap::bench::RatioReporter reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  reporter.printRatio();
  benchmark::Shutdown();
  return 0;
}
