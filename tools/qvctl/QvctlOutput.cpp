#include "tools/qvctl/QvctlOutput.h"

#include <charconv>

#include "platform/values/DateText.h"
#include "tools/qvctl/QvctlJson.h"

namespace qvctl {

using platform::Value;
using platform::ValueType;

namespace {

bool isContainer(const Value& value) {
  return value.type() == ValueType::Dictionary || value.type() == ValueType::Array;
}

bool isEmptyContainer(const Value& value) {
  if (const auto* dictionary = value.dictionary()) return dictionary->empty();
  if (const auto* array = value.array()) return array->empty();
  return false;
}

std::string scalarText(const Value& value) {
  switch (value.type()) {
    case ValueType::String:
      return *value.string();
    case ValueType::Integer:
      return std::to_string(*value.int64());
    case ValueType::Unsigned:
      return std::to_string(*value.uint64());
    case ValueType::Real: {
      char buffer[32];
      auto [end, error] = std::to_chars(buffer, buffer + sizeof buffer, *value.real());
      return error == std::errc() ? std::string(buffer, end) : value.description();
    }
    case ValueType::Boolean:
      return *value.boolean() ? "true" : "false";
    case ValueType::Date:
      return platform::formatIso8601(*value.date());
    case ValueType::Data:
      return "<" + std::to_string(value.data()->size()) + " bytes> " + base64(*value.data());
    case ValueType::Uuid:
      return value.uuid()->toString();
    case ValueType::None:
      return "(none)";
    case ValueType::Dictionary:
      return "{}";
    case ValueType::Array:
      return "[]";
  }
  return value.description();
}

// "<prefix><scalar>\n", or "<prefix>\n" and the container one level deeper.
void appendEntry(std::string& out, const std::string& prefix, const Value& value, int indent) {
  if (isContainer(value) && !isEmptyContainer(value)) {
    out += prefix;
    out += '\n';
    out += formatHuman(value, indent + 2);
  } else {
    out += prefix;
    out += ' ';
    out += scalarText(value);
    out += '\n';
  }
}

}  // namespace

std::string formatHuman(const Value& value, int indent) {
  const std::string pad(static_cast<std::size_t>(indent), ' ');
  if (!isContainer(value) || isEmptyContainer(value)) return pad + scalarText(value) + "\n";
  std::string out;
  if (const auto* dictionary = value.dictionary()) {
    for (const auto& [key, member] : *dictionary) appendEntry(out, pad + key + ":", member, indent);
  } else {
    for (const Value& item : *value.array()) appendEntry(out, pad + "-", item, indent);
  }
  return out;
}

std::string formatForms(const Value& forms) {
  std::vector<Value> list;
  if (const auto* array = forms.array()) {
    list = array->items();
  } else if (!forms.isNone()) {
    list.push_back(forms);
  }
  if (list.empty()) return "no plug-ins\n";
  std::string out = list.size() == 1 ? "1 plug-in\n" : std::to_string(list.size()) + " plug-ins\n";
  for (std::size_t i = 0; i < list.size(); ++i) {
    appendEntry(out, "plug-in " + std::to_string(i + 1) + ":", list[i], 0);
  }
  return out;
}

std::string formatJson(const Value& value) {
  // Texts that came over the wire are valid UTF-8; replace rather than throw
  // should one not be.
  return jsonFromValue(value).dump(2, ' ', false,
                                   nlohmann::ordered_json::error_handler_t::replace) +
         "\n";
}

}  // namespace qvctl
