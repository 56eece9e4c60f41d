// SPDX-License-Identifier: Apache-2.0
// The C interface's veltra_value: a reference-counted node of a tree. Any thread may read a node; only its
// owner changes it, one thread at a time.
#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <string>
#include <variant>
#include <vector>

#include "base/value.h"
#include "veltra/veltra.h"

// A container holds one reference to each of its parts. Parts cannot be changed, so that no value can contain
// itself, and their `depth` and `objects` are constant.
struct veltra_value {
  using Items = std::vector<veltra_value*>;
  using Entries = std::map<std::string, veltra_value*, std::less<>>;
  using Index = std::vector<const Entries::value_type*>;

  explicit veltra_value(veltrad::Value leaf) : held(std::move(leaf)) {}
  explicit veltra_value(Items items) : held(std::move(items)) {}
  explicit veltra_value(Entries entries) : held(std::move(entries)) {}
  ~veltra_value();

  const veltrad::Value* leaf() const { return std::get_if<veltrad::Value>(&held); }
  const Items* items() const { return std::get_if<Items>(&held); }
  const Entries* entries() const { return std::get_if<Entries>(&held); }
  // The entries by number, built by the first call.
  const Index& index() const;
  // Takes over a part. False if it would be nested too deep or the container is itself a part.
  bool append(veltra_value* part);
  bool set(std::string key, veltra_value* part);

  std::atomic<unsigned> references{1};
  std::atomic<bool> isPart{false};
  // The number of nested levels, including this value.
  int depth = 1;
  // This value and all its parts, shared ones counted at each place.
  std::size_t objects = 1;

 private:
  bool admit(veltra_value* part);

  std::variant<veltrad::Value, Items, Entries> held;
  mutable std::atomic<const Index*> madeIndex{nullptr};
};

namespace veltrad::client {

// The limit makes it safe to recurse over a value.
inline constexpr int kDeepestValue = 64;

// Owns one reference.
struct ReleaseValue {
  void operator()(const veltra_value* value) const { veltra_release(value); }
};
using ValuePointer = std::unique_ptr<veltra_value, ReleaseValue>;

ValuePointer nodeOfValue(const Value& value);
ValuePointer nodeOfDictionary(const Dictionary& dictionary);
Value valueOfNode(const veltra_value& node);
// Empty for anything but a dictionary.
Dictionary dictionaryOfNode(const veltra_value* node);

}  // namespace veltrad::client
