// SPDX-License-Identifier: Apache-2.0
// The checks, each in a function.
#include "daemon/machine_checks.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <ctime>

#include "base/version.h"
#include "config/preference_keys.h"

namespace veltrad::daemon {

namespace {

using Outcome = Check::Result;

Check fine(const char* name, std::string text) {
  return {name, Outcome::ok, std::move(text), ""};
}

Check checkConsent(Consent consent) {
  constexpr const char* kName = "consent";
  const std::string key = config::preference::kConsent;
  const std::string give = "veltractl config set " + key + " true";
  switch (consent) {
    case Consent::given:
      return fine(kName, "given");
    case Consent::refused:
      return {kName, Outcome::warning,
              "refused: " + key + " is false, so only what needs no consent is reported",
              "the owner's choice; to change it: " + give};
    case Consent::neverGiven:
      return {kName, Outcome::failure,
              "never given: " + key + " is not set, so only what needs no consent is reported", give};
    case Consent::noBoolean:
      return {kName, Outcome::failure, key + " is not a boolean, which counts as refused", give};
    case Consent::policyBroken:
      return {kName, Outcome::failure, "nothing may leave: policy.json is broken or cannot be read",
              "correct etc/veltrad/policy.json; the daemon's log names the line and column"};
    case Consent::reportingOff:
      return {kName, Outcome::warning, "nothing may leave: the owner of the device has turned reporting off",
              "the owner's choice: \"reporting\" in policy.json, or veltractl privacy on"};
    case Consent::notKnown:
      break;
  }
  return {kName, Outcome::warning, key + " cannot be read just now", "run the command again"};
}

Check checkMessageLog(const MachineFacts& facts) {
  constexpr const char* kName = "messageLog";
  if (facts.messageLogProblem.empty()) return fine(kName, facts.messageLogPath);
  return {kName, Outcome::failure, facts.messageLogProblem,
          fmt::format("make {} a directory that the daemon's user may write to, with free space",
                      facts.messageLogPath)};
}

Check checkSandbox(const MachineFacts& facts) {
  constexpr const char* kName = "sandbox";
  if (facts.sandboxInForce) return fine(kName, facts.sandboxLine);
  return {kName, Outcome::warning, facts.sandboxLine,
          "use a kernel with Landlock (5.13 or newer, \"landlock\" in its lsm= list)"};
}

Check checkDescriptors(const MachineFacts& facts) {
  constexpr const char* kName = "descriptors";
  const std::string mend = fmt::format("in the unit of veltrad: LimitNOFILE={}", facts.descriptorsNeeded);
  if (facts.descriptors < kFewestDescriptors) {
    return {kName, Outcome::failure,
            fmt::format("{} at most, and a daemon with a few clients needs {}", facts.descriptors,
                        kFewestDescriptors),
            mend};
  }
  if (facts.descriptors < facts.descriptorsNeeded) {
    return {kName, Outcome::warning,
            fmt::format("{} at most; for as many connections as are allowed it takes {}", facts.descriptors,
                        facts.descriptorsNeeded),
            mend};
  }
  return fine(kName, fmt::format("{} at most", facts.descriptors));
}

std::string dateOf(double secondsSince1970) {
  const auto whole = static_cast<std::time_t>(secondsSince1970);
  std::tm parts{};
  gmtime_r(&whole, &parts);
  return fmt::format("{:%Y-%m-%d %H:%M:%S} UTC", parts);
}

Check checkClock(double now) {
  constexpr const char* kName = "clock";
  if (now >= kEarliestTime) return fine(kName, dateOf(now));
  return {kName, Outcome::failure,
          fmt::format("{} is before this program was made: certificates seem not valid yet, and no storebag "
                      "expires by it",
                      dateOf(now)),
          "set the clock: timedatectl set-ntp true"};
}

}  // namespace

void addMachineChecks(const MachineFacts& facts, std::vector<Check>& checks) {
  checks.push_back(checkConsent(facts.consent));
  checks.push_back(checkMessageLog(facts));
  checks.push_back(checkSandbox(facts));
  checks.push_back(checkDescriptors(facts));
  checks.push_back(checkClock(facts.now));
}

}  // namespace veltrad::daemon
