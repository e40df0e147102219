// Any bytes to the reader. Whatever it accepts must write in both forms and
// read back as an identical value; the XML writer may instead refuse cleanly
// what the XML form cannot carry.
#include <cstdio>
#include <cstdlib>
#include <limits>

#include "platform/vmap/Reader.h"
#include "platform/vmap/VmapError.h"
#include "platform/vmap/Writer.h"

namespace {

using namespace platform;
using namespace platform::vmap;

[[noreturn]] void die(const char* what, const std::string& detail) {
  std::fprintf(stderr, "fuzz_vmap: %s\n%s\n", what, detail.c_str());
  std::abort();
}

// Kind for kind, as well as ==: an Unsigned that fits int64 may return as
// an Integer from the XML form, nothing else may change kind.
bool sameKinds(const Value& a, const Value& b) {
  if (a.type() != b.type() &&
      !(a.type() == ValueType::Unsigned && b.type() == ValueType::Integer))
    return false;
  if (const Array* x = a.array()) {
    for (std::size_t i = 0; i < x->size(); ++i)
      if (!sameKinds((*x)[i], (*b.array())[i])) return false;
  } else if (const Dictionary* x = a.dictionary()) {
    for (const auto& [key, item] : *x)
      if (!sameKinds(item, b.dictionary()->get(key))) return false;
  }
  return true;
}

void checkRoundTrip(const Value& value, Format format) {
  Result<std::string> written = write(value, format);
  if (!written.ok()) {
    const Error& e = written.error();
    if (format == Format::Xml && e.is(kErrorDomain, static_cast<std::int64_t>(ErrorCode::NotRepresentable)))
      return;
    die("writing an accepted value failed", e.description() + "\n" + value.description());
  }
  ReadLimits generous;
  generous.maxBytes = std::numeric_limits<std::size_t>::max();
  Result<Value> back = read({reinterpret_cast<const std::uint8_t*>(written->data()), written->size()},
                            generous);
  if (!back.ok()) die("reading what was written failed", back.error().description() + "\n" + *written);
  if (!(*back == value) || !sameKinds(value, *back))
    die("the value changed", value.description() + "\n" + back->description());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  Result<Value> value = read({data, size});
  if (!value.ok()) {
    if (value.error().domain() != kErrorDomain) die("an error outside the vmap domain", value.error().description());
    return 0;
  }
  checkRoundTrip(*value, Format::Binary);
  checkRoundTrip(*value, Format::Xml);
  return 0;
}
