// A move-only, type-erased `void()` callable: the unit of work every queue,
// group and event source carries. std::function cannot hold move-only
// lambdas and std::move_only_function is not available to every compiler we
// build with, so the layer carries its own.
//
// Thread safety: a Closure is a plain value; it is moved between threads but
// never used by two threads at once.
#pragma once

#include <cstddef>
#include <functional>
#include <new>
#include <type_traits>
#include <utility>

namespace platform::dispatch {

class Closure {
 public:
  Closure() noexcept = default;
  Closure(std::nullptr_t) noexcept {}

  // Accepts any callable invocable with no arguments; a result is discarded.
  // Small callables that can be moved without throwing are stored inline;
  // others go to the heap.
  template <class F>
  requires(!std::is_same_v<std::remove_cvref_t<F>, Closure> &&
           std::is_invocable_v<std::decay_t<F>&>)
      Closure(F&& f) {  // NOLINT(google-explicit-constructor): any callable is work.
    using Fn = std::decay_t<F>;
    if constexpr (std::is_pointer_v<std::remove_reference_t<F>> ||
                  std::is_member_pointer_v<std::remove_reference_t<F>>) {
      // A null function pointer stays an empty closure rather than a trap.
      if (f == nullptr) return;
    }
    if constexpr (fitsInline<Fn>()) {
      ::new (static_cast<void*>(storage_)) Fn(std::forward<F>(f));
      ops_ = &kInlineOps<Fn>;
    } else {
      ::new (static_cast<void*>(storage_)) Fn*(new Fn(std::forward<F>(f)));
      ops_ = &kHeapOps<Fn>;
    }
  }

  Closure(Closure&& other) noexcept { moveFrom(other); }
  Closure& operator=(Closure&& other) noexcept {
    if (this != &other) {
      reset();
      moveFrom(other);
    }
    return *this;
  }
  Closure(const Closure&) = delete;
  Closure& operator=(const Closure&) = delete;
  ~Closure() { reset(); }

  explicit operator bool() const { return ops_ != nullptr; }

  // Runs the callable. An exception escaping it ends the process: work has
  // no caller to report to.
  // REQUIRES: *this is not empty.
  void operator()() noexcept { ops_->invoke(storage_); }

  // Destroys the held callable (and what it captured) now.
  void reset() noexcept {
    if (ops_ != nullptr) {
      ops_->destroy(storage_);
      ops_ = nullptr;
    }
  }

  // Room for a lambda capturing a shared_ptr and a few references without
  // touching the heap.
  static constexpr std::size_t kInlineSize = 48;

 private:
  struct Ops {
    void (*invoke)(void* storage);
    void (*move)(void* dst, void* src) noexcept;  // leaves src destroyed
    void (*destroy)(void* storage) noexcept;
  };

  template <class Fn>
  static constexpr bool fitsInline() {
    return sizeof(Fn) <= kInlineSize && alignof(Fn) <= alignof(std::max_align_t) &&
           std::is_nothrow_move_constructible_v<Fn>;
  }

  template <class Fn>
  static constexpr Ops kInlineOps = {
      [](void* s) { std::invoke(*std::launder(static_cast<Fn*>(s))); },
      [](void* dst, void* src) noexcept {
        Fn* from = std::launder(static_cast<Fn*>(src));
        ::new (dst) Fn(std::move(*from));
        from->~Fn();
      },
      [](void* s) noexcept { std::launder(static_cast<Fn*>(s))->~Fn(); },
  };

  template <class Fn>
  static constexpr Ops kHeapOps = {
      [](void* s) { std::invoke(**std::launder(static_cast<Fn**>(s))); },
      [](void* dst, void* src) noexcept { ::new (dst) Fn*(*std::launder(static_cast<Fn**>(src))); },
      [](void* s) noexcept { delete *std::launder(static_cast<Fn**>(s)); },
  };

  void moveFrom(Closure& other) noexcept {
    if (other.ops_ != nullptr) {
      other.ops_->move(storage_, other.storage_);
      ops_ = other.ops_;
      other.ops_ = nullptr;
    }
  }

  alignas(std::max_align_t) unsigned char storage_[kInlineSize];
  const Ops* ops_ = nullptr;
};

}  // namespace platform::dispatch
