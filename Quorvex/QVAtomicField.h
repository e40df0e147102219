// One field of a shared object whose value other threads may replace at any
// moment: readers get a strong reference to an immutable value, which stays
// valid however soon the field is replaced.
//
// Thread safety: load and store may be called from any thread at once.
#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <utility>

template <typename T>
class QVAtomicField {
 public:
  QVAtomicField() = default;
  QVAtomicField(const QVAtomicField&) = delete;
  QVAtomicField& operator=(const QVAtomicField&) = delete;

  // The current value, or null when the field holds none.
  std::shared_ptr<const T> load() const {
    std::lock_guard<std::mutex> lock(mu_);
    return value_;
  }

  // A copy of the current value, or none.
  std::optional<T> copy() const {
    std::shared_ptr<const T> current = load();
    if (!current) return std::nullopt;
    return *current;
  }

  void store(std::shared_ptr<const T> value) {
    {
      std::lock_guard<std::mutex> lock(mu_);
      value_.swap(value);
    }
    // The previous value (now in `value`) is released here, outside the
    // lock: destroying a large dictionary must not hold up readers.
  }

  void store(std::optional<T> value) {
    store(value ? std::make_shared<const T>(std::move(*value)) : std::shared_ptr<const T>());
  }

 private:
  mutable std::mutex mu_;
  std::shared_ptr<const T> value_;
};
