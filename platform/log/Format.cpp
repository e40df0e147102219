#include "platform/log/Format.h"

#include "platform/log/internal/BoundedText.h"
#include "platform/log/internal/Conversion.h"
#include "platform/log/internal/ConversionWriter.h"

namespace platform::log {

std::string formatArguments(Redaction redaction, std::string_view format,
                            std::span<const internal::Argument> arguments) {
  using internal::ConversionStatus;
  internal::BoundedText out(kMaxMessageBytes);
  std::size_t next = 0;  // the next unused argument
  std::size_t pos = 0;
  while (pos < format.size() && !out.full()) {
    std::size_t percent = format.find('%', pos);
    if (percent == std::string_view::npos) {
      out.append(format.substr(pos));
      break;
    }
    out.append(format.substr(pos, percent - pos));
    internal::Conversion c = internal::parseConversion(format.substr(percent));
    pos = percent + c.length;
    switch (c.status) {
      case ConversionStatus::Percent:
        out.append("%");
        break;
      case ConversionStatus::Incomplete:
        out.append("<%?incomplete>");
        break;
      case ConversionStatus::BadAnnotation:
        out.append("<%{?annotation>");
        break;
      case ConversionStatus::Unknown:
        internal::writeMarker(c.conversion, "unknown", out);
        break;
      case ConversionStatus::Star:
        // Skip the arguments C would have taken, so later conversions still
        // line up with the arguments their author meant.
        next += static_cast<std::size_t>(c.starCount) + 1;
        out.append("<%*?unsupported>");
        break;
      case ConversionStatus::TooWide:
        ++next;
        internal::writeMarker(c.conversion, "width", out);
        break;
      case ConversionStatus::Ok:
        if (next >= arguments.size()) {
          internal::writeMarker(c.conversion, "missing", out);
        } else {
          internal::writeConversion(c, arguments[next++], redaction, out);
        }
        break;
    }
  }
  return std::move(out).finish(kTruncatedMarker);
}

}  // namespace platform::log
