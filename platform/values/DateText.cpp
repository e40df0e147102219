#include "platform/values/DateText.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>

namespace platform {
namespace {

bool readDigits(std::string_view& s, std::size_t n, int& out) {
  if (s.size() < n) return false;
  int v = 0;
  for (std::size_t i = 0; i < n; ++i) {
    char c = s[i];
    if (c < '0' || c > '9') return false;
    v = v * 10 + (c - '0');
  }
  out = v;
  s.remove_prefix(n);
  return true;
}

bool expect(std::string_view& s, char c) {
  if (s.empty() || s.front() != c) return false;
  s.remove_prefix(1);
  return true;
}

constexpr double kFirstSecond = -62167219200.0;  // 0000-01-01T00:00:00Z
constexpr double kLastSecond = 253402300799.0;   // 9999-12-31T23:59:59Z

}  // namespace

std::string formatIso8601(Date date) {
  double t = date.secondsSince1970;
  if (!std::isfinite(t)) return t != t ? "nan" : (t > 0 ? "+infinity" : "-infinity");
  // Years 0000-9999 only; beyond them the calendar types would overflow, and
  // no document needs such dates, so describe them by their seconds.
  if (t < kFirstSecond || t >= kLastSecond + 1) return "@" + std::to_string(t);
  double whole = std::floor(t);
  double fraction = t - whole;  // exact: both lie in the same binade range
  using namespace std::chrono;
  auto secs = sys_seconds{seconds{static_cast<long long>(whole)}};
  auto days = floor<std::chrono::days>(secs);
  year_month_day ymd{days};
  hh_mm_ss<seconds> hms{secs - days};
  char buf[64];
  std::snprintf(buf, sizeof buf, "%04d-%02u-%02uT%02d:%02d:%02lld", static_cast<int>(ymd.year()),
                static_cast<unsigned>(ymd.month()), static_cast<unsigned>(ymd.day()),
                static_cast<int>(hms.hours().count()), static_cast<int>(hms.minutes().count()),
                static_cast<long long>(hms.seconds().count()));
  std::string out(buf);
  if (fraction != 0) {
    char frac[400];
    // Shortest fixed form that reads back the same: "0.xxx".
    auto res = std::to_chars(frac, frac + sizeof frac, fraction, std::chars_format::fixed);
    std::string_view f(frac, static_cast<std::size_t>(res.ptr - frac));
    if (f.size() > 1 && f[0] == '0') f.remove_prefix(1);  // keep ".xxx"
    out.append(f);
  }
  out.push_back('Z');
  return out;
}

std::optional<Date> parseIso8601(std::string_view s) {
  int y, mo, d, h, mi, sec;
  if (!readDigits(s, 4, y) || !expect(s, '-') || !readDigits(s, 2, mo) || !expect(s, '-') ||
      !readDigits(s, 2, d) || !expect(s, 'T') || !readDigits(s, 2, h) || !expect(s, ':') ||
      !readDigits(s, 2, mi) || !expect(s, ':') || !readDigits(s, 2, sec))
    return std::nullopt;
  double fraction = 0;
  if (!s.empty() && s.front() == '.') {
    std::size_t n = 1;
    while (n < s.size() && s[n] >= '0' && s[n] <= '9') ++n;
    if (n == 1 || n > 400) return std::nullopt;
    std::string text("0");
    text.append(s.substr(0, n));
    auto res = std::from_chars(text.data(), text.data() + text.size(), fraction);
    if (res.ec != std::errc()) return std::nullopt;
    s.remove_prefix(n);
  }
  if (s != "Z") return std::nullopt;
  using namespace std::chrono;
  year_month_day ymd{year{y}, month{static_cast<unsigned>(mo)}, day{static_cast<unsigned>(d)}};
  if (!ymd.ok() || h > 23 || mi > 59 || sec > 60) return std::nullopt;
  long long days = sys_days{ymd}.time_since_epoch().count();
  double whole = static_cast<double>(days * 86400LL + h * 3600LL + mi * 60LL + sec);
  return Date{whole + fraction};
}

}  // namespace platform
