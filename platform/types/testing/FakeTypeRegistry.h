// A TypeRegistry that answers from what a test declared, with the real
// conformance walk and the real activation-rule evaluation, and counts the
// questions asked so that a test can tell that something was never asked.
//
// Thread safety: safe from any thread; declarations and questions are
// serialised.
#pragma once

#include <cstddef>
#include <mutex>
#include <string>
#include <vector>

#include "platform/types/TypeHierarchy.h"
#include "platform/types/TypeRegistry.h"

namespace platform::types {

class FakeTypeRegistry final : public TypeRegistry {
 public:
  // Declares `identifier` with its direct ancestors; false when it was
  // declared before (the first declaration stands).
  bool declare(std::string identifier, std::vector<std::string> conformsTo = {});

  bool conformsTo(std::string_view type, std::string_view other) const override;
  bool evaluateActivationRule(const Value& rule, const Dictionary& items) const override;

  std::size_t conformanceQuestions() const;
  std::size_t activationRuleEvaluations() const;

 private:
  mutable std::mutex mu_;
  TypeHierarchy hierarchy_;
  mutable std::size_t conformanceQuestions_ = 0;
  mutable std::size_t activationRuleEvaluations_ = 0;
};

}  // namespace platform::types
