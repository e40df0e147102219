// The message formatter: printf-style conversions over typed arguments, with
// redaction of strings and objects. Log lines use it, and so does any code
// that wants the same text for an error message.
//
// Conversions: %d %i %u %x %X %o %c %s %f %F %e %E %g %G %a %A %p %% with
// flags (-+ #0), width and precision; length modifiers (hh h l ll j z t L q)
// are accepted and ignored, since the argument's own type decides. Plus:
//   %@                an object's description (Value, anything with
//                     description(), text, Uuid; null prints "(null)")
//   %{public}s/@      never redacted; %{private}s/@ always redacted
//   %{uuid_t}.16P     16 bytes (Uuid, std::array<std::uint8_t,16> or a
//                     const std::uint8_t* to 16 bytes) as an upper-case UUID
//   %{errno}d         "[2: No such file or directory]"
// Under Redaction::On, %s and %@ not marked public print "<private>";
// numbers, pointers and UUIDs are always shown.
//
// Nothing here fails or crashes on a bad format. In place of the conversion:
//   <%d?string>       argument of the wrong kind (int uint double string
//                     null pointer bytes uuid object)
//   <%d?missing>      too few arguments (extra arguments are ignored)
//   <%k?unknown>      unknown conversion (consumes no argument)
//   <%*?unsupported>  '*' width or precision (consumes its arguments)
//   <%d?width>        width or precision over kMaxFieldWidth
//   <%?incomplete>    the format ends inside a conversion
//   <%{?annotation>   an unterminated or over-long {...}
//   <%@?throws>       the object's description() threw
// Integers are accepted where a real is expected; a real where an integer is
// expected is refused. A message longer than kMaxMessageBytes is cut (never
// inside a UTF-8 sequence) and ends with "<truncated>".
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include <array>
#include <cstddef>
#include <span>
#include <string>
#include <string_view>

#include "platform/log/internal/Argument.h"

namespace platform::log {

enum class Redaction { On, Off };

inline constexpr std::size_t kMaxMessageBytes = 16 * 1024;
inline constexpr std::size_t kMaxFieldWidth = 1024;
inline constexpr std::string_view kTruncatedMarker = "<truncated>";
inline constexpr std::string_view kPrivateMarker = "<private>";

// The formatter over already captured arguments.
// REQUIRES: every argument's referent is alive.
std::string formatArguments(Redaction redaction, std::string_view format,
                            std::span<const internal::Argument> arguments);

// formatMessage(Redaction::Off, "open %s: %{errno}d", path, errno)
template <typename... Args>
std::string formatMessage(Redaction redaction, std::string_view format, const Args&... args) {
  const std::array<internal::Argument, sizeof...(Args)> captured{internal::capture(args)...};
  return formatArguments(redaction, format, captured);
}

}  // namespace platform::log
