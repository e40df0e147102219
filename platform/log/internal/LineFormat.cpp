#include "platform/log/internal/LineFormat.h"

#include <cstdio>

namespace platform::log::internal {
namespace {

void appendTimestamp(std::string& out, const std::timespec& time) {
  std::tm utc{};
  gmtime_r(&time.tv_sec, &utc);
  char text[48];
  int n = std::snprintf(text, sizeof text, "%04d-%02d-%02dT%02d:%02d:%02d.%06ldZ ",
                        utc.tm_year + 1900, utc.tm_mon + 1, utc.tm_mday, utc.tm_hour, utc.tm_min,
                        utc.tm_sec, static_cast<long>(time.tv_nsec / 1000));
  if (n > 0 && static_cast<std::size_t>(n) < sizeof text)
    out.append(text, static_cast<std::size_t>(n));
}

}  // namespace

void appendEscaped(std::string& out, std::string_view text) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::size_t plain = 0;  // start of the run not yet copied
  for (std::size_t i = 0; i < text.size(); ++i) {
    unsigned char c = static_cast<unsigned char>(text[i]);
    if (c >= 0x20 && c != 0x7F && c != '\\') continue;
    out.append(text.substr(plain, i - plain));
    plain = i + 1;
    switch (c) {
      case '\\':
        out.append("\\\\");
        break;
      case '\n':
        out.append("\\n");
        break;
      case '\r':
        out.append("\\r");
        break;
      case '\t':
        out.append("\\t");
        break;
      default: {
        const char escape[4] = {'\\', 'x', kHex[c >> 4], kHex[c & 0x0F]};
        out.append(escape, 4);
      }
    }
  }
  out.append(text.substr(plain));
}

std::string renderLine(LineForm form, const LineOrigin& origin, Level level,
                       std::string_view subsystem, std::string_view category,
                       std::string_view message) {
  std::string line;
  line.reserve(96 + subsystem.size() + category.size() + message.size());
  if (form == LineForm::Journal) {
    line.push_back('<');
    line.push_back(static_cast<char>('0' + syslogPriority(level)));
    line.push_back('>');
  } else {
    appendTimestamp(line, origin.time);
  }
  char ids[64];
  int n = std::snprintf(ids, sizeof ids, "[%ld:%ld] <", origin.pid, origin.threadId);
  line.append(origin.processName);
  line.append(ids, static_cast<std::size_t>(n));
  line.append(levelName(level));
  line.append("> ");
  if (!subsystem.empty() || !category.empty()) {
    line.push_back('[');
    line.append(subsystem);
    line.push_back(':');
    line.append(category);
    line.append("] ");
  }
  appendEscaped(line, message);
  line.push_back('\n');
  return line;
}

}  // namespace platform::log::internal
