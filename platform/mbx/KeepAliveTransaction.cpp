#include "platform/mbx/KeepAliveTransaction.h"

#include <atomic>

namespace platform::mbx {

namespace {

std::atomic<std::size_t> gActive{0};

}  // namespace

KeepAliveTransaction::KeepAliveTransaction() : active_(true) {
  gActive.fetch_add(1, std::memory_order_relaxed);
}

KeepAliveTransaction::~KeepAliveTransaction() {
  end();
}

KeepAliveTransaction::KeepAliveTransaction(KeepAliveTransaction&& other) noexcept
    : active_(other.active_) {
  other.active_ = false;
}

KeepAliveTransaction& KeepAliveTransaction::operator=(KeepAliveTransaction&& other) noexcept {
  if (this != &other) {
    end();
    active_ = other.active_;
    other.active_ = false;
  }
  return *this;
}

void KeepAliveTransaction::end() {
  if (active_) {
    active_ = false;
    gActive.fetch_sub(1, std::memory_order_relaxed);
  }
}

std::size_t activeTransactionCount() {
  return gActive.load(std::memory_order_relaxed);
}

}  // namespace platform::mbx
