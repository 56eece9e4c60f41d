// From the system's values to those of the C interface. Pure; any thread.
#include "tools/ctl/veltra_values.h"

namespace veltrad::ctl {

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

}  // namespace veltrad::ctl
