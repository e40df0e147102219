// Status-or-value returns: a Result<T> holds either a T or an Error, and
// Status (Result<void>) holds nothing or an Error.
//
// Thread safety: a plain value type.
#pragma once

#include <cassert>
#include <utility>
#include <variant>

#include "platform/values/Error.h"

namespace platform {

template <typename T>
class [[nodiscard]] Result {
 public:
  Result(T value) : v_(std::in_place_index<0>, std::move(value)) {}
  Result(Error error) : v_(std::in_place_index<1>, std::move(error)) {}

  bool ok() const { return v_.index() == 0; }
  explicit operator bool() const { return ok(); }

  // REQUIRES: ok().
  T& value() & { assert(ok()); return std::get<0>(v_); }
  const T& value() const& { assert(ok()); return std::get<0>(v_); }
  T&& value() && { assert(ok()); return std::get<0>(std::move(v_)); }
  T* operator->() { return &value(); }
  const T* operator->() const { return &value(); }
  T& operator*() & { return value(); }
  const T& operator*() const& { return value(); }

  // REQUIRES: !ok().
  const Error& error() const { assert(!ok()); return std::get<1>(v_); }

  T valueOr(T fallback) const& { return ok() ? std::get<0>(v_) : std::move(fallback); }

 private:
  std::variant<T, Error> v_;
};

template <>
class [[nodiscard]] Result<void> {
 public:
  Result() = default;
  Result(Error error) : error_(std::move(error)) {}

  bool ok() const { return !error_; }
  explicit operator bool() const { return ok(); }
  // REQUIRES: !ok().
  const Error& error() const { assert(!ok()); return *error_; }

 private:
  std::optional<Error> error_;
};

using Status = Result<void>;

inline Status okStatus() { return Status(); }

}  // namespace platform
