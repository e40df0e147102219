// Keep-alive transactions: while work that must not be cut short is under
// way (a request being answered, a write being flushed), its owner holds a
// KeepAliveTransaction. The daemon reports the process-wide count, and an
// idle-exit policy can wait for it to reach zero before leaving.
//
//   {
//     mbx::KeepAliveTransaction busy;   // counts from here...
//     ...
//   }                                   // ...to here
//
// Thread safety: the count is an atomic; transactions may start and end on
// any thread. One transaction object is not shared between threads.
#pragma once

#include <cstddef>

namespace platform::mbx {

class KeepAliveTransaction {
 public:
  KeepAliveTransaction();
  ~KeepAliveTransaction();

  // Moving hands the count over: the moved-from object no longer counts.
  KeepAliveTransaction(KeepAliveTransaction&& other) noexcept;
  KeepAliveTransaction& operator=(KeepAliveTransaction&& other) noexcept;
  KeepAliveTransaction(const KeepAliveTransaction&) = delete;
  KeepAliveTransaction& operator=(const KeepAliveTransaction&) = delete;

  // Ends the transaction before destruction; idempotent.
  void end();
  bool active() const { return active_; }

 private:
  bool active_;
};

// Transactions alive in this process right now.
std::size_t activeTransactionCount();

}  // namespace platform::mbx
