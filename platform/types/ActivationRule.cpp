#include "platform/types/ActivationRule.h"

#include <cstdint>
#include <optional>

namespace platform::types {
namespace {

// The count of an offered kind: a non-negative integer, else none.
std::optional<std::uint64_t> countOf(const Value& count) {
  if (count.type() != ValueType::Integer && count.type() != ValueType::Unsigned) {
    return std::nullopt;
  }
  return count.uint64();  // none for a negative integer
}

// Whether `allowance` (the rule's entry for a kind) admits `count` items.
bool admits(const Value& allowance, std::uint64_t count) {
  // Booleans are numbers in the value model (true == 1), so they are
  // recognised before the number kinds.
  if (std::optional<bool> flag = allowance.boolean()) return *flag;
  if (allowance.type() == ValueType::Integer || allowance.type() == ValueType::Unsigned) {
    const std::optional<std::uint64_t> maximum = allowance.uint64();
    return maximum && count <= *maximum;
  }
  if (allowance.type() == ValueType::Real) {
    const double maximum = allowance.real().value_or(-1);
    // NaN compares false and so admits nothing.
    return static_cast<double>(count) <= maximum;
  }
  return false;
}

}  // namespace

bool evaluateActivationRule(const Value& rule, const Dictionary& items) {
  const Dictionary* allowances = rule.dictionary();
  if (allowances == nullptr) return false;
  for (const auto& [kind, offered] : items) {
    const std::optional<std::uint64_t> count = countOf(offered);
    if (!count) return false;
    if (*count == 0) continue;
    const Value* allowance = allowances->find(kind);
    if (allowance == nullptr || !admits(*allowance, *count)) return false;
  }
  return true;
}

}  // namespace platform::types
