#include "tests/unit/cbor/oracle/IdenticalValues.h"

#include <bit>
#include <cmath>
#include <cstdint>

namespace platform::cbor::oracle {
namespace {

// Far beyond any input the tests build, and it keeps a runaway Value from
// exhausting the stack.
constexpr int kMaxDepth = 10000;

bool sameDouble(double a, double b) {
  if (std::isnan(a) || std::isnan(b)) return std::isnan(a) && std::isnan(b);
  return std::bit_cast<std::uint64_t>(a) == std::bit_cast<std::uint64_t>(b);
}

std::optional<std::string> compare(const Value& e, const Value& a, const std::string& path,
                                   int depth) {
  const std::string where = path.empty() ? "/" : path;
  if (depth > kMaxDepth) return where + ": nested too deep to compare";
  if (e.type() != a.type())
    return where + ": expected " + valueTypeName(e.type()) + ", got " + valueTypeName(a.type());
  switch (e.type()) {
    case ValueType::None:
      return std::nullopt;
    case ValueType::Integer:
      if (*e.int64() != *a.int64())
        return where + ": expected " + std::to_string(*e.int64()) + ", got " +
               std::to_string(*a.int64());
      return std::nullopt;
    case ValueType::Unsigned:
      if (*e.uint64() != *a.uint64())
        return where + ": expected " + std::to_string(*e.uint64()) + ", got " +
               std::to_string(*a.uint64());
      return std::nullopt;
    case ValueType::Real:
      if (!sameDouble(*e.real(), *a.real())) return where + ": reals differ";
      return std::nullopt;
    case ValueType::Date:
      if (!sameDouble(e.date()->secondsSince1970, a.date()->secondsSince1970))
        return where + ": dates differ";
      return std::nullopt;
    case ValueType::Boolean:
      if (*e.boolean() != *a.boolean()) return where + ": booleans differ";
      return std::nullopt;
    case ValueType::String:
      if (*e.string() != *a.string())
        return where + ": expected \"" + *e.string() + "\", got \"" + *a.string() + "\"";
      return std::nullopt;
    case ValueType::Data:
      if (*e.data() != *a.data()) return where + ": data differ";
      return std::nullopt;
    case ValueType::Uuid:
      if (*e.uuid() != *a.uuid()) return where + ": UUIDs differ";
      return std::nullopt;
    case ValueType::Array: {
      const Array& ea = *e.array();
      const Array& aa = *a.array();
      if (ea.size() != aa.size())
        return where + ": expected " + std::to_string(ea.size()) + " elements, got " +
               std::to_string(aa.size());
      for (std::size_t i = 0; i < ea.size(); ++i)
        if (auto d = compare(ea[i], aa[i], path + "/" + std::to_string(i), depth + 1)) return d;
      return std::nullopt;
    }
    case ValueType::Dictionary: {
      const auto& ee = e.dictionary()->entries();
      const auto& ae = a.dictionary()->entries();
      if (ee.size() != ae.size())
        return where + ": expected " + std::to_string(ee.size()) + " entries, got " +
               std::to_string(ae.size());
      for (std::size_t i = 0; i < ee.size(); ++i) {
        if (ee[i].first != ae[i].first)
          return where + ": key " + std::to_string(i) + " expected \"" + ee[i].first +
                 "\", got \"" + ae[i].first + "\"";
        if (auto d = compare(ee[i].second, ae[i].second, path + "/" + ee[i].first, depth + 1))
          return d;
      }
      return std::nullopt;
    }
  }
  return where + ": unknown kind";
}

}  // namespace

std::optional<std::string> firstDifference(const Value& expected, const Value& actual) {
  return compare(expected, actual, "", 0);
}

}  // namespace platform::cbor::oracle
