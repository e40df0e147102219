// Arbitrary bytes against the match-rule evaluator and the type-declaration
// reader, the two places where client- or file-supplied structure is
// interpreted. Bytes that read as a vmap document are used whole:
//  - a dictionary is a rule set for a fixed plug-in (and each dictionary in
//    it the host's items for an activation rule); the set matches exactly
//    when each of its entries does;
//  - a list is a type-declarations document; whatever is accepted must
//    make each declared type conform to itself, and each declaration that
//    stands (the first of its identifier) to its direct ancestors.
// Other bytes are split at the first NUL into a value and a pattern
// operand, checking that "<>x" is always the negation of "=x".
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/holvane/testing/FakeRegistry.h"
#include "platform/locale/testing/FakeLocaleService.h"
#include "platform/root/Root.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"
#include "platform/types/ActivationRule.h"
#include "platform/types/TypeDeclarations.h"
#include "platform/types/testing/FakeTypeRegistry.h"
#include "platform/vmap/Reader.h"
#include "qvd/QVDRegistryPlugIn.h"

using namespace platform;

namespace {

void check(bool condition) {
  if (!condition) std::abort();
}

// A plug-in with a value behind most kinds of key: attributes of every
// kind, info keys, entitlements, a containing application.
std::shared_ptr<qvd::QVDPlugIn> makePlugIn() {
  auto registry = std::make_shared<holvane::FakeRegistry>();
  auto types = std::make_shared<types::FakeTypeRegistry>();
  types->declare("public.image", {"public.data"});
  types->declare("public.jpeg", {"public.image"});
  types->declare("a", {"b"});
  types->declare("b", {"a", "public.data"});
  holvane::PlugInRecord record;
  record.uuid = Uuid::generate();
  record.path = rootPath("System/Library/PlugIns/Fuzz.ovx");
  record.identifier = "com.example.fuzz";
  record.originalIdentifier = record.identifier;
  record.dataContainer = rootPath("var/containers/Data/com.example.fuzz");
  record.containingApplicationPath = rootPath("Applications/Host.app");
  record.entitlements = Dictionary{{"flag", true}, {"off", false}, {"text", "level-2"}};
  const Dictionary attributes{
      {"XOExtensionVersion", "2.10"},
      {"XOExtensionActivationRule", Dictionary{{"image", 2}, {"url", true}}},
      {"Kinds", Array{"public.jpeg", 7, Array{"x"}, "b"}},
      {"Number", 3},
      {"False", false}};
  record.info = Dictionary{
      {"XOExtension", Dictionary{{"XOExtensionProtocol", "p"}, {"XOExtensionAttributes", attributes}}},
      {"InfoOnly", "1.0"}};
  registry->put(record);
  auto plugIn = qvd::QVDPlugIn::initWithHVData(
      record, {registry, std::make_shared<locale::FakeLocaleService>("en"),
               std::make_shared<sandbox::FakeSandboxExtensions>(), types});
  check(plugIn != nullptr);
  return plugIn;
}

void ruleSet(const qvd::QVDPlugIn& plugIn, const Dictionary& rules) {
  bool each = true;
  for (const auto& [key, pattern] : rules) {
    each = plugIn.matchKeyPattern(key, pattern) && each;
    if (const Dictionary* items = pattern.dictionary()) {
      (void)types::evaluateActivationRule(Value(rules), *items);
    }
  }
  check(plugIn.match(rules) == each);
}

void declarations(const Value& document) {
  Result<std::vector<types::TypeDeclaration>> parsed = types::parseTypeDeclarations(document);
  if (!parsed.ok()) return;
  types::TypeHierarchy hierarchy;
  std::vector<bool> stands;  // the first declaration of an identifier stands
  for (const types::TypeDeclaration& declaration : *parsed) {
    stands.push_back(hierarchy.declare(declaration));
  }
  for (std::size_t i = 0; i < parsed->size(); ++i) {
    const types::TypeDeclaration& declaration = (*parsed)[i];
    check(hierarchy.conformsTo(declaration.identifier, declaration.identifier));
    if (!stands[i]) continue;
    for (const std::string& parent : declaration.conformsTo) {
      check(hierarchy.conformsTo(declaration.identifier, parent));
    }
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::shared_ptr<qvd::QVDPlugIn> plugIn = makePlugIn();
  const vmap::ReadLimits limits{.maxBytes = 64u << 10, .maxDepth = 16, .maxItems = 4096};
  Result<Value> document = vmap::read(std::span<const std::uint8_t>(data, size), limits);
  if (document.ok()) {
    if (const Dictionary* rules = document->dictionary()) ruleSet(*plugIn, *rules);
    if (document->array()) declarations(*document);
    return 0;
  }
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  const std::size_t split = text.find('\0');
  const std::string value(text.substr(0, split));
  const std::string operand(split == std::string_view::npos ? "" : text.substr(split + 1));
  check(plugIn->matchValuePattern(value, "<>" + operand) !=
        plugIn->matchValuePattern(value, "=" + operand));
  (void)plugIn->matchValuePattern(value, operand);
  return 0;
}
