#include "platform/cbor/internal/Decoder.h"

#include <algorithm>
#include <bit>
#include <cstdint>
#include <limits>
#include <utility>

#include "platform/cbor/internal/Failure.h"
#include "platform/cbor/internal/Floats.h"
#include "platform/cbor/internal/Head.h"
#include "platform/cbor/internal/Utf8.h"

namespace platform::cbor::internal {
namespace {

constexpr std::uint64_t kMaxInt64 =
    static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());

std::string at(std::size_t offset) {
  return " at offset " + std::to_string(offset);
}
std::string str(std::uint64_t n) {
  return std::to_string(n);
}

}  // namespace

Decoder::Decoder(std::span<const std::uint8_t> input, const DecodeLimits& limits)
    : data_(input.data()), size_(input.size()), limits_(limits) {}

template <typename Describe>
bool Decoder::fail(ErrorCode code, std::size_t offset, Describe&& describe) {
  error_ = decodeFailure(code, offset, describe());
  return false;
}

inline bool Decoder::countItem(std::size_t offset) {
  if (++items_ <= limits_.maxItems) [[likely]]
    return true;
  return fail(ErrorCode::kTooManyItems, offset,
              [&] { return "more than " + str(limits_.maxItems) + " items" + at(offset); });
}

inline bool Decoder::readHead(Head& head) {
  head.offset = pos_;
  if (pos_ >= size_) [[unlikely]]
    return fail(ErrorCode::kTruncated, pos_,
                [&] { return "input ends where an item should start" + at(pos_); });
  const std::uint8_t initial = data_[pos_++];
  head.major = initial >> 5;
  head.info = initial & 0x1F;
  if (head.info < kInfoOneByte) [[likely]] {
    head.argument = head.info;
    return true;
  }
  const std::size_t width =
      head.info <= kInfoEightBytes ? std::size_t{1} << (head.info - kInfoOneByte) : 0;
  if (width == 0) [[unlikely]] {
    if (head.info == kInfoIndefinite && head.major == kMajorSimple)
      return fail(ErrorCode::kIndefiniteLength, head.offset,
                  [&] { return "break code outside an indefinite-length item" + at(head.offset); });
    if (head.info == kInfoIndefinite && head.major >= kMajorBytes && head.major <= kMajorMap)
      return fail(ErrorCode::kIndefiniteLength, head.offset, [&] {
        return std::string("indefinite-length item (") + majorPhrase(head.major) + ")" +
               at(head.offset);
      });
    return fail(ErrorCode::kMalformedHead, head.offset, [&] {
      return "reserved additional information " + str(head.info) + " in the head of " +
             majorPhrase(head.major) + at(head.offset);
    });
  }
  if (size_ - pos_ < width) [[unlikely]]
    return fail(ErrorCode::kTruncated, head.offset,
                [&] { return "input ends inside the head" + at(head.offset); });
  const std::uint8_t* p = data_ + pos_;
  switch (width) {
    case 1:
      head.argument = p[0];
      break;
    case 2:
      head.argument = loadBig16(p);
      break;
    case 4:
      head.argument = loadBig32(p);
      break;
    default:
      head.argument = loadBig64(p);
      break;
  }
  pos_ += width;
  return true;
}

inline bool Decoder::takePayload(const Head& head, const std::uint8_t*& payload) {
  if (head.argument > size_ - pos_) [[unlikely]]
    return fail(ErrorCode::kTruncated, head.offset, [&] {
      return std::string(head.major == kMajorText ? "text" : "byte") + " string" + at(head.offset) +
             " declares " + str(head.argument) + " bytes but " + str(size_ - pos_) + " remain";
    });
  payload = data_ + pos_;
  pos_ += static_cast<std::size_t>(head.argument);
  return true;
}

inline bool Decoder::takeText(const Head& head, std::string_view& text) {
  const std::uint8_t* payload = nullptr;
  if (!takePayload(head, payload)) return false;
  const std::size_t length = static_cast<std::size_t>(head.argument);
  const std::size_t bad = firstInvalidUtf8(payload, length);
  if (bad != length) [[unlikely]] {
    const std::size_t offset = static_cast<std::size_t>(payload - data_) + bad;
    return fail(ErrorCode::kInvalidUtf8, offset, [&] {
      return "invalid UTF-8" + at(offset) + " in the text string" + at(head.offset);
    });
  }
  text = std::string_view(reinterpret_cast<const char*>(payload), length);
  return true;
}

