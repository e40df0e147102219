#include "platform/vmap/internal/BinaryForm.h"

#include <charconv>
#include <optional>
#include <string_view>
#include <vector>

#include "platform/cbor/Cbor.h"
#include "platform/vmap/Format.h"
#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/Utf8.h"
#include "platform/vmap/internal/ValuePath.h"

namespace platform::vmap::internal {
namespace {

ErrorCode vmapCodeOf(cbor::ErrorCode code) {
  switch (code) {
    case cbor::ErrorCode::kTooDeep: return ErrorCode::TooDeep;
    case cbor::ErrorCode::kTooManyItems: return ErrorCode::TooManyItems;
    case cbor::ErrorCode::kTooLarge: return ErrorCode::TooLarge;
    case cbor::ErrorCode::kDuplicateKey: return ErrorCode::DuplicateKey;
    default: return ErrorCode::BadBinary;
  }
}

// The codec counts offsets from the start of the CBOR item, in its messages
// too; a document's offsets count from the start of the file, magic included.
std::string shiftOffsets(std::string_view message) {
  constexpr std::string_view kWord = "offset ";
  std::string out;
  std::size_t at = 0;
  for (std::size_t found; (found = message.find(kWord, at)) != std::string_view::npos;) {
    std::size_t end = found + kWord.size();
    std::uint64_t n = 0;
    auto [digitsEnd, ec] = std::from_chars(message.data() + end, message.data() + message.size(), n);
    out.append(message.substr(at, end - at));
    if (ec == std::errc()) {
      out += std::to_string(n + kBinaryMagic.size());
      end = static_cast<std::size_t>(digitsEnd - message.data());
    }
    at = end;
  }
  out.append(message.substr(at));
  return out;
}

Error documentError(const Error& cborError) {
  const std::optional<std::uint64_t> offset = cbor::errorOffsetOf(cborError);
  const std::optional<cbor::ErrorCode> code = cbor::errorCodeOf(cborError);
  const ErrorCode vmapCode = code ? vmapCodeOf(*code) : ErrorCode::BadBinary;
  std::string what = shiftOffsets(cborError.description());
  if (!offset) return errorPlain(vmapCode, what);
  const std::uint64_t fileOffset = *offset + kBinaryMagic.size();
  // The location leads the message; a trailing repeat of it goes.
  const std::string suffix = " at offset " + std::to_string(fileOffset);
  if (what.ends_with(suffix)) what.resize(what.size() - suffix.size());
  return errorAtOffset(vmapCode, fileOffset, what);
}

// What the codec would refuse, found first so that the message names the
// value the way the XML writer does, and the depth the codec does not check.
// Thread safety: one per call of writeBinary; never shared.
class WritableCheck {
 public:
  explicit WritableCheck(const WriteLimits& limits) : limits_(limits) {}

  std::optional<Error> run(const Value& value) {
    check(value);
    return std::move(error_);
  }

 private:
  bool fail(ErrorCode code, const std::string& what) {
    error_ = errorPlain(code, path_.describe() + ": " + what);
    return false;
  }

  bool checkText(std::string_view text) {
    const std::size_t bad = findInvalidUtf8(text);
    if (bad == text.size()) return true;
    return fail(ErrorCode::NotRepresentable,
                "invalid UTF-8 at byte " + std::to_string(bad) + " of the text");
  }

  bool check(const Value& value) {
    switch (value.type()) {
      case ValueType::None:
        return fail(ErrorCode::NotRepresentable, "a none value cannot be written");
      case ValueType::String:
        return checkText(*value.string());
      case ValueType::Dictionary:
      case ValueType::Array: {
        if (++depth_ > limits_.maxDepth)
          return fail(ErrorCode::TooDeep,
                      "containers nested deeper than " + std::to_string(limits_.maxDepth));
        if (const Array* a = value.array()) {
          for (std::size_t i = 0; i < a->size(); ++i) {
            path_.pushIndex(i);
            if (!check((*a)[i])) return false;
            path_.pop();
          }
        } else {
          for (const auto& [key, item] : *value.dictionary()) {
            path_.pushKey(key);
            if (!checkText(key) || !check(item)) return false;
            path_.pop();
          }
        }
        --depth_;
        return true;
      }
      default:
        return true;
    }
  }

  const WriteLimits& limits_;
  ValuePath path_;
  std::size_t depth_ = 0;
  std::optional<Error> error_;
};

}  // namespace

Result<Value> readBinary(std::span<const std::uint8_t> bytes, const ReadLimits& limits) {
  cbor::DecodeLimits cborLimits;
  cborLimits.maxBytes = limits.maxBytes;
  cborLimits.maxDepth = limits.maxDepth;
  cborLimits.maxItems = limits.maxItems;
  Result<Value> value = cbor::decode(bytes.subspan(kBinaryMagic.size()), cborLimits);
  if (!value.ok()) return documentError(value.error());
  return value;
}

Result<std::string> writeBinary(const Value& value, const WriteLimits& limits) {
  if (std::optional<Error> error = WritableCheck(limits).run(value)) return *error;
  std::vector<std::uint8_t> bytes(kBinaryMagic.begin(), kBinaryMagic.end());
  Status status = cbor::encode(value, bytes);
  if (!status.ok())
    return errorPlain(ErrorCode::NotRepresentable, status.error().description());
  return std::string(bytes.begin(), bytes.end());
}

}  // namespace platform::vmap::internal
