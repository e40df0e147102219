// Typed capture of one logging argument. The logging templates turn each
// argument into an Argument before formatting, so that the formatter sees the
// real type of every value (never C varargs) and can refuse a mismatch.
//
// Thread safety: an Argument is a plain value that refers to the caller's
// object; it is valid only while that object is, which is for the duration of
// the logging call that made it.
#pragma once

#include <array>
#include <concepts>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <string>
#include <string_view>
#include <type_traits>

#include "platform/values/Uuid.h"

namespace platform::log::internal {

enum class ArgumentKind : std::uint8_t {
  Signed,    // any signed integer, bool, char or enum with a signed base
  Unsigned,  // any unsigned integer or enum with an unsigned base
  Real,      // float, double, long double (as double)
  String,    // text: std::string, std::string_view, const char*
  Null,      // a null string, object or smart pointer
  Pointer,   // any other pointer, printed by %p
  Bytes,     // const std::uint8_t* (or unsigned char*): also read as 16 bytes by %{uuid_t}.16P
  Uuid,      // platform::Uuid or std::array<std::uint8_t, 16>
  Object,    // anything with a description() member, platform::Value included
};

// Short name for markers such as "<%d?string>".
const char* argumentKindName(ArgumentKind kind);

struct Argument {
  using Describe = std::string (*)(const void* object);

  ArgumentKind kind = ArgumentKind::Null;
  // Signed/Unsigned: sizeof the original type, so that %x of an int -1 shows
  // "ffffffff" as C programmers expect.
  std::uint8_t integerBytes = 0;
  union {
    std::int64_t signedValue;
    std::uint64_t unsignedValue;
    double realValue;
    const void* pointer;            // Pointer, Bytes; Object (the object)
    const std::uint8_t* uuidBytes;  // Uuid: 16 bytes
    const char* textData;           // String
  };
  std::size_t textSize = 0;     // String
  Describe describe = nullptr;  // Object

  Argument() : signedValue(0) {}
};

template <typename T>
concept Describable = requires(const T& t) {
  { t.description() } -> std::convertible_to<std::string>;
};

template <typename T>
inline constexpr bool kAlwaysFalse = false;

template <typename T>
struct SmartPointee {
  using type = void;
};
template <typename T>
struct SmartPointee<std::shared_ptr<T>> {
  using type = T;
};
template <typename T, typename D>
struct SmartPointee<std::unique_ptr<T, D>> {
  using type = T;
};

inline Argument makeNull() {
  return Argument();
}

// The pointee kinds a pointer may be "seen through" (so that %@ prints the
// object, and a null pointer prints "(null)").
template <typename T>
inline constexpr bool kSeeThrough =
    Describable<T> || std::is_same_v<T, std::string> || std::is_same_v<T, std::string_view>;

// REQUIRES: the value outlives the use of the returned Argument.
template <typename T>
Argument capture(const T& value) {
  using D = std::remove_cvref_t<T>;
  Argument a;
  if constexpr (std::is_same_v<D, bool>) {
    a.kind = ArgumentKind::Signed;
    a.integerBytes = 1;
    a.signedValue = value ? 1 : 0;
  } else if constexpr (std::is_enum_v<D>) {
    return capture(static_cast<std::underlying_type_t<D>>(value));
  } else if constexpr (std::is_integral_v<D> && std::is_signed_v<D>) {
    a.kind = ArgumentKind::Signed;
    a.integerBytes = sizeof(D);
    a.signedValue = static_cast<std::int64_t>(value);
  } else if constexpr (std::is_integral_v<D>) {
    a.kind = ArgumentKind::Unsigned;
    a.integerBytes = sizeof(D);
    a.unsignedValue = static_cast<std::uint64_t>(value);
  } else if constexpr (std::is_floating_point_v<D>) {
    a.kind = ArgumentKind::Real;
    a.realValue = static_cast<double>(value);
  } else if constexpr (std::is_same_v<D, std::nullptr_t>) {
    return makeNull();
  } else if constexpr (std::is_array_v<D> &&
                       std::is_same_v<std::remove_cv_t<std::remove_extent_t<D>>, char>) {
    // A literal or a fixed buffer: never read past its end.
    a.kind = ArgumentKind::String;
    a.textData = value;
    a.textSize = strnlen(value, std::extent_v<D>);
  } else if constexpr (std::is_same_v<D, const char*> || std::is_same_v<D, char*>) {
    if (value == nullptr) return makeNull();
    a.kind = ArgumentKind::String;
    a.textData = value;
    a.textSize = std::strlen(value);
  } else if constexpr (std::is_same_v<D, std::string> || std::is_same_v<D, std::string_view>) {
    a.kind = ArgumentKind::String;
    a.textData = value.data();
    a.textSize = value.size();
  } else if constexpr (std::is_same_v<D, platform::Uuid>) {
    a.kind = ArgumentKind::Uuid;
    a.uuidBytes = value.bytes.data();
  } else if constexpr (std::is_same_v<D, std::array<std::uint8_t, 16>>) {
    a.kind = ArgumentKind::Uuid;
    a.uuidBytes = value.data();
  } else if constexpr (Describable<D>) {
    a.kind = ArgumentKind::Object;
    a.pointer = &value;
    a.describe = [](const void* object) -> std::string {
      return static_cast<const D*>(object)->description();
    };
  } else if constexpr (!std::is_void_v<typename SmartPointee<D>::type>) {
    using P = std::remove_cv_t<typename SmartPointee<D>::type>;
    static_assert(kSeeThrough<P> || std::is_same_v<P, platform::Uuid>,
                  "a smart pointer argument must point to text, a Uuid or an object with "
                  "description()");
    if (!value) return makeNull();
    return capture(*value);
  } else if constexpr (std::is_pointer_v<D>) {
    using P = std::remove_cv_t<std::remove_pointer_t<D>>;
    if constexpr (kSeeThrough<P>) {
      if (value == nullptr) return makeNull();
      return capture(*value);
    } else {
      a.kind = std::is_same_v<P, unsigned char> ? ArgumentKind::Bytes : ArgumentKind::Pointer;
      a.pointer = static_cast<const void*>(value);
    }
  } else {
    static_assert(kAlwaysFalse<D>, "this type cannot be logged: give it a description() member");
  }
  return a;
}

}  // namespace platform::log::internal
