#include "platform/log/internal/ConversionWriter.h"

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

namespace platform::log::internal {
namespace {

// strerror_r comes in two shapes (XSI returns int, GNU returns char*); accept
// either without caring which the C library gave us.
[[maybe_unused]] const char* strerrorResult(int rc, const char* buffer) {
  return rc == 0 ? buffer : nullptr;
}
[[maybe_unused]] const char* strerrorResult(const char* result, const char*) {
  return result;
}

// A printf spec built only from validated pieces, for the C library to render
// a number the way C programmers know.
class NumberSpec {
 public:
  NumberSpec(const Conversion& c, const char* length, char conversion) {
    add('%');
    if (c.leftAlign) add('-');
    if (c.plusSign) add('+');
    if (c.spaceSign) add(' ');
    if (c.alternate) add('#');
    if (c.zeroPad) add('0');
    if (c.width >= 0) addNumber(c.width);
    if (c.precision >= 0) {
      add('.');
      addNumber(c.precision);
    }
    for (; *length != '\0'; ++length) add(*length);
    add(conversion);
  }
  const char* text() const { return spec_; }

 private:
  void add(char c) { spec_[size_++] = c; }
  void addNumber(int n) {  // n <= kMaxFieldWidth: at most 4 digits
    char digits[8];
    int count = 0;
    do {
      digits[count++] = static_cast<char>('0' + n % 10);
      n /= 10;
    } while (n > 0);
    while (count > 0) add(digits[--count]);
  }
  // '%', 5 flags, 4 digits, '.', 4 digits, 2 length letters, conversion, NUL.
  char spec_[24] = {};
  std::size_t size_ = 0;
};

template <typename T>
void writeNumber(const NumberSpec& spec, T value, BoundedText& out) {
  char buffer[256];
  int n = std::snprintf(buffer, sizeof buffer, spec.text(), value);
  if (n < 0) return;
  if (static_cast<std::size_t>(n) < sizeof buffer) {
    out.append(std::string_view(buffer, static_cast<std::size_t>(n)));
    return;
  }
  std::string big(static_cast<std::size_t>(n) + 1, '\0');
  std::snprintf(big.data(), big.size(), spec.text(), value);
  big.pop_back();
  out.append(big);
}

// Width, precision (a byte count) and '-' applied to text, as %s does.
void writePadded(const Conversion& c, std::string_view text, BoundedText& out) {
  if (c.precision >= 0 && text.size() > static_cast<std::size_t>(c.precision)) {
    text = text.substr(0, static_cast<std::size_t>(c.precision));
  }
  std::size_t pad = c.width > 0 && static_cast<std::size_t>(c.width) > text.size()
                        ? static_cast<std::size_t>(c.width) - text.size()
                        : 0;
  if (!c.leftAlign) out.append(pad, ' ');
  out.append(text);
  if (c.leftAlign) out.append(pad, ' ');
}

void writeUuid(const std::uint8_t* bytes, BoundedText& out) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  char text[36];
  std::size_t n = 0;
  for (int i = 0; i < 16; ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text[n++] = '-';
    text[n++] = kHex[bytes[i] >> 4];
    text[n++] = kHex[bytes[i] & 0x0F];
  }
  out.append(std::string_view(text, n));
}

// The integer as the unsigned type of its original width (C's %u/%x/%o).
std::uint64_t asUnsigned(const Argument& a) {
  if (a.kind == ArgumentKind::Unsigned) return a.unsignedValue;
  std::uint64_t bits = static_cast<std::uint64_t>(a.signedValue);
  if (a.integerBytes > 0 && a.integerBytes < 8)
    bits &= (std::uint64_t{1} << (8 * a.integerBytes)) - 1;
  return bits;
}

bool isInteger(const Argument& a) {
  return a.kind == ArgumentKind::Signed || a.kind == ArgumentKind::Unsigned;
}

void writeErrno(const Argument& a, BoundedText& out) {
  long long code =
      a.kind == ArgumentKind::Signed ? a.signedValue : static_cast<long long>(a.unsignedValue);
  char number[32];
  int n = std::snprintf(number, sizeof number, "[%lld: ", code);
  out.append(std::string_view(number, static_cast<std::size_t>(n)));
  char buffer[256] = {};
  const char* text = nullptr;
  if (code >= INT32_MIN && code <= INT32_MAX) {
    text = strerrorResult(strerror_r(static_cast<int>(code), buffer, sizeof buffer), buffer);
  }
  out.append(text != nullptr ? std::string_view(text) : std::string_view("Unknown error"));
  out.append("]");
}

void writeText(const Conversion& c, const Argument& a, Redaction redaction, BoundedText& out) {
  if (a.kind == ArgumentKind::Null) {
    writePadded(c, "(null)", out);
    return;
  }
  bool redact = c.privacy == Privacy::Private ||
                (c.privacy == Privacy::Unmarked && redaction == Redaction::On);
  if (redact) {
    out.append(kPrivateMarker);  // no describe() call: the text is not needed
    return;
  }
  if (a.kind == ArgumentKind::String) {
    writePadded(c, std::string_view(a.textData, a.textSize), out);
    return;
  }
  std::string description;
  try {
    description = a.describe(a.pointer);
  } catch (...) {
    // A description that throws is the caller's bug; the message still goes out.
    return writeMarker(c.conversion, "throws", out);
  }
  writePadded(c, description, out);
}

}  // namespace

