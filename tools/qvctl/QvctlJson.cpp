#include "tools/qvctl/QvctlJson.h"

#include <cstdint>

#include "platform/values/DateText.h"

namespace qvctl {

using nlohmann::ordered_json;
using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Value;
using platform::ValueType;

namespace {

constexpr std::string_view kJsonErrorDomain = "qvctl.json";

Error jsonError(std::string message) {
  return Error(std::string(kJsonErrorDomain), 1, std::move(message));
}

// `where` is the JSON pointer of `json`, for the error message.
Result<Value> convert(const ordered_json& json, const std::string& where) {
  switch (json.type()) {
    case ordered_json::value_t::object: {
      Dictionary dictionary;
      for (const auto& [key, member] : json.items()) {
        Result<Value> value = convert(member, where + "/" + key);
        if (!value.ok()) return value.error();
        dictionary.set(key, std::move(value).value());
      }
      return Value(std::move(dictionary));
    }
    case ordered_json::value_t::array: {
      Array array;
      for (std::size_t i = 0; i < json.size(); ++i) {
        Result<Value> value = convert(json[i], where + "/" + std::to_string(i));
        if (!value.ok()) return value.error();
        array.append(std::move(value).value());
      }
      return Value(std::move(array));
    }
    case ordered_json::value_t::string:
      return Value(json.get<std::string>());
    case ordered_json::value_t::boolean:
      return Value(json.get<bool>());
    case ordered_json::value_t::number_integer:
      return Value(json.get<std::int64_t>());
    case ordered_json::value_t::number_unsigned: {
      // JSON's parser calls every non-negative integer unsigned; like the
      // message codec, keep those that fit as ordinary integers.
      const std::uint64_t number = json.get<std::uint64_t>();
      if (number <= static_cast<std::uint64_t>(INT64_MAX))
        return Value(static_cast<std::int64_t>(number));
      return Value(number);
    }
    case ordered_json::value_t::number_float:
      return Value(json.get<double>());
    default:
      return jsonError("null (or another value with no counterpart) at " +
                       (where.empty() ? std::string("the top") : where));
  }
}

}  // namespace

Result<Value> valueFromJsonText(std::string_view text) {
  // nlohmann reports syntax errors only by exception; it stays inside here.
  ordered_json json;
  try {
    json = ordered_json::parse(text);
  } catch (const ordered_json::exception& error) {
    return jsonError(std::string("not valid JSON (") + error.what() + ")");
  }
  return convert(json, "");
}

ordered_json jsonFromValue(const Value& value) {
  switch (value.type()) {
    case ValueType::Dictionary: {
      ordered_json object = ordered_json::object();
      for (const auto& [key, member] : *value.dictionary()) object[key] = jsonFromValue(member);
      return object;
    }
    case ValueType::Array: {
      ordered_json array = ordered_json::array();
      for (const Value& item : *value.array()) array.push_back(jsonFromValue(item));
      return array;
    }
    case ValueType::String:
      return *value.string();
    case ValueType::Integer:
      return *value.int64();
    case ValueType::Unsigned:
      return *value.uint64();
    case ValueType::Real:
      return *value.real();
    case ValueType::Boolean:
      return *value.boolean();
    case ValueType::Date:
      return platform::formatIso8601(*value.date());
    case ValueType::Data:
      return base64(*value.data());
    case ValueType::Uuid:
      return value.uuid()->toString();
    case ValueType::None:
      break;
  }
  return nullptr;
}

std::string base64(const platform::Data& data) {
  static constexpr char kAlphabet[] =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string text;
  text.reserve((data.size() + 2) / 3 * 4);
  std::size_t i = 0;
  for (; i + 3 <= data.size(); i += 3) {
    const std::uint32_t group = (data[i] << 16) | (data[i + 1] << 8) | data[i + 2];
    for (int shift = 18; shift >= 0; shift -= 6) text += kAlphabet[(group >> shift) & 0x3f];
  }
  const std::size_t left = data.size() - i;
  if (left > 0) {
    std::uint32_t group = data[i] << 16;
    if (left == 2) group |= data[i + 1] << 8;
    text += kAlphabet[(group >> 18) & 0x3f];
    text += kAlphabet[(group >> 12) & 0x3f];
    text += left == 2 ? kAlphabet[(group >> 6) & 0x3f] : '=';
    text += '=';
  }
  return text;
}

}  // namespace qvctl
