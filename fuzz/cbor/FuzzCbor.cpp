// Differential fuzzing of the CBOR decoder against libcbor, plus the
// decode -> encode -> decode round trip of everything we accept.
#include <cstdio>
#include <cstdlib>
#include <span>
#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/oracle/IdenticalValues.h"
#include "tests/unit/cbor/oracle/LibcborOracle.h"

namespace {

namespace cbor = platform::cbor;
namespace oracle = platform::cbor::oracle;

[[noreturn]] void finding(const char* what, const std::string& detail = {}) {
  std::fprintf(stderr, "fuzz_cbor finding: %s %s\n", what, detail.c_str());
  std::abort();
}

}  // namespace

// libcbor sizes some allocations from declared lengths before it sees that
// the input is too short for them (only on inputs we refuse). Such requests
// get null, which libcbor reports as a memory error, instead of gigabytes.
extern "C" const char* __asan_default_options() {
  return "allocator_may_return_null=1:max_allocation_size_mb=64";
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::span<const std::uint8_t> input(data, size);
  auto ours = cbor::decode(input);
  if (!ours.ok()) {
    const platform::Error& error = ours.error();
    auto code = cbor::errorCodeOf(error);
    auto offset = cbor::errorOffsetOf(error);
    if (!code || !offset || *offset > size || !error.localizedDescription())
      finding("malformed error", error.description());
    // Faults of well-formedness (not of our stricter mapping) are faults
    // for any decoder.
    if ((*code == cbor::ErrorCode::kTruncated || *code == cbor::ErrorCode::kMalformedHead) &&
        oracle::libcborLoad(input))
      finding("libcbor accepts what we call ill-formed:", error.description());
    return 0;
  }
  auto theirs = oracle::libcborLoad(input);
  if (!theirs) finding("libcbor refuses what we accept");
  if (auto mismatch = oracle::itemMismatch(*theirs, *ours))
    finding("libcbor reads it differently:", *mismatch);

  auto encoded = cbor::encode(*ours);
  if (!encoded.ok()) finding("cannot encode what we decoded:", encoded.error().description());
  auto again = cbor::decode(*encoded);
  if (!again.ok()) finding("cannot decode our own encoding:", again.error().description());
  if (auto difference = oracle::firstDifference(*ours, *again))
    finding("round trip changed the value:", *difference);
  // Our encoding is canonical: encoding what it decodes to gives it back.
  auto reencoded = cbor::encode(*again);
  if (!reencoded.ok() || *reencoded != *encoded) finding("encoding is not a fixed point");
  return 0;
}
