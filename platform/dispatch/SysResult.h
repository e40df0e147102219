// The outcome of an operation that needs a resource from the kernel (a file
// descriptor, a watch): the value, or the errno and the call that failed.
//
// Thread safety: a plain value.
#pragma once

#include <cstring>
#include <string>
#include <utility>
#include <variant>

namespace platform::dispatch {

template <class T>
class SysResult {
 public:
  static SysResult success(T value) { return SysResult(std::move(value)); }
  // REQUIRES: code != 0; `operation` is a string literal such as "epoll_ctl".
  static SysResult failure(int code, const char* operation) {
    return SysResult(Failure{code, operation});
  }

  bool ok() const { return state_.index() == 0; }
  explicit operator bool() const { return ok(); }

  // REQUIRES: ok().
  T& value() & { return std::get<0>(state_); }
  const T& value() const& { return std::get<0>(state_); }
  T&& value() && { return std::get<0>(std::move(state_)); }

  // The errno, or 0 when ok().
  int error() const { return ok() ? 0 : std::get<1>(state_).code; }
  // "epoll_ctl: Bad file descriptor", or "" when ok().
  std::string message() const {
    if (ok()) return std::string();
    const Failure& f = std::get<1>(state_);
    return std::string(f.operation) + ": " + std::strerror(f.code);
  }

 private:
  struct Failure {
    int code;
    const char* operation;
  };
  explicit SysResult(T value) : state_(std::in_place_index<0>, std::move(value)) {}
  explicit SysResult(Failure failure) : state_(std::in_place_index<1>, failure) {}

  std::variant<T, Failure> state_;
};

}  // namespace platform::dispatch
