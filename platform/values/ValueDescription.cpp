// Description text of values: an indented, old-style property-list text that
// reads well in logs. Strings at the top level describe as themselves.
#include <charconv>
#include <cstdio>

#include "platform/values/DateText.h"
#include "platform/values/Value.h"

namespace platform {
namespace {

constexpr std::size_t kMaxDataBytesShown = 24;

bool needsQuotes(const std::string& s) {
  if (s.empty()) return true;
  for (unsigned char c : s) {
    bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                 c == '_' || c == '.' || c == '/' || c == '-' || c >= 0x80;
    if (!plain) return true;
  }
  return false;
}

void appendQuoted(std::string& out, const std::string& s) {
  if (!needsQuotes(s)) {
    out += s;
    return;
  }
  out.push_back('"');
  for (unsigned char c : s) {
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\n': out += "\\n"; break;
      case '\t': out += "\\t"; break;
      default:
        if (c < 0x20 || c == 0x7f) {
          char buf[8];
          std::snprintf(buf, sizeof buf, "\\%03o", c);
          out += buf;
        } else {
          out.push_back(static_cast<char>(c));
        }
    }
  }
  out.push_back('"');
}

void indent(std::string& out, int level) { out.append(static_cast<std::size_t>(level) * 4, ' '); }

void describe(std::string& out, const Value& v, int level, bool nested) {
  switch (v.type()) {
    case ValueType::None: out += "(null)"; return;
    case ValueType::String:
      if (nested) appendQuoted(out, *v.string()); else out += *v.string();
      return;
    case ValueType::Boolean: out += *v.boolean() ? "true" : "false"; return;
    case ValueType::Integer: out += std::to_string(*v.int64()); return;
    case ValueType::Unsigned: out += std::to_string(*v.uint64()); return;
    case ValueType::Real: {
      char buf[40];
      auto r = std::to_chars(buf, buf + sizeof buf, *v.real());
      out.append(buf, r.ptr);
      return;
    }
    case ValueType::Date: out += formatIso8601(*v.date()); return;
    case ValueType::Uuid: out += v.uuid()->toString(); return;
    case ValueType::Data: {
      const Data& d = *v.data();
      out += "{length = " + std::to_string(d.size()) + ", bytes = 0x";
      char buf[4];
      for (std::size_t i = 0; i < d.size() && i < kMaxDataBytesShown; ++i) {
        std::snprintf(buf, sizeof buf, "%02x", d[i]);
        out += buf;
      }
      if (d.size() > kMaxDataBytesShown) out += "...";
      out += "}";
      return;
    }
    case ValueType::Array: {
      const Array& a = *v.array();
      if (a.empty()) {
        out += "()";
        return;
      }
      out += "(\n";
      for (std::size_t i = 0; i < a.size(); ++i) {
        indent(out, level + 1);
        describe(out, a[i], level + 1, true);
        out += i + 1 < a.size() ? ",\n" : "\n";
      }
      indent(out, level);
      out += ")";
      return;
    }
    case ValueType::Dictionary: {
      const Dictionary& d = *v.dictionary();
      if (d.empty()) {
        out += "{}";
        return;
      }
      out += "{\n";
      for (const auto& [key, value] : d) {
        indent(out, level + 1);
        appendQuoted(out, key);
        out += " = ";
        describe(out, value, level + 1, true);
        out += ";\n";
      }
      indent(out, level);
      out += "}";
      return;
    }
  }
}

}  // namespace

std::string Value::description() const {
  std::string out;
  describe(out, *this, 0, false);
  return out;
}

}  // namespace platform
