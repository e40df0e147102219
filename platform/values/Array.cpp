#include "platform/values/Array.h"

namespace platform {

Array::Array(std::initializer_list<Value> items) : items_(items) {}
Array::Array(std::vector<Value> items) : items_(std::move(items)) {}

const Value* Array::at(std::size_t index) const {
  return index < items_.size() ? &items_[index] : nullptr;
}

void Array::append(Value v) { items_.push_back(std::move(v)); }

bool Array::operator==(const Array& other) const { return items_ == other.items_; }

}  // namespace platform
