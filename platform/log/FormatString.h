// The format argument of the logging calls: a string literal, checked when
// the program is compiled. Keeping log formats constant means no caller can
// hand a client's text to the formatter as a format (formatMessage, for
// error texts, takes any string_view).
#pragma once

#include <cstddef>
#include <string_view>

namespace platform::log {

// Thread safety: a plain value; safe from any thread.
class FormatString {
 public:
  template <std::size_t N>
  consteval FormatString(const char (&literal)[N]) : text_(literal, N - 1) {}  // NOLINT
  std::string_view view() const { return text_; }

 private:
  std::string_view text_;
};

}  // namespace platform::log
