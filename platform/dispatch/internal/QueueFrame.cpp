#include "platform/dispatch/internal/QueueFrame.h"

namespace platform::dispatch::internal {
namespace {
thread_local const QueueFrame* tTop = nullptr;
}  // namespace

const QueueFrame* currentFrame() {
  return tTop;
}

bool chainContains(const Queue* queue) {
  for (const QueueFrame* f = tTop; f != nullptr; f = f->outer) {
    if (f->queue == queue) return true;
  }
  return false;
}

ScopedQueueFrame::ScopedQueueFrame(const Queue* queue, const QueueFrame* outer)
    : frame_{queue, outer}, saved_(tTop) {
  tTop = &frame_;
}

ScopedQueueFrame::~ScopedQueueFrame() {
  tTop = saved_;
}

}  // namespace platform::dispatch::internal
