// SPDX-License-Identifier: Apache-2.0
// The results of `veltractl doctor` that tests/e2e/test_doctor.py does not cover.
#include "daemon/diagnosis.h"

#include <gtest/gtest.h>

#include <functional>
#include <iterator>

#include "config/process_settings.h"
#include "wire/names.h"

namespace veltrad {
namespace {

using config::StorebagCause;

struct Facts {
  daemon::EntitlementFacts entitlement;
  daemon::AddressFacts address;
  daemon::StorebagFacts storebags;
  daemon::MachineFacts machine;
};

daemon::StorebagFinding finding(const char* name, StorebagCause cause, int status = 200) {
  daemon::StorebagFinding found{name, {}, "v1"};
  found.answer.cause = cause;
  found.answer.why = "why";
  found.answer.status = status;
  if (cause == StorebagCause::none) found.answer.genuine = true;
  return found;
}

Facts sound() {
  Facts facts;
  facts.entitlement.rules = ipc::RulesState{false, "", {}, true};
  facts.entitlement.granted = true;
  facts.address.inUse = "https://bags.test/x";
  facts.address.preferred = facts.address.inUse;
  facts.storebags.findings = {finding("ostvane", StorebagCause::none),
                              finding("quindle", StorebagCause::none)};
  facts.storebags.needed = true;
  facts.storebags.section = "release";
  facts.storebags.places = {"/keys", "/settings", "/seen"};
  facts.machine = {daemon::Consent::given, "/log", "", true, "in force", 20'000, 9'000, 1'800'000'000};
  return facts;
}

TEST(Diagnosis, NamesWhatIsWrongAndNothingElse) {
  const auto replaceLast = [](StorebagCause cause, int status) {
    return [=](Facts& facts) { facts.storebags.findings.back() = finding("quindle", cause, status); };
  };
  const auto replaceRefused = [=](wire::Reason reason) {
    return [=](Facts& facts) {
      replaceLast(StorebagCause::refused, 200)(facts);
      facts.storebags.findings.back().answer.refusal = reason;
    };
  };
  const auto spare = [=](int status) {
    return [=](Facts& facts) {
      replaceLast(StorebagCause::noStorebag, status)(facts);
      facts.storebags.needed = false;
    };
  };
  const std::tuple<std::function<void(Facts&)>, const char*, const char*, const char*> table[] = {
      {[](Facts& facts) { facts.entitlement.rules.reset(); }, "entitlement", "warning", "again"},
      {[](Facts& facts) { facts.address.preferred = "https://other.test"; }, "storebagAddress", "warning",
       "restart"},
      {replaceLast(StorebagCause::noStorebag, 404), "storebag", "failure", "publish"},
      {replaceLast(StorebagCause::content, 200), "storebag", "failure", "publish"},
      {replaceLast(StorebagCause::noAttempt, 0), "storebag", "failure", "again"},
      {replaceLast(StorebagCause::noAnswer, 0), "storebag", "failure", "https://bags.test/x"},
      {replaceRefused(wire::Reason::storebag_rolled_back), "storebag", "failure", "--serial"},
      {replaceRefused(wire::Reason::storebag_seen_unreadable), "storebag", "failure", "remove /seen"},
      {replaceRefused(wire::Reason::storebag_key_revoked), "signature", "failure", "\"keys\" of /settings"},
      {spare(404), "storebag", "warning", "publish"},
      {spare(500), "storebag", "failure", "publish"},
      {[](Facts& facts) { facts.storebags.findings[1].emptyRecord = true; }, "environment", "failure",
       "refresh"},
      {[](Facts& facts) { facts.machine.consent = daemon::Consent::notKnown; }, "consent", "warning",
       "again"},
      {[](Facts& facts) { facts.machine.consent = daemon::Consent::policyBroken; }, "consent", "failure",
       "policy.json"},
      {[](Facts& facts) { facts.machine.consent = daemon::Consent::reportingOff; }, "consent", "warning",
       "veltractl privacy on"},
      {[](Facts& facts) { facts.machine.sandboxInForce = false; }, "sandbox", "warning", "Landlock"},
      {[](Facts& facts) { facts.machine.now = 86'400; }, "clock", "failure", "timedatectl"}};
  for (const auto& [broken, name, result, word] : table) {
    SCOPED_TRACE(std::string(name) + " " + result + " " + word);
    Facts facts = sound();
    broken(facts);
    const auto checks = diagnose(facts.entitlement, facts.address, facts.storebags, facts.machine);
    ASSERT_EQ(checks.size() + 1, std::size(wire::check::kNames));
    for (std::size_t i = 0; i < checks.size(); ++i) {
      EXPECT_STREQ(checks[i].name, wire::check::kNames[i + 1]);
      const bool named = std::string(checks[i].name) == name;
      EXPECT_STREQ(nameOf(checks[i].result), named ? result : "ok") << checks[i].name;
      if (named) EXPECT_NE(checks[i].mend.find(word), std::string::npos) << checks[i].mend;
    }
  }
}

TEST(Diagnosis, KnowsTheHostsThatStandInForOnes) {
  for (const char* url :
       {"https://storebags.example/bags/maple", "https://storebags.internal.example:8443/x"})
    EXPECT_TRUE(config::isExampleStorebagURL(url)) << url;
  for (const char* url :
       {"https://storebags.example.org/", "http://storebags.example/", "https://x/storebags.example"})
    EXPECT_FALSE(config::isExampleStorebagURL(url)) << url;
}

}  // namespace
}  // namespace veltrad
