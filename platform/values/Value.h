// The property-list value model: every structured value the system stores,
// reads from a vmap document or carries in a message is a Value.
//
// Thread safety: a Value is immutable once built; copies share storage and
// may be read from any thread. Array and Dictionary are plain value types
// (not thread-safe while being mutated); freeze them into a Value to share.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/values/Uuid.h"

namespace platform {

class Array;
class Dictionary;
class Value;

using Data = std::vector<std::uint8_t>;

// A point in time: seconds since 1970-01-01T00:00:00Z (fractions allowed).
struct Date {
  double secondsSince1970 = 0;
  static Date now();
  bool operator==(const Date&) const = default;
};

enum class ValueType : std::uint8_t {
  None,  // absent: no value at all
  Dictionary,
  Array,
  String,
  Integer,   // signed 64-bit
  Unsigned,  // unsigned 64-bit
  Real,
  Boolean,
  Date,
  Data,
  Uuid,
};

const char* valueTypeName(ValueType type);

class Value {
 public:
  Value() = default;  // none
  Value(std::nullptr_t) {}
  Value(bool b) : v_(b) {}
  Value(int i) : v_(std::int64_t{i}) {}
  Value(long i) : v_(std::int64_t{i}) {}
  Value(long long i) : v_(std::int64_t{i}) {}
  Value(unsigned u) : v_(std::uint64_t{u}) {}
  Value(unsigned long u) : v_(std::uint64_t{u}) {}
  Value(unsigned long long u) : v_(std::uint64_t{u}) {}
  Value(double d) : v_(d) {}
  Value(const char* s);
  Value(std::string_view s);
  Value(std::string s);
  Value(Date d) : v_(d) {}
  Value(Data d);
  Value(Uuid u) : v_(u) {}
  Value(Array a);
  Value(Dictionary d);
  // Shares a dictionary that is already immutable, without copying it; a
  // null pointer makes none.
  explicit Value(std::shared_ptr<const Dictionary> d);

  ValueType type() const;
  bool isNone() const { return v_.index() == 0; }
  // Integer, Unsigned, Real or Boolean: the kinds that compare as numbers.
  bool isNumber() const;

  // Typed accessors answer none (nullptr / nullopt) when the value is of
  // another kind; they never throw.
  const std::string* string() const;
  const Array* array() const;
  const Dictionary* dictionary() const;
  const Data* data() const;
  std::optional<Date> date() const;
  std::optional<Uuid> uuid() const;
  // Only a Boolean answers.
  std::optional<bool> boolean() const;
  // Any number answers: non-zero is true (0 and false are the same value).
  std::optional<bool> truth() const;
  // Integer, Unsigned or Boolean whose value fits; reals do not answer.
  std::optional<std::int64_t> int64() const;
  std::optional<std::uint64_t> uint64() const;
  // Any number, converted to double.
  std::optional<double> real() const;

  // Property-list equality: numbers compare by numeric value (false == 0,
  // true == 1, 2 == 2.0), dictionaries regardless of key order.
  bool operator==(const Value& other) const;
  std::size_t hash() const;

  // Human-readable text, used for "%@" in log formats. A top-level string
  // describes as itself.
  std::string description() const;

 private:
  friend class ValueAccess;
  using Storage =
      std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Date, Uuid,
                   std::shared_ptr<const std::string>, std::shared_ptr<const Data>,
                   std::shared_ptr<const Array>, std::shared_ptr<const Dictionary>>;
  Storage v_;
};

struct ValueHash {
  std::size_t operator()(const Value& v) const { return v.hash(); }
};

}  // namespace platform

#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
