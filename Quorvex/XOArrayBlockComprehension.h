// Array comprehension: map a collection through a callback, keeping the
// results that are not none.
//
// Thread safety: pure; REQUIRES: the collection does not change while this runs.
#pragma once

#include <memory>
#include <optional>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/values/Value.h"

namespace internal_comprehension {
template <typename T>
struct IsOptional : std::false_type {};
template <typename T>
struct IsOptional<std::optional<T>> : std::true_type {};
template <typename T>
struct IsSharedPtr : std::false_type {};
template <typename T>
struct IsSharedPtr<std::shared_ptr<T>> : std::true_type {};
}  // namespace internal_comprehension

// Calls `block` with each element in the collection's order and appends each
// result that is not none:
// - a block answering platform::Value gives a platform::Array (none skipped);
// - a block answering std::optional<T> gives std::vector<T> (nullopt skipped);
// - a block answering std::shared_ptr<T> gives a vector of them (null skipped).
template <typename Collection, typename Block>
auto arrayWithValuesInBlock(const Collection& collection, Block&& block) {
  using Element = decltype(*std::begin(collection));
  using R = std::decay_t<std::invoke_result_t<Block&, Element>>;
  if constexpr (std::is_same_v<R, platform::Value>) {
    platform::Array out;
    for (const auto& element : collection) {
      platform::Value v = block(element);
      if (!v.isNone()) out.append(std::move(v));
    }
    return out;
  } else if constexpr (internal_comprehension::IsOptional<R>::value) {
    std::vector<typename R::value_type> out;
    for (const auto& element : collection) {
      R v = block(element);
      if (v) out.push_back(std::move(*v));
    }
    return out;
  } else {
    static_assert(internal_comprehension::IsSharedPtr<R>::value,
                  "the block must answer a Value, an optional or a shared_ptr");
    std::vector<R> out;
    for (const auto& element : collection) {
      R v = block(element);
      if (v) out.push_back(std::move(v));
    }
    return out;
  }
}
