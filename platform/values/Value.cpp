#include "platform/values/Value.h"

#include <chrono>
#include <cmath>
#include <cstring>
#include <functional>
#include <limits>

namespace platform {
namespace {

constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

// A number reduced to the form in which equal numbers look alike: integral
// values as (sign, magnitude) pairs, everything else as a double.
struct Numeric {
  enum Kind { kNegative, kNonNegative, kFraction } kind;
  std::uint64_t magnitude = 0;  // kNegative: the int64 value's bits
  double real = 0;
};

Numeric numericOf(bool b) { return {Numeric::kNonNegative, b ? 1u : 0u, 0}; }
Numeric numericOf(std::int64_t i) {
  if (i < 0) return {Numeric::kNegative, static_cast<std::uint64_t>(i), 0};
  return {Numeric::kNonNegative, static_cast<std::uint64_t>(i), 0};
}
Numeric numericOf(std::uint64_t u) { return {Numeric::kNonNegative, u, 0}; }
Numeric numericOf(double d) {
  if (std::isfinite(d) && std::floor(d) == d) {
    if (d >= 0 && d < kTwoTo64) return {Numeric::kNonNegative, static_cast<std::uint64_t>(d), 0};
    if (d < 0 && d >= -kTwoTo63)
      return {Numeric::kNegative, static_cast<std::uint64_t>(static_cast<std::int64_t>(d)), 0};
  }
  return {Numeric::kFraction, 0, d};
}

bool sameNumeric(const Numeric& a, const Numeric& b) {
  if (a.kind != b.kind) return false;
  if (a.kind == Numeric::kFraction) return a.real == b.real || (a.real != a.real && b.real != b.real);
  return a.magnitude == b.magnitude;
}

std::size_t mix(std::size_t h) {
  std::uint64_t x = h;
  x ^= x >> 33;
  x *= 0xff51afd7ed558ccdull;
  x ^= x >> 33;
  return static_cast<std::size_t>(x);
}

}  // namespace

Date Date::now() {
  auto since = std::chrono::system_clock::now().time_since_epoch();
  return Date{std::chrono::duration<double>(since).count()};
}

const char* valueTypeName(ValueType type) {
  switch (type) {
    case ValueType::None: return "none";
    case ValueType::Dictionary: return "dictionary";
    case ValueType::Array: return "array";
    case ValueType::String: return "string";
    case ValueType::Integer: return "integer";
    case ValueType::Unsigned: return "unsigned integer";
    case ValueType::Real: return "real";
    case ValueType::Boolean: return "boolean";
    case ValueType::Date: return "date";
    case ValueType::Data: return "data";
    case ValueType::Uuid: return "uuid";
  }
  return "unknown";
}

Value::Value(const char* s) : v_(std::make_shared<const std::string>(s ? s : "")) {}
Value::Value(std::string_view s) : v_(std::make_shared<const std::string>(s)) {}
Value::Value(std::string s) : v_(std::make_shared<const std::string>(std::move(s))) {}
Value::Value(Data d) : v_(std::make_shared<const Data>(std::move(d))) {}
Value::Value(Array a) : v_(std::make_shared<const Array>(std::move(a))) {}
Value::Value(Dictionary d) : v_(std::make_shared<const Dictionary>(std::move(d))) {}

Value::Value(std::shared_ptr<const Dictionary> d) {
  if (d) v_ = std::move(d);
}

ValueType Value::type() const {
  switch (v_.index()) {
    case 0: return ValueType::None;
    case 1: return ValueType::Boolean;
    case 2: return ValueType::Integer;
    case 3: return ValueType::Unsigned;
    case 4: return ValueType::Real;
    case 5: return ValueType::Date;
    case 6: return ValueType::Uuid;
    case 7: return ValueType::String;
    case 8: return ValueType::Data;
    case 9: return ValueType::Array;
    default: return ValueType::Dictionary;
  }
}

bool Value::isNumber() const {
  auto t = type();
  return t == ValueType::Integer || t == ValueType::Unsigned || t == ValueType::Real ||
         t == ValueType::Boolean;
}

const std::string* Value::string() const {
  auto p = std::get_if<std::shared_ptr<const std::string>>(&v_);
  return p ? p->get() : nullptr;
}
const Array* Value::array() const {
  auto p = std::get_if<std::shared_ptr<const Array>>(&v_);
  return p ? p->get() : nullptr;
}
const Dictionary* Value::dictionary() const {
  auto p = std::get_if<std::shared_ptr<const Dictionary>>(&v_);
  return p ? p->get() : nullptr;
}
const Data* Value::data() const {
  auto p = std::get_if<std::shared_ptr<const Data>>(&v_);
  return p ? p->get() : nullptr;
}
std::optional<Date> Value::date() const {
  if (auto p = std::get_if<Date>(&v_)) return *p;
  return std::nullopt;
}
std::optional<Uuid> Value::uuid() const {
  if (auto p = std::get_if<Uuid>(&v_)) return *p;
  return std::nullopt;
}
std::optional<bool> Value::boolean() const {
  if (auto p = std::get_if<bool>(&v_)) return *p;
  return std::nullopt;
}

std::optional<bool> Value::truth() const {
  if (auto p = std::get_if<bool>(&v_)) return *p;
  if (auto p = std::get_if<std::int64_t>(&v_)) return *p != 0;
  if (auto p = std::get_if<std::uint64_t>(&v_)) return *p != 0;
  if (auto p = std::get_if<double>(&v_)) return *p != 0;
  return std::nullopt;
}

std::optional<std::int64_t> Value::int64() const {
  if (auto p = std::get_if<std::int64_t>(&v_)) return *p;
  if (auto p = std::get_if<bool>(&v_)) return *p ? 1 : 0;
  if (auto p = std::get_if<std::uint64_t>(&v_)) {
    if (*p <= static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max()))
      return static_cast<std::int64_t>(*p);
  }
  return std::nullopt;
}

