// How urgently work should run. The pool always picks ready work of a higher
// priority first; event sources ready at the same moment are delivered
// highest priority first.
//
// Thread safety: plain values and pure functions, usable from any thread.
#pragma once

#include <cstdint>

namespace platform::dispatch {

enum class Priority : std::uint8_t {
  Background,  // maintenance nobody is waiting for
  Utility,     // long-running work with a visible but patient consumer
  Default,
  UserInitiated,    // someone asked and is waiting for the answer
  UserInteractive,  // on the path of a person's input; keep it short
};

inline constexpr int kPriorityCount = 5;

// The position of `p` in 0..kPriorityCount-1, Background first.
constexpr int priorityIndex(Priority p) {
  return static_cast<int>(p);
}

// "background", "utility", "default", "user-initiated", "user-interactive".
const char* priorityName(Priority p);

}  // namespace platform::dispatch
