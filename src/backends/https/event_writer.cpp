// SPDX-License-Identifier: Apache-2.0
// Merges and filters the fields of an event.
#include "backends/https/event_writer.h"

#include "backends/https/json_fields.h"

namespace veltrad::backends {

namespace {
// Most keys differ in their first byte. (A string's end counts as a byte of 0.)
bool precedes(const std::string& a, std::string_view b) {
  if (!b.empty() && a[0] != b[0]) return static_cast<unsigned char>(a[0]) < static_cast<unsigned char>(b[0]);
  return a < b;
}
}  // namespace

EventWriter::EventWriter(const Dictionary& payload, const Dictionary& userInfo, const FilterTable& filters,
                         std::int32_t method, std::int32_t status, WrittenEvent& event)
    : _filters(filters),
      _method(method),
      _status(status),
      _event(event),
      _writer(event.text.json),
      _payload(payload.begin()),
      _payloadEnd(payload.end()),
      _user(userInfo.begin()),
      _userEnd(userInfo.end()) {
  _writer.StartObject();
}

void EventWriter::putUpTo(const std::string_view* key) {
  for (;;) {
    const bool users = _user != _userEnd && (!key || precedes(_user->first, *key));
    const bool payloads = _payload != _payloadEnd && (!key || precedes(_payload->first, *key));
    if (!users && !payloads) return;
    if (!users || (payloads && precedes(_payload->first, _user->first))) {
      put(*_payload++);
      continue;
    }
    if (payloads && _payload->first == _user->first) ++_payload;
    put(*_user++);
  }
}

void EventWriter::put(const Dictionary::Entry& field) {
  const auto& [key, value] = field;
  const auto action =
      _filters.empty() ? config::FilterAction::keep : _filters.actionOn(key, _method, _status);
  if (action == config::FilterAction::keep) {
    ++(writeField(_writer, key, value) ? _event.text.fields : _event.notJSON);
    return;
  }
  const auto digest = action == config::FilterAction::sha256 ? FilterTable::digestOf(value) : std::nullopt;
  if (!digest) {
    ++_event.filtered.removed;
    _event.edits.changed(config::FieldChange::removed, key);
    return;
  }
  ++_event.filtered.hashed;
  _event.edits.changed(config::FieldChange::hashed, key);
  ++_event.text.fields;
  _writer.Key(key);
  _writer.String(*digest);
}

}  // namespace veltrad::backends
