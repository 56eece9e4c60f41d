// SPDX-License-Identifier: Apache-2.0
// The storebag section that a session has been given. The session's thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>

#include "config/storebag_content.h"
#include "session/session_delegate.h"

namespace veltrad::session {

class GivenStorebag {
 public:
  void give(std::shared_ptr<const config::StorebagSection> section, std::optional<std::string> version) {
    _section = std::move(section);
    _version = std::move(version);
  }
  // Gives what the daemon holds now. If back ends must be made anew, because of another version, another
  // section, or none that may be used, which leaves an empty one, `make` makes them, and this is logged with
  // the session's ID. What `make` throws leaves what was given before, so that the next call tries again.
  void follow(StorebagNow now, std::uint32_t sessionID, const std::function<void()>& make);
  void forget() { give(nullptr, std::nullopt); }

  // Something was given.
  const config::StorebagSection& section() const { return *_section; }
  const std::optional<std::string>& version() const { return _version; }

 private:
  // Whether it is another one.
  bool take(StorebagNow now);

  std::shared_ptr<const config::StorebagSection> _section;
  std::optional<std::string> _version;
};

}  // namespace veltrad::session
