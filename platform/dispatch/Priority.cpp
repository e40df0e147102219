#include "platform/dispatch/Priority.h"

namespace platform::dispatch {

const char* priorityName(Priority p) {
  switch (p) {
    case Priority::Background:
      return "background";
    case Priority::Utility:
      return "utility";
    case Priority::Default:
      return "default";
    case Priority::UserInitiated:
      return "user-initiated";
    case Priority::UserInteractive:
      return "user-interactive";
  }
  return "unknown";
}

}  // namespace platform::dispatch
