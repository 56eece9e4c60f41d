// SPDX-License-Identifier: Apache-2.0
// Reads and changes preferences through the daemon, or in their files while no daemon runs. One thread.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "base/result.h"
#include "base/value.h"
#include "tools/ctl/control_client.h"

namespace veltrad::ctl {

class PreferenceAccess {
 public:
  enum class Use { read, change };
  // If no daemon runs, the daemon's lock is held from here on. The error is one line that says what to do.
  static Result<PreferenceAccess, std::string> open(const std::optional<std::string>& root, Use use);
  PreferenceAccess(PreferenceAccess&&) noexcept;
  ~PreferenceAccess();

  // The questions "config", "setConfig" and "unsetConfig" of the control socket.
  Result<Dictionary, std::string> ask(const char* question, const Dictionary& arguments = {});

 private:
  struct Files;
  PreferenceAccess();

  std::optional<ControlClient> _daemon;
  std::unique_ptr<Files> _files;  // where there is no daemon
};

}  // namespace veltrad::ctl
