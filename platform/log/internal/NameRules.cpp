#include "platform/log/internal/NameRules.h"

#include <string>

#include "platform/log/internal/LineFormat.h"

namespace platform::log {

std::string_view loggerErrorName(LoggerError error) {
  switch (error) {
    case LoggerError::EmptyName:
      return "empty name";
    case LoggerError::NameTooLong:
      return "name too long";
    case LoggerError::InvalidCharacter:
      return "invalid character in name";
    case LoggerError::TooManyLoggers:
      return "too many loggers";
  }
  return "?";
}

Error makeLoggerError(LoggerError error, std::string_view subsystem, std::string_view category) {
  // The names are what was refused: keep them short and printable.
  constexpr std::size_t kShown = 40;
  std::string text(loggerErrorName(error));
  text.append(" for logger (");
  internal::appendEscaped(text, subsystem.substr(0, kShown));
  if (subsystem.size() > kShown) text.append("...");
  text.append(", ");
  internal::appendEscaped(text, category.substr(0, kShown));
  if (category.size() > kShown) text.append("...");
  text.append(")");
  return Error(std::string(kLoggerErrorDomain), static_cast<std::int64_t>(error), std::move(text));
}

namespace internal {

std::optional<LoggerError> checkName(std::string_view name) {
  if (name.empty()) return LoggerError::EmptyName;
  if (name.size() > kMaxNameBytes) return LoggerError::NameTooLong;
  for (char c : name) {
    bool visible = c > 0x20 && c < 0x7F;
    if (!visible || c == ',' || c == ':' || c == '=') return LoggerError::InvalidCharacter;
  }
  return std::nullopt;
}

}  // namespace internal
}  // namespace platform::log