bool Decoder::readKey(Frame& frame) {
  Head head;
  if (!readHead(head) || !countItem(head.offset)) return false;
  if (head.major != kMajorText) [[unlikely]]
    return fail(ErrorCode::kNonTextKey, head.offset, [&] {
      return std::string("map key") + at(head.offset) + " is " + majorPhrase(head.major) +
             ", not a text string";
    });
  frame.keyOffset = head.offset;
  return takeText(head, frame.key);
}

bool Decoder::openContainer(const Head& head) {
  const bool isMap = head.major == kMajorMap;
  if (stack_.size() >= limits_.maxDepth) [[unlikely]]
    return fail(ErrorCode::kTooDeep, head.offset,
                [&] { return "nesting deeper than " + str(limits_.maxDepth) + at(head.offset); });
  // Every element takes at least one byte and every pair two, so a count the
  // rest of the input cannot hold is refused before anything is reserved.
  const std::size_t left = size_ - pos_;
  if (head.argument > (isMap ? left / 2 : left)) [[unlikely]]
    return fail(ErrorCode::kTruncated, head.offset, [&] {
      return std::string(isMap ? "map" : "array") + at(head.offset) + " declares " +
             str(head.argument) + (isMap ? " pairs" : " elements") + " but only " + str(left) +
             " bytes remain";
    });
  // Likewise for the item limit: these items will all be counted.
  const std::uint64_t items = isMap ? head.argument * 2 : head.argument;
  if (items > limits_.maxItems - std::min(items_, limits_.maxItems)) [[unlikely]]
    return fail(ErrorCode::kTooManyItems, head.offset,
                [&] { return "more than " + str(limits_.maxItems) + " items" + at(head.offset); });
  Frame& frame = stack_.emplace_back();
  frame.remaining = head.argument;
  frame.isMap = isMap;
  frame.offset = head.offset;
  if (isMap) {
    frame.entries.reserve(static_cast<std::size_t>(head.argument));
  } else {
    frame.elements.reserve(static_cast<std::size_t>(head.argument));
  }
  return true;
}

bool Decoder::readSimple(const Head& head, Value& out) {
  switch (head.info) {
    case kSimpleFalse:
      out = Value(false);
      return true;
    case kSimpleTrue:
      out = Value(true);
      return true;
    case kFloat16:
      out = Value(halfToDouble(static_cast<std::uint16_t>(head.argument)));
      return true;
    case kFloat32:
      out = Value(singleToDouble(static_cast<std::uint32_t>(head.argument)));
      return true;
    case kFloat64:
      out = Value(std::bit_cast<double>(head.argument));
      return true;
    default:
      break;
  }
  return fail(ErrorCode::kUnsupportedSimpleValue, head.offset, [&] {
    const char* name = head.argument == kSimpleNull        ? " (null)"
                       : head.argument == kSimpleUndefined ? " (undefined)"
                                                           : "";
    return "unsupported simple value " + str(head.argument) + name + at(head.offset);
  });
}

bool Decoder::readTagged(const Head& tag, Value& out) {
  if (tag.argument != kTagEpochDate && tag.argument != kTagUuid) [[unlikely]]
    return fail(ErrorCode::kUnsupportedTag, tag.offset,
                [&] { return "unsupported tag " + str(tag.argument) + at(tag.offset); });
  Head content;
  if (!readHead(content)) return false;
  if (tag.argument == kTagUuid) {
    if (content.major != kMajorBytes) [[unlikely]]
      return fail(ErrorCode::kBadTagContent, tag.offset, [&] {
        return std::string("UUID tag") + at(tag.offset) + " encloses " +
               majorPhrase(content.major) + ", not a byte string";
      });
    const std::uint8_t* payload = nullptr;
    if (!takePayload(content, payload)) return false;
    if (content.argument != kUuidSize) [[unlikely]]
      return fail(ErrorCode::kBadUuidLength, tag.offset, [&] {
        return "UUID" + at(tag.offset) + " has " + str(content.argument) + " bytes, not 16";
      });
    out = Value(Uuid::fromBytes(payload));
    return true;
  }
  const bool isFloat =
      content.major == kMajorSimple &&
      (content.info == kFloat16 || content.info == kFloat32 || content.info == kFloat64);
  if (content.major != kMajorUnsigned && content.major != kMajorNegative && !isFloat) [[unlikely]]
    return fail(ErrorCode::kBadTagContent, tag.offset, [&] {
      return std::string("date tag") + at(tag.offset) + " encloses " + majorPhrase(content.major) +
             ", not a number";
    });
  // Content is a number now, so this cannot come back here: no recursion.
  Value seconds;
  if (!readLeaf(content, seconds)) return false;
  out = Value(Date{*seconds.real()});
  return true;
}

