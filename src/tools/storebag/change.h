// SPDX-License-Identifier: Apache-2.0
// A change between two states of a storebag, and its effect on users.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/value.h"

namespace veltrad::storebag {

// The worst for users first.
enum class ChangeKind {
  consent,
  backend,
  filter,
  entry,
  address,
  country,
  device,
  sampling,
  identifier,
  order,
  batching,
  hierarchy,
  refresh,
  version
};
const char* nameOf(ChangeKind kind);

// Whether more leaves devices than before: more events, more in clear, or to someone who got none.
enum class Effect { more, less, other };
const char* nameOf(Effect effect);

// The place in the new storebag; for removed parts, in the old one.
struct ChangePlace {
  std::optional<std::string> section;
  std::optional<std::string> backend;
  std::optional<std::size_t> entry;
  // Lists as they are written.
  std::optional<std::string> client;
  std::optional<std::string> service;
};

struct Change {
  ChangeKind kind;
  Effect effect;
  ChangePlace at;
  // Of the storebag, or the name of a filtered field.
  std::optional<std::string> key;
  std::optional<Value> before;
  std::optional<Value> now;
  // A sentence without a full stop.
  std::string text;
};

// As it is written; nothing: it is not there.
std::optional<Value> valueIn(const Dictionary* dictionary, const std::string& key);

// The combined effect of changes.
Effect worstOf(const std::vector<Change>& changes);
void sortWorstFirst(std::vector<Change>& changes);

// Takes the changes of one place.
class ChangeSink {
 public:
  // `changes` must outlive it.
  ChangeSink(std::vector<Change>& changes, ChangePlace at) : _changes(changes), _at(std::move(at)) {}

  void say(ChangeKind kind, Effect effect, std::optional<std::string> key, std::optional<Value> before,
           std::optional<Value> now, std::string text) {
    _changes.push_back(
        {kind, effect, _at, std::move(key), std::move(before), std::move(now), std::move(text)});
  }
  // Of a key of the dictionary that is there, as it was and as it is; null: there is none.
  void sayKey(ChangeKind kind, Effect effect, const std::string& key, const Dictionary* before,
              const Dictionary* now, std::string text) {
    say(kind, effect, key, valueIn(before, key), valueIn(now, key), std::move(text));
  }

 private:
  std::vector<Change>& _changes;
  const ChangePlace _at;
};

}  // namespace veltrad::storebag
