#include "platform/dispatch/Queue.h"

#include <string>

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/QueueFrame.h"

namespace platform::dispatch {

Queue::Queue(std::string_view label, Priority priority)
    : label_(label.substr(0, kMaxLabelLength)), priority_(priority) {}

Queue::~Queue() = default;

bool Queue::tryClaim() {
  return false;
}

void Queue::runClaimed(Closure&) {
  internal::fatal("queue '%s' asked to run work it never claimed", label_.c_str());
}

bool Queue::isCurrent() const {
  return internal::chainContains(this);
}

void Queue::assertCurrent(const char* file, int line) const {
  if (isCurrent()) return;
  std::string actual;
  for (const internal::QueueFrame* f = internal::currentFrame(); f != nullptr; f = f->outer) {
    if (!actual.empty()) actual += " <- ";
    actual += "'" + f->queue->label() + "'";
  }
  if (actual.empty()) actual = "no queue";
  internal::fatal("expected to run on queue '%s' but running on %s (at %s:%d)", label_.c_str(),
                  actual.c_str(), file != nullptr ? file : "?", line);
}

std::string currentQueueLabel() {
  const internal::QueueFrame* f = internal::currentFrame();
  return f != nullptr ? f->queue->label() : std::string();
}

}  // namespace platform::dispatch
