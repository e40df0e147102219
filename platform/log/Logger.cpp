#include "platform/log/Logger.h"

#include "platform/log/internal/Output.h"

namespace platform::log {

Logger::Logger(std::string subsystem, std::string category, Threshold threshold)
    : subsystem_(std::move(subsystem)),
      category_(std::move(category)),
      threshold_(static_cast<std::uint8_t>(threshold)) {}

void Logger::emit(Level level, std::string_view format,
                  std::span<const internal::Argument> arguments) const noexcept {
  try {
    internal::Output& output = internal::Output::shared();
    std::string message = formatArguments(output.redaction(), format, arguments);
    output.write(level, subsystem_, category_, message);
  } catch (...) {
    // Out of memory: nothing sensible is left to do with the line.
  }
}

}  // namespace platform::log
