// SPDX-License-Identifier: Apache-2.0
// Compares what a session has been given with what the daemon holds.
#include "session/given_storebag.h"

#include "platform/log.h"

namespace veltrad::session {

bool GivenStorebag::follow(StorebagNow now, std::uint32_t sessionID) {
  if (now.section == _section) return false;
  if (!now.section) {
    if (_section->asGiven == Dictionary()) return false;
    config::StorebagOrigin origin = _section->origin;
    give(config::parseSection({}, std::move(origin)), std::move(_version));
    logWarning("takeNews: Session %u has no storebag '%s' any more that may be used", sessionID,
               _section->origin.name.c_str());
    return true;
  }
  // The same content may have been fetched once more.
  const bool same = now.section->asGiven == _section->asGiven &&
                    now.section->origin.version == _section->origin.version &&
                    now.section->origin.section == _section->origin.section;
  give(std::move(now.section), std::move(now.version));
  if (same) return false;
  logInfo("takeNews: Session %u goes on with storebag '%s', version %s", sessionID,
          _section->origin.name.c_str(), _version ? _version->c_str() : "(null)");
  return true;
}

}  // namespace veltrad::session
