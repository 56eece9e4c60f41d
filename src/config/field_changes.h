// SPDX-License-Identifier: Apache-2.0
// Who hears which fields of a message were taken out, or had their values hidden.
#pragma once

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

// Keeps the names. Allocates nothing before the first.
struct EditedFields final : FieldChanges {
  std::set<std::string> removed;
  std::set<std::string> hashed;

  void changed(FieldChange change, std::string_view name) override {
    (change == FieldChange::removed ? removed : hashed).emplace(name);
  }
  void add(const EditedFields& others) {
    removed.insert(others.removed.begin(), others.removed.end());
    hashed.insert(others.hashed.begin(), others.hashed.end());
  }
  bool empty() const { return removed.empty() && hashed.empty(); }
};
// Null: no field was changed.
using SharedEdits = std::shared_ptr<const EditedFields>;

}  // namespace veltrad::config
