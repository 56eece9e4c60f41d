// SPDX-License-Identifier: Apache-2.0
// The C interface's functions on values.
#include <cstring>
#include <iterator>

#include "base/text.h"
#include "client/value_node.h"

using veltrad::Value;

namespace {

// Property lists hold only valid Unicode.
std::string mended(std::string_view text) {
  return veltrad::isUTF8(text) ? std::string(text) : veltrad::toUTF8(text);
}

veltra_value* leaf(Value value) {
  return new veltra_value(std::move(value));
}

bool isOf(const veltra_value* value, Value::Type type) {
  return value && value->leaf() && value->leaf()->type() == type;
}

}  // namespace

veltra_value* veltra_boolean(bool value) {
  return leaf(value);
}
veltra_value* veltra_signed(int64_t value) {
  return leaf(value);
}
veltra_value* veltra_unsigned(uint64_t value) {
  return leaf(value);
}
veltra_value* veltra_real(double value) {
  return leaf(value);
}
veltra_value* veltra_date(double seconds_since_1970) {
  return leaf(veltrad::Date{seconds_since_1970});
}
veltra_value* veltra_array(void) {
  return new veltra_value(veltra_value::Items{});
}
veltra_value* veltra_dictionary(void) {
  return new veltra_value(veltra_value::Entries{});
}

veltra_value* veltra_string(const char* text) {
  return text ? veltra_string_with_length(text, std::strlen(text)) : nullptr;
}

veltra_value* veltra_string_with_length(const char* text, size_t length) {
  if (!text && length > 0) return nullptr;
  return leaf(mended(text ? std::string_view(text, length) : std::string_view()));
}

veltra_value* veltra_data(const void* bytes, size_t length) {
  if (!bytes && length > 0) return nullptr;
  return leaf(veltrad::Data{bytes ? std::string(static_cast<const char*>(bytes), length) : std::string()});
}

veltra_status veltra_array_append(veltra_value* array, veltra_value* value) {
  if (array && value && array->append(value)) return VELTRA_OK;
  veltra_release(value);
  return VELTRA_INVALID;
}

veltra_status veltra_dictionary_set(veltra_value* dictionary, const char* key, veltra_value* value) {
  if (dictionary && key && value && dictionary->set(mended(key), value)) return VELTRA_OK;
  veltra_release(value);
  return VELTRA_INVALID;
}

veltra_type veltra_type_of(const veltra_value* value) {
  if (!value) return VELTRA_TYPE_NONE;
  if (value->items()) return VELTRA_TYPE_ARRAY;
  if (value->entries()) return VELTRA_TYPE_DICTIONARY;
  static constexpr veltra_type kTypes[] = {VELTRA_TYPE_BOOLEAN, VELTRA_TYPE_SIGNED, VELTRA_TYPE_UNSIGNED,
                                           VELTRA_TYPE_REAL,    VELTRA_TYPE_STRING, VELTRA_TYPE_DATE,
                                           VELTRA_TYPE_DATA,    VELTRA_TYPE_ARRAY,  VELTRA_TYPE_DICTIONARY};
  static_assert(std::size(kTypes) == static_cast<std::size_t>(Value::Type::dictionary) + 1);
  return kTypes[static_cast<std::size_t>(value->leaf()->type())];
}

bool veltra_get_boolean(const veltra_value* value) {
  return isOf(value, Value::Type::boolean) && value->leaf()->toBoolean().value_or(false);
}

int64_t veltra_get_signed(const veltra_value* value) {
  // An unsigned value that does not fit wraps to a negative one.
  if (isOf(value, Value::Type::signedInteger)) return value->leaf()->toInt64().value_or(0);
  if (!isOf(value, Value::Type::unsignedInteger)) return 0;
  const int64_t wrapped = value->leaf()->toInt64().value_or(0);
  return wrapped >= 0 ? wrapped : 0;
}

uint64_t veltra_get_unsigned(const veltra_value* value) {
  if (isOf(value, Value::Type::unsignedInteger)) {
    return static_cast<uint64_t>(value->leaf()->toInt64().value_or(0));
  }
  if (!isOf(value, Value::Type::signedInteger)) return 0;
  const int64_t number = value->leaf()->toInt64().value_or(0);
  return number >= 0 ? static_cast<uint64_t>(number) : 0;
}

double veltra_get_real(const veltra_value* value) {
  if (!value || !value->leaf()) return 0;
  if (const veltrad::Date* date = value->leaf()->asDate()) return date->secondsSince1970;
  if (const double* real = value->leaf()->asReal()) return *real;
  return value->leaf()->isNumber() ? value->leaf()->toDouble().value_or(0) : 0;
}

const char* veltra_get_string(const veltra_value* value, size_t* length) {
  const std::string* text = value && value->leaf() ? value->leaf()->asString() : nullptr;
  if (length) *length = text ? text->size() : 0;
  return text ? text->c_str() : nullptr;
}

const void* veltra_get_data(const veltra_value* value, size_t* length) {
  const veltrad::Data* data = value && value->leaf() ? value->leaf()->asData() : nullptr;
  if (length) *length = data ? data->bytes.size() : 0;
  return data ? data->bytes.data() : nullptr;
}

size_t veltra_count(const veltra_value* value) {
  if (!value) return 0;
  if (value->items()) return value->items()->size();
  return value->entries() ? value->entries()->size() : 0;
}

const veltra_value* veltra_array_item(const veltra_value* array, size_t index) {
  return array && array->items() && index < array->items()->size() ? (*array->items())[index] : nullptr;
}

const veltra_value* veltra_dictionary_item(const veltra_value* dictionary, const char* key) {
  if (!dictionary || !key || !dictionary->entries()) return nullptr;
  const auto at = dictionary->entries()->find(std::string_view(key));
  return at != dictionary->entries()->end() ? at->second : nullptr;
}

const veltra_value* veltra_dictionary_entry(const veltra_value* dictionary, size_t index, const char** key) {
  const bool there = dictionary && dictionary->entries() && index < dictionary->entries()->size();
  const auto* entry = there ? dictionary->index()[index] : nullptr;
  if (key) *key = entry ? entry->first.c_str() : nullptr;
  return entry ? entry->second : nullptr;
}
