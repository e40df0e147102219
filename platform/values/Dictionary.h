// A dictionary from text keys to Values that keeps insertion order.
//
// Thread safety: a plain value type; not safe to mutate while others read.
//
// Small dictionaries are searched linearly; past a few entries a hash index
// is kept beside the entries so that look-ups stay O(1).
#pragma once

#include <cstdint>
#include <initializer_list>

#include "platform/values/Value.h"
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

class Value;

class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;

  Dictionary() = default;
  Dictionary(std::initializer_list<Entry> entries);

  std::size_t size() const { return entries_.size(); }
  bool empty() const { return entries_.empty(); }

  // The value under key, or none (nullptr).
  const Value* find(std::string_view key) const;
  bool contains(std::string_view key) const { return find(key) != nullptr; }
  // The value under key, or a none Value.
  const Value& get(std::string_view key) const;

  // Replaces the value in place (keeping its position) or appends the key.
  // Setting a none value removes the key.
  void set(std::string_view key, Value value);
  // Returns whether the key was present.
  bool remove(std::string_view key);
  // Makes room for `n` entries, so that a decoder that knows the count
  // appends without regrowing.
  void reserve(std::size_t n) { entries_.reserve(n); }

  auto begin() const { return entries_.begin(); }
  auto end() const { return entries_.end(); }
  const std::vector<Entry>& entries() const { return entries_; }
  std::vector<std::string> keys() const;

  // Order-insensitive, property-list equality of the values.
  bool operator==(const Dictionary& other) const;

 private:
  static constexpr std::size_t kIndexThreshold = 8;
  std::size_t indexOf(std::string_view key) const;  // size() when absent
  void rebuildIndex();
  void indexInsert(std::uint32_t position);

  std::vector<Entry> entries_;
  // Open addressing over positions + 1 (0 = empty slot); empty while small.
  std::vector<std::uint32_t> index_;
};

}  // namespace platform
