#include "platform/vmap/internal/ScalarText.h"

#include <charconv>
#include <cmath>
#include <cstdint>
#include <limits>

#include "platform/values/DateText.h"

namespace platform::vmap::internal {
namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

// Digits at the front of `text`, consumed; returns how many.
std::size_t skipDigits(std::string_view& text) {
  std::size_t n = 0;
  while (n < text.size() && isDigit(text[n])) ++n;
  text.remove_prefix(n);
  return n;
}

// Long enough for any double's shortest fraction (the smallest subnormal
// takes 340 places), short enough to bound the work.
constexpr std::size_t kMaxFractionDigits = 400;

// The first and last whole seconds of the years 0000-9999.
constexpr double kFirstSecond = -62167219200.0;
constexpr double kLastSecond = 253402300799.0;

}  // namespace

std::optional<Value> parseInteger(std::string_view text, std::string& why) {
  bool negative = false;
  if (!text.empty() && (text.front() == '-' || text.front() == '+')) {
    negative = text.front() == '-';
    text.remove_prefix(1);
  }
  std::string_view digits = text;
  if (skipDigits(text) == 0 || !text.empty()) {
    why = "not a decimal integer";
    return std::nullopt;
  }
  std::uint64_t magnitude = 0;
  auto [end, ec] = std::from_chars(digits.data(), digits.data() + digits.size(), magnitude);
  if (ec != std::errc() || end != digits.data() + digits.size()) {
    why = "out of the 64-bit range";
    return std::nullopt;
  }
  constexpr std::uint64_t kMaxSigned = std::numeric_limits<std::int64_t>::max();
  if (!negative) {
    if (magnitude <= kMaxSigned) return Value(static_cast<std::int64_t>(magnitude));
    return Value(magnitude);
  }
  if (magnitude > kMaxSigned + 1) {
    why = "out of the 64-bit range";
    return std::nullopt;
  }
  // -(2^63) has no positive counterpart in int64; negate in unsigned.
  return Value(static_cast<std::int64_t>(0 - magnitude));
}

std::optional<double> parseReal(std::string_view text, std::string& why) {
  if (text == "nan") return std::numeric_limits<double>::quiet_NaN();
  if (text == "inf" || text == "+inf") return std::numeric_limits<double>::infinity();
  if (text == "-inf") return -std::numeric_limits<double>::infinity();
  // from_chars knows no '+' and accepts spellings ("infinity", hex) that the
  // document does not, so check the grammar first.
  std::string_view number = text;
  if (!number.empty() && number.front() == '+') number.remove_prefix(1);
  std::string_view rest = number;
  if (!rest.empty() && rest.front() == '-') rest.remove_prefix(1);
  std::size_t mantissaDigits = skipDigits(rest);
  if (!rest.empty() && rest.front() == '.') {
    rest.remove_prefix(1);
    mantissaDigits += skipDigits(rest);
  }
  bool ok = mantissaDigits > 0;
  if (ok && !rest.empty() && (rest.front() == 'e' || rest.front() == 'E')) {
    rest.remove_prefix(1);
    if (!rest.empty() && (rest.front() == '+' || rest.front() == '-')) rest.remove_prefix(1);
    ok = skipDigits(rest) > 0;
  }
  if (!ok || !rest.empty()) {
    why = "not a decimal number";
    return std::nullopt;
  }
  double value = 0;
  auto [end, ec] = std::from_chars(number.data(), number.data() + number.size(), value);
  if (ec != std::errc() || end != number.data() + number.size()) {
    why = "out of the range of a double";
    return std::nullopt;
  }
  return value;
}

void appendReal(std::string& out, double value) {
  if (std::isnan(value)) {
    out += "nan";
  } else if (std::isinf(value)) {
    out += value > 0 ? "inf" : "-inf";
  } else {
    char buf[32];
    auto result = std::to_chars(buf, buf + sizeof buf, value);
    out.append(buf, result.ptr);
  }
}

std::optional<Date> parseDate(std::string_view text) {
  // The whole seconds go to the shared ISO 8601 parser; the fraction is read
  // here so that it may carry as many places as a double needs.
  constexpr std::size_t kWholeLength = 19;  // "YYYY-MM-DDTHH:MM:SS"
  if (text.size() < kWholeLength + 1 || text.back() != 'Z') return std::nullopt;
  std::string whole(text.substr(0, kWholeLength));
  whole.push_back('Z');
  std::optional<Date> date = parseIso8601(whole);
  if (!date) return std::nullopt;
  std::string_view tail = text.substr(kWholeLength, text.size() - kWholeLength - 1);
  if (tail.empty()) return date;
  if (tail.front() != '.') return std::nullopt;
  std::string_view digits = tail.substr(1);
  std::string_view rest = digits;
  const std::size_t n = skipDigits(rest);
  if (n == 0 || n > kMaxFractionDigits || !rest.empty()) return std::nullopt;
  std::string fraction = "0." + std::string(digits);
  double value = 0;
  auto [end, ec] = std::from_chars(fraction.data(), fraction.data() + fraction.size(), value);
  // A tiny fraction may underflow to "out of range"; it is then no fraction.
  if (ec == std::errc::result_out_of_range) value = 0;
  else if (ec != std::errc() || end != fraction.data() + fraction.size()) return std::nullopt;
  return Date{date->secondsSince1970 + value};
}

std::optional<std::string> formatDate(Date date) {
  const double t = date.secondsSince1970;
  if (!std::isfinite(t)) return std::nullopt;
  const double whole = std::floor(t);
  if (whole < kFirstSecond || whole > kLastSecond) return std::nullopt;
  std::string text = formatIso8601(Date{whole});  // whole seconds: "...SSZ"
  text.pop_back();
  const double fraction = t - whole;
  if (fraction != 0) {
    char buf[kMaxFractionDigits + 8];
    auto result = std::to_chars(buf, buf + sizeof buf, fraction, std::chars_format::fixed);
    if (result.ec != std::errc()) return std::nullopt;
    std::string_view digits(buf, static_cast<std::size_t>(result.ptr - buf));
    if (digits.substr(0, 2) != "0.") return std::nullopt;  // rounded up to 1
    text.append(digits.substr(1));
  }
  text.push_back('Z');
  // Before 1970 the fraction is measured from an earlier whole second, and
  // the subtraction may have rounded; only text that reads back exactly will do.
  std::optional<Date> back = parseDate(text);
  if (!back || back->secondsSince1970 != t) return std::nullopt;
  return text;
}

}  // namespace platform::vmap::internal
