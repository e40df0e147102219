#include "tests/unit/cbor/oracle/LibcborOracle.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <string_view>

namespace platform::cbor::oracle {
namespace {

constexpr int kMaxDepth = 10000;  // keeps a hostile tree from exhausting the stack
constexpr std::uint64_t kMaxInt64 =
    static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());

// A plain, byte-by-byte UTF-8 check, deliberately unlike the codec's own.
bool isUtf8(const unsigned char* s, std::size_t n) {
  std::size_t i = 0;
  while (i < n) {
    unsigned char c = s[i];
    std::uint32_t cp;
    std::size_t extra;
    if (c < 0x80) {
      ++i;
      continue;
    }
    if ((c & 0xE0) == 0xC0) {
      cp = c & 0x1F;
      extra = 1;
    } else if ((c & 0xF0) == 0xE0) {
      cp = c & 0x0F;
      extra = 2;
    } else if ((c & 0xF8) == 0xF0) {
      cp = c & 0x07;
      extra = 3;
    } else
      return false;
    if (extra >= n - i) return false;
    for (std::size_t k = 1; k <= extra; ++k) {
      if ((s[i + k] & 0xC0) != 0x80) return false;
      cp = (cp << 6) | (s[i + k] & 0x3F);
    }
    static constexpr std::uint32_t kSmallest[] = {0, 0x80, 0x800, 0x10000};
    if (cp < kSmallest[extra] || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) return false;
    i += extra + 1;
  }
  return true;
}

std::string_view textOf(const cbor_item_t& item) {
  return {reinterpret_cast<const char*>(cbor_string_handle(&item)), cbor_string_length(&item)};
}

bool sameDouble(double a, double b) {
  if (std::isnan(a) || std::isnan(b)) return std::isnan(a) && std::isnan(b);
  return std::bit_cast<std::uint64_t>(a) == std::bit_cast<std::uint64_t>(b);
}

// The number a date tag encloses, when it is one.
std::optional<double> dateSeconds(const cbor_item_t& content) {
  switch (cbor_typeof(&content)) {
    case CBOR_TYPE_UINT:
      return static_cast<double>(cbor_get_int(&content));
    case CBOR_TYPE_NEGINT:
      if (cbor_get_int(&content) > kMaxInt64) return std::nullopt;
      return static_cast<double>(-1 - static_cast<std::int64_t>(cbor_get_int(&content)));
    case CBOR_TYPE_FLOAT_CTRL:
      if (cbor_is_float(&content)) return cbor_float_get_float(&content);
      return std::nullopt;
    default:
      return std::nullopt;
  }
}

std::optional<Value> convert(const cbor_item_t& item, std::string* why, int depth) {
  auto refuse = [why](const char* reason) -> std::optional<Value> {
    if (why) *why = reason;
    return std::nullopt;
  };
  if (depth > kMaxDepth) return refuse("too deep");
  switch (cbor_typeof(&item)) {
    case CBOR_TYPE_UINT: {
      std::uint64_t u = cbor_get_int(&item);
      if (u <= kMaxInt64) return Value(static_cast<std::int64_t>(u));
      return Value(u);
    }
    case CBOR_TYPE_NEGINT: {
      std::uint64_t n = cbor_get_int(&item);
      if (n > kMaxInt64) return refuse("negative integer below INT64_MIN");
      return Value(-1 - static_cast<std::int64_t>(n));
    }
    case CBOR_TYPE_BYTESTRING: {
      if (!cbor_bytestring_is_definite(&item)) return refuse("indefinite byte string");
      const unsigned char* p = cbor_bytestring_handle(&item);
      return Value(Data(p, p + cbor_bytestring_length(&item)));
    }
    case CBOR_TYPE_STRING: {
      if (!cbor_string_is_definite(&item)) return refuse("indefinite text string");
      if (!isUtf8(cbor_string_handle(&item), cbor_string_length(&item)))
        return refuse("text not UTF-8");
      return Value(textOf(item));
    }
    case CBOR_TYPE_ARRAY: {
      if (!cbor_array_is_definite(&item)) return refuse("indefinite array");
      std::vector<Value> elements;
      elements.reserve(cbor_array_size(&item));
      cbor_item_t** handle = cbor_array_handle(&item);
      for (std::size_t i = 0; i < cbor_array_size(&item); ++i) {
        auto element = convert(*handle[i], why, depth + 1);
        if (!element) return std::nullopt;
        elements.push_back(std::move(*element));
      }
      return Value(Array(std::move(elements)));
    }
    case CBOR_TYPE_MAP: {
      if (!cbor_map_is_definite(&item)) return refuse("indefinite map");
      Dictionary entries;
      cbor_pair* pairs = cbor_map_handle(&item);
      for (std::size_t i = 0; i < cbor_map_size(&item); ++i) {
        const cbor_item_t& key = *pairs[i].key;
        if (!cbor_isa_string(&key) || !cbor_string_is_definite(&key))
          return refuse("map key not a definite text string");
        if (!isUtf8(cbor_string_handle(&key), cbor_string_length(&key)))
          return refuse("key not UTF-8");
        auto value = convert(*pairs[i].value, why, depth + 1);
        if (!value) return std::nullopt;
        std::size_t before = entries.size();
        entries.set(textOf(key), std::move(*value));
        if (entries.size() == before) return refuse("duplicate key");
      }
      return Value(std::move(entries));
    }
    case CBOR_TYPE_TAG: {
      ItemPtr content(cbor_tag_item(&item));
      if (!content) return refuse("tag without content");
      if (cbor_tag_value(&item) == 1) {
        auto seconds = dateSeconds(*content);
        if (!seconds) return refuse("date tag on a non-number");
        return Value(Date{*seconds});
      }
      if (cbor_tag_value(&item) == 37) {
        if (!cbor_isa_bytestring(content.get()) || !cbor_bytestring_is_definite(content.get()) ||
            cbor_bytestring_length(content.get()) != 16)
          return refuse("UUID tag not on 16 bytes");
        return Value(Uuid::fromBytes(cbor_bytestring_handle(content.get())));
      }
      return refuse("unsupported tag");
    }
    case CBOR_TYPE_FLOAT_CTRL:
      if (cbor_is_float(&item)) return Value(cbor_float_get_float(&item));
      if (cbor_is_bool(&item)) return Value(cbor_get_bool(&item));
      return refuse("unsupported simple value");
  }
  return refuse("unknown item type");
}

cbor_item_t* buildUnsigned(std::uint64_t u, ItemWidths widths) {
  if (widths == ItemWidths::kWidest) return cbor_build_uint64(u);
  if (u <= 0xFF) return cbor_build_uint8(static_cast<std::uint8_t>(u));
  if (u <= 0xFFFF) return cbor_build_uint16(static_cast<std::uint16_t>(u));
  if (u <= 0xFFFFFFFF) return cbor_build_uint32(static_cast<std::uint32_t>(u));
  return cbor_build_uint64(u);
}

cbor_item_t* buildNegative(std::uint64_t n, ItemWidths widths) {
  if (widths == ItemWidths::kWidest) return cbor_build_negint64(n);
  if (n <= 0xFF) return cbor_build_negint8(static_cast<std::uint8_t>(n));
  if (n <= 0xFFFF) return cbor_build_negint16(static_cast<std::uint16_t>(n));
  if (n <= 0xFFFFFFFF) return cbor_build_negint32(static_cast<std::uint32_t>(n));
  return cbor_build_negint64(n);
}

cbor_item_t* buildReal(double d, ItemWidths widths) {
  if (widths == ItemWidths::kNarrowest && !std::isnan(d) &&
      static_cast<double>(static_cast<float>(d)) == d)
    return cbor_build_float4(static_cast<float>(d));
  return cbor_build_float8(d);
}

// Returns a new reference, or null for a none.
cbor_item_t* build(const Value& value, ItemWidths widths, int depth) {
  if (depth > kMaxDepth) return nullptr;
  switch (value.type()) {
    case ValueType::None:
      return nullptr;
    case ValueType::Integer: {
      std::int64_t i = *value.int64();
      return i >= 0 ? buildUnsigned(static_cast<std::uint64_t>(i), widths)
                    : buildNegative(~static_cast<std::uint64_t>(i), widths);
    }
    case ValueType::Unsigned:
      return buildUnsigned(*value.uint64(), widths);
    case ValueType::Real:
      return buildReal(*value.real(), widths);
    case ValueType::Boolean:
      return cbor_build_bool(*value.boolean());
    case ValueType::String:
      return cbor_build_stringn(value.string()->data(), value.string()->size());
    case ValueType::Data:
      return cbor_build_bytestring(value.data()->data(), value.data()->size());
    case ValueType::Date: {
      ItemPtr seconds(cbor_build_float8(value.date()->secondsSince1970));
      return cbor_build_tag(1, seconds.get());
    }
    case ValueType::Uuid: {
      ItemPtr bytes(cbor_build_bytestring(value.uuid()->bytes.data(), 16));
      return cbor_build_tag(37, bytes.get());
    }
    case ValueType::Array: {
      const Array& array = *value.array();
      ItemPtr item(cbor_new_definite_array(array.size()));
      for (const Value& element : array) {
        ItemPtr child(build(element, widths, depth + 1));
        if (!child || !cbor_array_push(item.get(), child.get())) return nullptr;
      }
      return item.release();
    }
    case ValueType::Dictionary: {
      const Dictionary& dictionary = *value.dictionary();
      ItemPtr item(cbor_new_definite_map(dictionary.size()));
      for (const auto& [key, element] : dictionary) {
        ItemPtr k(cbor_build_stringn(key.data(), key.size()));
        ItemPtr v(build(element, widths, depth + 1));
        if (!v || !cbor_map_add(item.get(), cbor_pair{k.get(), v.get()})) return nullptr;
      }
      return item.release();
    }
  }
  return nullptr;
}

std::optional<std::string> walk(const cbor_item_t& item, const Value& value,
                                const std::string& path, int depth) {
  const std::string where = path.empty() ? "/" : path;
  auto differ = [&](const std::string& what) -> std::optional<std::string> {
    return where + ": " + what;
  };
  if (depth > kMaxDepth) return differ("too deep to compare");
  switch (cbor_typeof(&item)) {
    case CBOR_TYPE_UINT: {
      std::uint64_t u = cbor_get_int(&item);
      bool same = u <= kMaxInt64 ? value.type() == ValueType::Integer &&
                                       *value.int64() == static_cast<std::int64_t>(u)
                                 : value.type() == ValueType::Unsigned && *value.uint64() == u;
      return same ? std::nullopt
                  : differ("libcbor has unsigned " + std::to_string(u) + ", we have " +
                           value.description());
    }
    case CBOR_TYPE_NEGINT: {
      std::uint64_t n = cbor_get_int(&item);
      bool same = n <= kMaxInt64 && value.type() == ValueType::Integer &&
                  *value.int64() == -1 - static_cast<std::int64_t>(n);
      return same ? std::nullopt
                  : differ("libcbor has -1-" + std::to_string(n) + ", we have " +
                           value.description());
    }
    case CBOR_TYPE_BYTESTRING: {
      if (!cbor_bytestring_is_definite(&item) || !value.data())
        return differ("byte string vs " + std::string(valueTypeName(value.type())));
      const unsigned char* p = cbor_bytestring_handle(&item);
      return Data(p, p + cbor_bytestring_length(&item)) == *value.data() ? std::nullopt
                                                                         : differ("bytes differ");
    }
    case CBOR_TYPE_STRING:
      if (!cbor_string_is_definite(&item) || !value.string())
        return differ("text vs " + std::string(valueTypeName(value.type())));
      return textOf(item) == *value.string() ? std::nullopt : differ("text differs");
    case CBOR_TYPE_ARRAY: {
      if (!cbor_array_is_definite(&item) || !value.array())
        return differ("array vs " + std::string(valueTypeName(value.type())));
      const Array& array = *value.array();
      if (cbor_array_size(&item) != array.size()) return differ("array sizes differ");
      cbor_item_t** handle = cbor_array_handle(&item);
      for (std::size_t i = 0; i < array.size(); ++i)
        if (auto d = walk(*handle[i], array[i], path + "/" + std::to_string(i), depth + 1))
          return d;
      return std::nullopt;
    }
    case CBOR_TYPE_MAP: {
      if (!cbor_map_is_definite(&item) || !value.dictionary())
        return differ("map vs " + std::string(valueTypeName(value.type())));
      const auto& entries = value.dictionary()->entries();
      if (cbor_map_size(&item) != entries.size()) return differ("map sizes differ");
      cbor_pair* pairs = cbor_map_handle(&item);
      for (std::size_t i = 0; i < entries.size(); ++i) {
        if (!cbor_isa_string(pairs[i].key) || !cbor_string_is_definite(pairs[i].key) ||
            textOf(*pairs[i].key) != entries[i].first)
          return differ("key " + std::to_string(i) + " differs");
        if (auto d =
                walk(*pairs[i].value, entries[i].second, path + "/" + entries[i].first, depth + 1))
          return d;
      }
      return std::nullopt;
    }
    case CBOR_TYPE_TAG: {
      ItemPtr content(cbor_tag_item(&item));
      if (!content) return differ("tag without content");
      if (cbor_tag_value(&item) == 1) {
        auto seconds = dateSeconds(*content);
        if (!seconds || !value.date() || !sameDouble(*seconds, value.date()->secondsSince1970))
          return differ("dates differ");
        return std::nullopt;
      }
      if (cbor_tag_value(&item) == 37) {
        const std::optional<Uuid> uuid = value.uuid();
        if (!uuid || !cbor_isa_bytestring(content.get()) ||
            cbor_bytestring_length(content.get()) != 16 ||
            !std::equal(uuid->bytes.begin(), uuid->bytes.end(),
                        cbor_bytestring_handle(content.get())))
          return differ("UUIDs differ");
        return std::nullopt;
      }
      return differ("libcbor has tag " + std::to_string(cbor_tag_value(&item)));
    }
    case CBOR_TYPE_FLOAT_CTRL:
      if (cbor_is_float(&item)) {
        if (value.type() != ValueType::Real ||
            !sameDouble(cbor_float_get_float(&item), *value.real()))
          return differ("reals differ");
        return std::nullopt;
      }
      if (cbor_is_bool(&item)) {
        if (value.type() != ValueType::Boolean || *value.boolean() != cbor_get_bool(&item))
          return differ("booleans differ");
        return std::nullopt;
      }
      return differ("libcbor has simple value " + std::to_string(cbor_ctrl_value(&item)));
  }
  return differ("unknown libcbor item type");
}

}  // namespace

ItemPtr libcborLoad(std::span<const std::uint8_t> bytes) {
  cbor_load_result result{};
  ItemPtr item(cbor_load(bytes.data(), bytes.size(), &result));
  if (!item || result.error.code != CBOR_ERR_NONE || result.read != bytes.size()) return nullptr;
  return item;
}

std::vector<std::uint8_t> libcborSerialize(const cbor_item_t& item) {
  unsigned char* buffer = nullptr;
  std::size_t capacity = 0;
  std::size_t length = cbor_serialize_alloc(&item, &buffer, &capacity);
  std::vector<std::uint8_t> out(buffer, buffer + length);
  std::free(buffer);
  return out;
}

std::optional<Value> valueFromItem(const cbor_item_t& item, std::string* why) {
  return convert(item, why, 0);
}

ItemPtr itemFromValue(const Value& value, ItemWidths widths) {
  return ItemPtr(build(value, widths, 0));
}

std::optional<std::string> itemMismatch(const cbor_item_t& item, const Value& value) {
  return walk(item, value, "", 0);
}

}  // namespace platform::cbor::oracle
