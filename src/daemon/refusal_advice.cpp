// SPDX-License-Identifier: Apache-2.0
// One advice for each reason.
#include "daemon/refusal_advice.h"

#include <fmt/format.h>

namespace veltrad::daemon {

using wire::Reason;

std::string adviceOn(Reason reason, const RefusalPlaces& places) {
  switch (reason) {
    case Reason::storebag_rolled_back:
      return "publish the newest storebag, signed with a serial that grows with every change: "
             "veltra-storebag sign --serial N; see why the server has an older one";
    case Reason::storebag_expired:
      return "sign the storebag again with a later date: veltra-storebag sign --expires DATE; see why the "
             "server still has the old one";
    case Reason::storebag_wrong_name:
      return "publish each storebag under the name that it is signed for: veltra-storebag sign --name NAME";
    case Reason::storebag_claims_unreadable:
      return "correct that key of the storebag and sign it again; veltra-storebag lint finds it";
    case Reason::storebag_seen_unreadable:
      return fmt::format(
          "make sure that the server has the newest storebags, and then remove {}: serials and "
          "revocations are learnt anew",
          places.seen);
    case Reason::storebag_key_revoked:
      return fmt::format(
          "sign the storebag with a key that is not revoked, whose public half is in {} and "
          "named in \"keys\" of {}",
          places.keysDirectory, places.settings);
    case Reason::storebag_no_ed25519:
      return fmt::format(
          "sign the storebag with veltra-storebag sign --ed25519 KEY too; the public half of "
          "KEY belongs into {} and is named in \"keys\" of {}",
          places.keysDirectory, places.settings);
    default:
      return "see the daemon's log";
  }
}

bool concernsSignature(Reason reason) {
  return reason == Reason::storebag_key_revoked || reason == Reason::storebag_no_ed25519;
}

}  // namespace veltrad::daemon
