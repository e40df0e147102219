#include "platform/dispatch/ScopedBlockingCall.h"

#include "platform/dispatch/internal/ThreadPool.h"

namespace platform::dispatch {

ScopedBlockingCall::ScopedBlockingCall() {
  internal::ThreadPool::instance().beginBlocking();
}

ScopedBlockingCall::~ScopedBlockingCall() {
  internal::ThreadPool::instance().endBlocking();
}

}  // namespace platform::dispatch
