// SPDX-License-Identifier: Apache-2.0
// The storebag section that a session uses. The session's thread.
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
  // Takes the daemon's current section. If it has another version or content, or none may be used (then an
  // empty one is taken), `make` makes new back ends, and this is logged with the session's ID. If `make`
  // throws, the earlier section stays, and the next call tries again.
  void follow(StorebagNow now, std::uint32_t sessionID, const std::function<void()>& make);
  void forget() { give(nullptr, std::nullopt); }

  // A section must have been taken.
  const config::StorebagSection& section() const { return *_section; }
  const std::optional<std::string>& version() const { return _version; }

 private:
  // Whether it is another one.
  bool take(StorebagNow now);

  std::shared_ptr<const config::StorebagSection> _section;
  std::optional<std::string> _version;
};

}  // namespace veltrad::session
