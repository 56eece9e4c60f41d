// SPDX-License-Identifier: Apache-2.0
// Compares the session's section with the daemon's current one.
#include "session/given_storebag.h"

#include "platform/log.h"

namespace veltrad::session {

void GivenStorebag::follow(StorebagNow now, std::uint32_t sessionID, const std::function<void()>& make) {
  if (now.section == _section) return;
  const bool mayBeUsed = now.section != nullptr;
  GivenStorebag before = *this;
  try {
    if (!take(std::move(now))) return;
    make();
  } catch (...) {
    *this = std::move(before);
    throw;
  }
  if (mayBeUsed)
    logInfo("takeNews: Session %u goes on with storebag '%s', version %s", sessionID,
            _section->origin.name.c_str(), _version ? _version->c_str() : "(null)");
  else
    logWarning("takeNews: Session %u has no storebag '%s' any more that may be used", sessionID,
               _section->origin.name.c_str());
}

bool GivenStorebag::take(StorebagNow now) {
  if (!now.section) {
    if (_section->asGiven == Dictionary()) return false;
    give(config::parseSection({}, _section->origin), _version);
    return true;
  }
  // The same content may have been fetched once more.
  const bool same = now.section->asGiven == _section->asGiven &&
                    now.section->origin.version == _section->origin.version &&
                    now.section->origin.section == _section->origin.section;
  give(std::move(now.section), std::move(now.version));
  return !same;
}

}  // namespace veltrad::session
