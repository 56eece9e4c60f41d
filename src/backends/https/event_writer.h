// SPDX-License-Identifier: Apache-2.0
// Writes an event field by field.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "backends/https/event.h"
#include "base/value.h"
#include "formats/json_text_writer.h"

namespace veltrad::backends {

// Merges the payload, the added fields and the user info in one pass, in the order of the keys' bytes, and
// filters each field as it is written; so no dictionary is made of the event. Of equal keys the user info
// wins, then the added field. The arguments must outlive it.
class EventWriter {
 public:
  // Overwrites the text. `method` and `status` are those for the filters.
  EventWriter(const Dictionary& payload, const Dictionary& userInfo, const FilterTable& filters,
              std::int32_t method, std::int32_t status, WrittenEvent& event);

  // To be called in the order of the keys' bytes. A text, an integer or a finite real.
  template <typename T>
  void add(std::string_view key, T value) {
    putUpTo(&key);
    if (_payload != _payloadEnd && _payload->first == key) ++_payload;
    if (_user != _userEnd && _user->first == key) return put(*_user++);
    if (!_filters.empty()) return put({std::string(key), Value(value)});
    _writer.Key(key);
    write(value);
    ++_event.text.fields;
  }
  // Writes what follows the last field.
  void finish() {
    putUpTo(nullptr);
    _writer.EndObject();
  }

 private:
  using Field = Dictionary::const_iterator;

  // Writes the fields of the payload and the user info before `key`, or all.
  void putUpTo(const std::string_view* key);
  void put(const Dictionary::Entry& field);
  void write(std::string_view text) { _writer.String(text); }
  void write(double number) { _writer.Double(number); }
  void write(std::int32_t number) { _writer.Int64(number); }
  void write(std::uint32_t number) { _writer.Uint64(number); }

  const FilterTable& _filters;
  const std::int32_t _method;
  const std::int32_t _status;
  WrittenEvent& _event;
  formats::JSONTextWriter _writer;
  Field _payload;
  const Field _payloadEnd;
  Field _user;
  const Field _userEnd;
};

}  // namespace veltrad::backends
