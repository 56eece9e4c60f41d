// SPDX-License-Identifier: Apache-2.0
// A listener for the fields of a message that were removed or hashed.
#pragma once

#include <cstddef>
#include <memory>
#include <set>
#include <string>
#include <string_view>

namespace veltrad::config {

enum class FieldChange { removed, hashed };

class FieldChanges {
 public:
  virtual ~FieldChanges() = default;
  // `name`: as the message has it, at any depth; valid during the call.
  virtual void changed(FieldChange change, std::string_view name) = 0;
};

// Keeps the names: of each kind the first 256, because a client can write a name in any number of letter
// cases. Allocates nothing before the first.
struct EditedFields final : FieldChanges {
  static constexpr std::size_t kMost = 256;

  std::set<std::string> removed;
  std::set<std::string> hashed;

  void changed(FieldChange change, std::string_view name) override {
    auto& names = change == FieldChange::removed ? removed : hashed;
    if (names.size() < kMost) names.emplace(name);
  }
  void add(const EditedFields& others) {
    for (const std::string& name : others.removed) changed(FieldChange::removed, name);
    for (const std::string& name : others.hashed) changed(FieldChange::hashed, name);
  }
  bool empty() const { return removed.empty() && hashed.empty(); }
};
// Null: no field was changed.
using SharedEdits = std::shared_ptr<const EditedFields>;

}  // namespace veltrad::config
