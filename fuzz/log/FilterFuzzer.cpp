// Feeds arbitrary text to the QV_LOG parser and checks what it promises:
// bounded problem reports and a filter that answers for any names.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "platform/log/Filter.h"

using platform::log::Filter;
using platform::log::Threshold;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::string_view text(reinterpret_cast<const char*>(data), size);
  Filter::Parsed parsed = Filter::parse(text);
  // One report per entry at most, plus one each for the two limits.
  if (parsed.problems.size() > Filter::kMaxEntries + 2) std::abort();
  for (const std::string& problem : parsed.problems) {
    if (problem.size() > 200) std::abort();
  }
  // Ask about names taken from the input itself, so rules can match.
  std::string_view first = text.substr(0, text.find(','));
  std::size_t colon = first.find(':');
  std::string_view subsystem = colon == std::string_view::npos ? "s" : first.substr(0, colon);
  std::string_view category = first.substr(colon == std::string_view::npos ? 0 : colon + 1);
  category = category.substr(0, category.find('='));
  for (Threshold t : {parsed.filter.thresholdFor(subsystem, category),
                      parsed.filter.thresholdFor("", ""), parsed.filter.globalThreshold()}) {
    if (static_cast<int>(t) > static_cast<int>(Threshold::Off)) std::abort();
  }
  // Parsing is a pure function of the text.
  if (Filter::parse(text).problems != parsed.problems) std::abort();
  return 0;
}
