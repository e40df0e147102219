// A queue is a named place where work runs. Everything outside the dispatch
// layer runs as work on some queue; "which queue am I on" is the question
// code asks instead of "which thread am I on".
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/dispatch/Priority.h"
#include "platform/dispatch/internal/Closure.h"

namespace platform::dispatch {

class FdSource;

class Queue : public std::enable_shared_from_this<Queue> {
 public:
  virtual ~Queue();
  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

  const std::string& label() const { return label_; }
  Priority priority() const { return priority_; }

  // Runs `work` on this queue later; returns at once. An exception escaping
  // `work` ends the process.
  virtual void async(Closure work) = 0;

  // async() for work posted as the last act of an event handler or a job,
  // such as a request handed from its connection to the queue serving it.
  // On a pool thread no other thread is woken for it: the calling thread
  // takes it once it returns to the pool, unless an idle thread that wakes
  // for something else gets there first. The hand-off then costs no thread
  // switch. Off the pool (and on the main queue) this is async().
  // REQUIRES: the caller returns to the pool after bounded work. Blocking
  //           in between is allowed: the pool then wakes a thread for it.
  virtual void asyncAfterCaller(Closure work) { async(std::move(work)); }

  // Runs `work` on this queue and returns when it has finished. Whether the
  // calling thread runs it or waits for another depends on the queue kind.
  // REQUIRES: for a serial or the main queue, the queue is not current
  //           (that would wait on itself; the process aborts instead).
  virtual void sync(Closure work) = 0;

  // True while the calling code runs as work of this queue, including inside
  // a chain of syncs that started on it.
  bool isCurrent() const;

  // Aborts, naming this queue and the queue actually current, unless
  // isCurrent(). `file` and `line` name the caller; see QV_ASSERT_ON_QUEUE.
  void assertCurrent(const char* file = nullptr, int line = 0) const;

 protected:
  // Labels longer than kMaxLabelLength are cut to that length.
  Queue(std::string_view label, Priority priority);

 private:
  friend class FdSource;
  // For an event source on a pool thread that has just taken its event:
  // claims the queue when the work could start here and now without
  // breaking the queue's order or exclusion (an idle serial queue, a
  // concurrent queue). The main queue never can. On true the caller must
  // call runClaimed() next, on the same thread.
  virtual bool tryClaim();
  // Runs `work` as an item of this queue on the calling thread, then lets
  // the queue go on with whatever was posted meanwhile.
  // REQUIRES: tryClaim() returned true on this thread.
  virtual void runClaimed(Closure& work);

  const std::string label_;
  const Priority priority_;
};

inline constexpr std::size_t kMaxLabelLength = 128;

// The label of the innermost current queue, or "" when the calling code is
// not running on any queue. Meant for log lines.
std::string currentQueueLabel();

}  // namespace platform::dispatch

// Aborts unless the calling code runs on `queue` (a pointer or smart pointer
// to a Queue). Use it at the top of methods of objects confined to a queue.
#define QV_ASSERT_ON_QUEUE(queue) ((queue)->assertCurrent(__FILE__, __LINE__))
