// An ordered list of Values.
//
// Thread safety: a plain value type; not safe to mutate while others read.
#pragma once

#include <initializer_list>

#include "platform/values/Value.h"
#include <vector>

namespace platform {

class Value;

class Array {
 public:
  Array() = default;
  Array(std::initializer_list<Value> items);
  explicit Array(std::vector<Value> items);

  std::size_t size() const { return items_.size(); }
  bool empty() const { return items_.empty(); }
  // REQUIRES: index < size().
  const Value& operator[](std::size_t index) const { return items_[index]; }
  // Out of range: none.
  const Value* at(std::size_t index) const;

  void append(Value v);
  void reserve(std::size_t n) { items_.reserve(n); }

  auto begin() const { return items_.begin(); }
  auto end() const { return items_.end(); }
  const std::vector<Value>& items() const { return items_; }

  bool operator==(const Array& other) const;

 private:
  std::vector<Value> items_;
};

}  // namespace platform
