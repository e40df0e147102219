#include "platform/codesign/EntitlementStore.h"

namespace platform::codesign {

Value EntitlementStore::entitlementValue(std::string_view executablePath,
                                         std::string_view key) const {
  Result<Dictionary> granted = entitlementsOfExecutable(executablePath);
  if (!granted.ok()) return Value();
  return granted->get(key);
}

}  // namespace platform::codesign