const char* argumentKindName(ArgumentKind kind) {
  switch (kind) {
    case ArgumentKind::Signed:
      return "int";
    case ArgumentKind::Unsigned:
      return "uint";
    case ArgumentKind::Real:
      return "double";
    case ArgumentKind::String:
      return "string";
    case ArgumentKind::Null:
      return "null";
    case ArgumentKind::Pointer:
      return "pointer";
    case ArgumentKind::Bytes:
      return "bytes";
    case ArgumentKind::Uuid:
      return "uuid";
    case ArgumentKind::Object:
      return "object";
  }
  return "?";
}

void writeMarker(char conversion, std::string_view reason, BoundedText& out) {
  char c = conversion > 0x20 && conversion < 0x7F ? conversion : '?';
  out.append("<%");
  out.append(std::string_view(&c, 1));
  out.append("?");
  out.append(reason);
  out.append(">");
}

void writeConversion(const Conversion& c, const Argument& a, Redaction redaction,
                     BoundedText& out) {
  const char kind = c.conversion;
  auto refuse = [&] { writeMarker(kind, argumentKindName(a.kind), out); };
  switch (kind) {
    case 'd':
    case 'i':
      if (!isInteger(a)) return refuse();
      if (c.errnoValue) return writeErrno(a, out);
      if (a.kind == ArgumentKind::Signed) {
        return writeNumber(NumberSpec(c, "ll", 'd'), static_cast<long long>(a.signedValue), out);
      }
      return writeNumber(NumberSpec(c, "ll", 'u'), static_cast<unsigned long long>(a.unsignedValue),
                         out);
    case 'u':
    case 'x':
    case 'X':
    case 'o':
      if (!isInteger(a)) return refuse();
      return writeNumber(NumberSpec(c, "ll", kind), static_cast<unsigned long long>(asUnsigned(a)),
                         out);
    case 'c':
      if (!isInteger(a)) return refuse();
      {
        const char byte = static_cast<char>(asUnsigned(a) & 0xFF);
        Conversion padding;  // C's %c honours only width and '-'
        padding.width = c.width;
        padding.leftAlign = c.leftAlign;
        return writePadded(padding, std::string_view(&byte, 1), out);
      }
    case 'f':
    case 'F':
    case 'e':
    case 'E':
    case 'g':
    case 'G':
    case 'a':
    case 'A': {
      double value = 0;
      if (a.kind == ArgumentKind::Real)
        value = a.realValue;
      else if (a.kind == ArgumentKind::Signed)
        value = static_cast<double>(a.signedValue);
      else if (a.kind == ArgumentKind::Unsigned)
        value = static_cast<double>(a.unsignedValue);
      else
        return refuse();
      return writeNumber(NumberSpec(c, "", kind), value, out);
    }
    case 's':
      if (a.kind != ArgumentKind::String && a.kind != ArgumentKind::Null) return refuse();
      return writeText(c, a, redaction, out);
    case '@':
      if (a.kind == ArgumentKind::Uuid) return writeUuid(a.uuidBytes, out);
      if (a.kind != ArgumentKind::String && a.kind != ArgumentKind::Null &&
          a.kind != ArgumentKind::Object) {
        return refuse();
      }
      return writeText(c, a, redaction, out);
    case 'p': {
      const void* address = nullptr;
      if (a.kind == ArgumentKind::Pointer || a.kind == ArgumentKind::Bytes ||
          a.kind == ArgumentKind::Object) {
        address = a.pointer;
      } else if (a.kind == ArgumentKind::String) {
        address = a.textData;
      } else if (a.kind != ArgumentKind::Null) {
        return refuse();
      }
      char text[32];
      int n =
          std::snprintf(text, sizeof text, "0x%llx",
                        static_cast<unsigned long long>(reinterpret_cast<std::uintptr_t>(address)));
      Conversion padding;  // width and '-' only: no precision for an address
      padding.width = c.width;
      padding.leftAlign = c.leftAlign;
      return writePadded(padding, std::string_view(text, static_cast<std::size_t>(n)), out);
    }
    case 'P':
      if (!c.uuid || c.precision != 16) return writeMarker(kind, "unknown", out);
      if (a.kind == ArgumentKind::Uuid) return writeUuid(a.uuidBytes, out);
      if (a.kind == ArgumentKind::Null || (a.kind == ArgumentKind::Bytes && a.pointer == nullptr)) {
        return out.append("(null)");
      }
      // Only a byte pointer is taken to point at 16 bytes; an int* is not.
      if (a.kind != ArgumentKind::Bytes) return refuse();
      return writeUuid(static_cast<const std::uint8_t*>(a.pointer), out);
    default:
      return writeMarker(kind, "unknown", out);
  }
}

}  // namespace platform::log::internal
