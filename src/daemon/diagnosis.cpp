// SPDX-License-Identifier: Apache-2.0
// The checks, each in a function; those about the server use the results of the checks before.
#include "daemon/diagnosis.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>

#include "base/text.h"
#include "config/process_settings.h"
#include "daemon/machine_checks.h"
#include "wire/constants.h"

namespace veltrad::daemon {

namespace {

using Outcome = Check::Result;
using Cause = config::StorebagCause;
using Findings = std::vector<StorebagFinding>;

Check ok(const char* name, std::string text) {
  return {name, Outcome::ok, std::move(text), ""};
}

Check skipped(const char* name, std::string why) {
  return {name, Outcome::skipped, std::move(why), ""};
}

Check checkEntitlement(const EntitlementFacts& facts) {
  constexpr const char* kName = "entitlement";
  const std::string rule =
      fmt::format(R"({{"uid": {}, "entitlements": {{"{}": true}}}})", facts.uid, wire::kVeltraEntitlement);
  if (!facts.rules) {
    return {kName, Outcome::warning, facts.path + " cannot be read just now", "run the command again"};
  }
  if (facts.rules->missing) {
    return {kName, Outcome::failure, fmt::format("there is no {}, so nobody may report", facts.path),
            fmt::format("write that file: an array of rules such as {}", rule)};
  }
  if (!facts.rules->error.empty()) {
    return {kName, Outcome::failure, facts.rules->error + "; nobody may report",
            fmt::format("mend {}: an array of rules such as {}", facts.path, rule)};
  }
  if (!facts.rules->grants) {
    const std::string why = facts.rules->warnings.empty() ? "" : ": " + facts.rules->warnings.front();
    return {
        kName, Outcome::failure,
        fmt::format("no rule in {} grants \"{}\" to anybody{}", facts.path, wire::kVeltraEntitlement, why),
        fmt::format("add a rule such as {}", rule)};
  }
  if (!facts.granted) {
    return {kName, Outcome::warning,
            fmt::format("{} grants \"{}\" to others, but not to uid {}, which asks", facts.path,
                        wire::kVeltraEntitlement, facts.uid),
            fmt::format("if this user is to report, add a rule such as {}", rule)};
  }
  return ok(kName, fmt::format("uid {} may report", facts.uid));
}

Check checkAddress(const AddressFacts& facts) {
  constexpr const char* kName = "storebagAddress";
  constexpr const char* kSet = "veltractl config set veltra_storebag_url https://HOST/PATH";
  if (!facts.inUse) {
    return {kName, Outcome::warning, "the storebag server's address cannot be read just now",
            "run the command again"};
  }
  const std::string shown = escapedForLog(*facts.inUse);
  const bool changed = facts.preferred && *facts.preferred != *facts.inUse;
  if (config::isExampleStorebagURL(*facts.inUse)) {
    if (changed) {
      return {kName, Outcome::failure,
              fmt::format("veltra_storebag_url was set after the daemon had chosen {}, a built-in example",
                          shown),
              "start the daemon again: systemctl restart veltrad"};
    }
    const std::string why = facts.deploymentProblem.empty()
                                ? fmt::format(
                                      "neither the preference veltra_storebag_url nor {} names a "
                                      "storebag server",
                                      facts.deploymentPath)
                                : facts.deploymentProblem;
    return {kName, Outcome::failure, fmt::format("{}; {} is a built-in example", why, shown),
            fmt::format("{}, or name the host in {}; then: systemctl restart veltrad", kSet,
                        facts.deploymentPath)};
  }
  if (!facts.inUse->starts_with("https://")) {
    return {kName, Outcome::failure, fmt::format("\"{}\" does not begin with https://", shown),
            fmt::format("{}; then: systemctl restart veltrad", kSet)};
  }
  if (changed) {
    return {kName, Outcome::warning,
            fmt::format("{} is in use, and veltra_storebag_url is now {}", shown,
                        escapedForLog(*facts.preferred)),
            "for the new address start the daemon again: systemctl restart veltrad"};
  }
  return ok(kName, shown);
}

const StorebagFinding* findingWith(const Findings& findings, Cause cause) {
  const auto at = std::find_if(findings.begin(), findings.end(), [cause](const StorebagFinding& finding) {
    return finding.answer.cause == cause;
  });
  return at == findings.end() ? nullptr : &*at;
}

bool anyAnswered(const Findings& findings) {
  return std::any_of(findings.begin(), findings.end(),
                     [](const StorebagFinding& finding) { return finding.answer.status != 0; });
}

// An error page is no storebag either, but this does not mean that the storebag is wrong.
std::string labelled(const StorebagFinding& finding) {
  const bool refused = finding.answer.cause == Cause::noStorebag && finding.answer.status >= 400;
  return fmt::format(
      "\"{}\": {}", finding.name,
      refused ? fmt::format("HTTP {}", finding.answer.status) : escapedForLog(finding.answer.why));
}

template <typename Chosen>
std::string listed(const Findings& findings, Chosen chosen, std::string (*label)(const StorebagFinding&)) {
  std::string text;
  for (const StorebagFinding& finding : findings) {
    if (chosen(finding)) text += (text.empty() ? "" : "; ") + label(finding);
  }
  return text;
}

Check checkNameResolution(const Findings& findings) {
  constexpr const char* kName = "nameResolution";
  if (const StorebagFinding* finding = findingWith(findings, Cause::resolve)) {
    return {kName, Outcome::failure, escapedForLog(finding->answer.why),
            "see whether the host in veltra_storebag_url is right, and whether this device resolves names"};
  }
  if (!anyAnswered(findings) && findingWith(findings, Cause::noAttempt))
    return skipped(kName, "no request could be made");
  return ok(kName, "the server's name is resolved");
}

Check checkTrust(const StorebagFacts& facts, const Check& resolved) {
  constexpr const char* kName = "trust";
  if (resolved.result == Outcome::failure) return skipped(kName, "the server's name is not resolved");
  if (const StorebagFinding* finding = findingWith(facts.findings, Cause::trust)) {
    return {kName, Outcome::failure, escapedForLog(finding->answer.why),
            fmt::format("put the certificate of the authority that signed the server's into {}, in PEM form",
                        facts.certificatesPath)};
  }
  if (!anyAnswered(facts.findings)) return skipped(kName, "no connection to the server has come about");
  return ok(kName, "the server's certificate is trusted");
}

// The check `name` for a storebag that a rule of the operator refuses; nothing if there is none.
std::optional<Check> checkOfRefusal(const char* name, const StorebagFacts& facts, bool ofSignature) {
  const auto is = [ofSignature](const StorebagFinding& one) {
    return one.answer.refusal && concernsSignature(*one.answer.refusal) == ofSignature;
  };
  const auto first = std::find_if(facts.findings.begin(), facts.findings.end(), is);
  if (first == facts.findings.end()) return std::nullopt;
  return Check{name, Outcome::failure, listed(facts.findings, is, labelled),
               adviceOn(*first->answer.refusal, facts.places)};
}

bool isGenuine(const StorebagFinding& finding) {
  return finding.answer.genuine.value_or(false);
}

bool isNoStorebag(const StorebagFinding& finding) {
  return finding.answer.cause == Cause::noStorebag || finding.answer.cause == Cause::content;
}

Check checkStorebag(const StorebagFacts& facts, const std::string& address) {
  constexpr const char* kName = "storebag";
  const Findings& findings = facts.findings;
  if (findingWith(findings, Cause::resolve) || findingWith(findings, Cause::trust))
    return skipped(kName, "no storebag could be asked for");
  const StorebagFinding& last = findings.back();
  if (last.answer.cause == Cause::noAttempt) {
    return {kName, Outcome::failure, labelled(last),
            "run the command again, and see the check of descriptors"};
  }
  if (endsAtServer(last.answer.cause)) {
    return {kName, Outcome::failure, labelled(last),
            fmt::format("see whether the storebag server runs and answers at {}", address)};
  }
  if (const auto refused = checkOfRefusal(kName, facts, false)) return *refused;
  const std::string problems = listed(findings, isNoStorebag, labelled);
  if (problems.empty()) return ok(kName, fmt::format("{} fetched", findings.size()));
  const std::string mend =
      fmt::format("publish the storebag, made with `veltra-storebag sign`, under {}/NAME", address);
  // No session has asked for these so far, and a fleet need not have all of them.
  const bool spare =
      !facts.needed && std::all_of(findings.begin(), findings.end(), [](const StorebagFinding& one) {
        return !isNoStorebag(one) || one.answer.status == 404;
      });
  const bool some = std::any_of(findings.begin(), findings.end(), isGenuine);
  return {kName, spare && some ? Outcome::warning : Outcome::failure, problems, mend};
}

bool isNotGenuine(const StorebagFinding& finding) {
  return finding.answer.cause == Cause::signature || finding.answer.cause == Cause::publicKey;
}

std::string quoted(const StorebagFinding& finding) {
  return fmt::format("\"{}\"", finding.name);
}

Check checkSignature(const StorebagFacts& facts) {
  constexpr const char* kName = "signature";
  if (const StorebagFinding* without = findingWith(facts.findings, Cause::publicKey)) {
    return {kName, Outcome::failure, labelled(*without),
            fmt::format("install the public key that storebags are signed for as {}", facts.publicKeyPath)};
  }
  const std::string bad = listed(facts.findings, isNotGenuine, quoted);
  if (!bad.empty()) {
    return {kName, Outcome::failure, listed(facts.findings, isNotGenuine, labelled),
            fmt::format("sign {} with the private key that belongs to {}, or install the publicKey.der that "
                        "belongs to the key it is signed with",
                        bad, facts.publicKeyPath)};
  }
  if (const auto refused = checkOfRefusal(kName, facts, true)) return *refused;
  const std::string good = listed(facts.findings, isGenuine, quoted);
  if (good.empty()) return skipped(kName, "there is no storebag to verify");
  return ok(kName, "good: " + good);
}

std::string withVersion(const StorebagFinding& finding) {
  return finding.version ? fmt::format("\"{}\" ({})", finding.name, escapedForLog(*finding.version))
                         : quoted(finding);
}

Check checkEnvironment(const StorebagFacts& facts) {
  constexpr const char* kName = "environment";
  const auto without = [](const StorebagFinding& one) { return one.answer.cause == Cause::noSection; };
  const auto with = [](const StorebagFinding& one) { return one.answer.cause == Cause::none; };
  const auto empty = [](const StorebagFinding& one) { return one.emptyRecord; };
  if (const std::string missing = listed(facts.findings, without, labelled); !missing.empty()) {
    const std::string mend =
        facts.section ? fmt::format(
                            "add the section \"{}\" to the storebag, or choose another environment: "
                            "veltractl config set environmentType 1 to 4",
                            facts.section)
                      : "choose an environment: veltractl config set environmentType 1 to 4";
    return {kName, Outcome::failure, missing, mend};
  }
  if (const std::string names = listed(facts.findings, empty, quoted); !names.empty()) {
    return {kName, Outcome::failure,
            fmt::format("the daemon holds {} as fetched successfully, but without a section: the server says "
                        "\"not modified\" of a storebag that was not kept",
                        names),
            "fetch it whole: veltractl refresh NAME"};
  }
  const std::string there = listed(facts.findings, with, withVersion);
  if (there.empty()) return skipped(kName, "there is no verified storebag to look into");
  return ok(kName, fmt::format("section \"{}\" of {}", facts.section ? facts.section : "", there));
}

Check checkClientTypes(const StorebagFacts& facts) {
  constexpr const char* kName = "clientTypes";
  if (facts.typesWithout.empty()) {
    const auto all = [](const StorebagFinding&) { return true; };
    const std::string names = listed(facts.findings, all, quoted);
    return ok(kName, names.empty() ? "no storebag was asked for" : "storebags asked for: " + names);
  }
  std::string numbers;
  for (const std::int32_t type : facts.typesWithout)
    numbers += (numbers.empty() ? "" : ", ") + std::to_string(type);
  return {kName, Outcome::warning,
          fmt::format("client types without a storebag, whose sessions never report: {}", numbers),
          "use a client type from 5 to 17"};
}

// The checks on the way to a storebag in use.
void diagnoseServer(const StorebagFacts& storebags, const AddressFacts& address, std::vector<Check>& checks) {
  const bool noAddress = checks.back().result == Outcome::failure || !address.inUse;
  if (noAddress || storebags.findings.empty()) {
    const std::string why =
        noAddress ? "there is no storebag server to ask" : "no client type that was asked for has a storebag";
    for (const char* name : {"nameResolution", "trust", "storebag", "signature", "environment"})
      checks.push_back(skipped(name, why));
    return;
  }
  checks.push_back(checkNameResolution(storebags.findings));
  checks.push_back(checkTrust(storebags, checks.back()));
  checks.push_back(checkStorebag(storebags, escapedForLog(address.inUse.value_or(""))));
  checks.push_back(checkSignature(storebags));
  checks.push_back(checkEnvironment(storebags));
}

}  // namespace

bool endsAtServer(config::StorebagCause cause) {
  return cause == Cause::noAttempt || cause == Cause::resolve || cause == Cause::connect ||
         cause == Cause::trust || cause == Cause::noAnswer;
}

const char* nameOf(Check::Result result) {
  constexpr const char* kNames[] = {"ok", "warning", "failure", "skipped"};
  return kNames[static_cast<std::size_t>(result)];
}

std::vector<Check> diagnose(const EntitlementFacts& entitlement, const AddressFacts& address,
                            const StorebagFacts& storebags, const MachineFacts& machine) {
  std::vector<Check> checks{checkEntitlement(entitlement), checkAddress(address)};
  diagnoseServer(storebags, address, checks);
  checks.push_back(checkClientTypes(storebags));
  addMachineChecks(machine, checks);
  return checks;
}

}  // namespace veltrad::daemon
