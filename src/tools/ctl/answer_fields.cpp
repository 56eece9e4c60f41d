// SPDX-License-Identifier: Apache-2.0
#include "tools/ctl/answer_fields.h"

#include "base/text.h"

namespace veltrad::ctl {

std::string textIn(const Dictionary& answer, const char* key, const char* otherwise) {
  const std::string* text = answer.string(key);
  return escapedForLog(text ? *text : otherwise);
}

std::int64_t numberIn(const Dictionary& answer, const char* key) {
  const Value* value = answer.find(key);
  return value ? value->toInt64().value_or(0) : 0;
}

const Array& arrayIn(const Dictionary& answer, const char* key) {
  static const Array kNone;
  const Array* array = answer.array(key);
  return array ? *array : kNone;
}

std::vector<const Dictionary*> dictionariesIn(const Dictionary& answer, const char* key) {
  std::vector<const Dictionary*> dictionaries;
  for (const Value& element : arrayIn(answer, key))
    if (const Dictionary* dictionary = element.asDictionary()) dictionaries.push_back(dictionary);
  return dictionaries;
}

}  // namespace veltrad::ctl
