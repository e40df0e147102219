#include "platform/dispatch/internal/Fatal.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>

#include "platform/dispatch/internal/Thread.h"

namespace platform::dispatch::internal {

void fatal(const char* format, ...) {
  char message[1024];
  va_list args;
  va_start(args, format);
  std::vsnprintf(message, sizeof message, format, args);
  va_end(args);
  std::fprintf(stderr, "qvd dispatch: %s [thread %s]\n", message, currentThreadName().c_str());
  std::fflush(stderr);
  std::abort();
}

}  // namespace platform::dispatch::internal
