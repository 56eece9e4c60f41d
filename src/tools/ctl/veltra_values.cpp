// Converts values.
#include "tools/ctl/veltra_values.h"

namespace veltrad::ctl {
namespace {

// `value` is not NULL: the items of containers never are.
Value valueOf(const veltra_value* value) {
  std::size_t length = 0;
  switch (veltra_type_of(value)) {
    case VELTRA_TYPE_BOOLEAN:
      return Value(veltra_get_boolean(value));
    case VELTRA_TYPE_SIGNED:
      return Value(std::int64_t{veltra_get_signed(value)});
    case VELTRA_TYPE_UNSIGNED:
      return Value(std::uint64_t{veltra_get_unsigned(value)});
    case VELTRA_TYPE_REAL:
      return Value(veltra_get_real(value));
    case VELTRA_TYPE_DATE:
      return Value(Date{veltra_get_real(value)});
    case VELTRA_TYPE_STRING: {
      const char* text = veltra_get_string(value, &length);
      return Value(std::string(text, length));
    }
    case VELTRA_TYPE_DATA: {
      const auto* bytes = static_cast<const char*>(veltra_get_data(value, &length));
      return Value(Data{bytes ? std::string(bytes, length) : std::string()});
    }
    case VELTRA_TYPE_ARRAY: {
      Array array;
      for (std::size_t index = 0; index < veltra_count(value); ++index)
        array.push_back(valueOf(veltra_array_item(value, index)));
      return Value(std::move(array));
    }
    case VELTRA_TYPE_DICTIONARY:
    case VELTRA_TYPE_NONE:
      break;
  }
  return Value(dictionaryOf(value).value_or(Dictionary()));
}

}  // namespace

VeltraValue toVeltraValue(const Value& value) {
  switch (value.type()) {
    case Value::Type::boolean:
      return VeltraValue(veltra_boolean(*value.toBoolean()));
    case Value::Type::signedInteger:
      return VeltraValue(veltra_signed(*value.toInt64()));
    // The conversion wraps, so the bits are those of the unsigned value.
    case Value::Type::unsignedInteger:
      return VeltraValue(veltra_unsigned(static_cast<std::uint64_t>(*value.toInt64())));
    case Value::Type::real:
      return VeltraValue(veltra_real(*value.toDouble()));
    case Value::Type::string: {
      const std::string& text = *value.asString();
      return VeltraValue(veltra_string_with_length(text.data(), text.size()));
    }
    case Value::Type::date:
      return VeltraValue(veltra_date(value.asDate()->secondsSince1970));
    case Value::Type::data: {
      const std::string& bytes = value.asData()->bytes;
      return VeltraValue(veltra_data(bytes.data(), bytes.size()));
    }
    case Value::Type::array: {
      VeltraValue array(veltra_array());
      for (const Value& item : *value.asArray())
        veltra_array_append(array.get(), toVeltraValue(item).release());
      return array;
    }
    case Value::Type::dictionary: {
      VeltraValue dictionary(veltra_dictionary());
      for (const auto& [key, item] : *value.asDictionary()) {
        veltra_dictionary_set(dictionary.get(), key.c_str(), toVeltraValue(item).release());
      }
      return dictionary;
    }
  }
  return nullptr;
}

VeltraValue toVeltraValue(const std::optional<Dictionary>& dictionary) {
  return dictionary ? toVeltraValue(Value(*dictionary)) : nullptr;
}

std::optional<Dictionary> dictionaryOf(const veltra_value* value) {
  if (veltra_type_of(value) != VELTRA_TYPE_DICTIONARY) return std::nullopt;
  std::vector<Dictionary::Entry> entries;
  for (std::size_t index = 0; index < veltra_count(value); ++index) {
    const char* key = nullptr;
    const veltra_value* item = veltra_dictionary_entry(value, index, &key);
    entries.emplace_back(key, valueOf(item));
  }
  return Dictionary::fromEntries(std::move(entries));
}

}  // namespace veltrad::ctl
