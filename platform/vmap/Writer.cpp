#include "platform/vmap/Writer.h"

#include "platform/vmap/internal/BinaryForm.h"
#include "platform/vmap/internal/XmlWriter.h"

namespace platform::vmap {

Result<std::string> write(const Value& value, Format format, const WriteLimits& limits) {
  if (format == Format::Binary) return internal::writeBinary(value, limits);
  return internal::writeXml(value, limits);
}

}  // namespace platform::vmap
