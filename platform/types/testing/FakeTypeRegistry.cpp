#include "platform/types/testing/FakeTypeRegistry.h"

#include <utility>

#include "platform/types/ActivationRule.h"

namespace platform::types {

bool FakeTypeRegistry::declare(std::string identifier, std::vector<std::string> conformsTo) {
  std::lock_guard<std::mutex> lock(mu_);
  return hierarchy_.declare({std::move(identifier), std::move(conformsTo)});
}

bool FakeTypeRegistry::conformsTo(std::string_view type, std::string_view other) const {
  std::lock_guard<std::mutex> lock(mu_);
  ++conformanceQuestions_;
  return hierarchy_.conformsTo(type, other);
}

bool FakeTypeRegistry::evaluateActivationRule(const Value& rule, const Dictionary& items) const {
  {
    std::lock_guard<std::mutex> lock(mu_);
    ++activationRuleEvaluations_;
  }
  return types::evaluateActivationRule(rule, items);
}

std::size_t FakeTypeRegistry::conformanceQuestions() const {
  std::lock_guard<std::mutex> lock(mu_);
  return conformanceQuestions_;
}

std::size_t FakeTypeRegistry::activationRuleEvaluations() const {
  std::lock_guard<std::mutex> lock(mu_);
  return activationRuleEvaluations_;
}

}  // namespace platform::types
