#include "platform/log/internal/Conversion.h"

#include "platform/log/Format.h"

namespace platform::log::internal {
namespace {

bool isDigit(char c) {
  return c >= '0' && c <= '9';
}

std::string_view trim(std::string_view s) {
  while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
  while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) s.remove_suffix(1);
  return s;
}

// Unknown words are ignored, so that a format written for a richer reader
// still prints.
void applyAnnotation(std::string_view words, Conversion& c) {
  while (!words.empty()) {
    std::size_t comma = words.find(',');
    std::string_view word = trim(words.substr(0, comma));
    words = comma == std::string_view::npos ? std::string_view() : words.substr(comma + 1);
    if (word == "public") {
      c.privacy = Privacy::Public;
    } else if (word == "private") {
      c.privacy = Privacy::Private;
    } else if (word == "uuid_t") {
      c.uuid = true;
    } else if (word == "errno") {
      c.errnoValue = true;
    }
  }
}

// Reads a decimal field; stops growing past the limit but consumes all digits.
int readNumber(std::string_view text, std::size_t& pos, bool& tooWide) {
  int value = 0;
  while (pos < text.size() && isDigit(text[pos])) {
    if (value <= static_cast<int>(kMaxFieldWidth)) value = value * 10 + (text[pos] - '0');
    ++pos;
  }
  if (value > static_cast<int>(kMaxFieldWidth)) tooWide = true;
  return value;
}

bool isKnownConversion(char c) {
  return c != '\0' && std::string_view("diuxXocsfFeEgGaAp@P").find(c) != std::string_view::npos;
}

// Sets the flag `f` names; false when `f` is not a flag.
bool applyFlag(char f, Conversion& c) {
  switch (f) {
    case '-':
      c.leftAlign = true;
      return true;
    case '+':
      c.plusSign = true;
      return true;
    case ' ':
      c.spaceSign = true;
      return true;
    case '#':
      c.alternate = true;
      return true;
    case '0':
      c.zeroPad = true;
      return true;
    default:
      return false;
  }
}

}  // namespace

Conversion parseConversion(std::string_view text) {
  Conversion c;
  std::size_t pos = 1;
  auto finish = [&](ConversionStatus status) {
    c.status = status;
    c.length = pos;
    return c;
  };
  if (pos >= text.size()) return finish(ConversionStatus::Incomplete);
  if (text[pos] == '%') {
    ++pos;
    return finish(ConversionStatus::Percent);
  }
  if (text[pos] == '{') {
    std::string_view rest = text.substr(pos + 1, kMaxAnnotationBytes + 1);
    std::size_t close = rest.find('}');
    if (close == std::string_view::npos) {
      ++pos;  // skip only "%{": the rest prints as text
      return finish(ConversionStatus::BadAnnotation);
    }
    applyAnnotation(rest.substr(0, close), c);
    pos += close + 2;
  }
  while (pos < text.size() && applyFlag(text[pos], c)) ++pos;
  bool tooWide = false;
  if (pos < text.size() && text[pos] == '*') {
    ++c.starCount;
    ++pos;
  } else if (pos < text.size() && isDigit(text[pos])) {
    c.width = readNumber(text, pos, tooWide);
  }
  if (pos < text.size() && text[pos] == '.') {
    ++pos;
    if (pos < text.size() && text[pos] == '*') {
      ++c.starCount;
      ++pos;
    } else {
      c.precision = readNumber(text, pos, tooWide);
    }
  }
  // Length modifiers: at most two letters ("hh", "ll").
  for (int n = 0; n < 2 && pos < text.size(); ++n) {
    char m = text[pos];
    if (m == 'h' || m == 'l' || m == 'j' || m == 'z' || m == 't' || m == 'L' || m == 'q') {
      ++pos;
    } else {
      break;
    }
  }
  if (pos >= text.size()) return finish(ConversionStatus::Incomplete);
  c.conversion = text[pos++];
  if (!isKnownConversion(c.conversion)) return finish(ConversionStatus::Unknown);
  if (c.starCount > 0) return finish(ConversionStatus::Star);
  if (tooWide) return finish(ConversionStatus::TooWide);
  return finish(ConversionStatus::Ok);
}

}  // namespace platform::log::internal
