#include "platform/values/Dictionary.h"

#include <functional>

namespace platform {
namespace {

std::size_t keyHash(std::string_view key) { return std::hash<std::string_view>{}(key); }

}  // namespace

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  for (const auto& e : entries) set(e.first, e.second);
}

std::size_t Dictionary::indexOf(std::string_view key) const {
  if (index_.empty()) {
    for (std::size_t i = 0; i < entries_.size(); ++i)
      if (entries_[i].first == key) return i;
    return entries_.size();
  }
  const std::size_t mask = index_.size() - 1;
  for (std::size_t slot = keyHash(key) & mask;; slot = (slot + 1) & mask) {
    std::uint32_t pos = index_[slot];
    if (pos == 0) return entries_.size();
    if (entries_[pos - 1].first == key) return pos - 1;
  }
}

const Value* Dictionary::find(std::string_view key) const {
  std::size_t i = indexOf(key);
  return i < entries_.size() ? &entries_[i].second : nullptr;
}

const Value& Dictionary::get(std::string_view key) const {
  static const Value kNone;
  const Value* v = find(key);
  return v ? *v : kNone;
}

void Dictionary::indexInsert(std::uint32_t position) {
  const std::size_t mask = index_.size() - 1;
  std::size_t slot = keyHash(entries_[position].first) & mask;
  while (index_[slot] != 0) slot = (slot + 1) & mask;
  index_[slot] = position + 1;
}

void Dictionary::rebuildIndex() {
  index_.clear();
  if (entries_.size() <= kIndexThreshold) return;
  std::size_t capacity = 16;
  while (capacity < entries_.size() * 2) capacity *= 2;
  index_.assign(capacity, 0);
  for (std::uint32_t i = 0; i < entries_.size(); ++i) indexInsert(i);
}

void Dictionary::set(std::string_view key, Value value) {
  if (value.isNone()) {
    remove(key);
    return;
  }
  std::size_t i = indexOf(key);
  if (i < entries_.size()) {
    entries_[i].second = std::move(value);
    return;
  }
  entries_.emplace_back(std::string(key), std::move(value));
  // Keep the table at most half full; growing rebuilds it whole.
  if (entries_.size() > kIndexThreshold && entries_.size() * 2 > index_.size()) {
    rebuildIndex();
  } else if (!index_.empty()) {
    indexInsert(static_cast<std::uint32_t>(entries_.size() - 1));
  }
}

bool Dictionary::remove(std::string_view key) {
  std::size_t i = indexOf(key);
  if (i == entries_.size()) return false;
  entries_.erase(entries_.begin() + static_cast<std::ptrdiff_t>(i));
  rebuildIndex();
  return true;
}

std::vector<std::string> Dictionary::keys() const {
  std::vector<std::string> out;
  out.reserve(entries_.size());
  for (const auto& e : entries_) out.push_back(e.first);
  return out;
}

bool Dictionary::operator==(const Dictionary& other) const {
  if (entries_.size() != other.entries_.size()) return false;
  for (const auto& e : entries_) {
    const Value* v = other.find(e.first);
    if (!v || !(*v == e.second)) return false;
  }
  return true;
}

}  // namespace platform
