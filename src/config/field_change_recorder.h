// SPDX-License-Identifier: Apache-2.0
// Writes the names of fields that were changed into the record of fates. One thread.
#pragma once

#include <cstdint>
#include <string_view>

#include "config/field_changes.h"
#include "platform/fate_writer.h"

namespace veltrad::config {

// Writes a few names at a time, and the rest in the destructor. Allocates nothing.
class FieldChangeRecorder final : public FieldChanges {
 public:
  // `about` names the message or the batch, and the time.
  FieldChangeRecorder(const platform::FateWriter& pen, const wire::NamesEntry& about)
      : _pen(pen), _about(about) {
    _about.backend = pen.backend();
  }
  FieldChangeRecorder(const FieldChangeRecorder&) = delete;
  ~FieldChangeRecorder() override { write(); }

  void changed(FieldChange change, std::string_view name) override {
    note(change == FieldChange::removed ? wire::Step::removed : wire::Step::hashed, name);
  }
  void restored(std::string_view name) { note(wire::Step::restored, name); }
  // Omits removed fields that are hashed in `elsewhere`, another part of the message (may be null).
  void changed(const EditedFields& edits, const EditedFields* elsewhere = nullptr) {
    for (const std::string& name : edits.removed)
      if (!elsewhere || !elsewhere->hashed.contains(name)) note(wire::Step::removed, name);
    for (const std::string& name : edits.hashed) note(wire::Step::hashed, name);
  }

 private:
  void note(wire::Step step, std::string_view name) {
    if (!_pen.writes()) return;
    if (step != _about.step || _about.count == wire::NamesEntry::kMost) write();
    _about.step = step;
    _about.names[_about.count++] = _pen.textOf(name);
  }
  void write() {
    if (_about.count > 0) _pen.ring()->write(_about);
    _about.count = 0;
  }

  const platform::FateWriter _pen;
  wire::NamesEntry _about;
};

}  // namespace veltrad::config