bool Decoder::readLeaf(const Head& head, Value& out) {
  switch (head.major) {
    case kMajorUnsigned:
      if (head.argument <= kMaxInt64)
        out = Value(static_cast<std::int64_t>(head.argument));
      else
        out = Value(static_cast<std::uint64_t>(head.argument));
      return true;
    case kMajorNegative:
      if (head.argument > kMaxInt64) [[unlikely]]
        return fail(ErrorCode::kIntegerOutOfRange, head.offset,
                    [&] { return "negative integer below INT64_MIN" + at(head.offset); });
      // -1 - n, which cannot overflow for n <= INT64_MAX.
      out = Value(-1 - static_cast<std::int64_t>(head.argument));
      return true;
    case kMajorBytes: {
      const std::uint8_t* payload = nullptr;
      if (!takePayload(head, payload)) return false;
      out = Value(Data(payload, payload + head.argument));
      return true;
    }
    case kMajorText: {
      std::string_view text;
      if (!takeText(head, text)) return false;
      out = Value(text);
      return true;
    }
    case kMajorTag:
      return readTagged(head, out);
    default:
      return readSimple(head, out);
  }
}

Result<Value> Decoder::run() {
  if (size_ > limits_.maxBytes) {
    fail(ErrorCode::kTooLarge, limits_.maxBytes, [&] {
      return "input of " + str(size_) + " bytes exceeds the limit of " + str(limits_.maxBytes) +
             at(limits_.maxBytes);
    });
    return std::move(*error_);
  }
  Value value;
  for (;;) {
    // A map always wants its next key first: values are read straight
    // after their key, and an opened container becomes the top frame.
    if (!stack_.empty() && stack_.back().isMap && !readKey(stack_.back()))
      return std::move(*error_);
    Head head;
    if (!readHead(head) || !countItem(head.offset)) return std::move(*error_);
    if (head.major == kMajorArray || head.major == kMajorMap) {
      if (!openContainer(head)) return std::move(*error_);
      if (head.argument != 0) continue;
      value = stack_.back().isMap ? Value(Dictionary()) : Value(Array());
      stack_.pop_back();
    } else if (!readLeaf(head, value)) {
      return std::move(*error_);
    }
    // Hand the finished value to its container, closing every container it
    // completes on the way up.
    for (;;) {
      if (stack_.empty()) {
        if (pos_ != size_) [[unlikely]] {
          fail(ErrorCode::kTrailingBytes, pos_,
               [&] { return str(size_ - pos_) + " trailing bytes after the item" + at(pos_); });
          return std::move(*error_);
        }
        return value;
      }
      Frame& top = stack_.back();
      if (top.isMap) {
        const std::size_t before = top.entries.size();
        top.entries.set(top.key, std::move(value));
        if (top.entries.size() == before) [[unlikely]] {
          fail(ErrorCode::kDuplicateKey, top.keyOffset,
               [&] { return "duplicate map key " + quoteForMessage(top.key) + at(top.keyOffset); });
          return std::move(*error_);
        }
      } else {
        top.elements.push_back(std::move(value));
      }
      if (--top.remaining != 0) break;
      value = top.isMap ? Value(std::move(top.entries)) : Value(Array(std::move(top.elements)));
      stack_.pop_back();
    }
  }
}

}  // namespace platform::cbor::internal
