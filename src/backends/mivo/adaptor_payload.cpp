// SPDX-License-Identifier: Apache-2.0
// Converts values into the structures of veltra/adaptor.h.
#include "backends/mivo/adaptor_payload.h"

#include <utility>

namespace veltrad::backends {

AdaptorPayload::AdaptorPayload(const Dictionary* payload)
    : _present(payload != nullptr), _dictionary(payload ? valueOf(*payload) : veltra_adaptor_value{}) {}

veltra_adaptor_value AdaptorPayload::valueOf(const Value& value) {
  veltra_adaptor_value seen{};
  switch (value.type()) {
    case Value::Type::boolean:
      seen.type = VELTRA_ADAPTOR_BOOLEAN;
      seen.as.boolean = value.toBoolean().value_or(false);
      break;
    case Value::Type::signedInteger:
      seen.type = VELTRA_ADAPTOR_SIGNED;
      seen.as.signed_integer = *value.asSigned();
      break;
    case Value::Type::unsignedInteger:
      seen.type = VELTRA_ADAPTOR_UNSIGNED;
      seen.as.unsigned_integer = *value.asUnsigned();
      break;
    case Value::Type::real:
      seen.type = VELTRA_ADAPTOR_REAL;
      seen.as.real = *value.asReal();
      break;
    case Value::Type::string:
      seen.type = VELTRA_ADAPTOR_STRING;
      seen.count = value.asString()->size();
      seen.as.string = value.asString()->c_str();
      break;
    case Value::Type::date:
      seen.type = VELTRA_ADAPTOR_DATE;
      seen.as.real = value.asDate()->secondsSince1970;
      break;
    case Value::Type::data:
      seen.type = VELTRA_ADAPTOR_DATA;
      seen.count = value.asData()->bytes.size();
      seen.as.data = value.asData()->bytes.data();
      break;
    case Value::Type::array:
      return valueOf(*value.asArray());
    case Value::Type::dictionary:
      return valueOf(*value.asDictionary());
  }
  return seen;
}

veltra_adaptor_value AdaptorPayload::valueOf(const Array& array) {
  std::vector<veltra_adaptor_value> items;
  items.reserve(array.size());
  for (const Value& item : array) items.push_back(valueOf(item));
  veltra_adaptor_value seen{};
  seen.type = VELTRA_ADAPTOR_ARRAY;
  seen.count = items.size();
  seen.as.items = _items.emplace_back(std::move(items)).data();
  return seen;
}

veltra_adaptor_value AdaptorPayload::valueOf(const Dictionary& dictionary) {
  std::vector<veltra_adaptor_entry> entries;
  entries.reserve(dictionary.size());
  for (const Dictionary::Entry& entry : dictionary) {
    entries.push_back({entry.first.c_str(), entry.first.size(), valueOf(entry.second)});
  }
  veltra_adaptor_value seen{};
  seen.type = VELTRA_ADAPTOR_DICTIONARY;
  seen.count = entries.size();
  seen.as.entries = _entries.emplace_back(std::move(entries)).data();
  return seen;
}

}  // namespace veltrad::backends
