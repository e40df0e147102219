// A bridge between Values and libcbor, the independent CBOR implementation
// the codec is checked against and measured with. Only the public libcbor
// API is used.
//
// Thread safety: pure functions; the items they make are owned by the caller
// and not shared.
#pragma once

#include <cbor.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/values/Value.h"

namespace platform::cbor::oracle {

struct ItemDeleter {
  void operator()(cbor_item_t* item) const { cbor_decref(&item); }
};
using ItemPtr = std::unique_ptr<cbor_item_t, ItemDeleter>;

// libcbor's decoding of exactly `bytes`: null when it fails or when the item
// does not fill the input.
ItemPtr libcborLoad(std::span<const std::uint8_t> bytes);

// libcbor's serialization of `item`; empty when it fails.
std::vector<std::uint8_t> libcborSerialize(const cbor_item_t& item);

// The Value `item` stands for under the codec's mapping (same kinds, UTF-8
// text, text keys without duplicates, tags 1 and 37 only). None when the item
// is outside the mapping; *why then says where, if given.
std::optional<Value> valueFromItem(const cbor_item_t& item, std::string* why = nullptr);

enum class ItemWidths {
  kShortest,   // smallest integer items, 64-bit floats: the codec's own form
  kNarrowest,  // as kShortest, but reals exact as 32-bit floats written so
  kWidest,     // 64-bit integer items everywhere
};

// A libcbor item built with libcbor's constructors for `value`; null when
// `value` holds a none anywhere.
ItemPtr itemFromValue(const Value& value, ItemWidths widths = ItemWidths::kShortest);

// None when `item` has exactly the structure of `value` (kinds, order of
// keys, every number and byte; any NaN matches any NaN); otherwise the path
// and nature of the first difference. Walks both trees side by side.
std::optional<std::string> itemMismatch(const cbor_item_t& item, const Value& value);

}  // namespace platform::cbor::oracle