std::optional<std::uint64_t> Value::uint64() const {
  if (auto p = std::get_if<std::uint64_t>(&v_)) return *p;
  if (auto p = std::get_if<bool>(&v_)) return *p ? 1u : 0u;
  if (auto p = std::get_if<std::int64_t>(&v_)) {
    if (*p >= 0) return static_cast<std::uint64_t>(*p);
  }
  return std::nullopt;
}

std::optional<double> Value::real() const {
  if (auto p = std::get_if<double>(&v_)) return *p;
  if (auto p = std::get_if<std::int64_t>(&v_)) return static_cast<double>(*p);
  if (auto p = std::get_if<std::uint64_t>(&v_)) return static_cast<double>(*p);
  if (auto p = std::get_if<bool>(&v_)) return *p ? 1.0 : 0.0;
  return std::nullopt;
}

namespace {

std::optional<Numeric> numericOfStorage(const Value& v) {
  switch (v.type()) {
    case ValueType::Boolean: return numericOf(*v.boolean());
    case ValueType::Integer: return numericOf(*v.int64());
    case ValueType::Unsigned: return numericOf(*v.uint64());
    case ValueType::Real: return numericOf(*v.real());
    default: return std::nullopt;
  }
}

}  // namespace

bool Value::operator==(const Value& other) const {
  if (isNumber() || other.isNumber()) {
    auto a = numericOfStorage(*this);
    auto b = numericOfStorage(other);
    return a && b && sameNumeric(*a, *b);
  }
  if (v_.index() != other.v_.index()) return false;
  switch (type()) {
    case ValueType::None: return true;
    case ValueType::String: return *string() == *other.string();
    case ValueType::Data: return *data() == *other.data();
    case ValueType::Array: return array() == other.array() || *array() == *other.array();
    case ValueType::Dictionary:
      return dictionary() == other.dictionary() || *dictionary() == *other.dictionary();
    case ValueType::Date: {
      double a = date()->secondsSince1970, b = other.date()->secondsSince1970;
      return a == b || (a != a && b != b);
    }
    case ValueType::Uuid: return *uuid() == *other.uuid();
    default: return false;
  }
}

std::size_t Value::hash() const {
  if (auto n = numericOfStorage(*this)) {
    if (n->kind == Numeric::kFraction) {
      if (n->real != n->real) return 0x7ff8;  // every NaN alike
      std::uint64_t bits;
      std::memcpy(&bits, &n->real, sizeof bits);
      return mix(bits);
    }
    return mix(n->magnitude);
  }
  switch (type()) {
    case ValueType::None: return 0;
    case ValueType::String: return std::hash<std::string>{}(*string());
    case ValueType::Data:
      return std::hash<std::string_view>{}(std::string_view(
          reinterpret_cast<const char*>(data()->data()), data()->size()));
    case ValueType::Uuid: return UuidHash{}(*uuid());
    case ValueType::Date: return mix(std::hash<double>{}(date()->secondsSince1970) + 7);
    case ValueType::Array: {
      std::size_t h = 0xA11A7;
      for (const auto& item : *array()) h = mix(h * 31 + item.hash());
      return h;
    }
    case ValueType::Dictionary: {
      // Order-insensitive, since equal dictionaries may differ in order.
      std::size_t h = dictionary()->size();
      for (const auto& [k, v] : *dictionary())
        h += mix(std::hash<std::string>{}(k) ^ (v.hash() * 0x9E3779B97F4A7C15ull));
      return h;
    }
    default: return 0;
  }
}

}  // namespace platform
