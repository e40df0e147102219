// The chain of queues the calling code runs on. Running an item pushes a
// frame for its queue; a sync that hops to another thread carries the
// waiting caller's chain along, so inside a sync from A to B both A and B
// are current no matter which thread runs the work.
//
// Thread safety: each thread has its own chain. A chain may extend into
// frames on another thread's stack, but only while that thread is blocked
// waiting for this one, so those frames do not change while they are read.
#pragma once

namespace platform::dispatch {
class Queue;
}

namespace platform::dispatch::internal {

struct QueueFrame {
  const Queue* queue;
  const QueueFrame* outer;  // the frame that was current when this one began
};

// The innermost frame on this thread, or nullptr when no queue is current.
const QueueFrame* currentFrame();

// True when `queue` is anywhere on this thread's chain.
bool chainContains(const Queue* queue);

// Makes `queue` current for the lifetime of this object.
class ScopedQueueFrame {
 public:
  // `outer` is the chain this frame extends: the thread's own by default,
  // or a blocked sync caller's.
  ScopedQueueFrame(const Queue* queue, const QueueFrame* outer);
  explicit ScopedQueueFrame(const Queue* queue) : ScopedQueueFrame(queue, currentFrame()) {}
  ~ScopedQueueFrame();

  ScopedQueueFrame(const ScopedQueueFrame&) = delete;
  ScopedQueueFrame& operator=(const ScopedQueueFrame&) = delete;

 private:
  QueueFrame frame_;
  const QueueFrame* saved_;
};

}  // namespace platform::dispatch::internal
