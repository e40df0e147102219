#include "platform/cbor/internal/Encoder.h"

#include <algorithm>
#include <bit>
#include <cstring>

#include "platform/cbor/internal/Failure.h"
#include "platform/cbor/internal/Head.h"
#include "platform/cbor/internal/Utf8.h"

namespace platform::cbor::internal {

std::uint8_t* Encoder::room(std::size_t size) {
  if (out_.size() - used_ < size) [[unlikely]]
    out_.resize(std::max(out_.size() * 2, used_ + size + 64));
  std::uint8_t* at = out_.data() + used_;
  used_ += size;
  return at;
}

void Encoder::writeHead(std::uint8_t major, std::uint64_t argument) {
  std::uint8_t* at = room(kMaxHeadSize);
  used_ -= kMaxHeadSize - internal::writeHead(major, argument, at);
}

void Encoder::writeBytes(const void* bytes, std::size_t size) {
  if (size != 0) std::memcpy(room(size), bytes, size);
}

void Encoder::writeByte(std::uint8_t byte) {
  *room(1) = byte;
}

void Encoder::writeDouble(double d) {
  std::uint8_t* at = room(kMaxHeadSize);
  at[0] = (kMajorSimple << 5) | kFloat64;
  storeBig64(std::bit_cast<std::uint64_t>(d), at + 1);
}

bool Encoder::writeText(std::string_view text) {
  const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
  // What we write must be something we would read back.
  if (firstInvalidUtf8(bytes, text.size()) != text.size()) {
    failure_ = ErrorCode::kInvalidUtf8;
    failureWhat_ = "string is not valid UTF-8";
    return false;
  }
  writeHead(kMajorText, text.size());
  writeBytes(bytes, text.size());
  return true;
}

bool Encoder::writeValue(const Value& value) {
  switch (value.type()) {
    case ValueType::None:
      failure_ = ErrorCode::kUnencodableValue;
      failureWhat_ = "a none value cannot be encoded";
      return false;
    case ValueType::Dictionary: {
      const Dictionary* d = value.dictionary();
      writeHead(kMajorMap, d->size());
      if (!d->empty()) stack_.push_back(Frame{nullptr, d, 0});
      return true;
    }
    case ValueType::Array: {
      const Array* a = value.array();
      writeHead(kMajorArray, a->size());
      if (!a->empty()) stack_.push_back(Frame{a, nullptr, 0});
      return true;
    }
    case ValueType::String:
      return writeText(*value.string());
    case ValueType::Integer: {
      const std::int64_t i = *value.int64();
      // For negatives the argument is -1 - i, which is ~i in two's complement.
      if (i >= 0)
        writeHead(kMajorUnsigned, static_cast<std::uint64_t>(i));
      else
        writeHead(kMajorNegative, ~static_cast<std::uint64_t>(i));
      return true;
    }
    case ValueType::Unsigned:
      writeHead(kMajorUnsigned, *value.uint64());
      return true;
    case ValueType::Real:
      writeDouble(*value.real());
      return true;
    case ValueType::Boolean:
      writeByte((kMajorSimple << 5) | (*value.boolean() ? kSimpleTrue : kSimpleFalse));
      return true;
    case ValueType::Date:
      writeHead(kMajorTag, kTagEpochDate);
      writeDouble(value.date()->secondsSince1970);
      return true;
    case ValueType::Data: {
      const Data* data = value.data();
      writeHead(kMajorBytes, data->size());
      writeBytes(data->data(), data->size());
      return true;
    }
    case ValueType::Uuid: {
      writeHead(kMajorTag, kTagUuid);
      writeHead(kMajorBytes, kUuidSize);
      writeBytes(value.uuid()->bytes.data(), kUuidSize);
      return true;
    }
  }
  failure_ = ErrorCode::kUnencodableValue;
  failureWhat_ = "a value of unknown kind cannot be encoded";
  return false;
}

std::string Encoder::currentPath() const {
  std::string path;
  for (const Frame& frame : stack_) {
    path.push_back('/');
    if (frame.array)
      path.append(std::to_string(frame.next - 1));
    else
      path.append(frame.dictionary->entries()[frame.next - 1].first);
  }
  return path.empty() ? "/" : path;
}

bool Encoder::writeTree(const Value& root) {
  const Value* value = &root;
  for (;;) {
    if (!writeValue(*value)) return false;
    // Find the next value to write: the next child of the innermost
    // container that has one left, writing dictionary keys on the way.
    value = nullptr;
    while (!stack_.empty()) {
      Frame& top = stack_.back();
      if (top.array) {
        if (top.next < top.array->size()) {
          value = &(*top.array)[top.next++];
          break;
        }
      } else if (top.next < top.dictionary->size()) {
        const Dictionary::Entry& entry = top.dictionary->entries()[top.next++];
        if (!writeText(entry.first)) return false;
        value = &entry.second;
        break;
      }
      stack_.pop_back();
    }
    if (!value) return true;
  }
}

Status Encoder::run(const Value& root) {
  const std::size_t start = out_.size();
  used_ = start;
  if (writeTree(root)) {
    out_.resize(used_);
    return okStatus();
  }
  out_.resize(start);
  // A failing container was already pushed only if it was written, so the
  // path is that of the failing value (or key) itself.
  return encodeFailure(failure_, failureWhat_ + " (at " + currentPath() + ")");
}

Status Encoder::runMap(const Dictionary& entries, std::span<const EncodedEntry> encoded) {
  const std::size_t start = out_.size();
  used_ = start;
  writeHead(kMajorMap, entries.size() + encoded.size());
  std::string_view failedKey;
  bool written = true;
  for (const auto& [key, value] : entries) {
    failedKey = key;
    if (!writeText(key) || !writeTree(value)) {
      written = false;
      break;
    }
  }
  if (written) {
    for (const auto& [key, value] : encoded) {
      failedKey = key;
      if (!writeText(key)) {
        written = false;
        break;
      }
      writeBytes(value.bytes().data(), value.size());
    }
  }
  if (written) {
    out_.resize(used_);
    return okStatus();
  }
  out_.resize(start);
  const std::string below = stack_.empty() ? std::string() : currentPath();
  return encodeFailure(failure_, failureWhat_ + " (at /" + std::string(failedKey) + below + ")");
}

}  // namespace platform::cbor::internal
