// SPDX-License-Identifier: Apache-2.0
// Which storebags are accepted: dates, the operator's rules, and the record of earlier ones.
#include "config/storebag_verdict.h"

#include <gtest/gtest.h>

#include "config/expiry_date.h"
#include "config/seen_storebags_file.h"
#include "config/storebag_signing.h"
#include "configuration.h"

namespace veltrad {
namespace {

using config::StorebagClaims;
using wire::Reason;

TEST(ExpiryDate, IsTheEndOfADayOrAMoment) {
  const std::pair<std::string_view, std::optional<double>> table[] = {
      {"1970-01-01", 86'400},
      {"2026-11-26", 1'795'737'600},
      {"2024-02-29", 1'709'251'200},
      {"2026-11-26T00:00:00Z", 1'795'651'200},
      {"2026-11-26t01:02:03.5z", 1'795'654'923.5},
      {"2026-11-26 01:00:00+01:00", 1'795'651'200},
      {"2026-11-25T22:30:00-01:30", 1'795'651'200},
      {"2026-12-31T23:59:60Z", 1'798'761'600},
      {"9999-12-31", 253'402'300'800},
  };
  for (const auto& [text, seconds] : table) EXPECT_EQ(config::expiryOf(text), seconds) << text;
  for (const std::string_view text : {"",
                                      "soon",
                                      "2026",
                                      "2026-11",
                                      "2026-11-26T",
                                      "26-11-2026",
                                      "2026/11/26",
                                      "2026-13-01",
                                      "2025-02-29",
                                      "2026-11-31",
                                      "2026-00-10",
                                      "1969-12-31",
                                      "-026-11-26",
                                      "2026-11-26T01:02",
                                      "2026-11-26T01:02:03",
                                      "2026-11-26T24:00:00Z",
                                      "2026-11-26T01:60:00Z",
                                      "2026-11-26T01:02:61Z",
                                      "2026-11-26T01:02:03.Z",
                                      "2026-11-26T01:02:03+24:00",
                                      "2026-11-26T01:02:03+0100",
                                      "2026-11-26T01:02:03Zz",
                                      "2026-11-26 ",
                                      " 2026-11-26",
                                      "2026-1-26"})
    EXPECT_EQ(config::expiryOf(text), std::nullopt) << text;
}

constexpr double kNow = 1'795'700'000;  // within 2026-11-26
const std::string kRSA(64, 'a'), kFirst(64, 'b'), kSecond(64, 'c');
const config::StorebagRules kAll{true, true, true, true, true};

// A bag that satisfies all rules, with the given changes.
Dictionary saying(const Dictionary& other = {}) {
  Dictionary bag{{"release", Dictionary()}, {"name", "quindle"}, {"serial", 5}, {"expires", "2026-11-26"}};
  bag.merge(other);
  return bag;
}
Dictionary without(const char* key) {
  Dictionary bag = saying();
  bag.erase(key);
  return bag;
}

std::optional<config::StorebagRefusal> refusalOf(const Dictionary& bag,
                                                 const config::StorebagSigners& signers,
                                                 const config::SeenStorebags& seen,
                                                 const config::StorebagRules& rules, double now = kNow) {
  if (auto refusal = config::refusalOfSigners(signers, seen, rules)) return refusal;
  return config::refusalOfClaims("quindle", StorebagClaims::of(bag), signers, seen, rules, now);
}

TEST(StorebagVerdict, NamesTheRuleThatABagBreaks) {
  const config::StorebagSigners both{kRSA, {kFirst, kSecond}}, first{kRSA, {kFirst}}, none{kRSA, {}};
  const config::SeenStorebags five{{{"quindle", {{kFirst, 5}}}, {"ostvane", {{kFirst, 9}}}}, {}};
  const config::SeenStorebags fastForward{{{"quindle", {{kFirst, 5}, {kSecond, 1'000'000}}}}, {}};
  const config::SeenStorebags firstRevoked{{}, {kFirst}}, rsaRevoked{{}, {kRSA}};
  const auto revoking = [](const std::string& key) { return saying({{"revoked", Array{key}}}); };
  struct Case {
    Dictionary bag;
    config::StorebagSigners signers;
    config::SeenStorebags seen;
    std::optional<Reason> reason;
    const char* text;
  };
  const std::vector<Case> table = {
      {saying(), first, five, {}, ""},
      {saying({{"serial", 6}}), first, five, {}, ""},
      {saying({{"serial", 4}}), first, five, Reason::storebag_rolled_back, "serial 4 is lower than 5"},
      {without("serial"), first, five, Reason::storebag_rolled_back, "it has no serial, the last one had 5"},
      {without("serial"), first, {}, {}, ""},
      {saying({{"serial", "6"}}), first, five, Reason::storebag_claims_unreadable,
       "its \"serial\" is no number"},
      {saying({{"expires", "2026-11-25"}}), first, five, Reason::storebag_expired, "expired on 2026-11-25"},
      {without("expires"), first, five, {}, ""},
      {saying({{"expires", "Monday"}}), first, five, Reason::storebag_claims_unreadable,
       "its \"expires\" is no date"},
      {saying({{"expires", 1'795'700'001}}), first, five, Reason::storebag_claims_unreadable,
       "its \"expires\" is no date"},
      {saying({{"name", "ostvane"}}), first, five, Reason::storebag_wrong_name, "its name is 'ostvane'"},
      {without("name"), first, five, Reason::storebag_wrong_name, "it has no name"},
      {saying(), none, five, Reason::storebag_no_ed25519, "it has no Ed25519 signature of a known key"},
      {saying(), first, firstRevoked, Reason::storebag_key_revoked, "key bbbbbbbbbbbbbbbb is revoked"},
      {saying(), both, firstRevoked, {}, ""},
      {saying(), first, rsaRevoked, Reason::storebag_key_revoked, "key aaaaaaaaaaaaaaaa is revoked"},
      // Its own word holds for it.
      {revoking(kFirst), first, five, Reason::storebag_key_revoked, "key bbbbbbbbbbbbbbbb is revoked"},
      {revoking(std::string(64, 'B')), first, five, Reason::storebag_key_revoked,
       "key bbbbbbbbbbbbbbbb is revoked"},
      {revoking(kRSA), first, five, Reason::storebag_key_revoked, "key aaaaaaaaaaaaaaaa is revoked"},
      {revoking(kFirst), both, five, {}, ""},
      {revoking("bb"), first, five, Reason::storebag_claims_unreadable,
       "its \"revoked\" is no array of SHA-256 digests in 64 hexadecimal digits"},
      {saying({{"revoked", kFirst}}), both, five, Reason::storebag_claims_unreadable,
       "its \"revoked\" is no array"},
      // What a stolen key has set goes with it.
      {saying({{"serial", 6}}), first, fastForward, Reason::storebag_rolled_back,
       "serial 6 is lower than 1000000"},
      {saying({{"serial", 6}, {"revoked", Array{kSecond}}}), first, fastForward, {}, ""},
      {saying({{"serial", 4}, {"revoked", Array{kSecond}}}), first, fastForward, Reason::storebag_rolled_back,
       "serial 4 is lower than 5"},
  };
  for (const Case& c : table) {
    SCOPED_TRACE(formats::writeXMLPropertyList(c.bag));
    const auto refusal = refusalOf(c.bag, c.signers, c.seen, kAll);
    EXPECT_EQ(refusal ? std::optional(refusal->reason) : std::nullopt, c.reason);
    EXPECT_EQ(refusal ? refusal->text : "", c.text);
    // Without the rules none of it is checked.
    EXPECT_FALSE(refusalOf(c.bag, c.signers, c.seen, {}));
  }
  Array many;
  for (int i = 0; i < 1'025; ++i) many.push_back(std::string(60, 'd') + std::to_string(1'000 + i));
  EXPECT_EQ(refusalOf(saying({{"revoked", many}}), first, {}, kAll)->text,
            "more than 1024 keys would be revoked");
  // A clock from before this release is none.
  EXPECT_FALSE(refusalOf(saying({{"expires", "2001-01-01"}}), first, {}, kAll, 1'700'000'000));
  EXPECT_TRUE(refusalOf(saying({{"expires", "2001-01-01"}}), first, {}, kAll));
}

TEST(StorebagVerdict, RemembersSerialsByTheirSignerAndRevocationsForGood) {
  config::SeenStorebags seen;
  const auto take = [&](const Dictionary& bag, const config::StorebagSigners& signers) {
    config::remember(seen, "quindle", StorebagClaims::of(bag), signers, kAll);
  };
  take(saying(), {kRSA, {kFirst}});
  take(saying({{"serial", 3}}), {kRSA, {kFirst}});
  take(without("serial"), {kRSA, {kSecond}});
  EXPECT_EQ(seen.highest("quindle", {}), 5);
  take(saying({{"serial", 7}, {"revoked", Array{kFirst}}}), {kRSA, {kFirst, kSecond}});
  EXPECT_EQ(seen, (config::SeenStorebags{{{"quindle", {{kSecond, 7}}}}, {kFirst}}));
  EXPECT_EQ(seen.highest("quindle", {kSecond}), std::nullopt);
  EXPECT_EQ(config::seenStorebagsIn(config::textOf(seen)), seen);
  const std::string whole = config::textOf(seen);
  for (std::size_t length = 0; length + 1 < whole.size(); ++length)
    EXPECT_FALSE(config::seenStorebagsIn(whole.substr(0, length))) << length;
  for (const char* text :
       {"{}", "[]", R"({"serials": {}, "revoked": {}})", R"({"serials": [], "revoked": []})",
        R"({"serials": {"a": 1}, "revoked": []})", R"({"serials": {}, "revoked": [1]})",
        R"({"serials": {"a": {"b": "1"}}, "revoked": []})"})
    EXPECT_FALSE(config::seenStorebagsIn(text)) << text;
}

// With keys and files, as the daemon has them.
TEST(StorebagTrust, RemembersOverARestartAndVouchesForNothingOnceThatIsTorn) {
  Configuration device;
  const auto ed25519 = config::SigningKey::generateEd25519();
  device.files.put(device.root.keysDirectory() + "/second", ed25519.publicDER());
  config::OperatorChoices choices;
  choices.keys.texts = {"../second", "gone", "second"};  // of many bad ones one line a second
  choices.storebags.rollback.on = choices.storebags.ed25519.on = true;
  const auto containerOf = [&](std::int64_t serial, bool twice) {
    const std::string bag = formats::writeXMLPropertyList(saying({{"serial", serial}}));
    Dictionary container{{"signature", encodeBase64(RSAKey::shared().sign(bag))}, {"bag", encodeBase64(bag)}};
    if (twice)
      container.set("signatures", Array{Dictionary{{"key", ed25519.fingerprint().substr(0, 16)},
                                                   {"ed25519", encodeBase64(ed25519.sign(bag))}}});
    return formats::writeXMLPropertyList(container);
  };
  const auto refusal = [&](config::StorebagTrust& trust, std::int64_t serial, bool twice = true) {
    const auto storebag = trust.accepted("quindle", containerOf(serial, twice), choices);
    return storebag ? std::optional<Reason>() : storebag.error().reason;
  };
  const std::string path = device.root.seenStorebagsPath();
  const std::string line = "Storebag 'quindle' refused: ";
  ExpectedLog log(
      {"3 Storebag key not used: \"../second\" is no name of a file in /etc/veltrad/keys",
       "3 " + line + "serial 4 is lower than 5", "3 " + line + "it has no Ed25519 signature of a known key",
       "3 " + line + "what was seen of earlier ones cannot be read: " + path +
           ": torn, or not written by this program",
       "4 Storebag 'quindle': its serial and revocations will not be known after the next start: " + path +
           ": No space left on device",
       "3 " + line + "serial 6 is lower than 7"});
  EXPECT_EQ(refusal(device.trust, 5), std::nullopt);
  choices.keys.texts = {"second"};
  EXPECT_EQ(device.files.mode(path), 0600u);
  EXPECT_EQ(refusal(device.trust, 6, false), Reason::storebag_no_ed25519);
  const auto restarted = [&](auto then) {
    config::SeenStorebagsFile seen(device.files, path);
    config::StorebagTrust trust(device.veltra, device.files, seen, device.clock, device.counters,
                                device.root.keysDirectory());
    return then(trust);
  };
  EXPECT_EQ(restarted([&](auto& trust) { return refusal(trust, 4); }), Reason::storebag_rolled_back);
  const std::string whole = *device.files.bytes(path);
  device.files.put(path, whole.substr(0, whole.size() / 2));
  EXPECT_EQ(restarted([&](auto& trust) { return refusal(trust, 5); }), Reason::storebag_seen_unreadable);
  device.files.failReads(path, FakeFileStore::Kind::shortage);
  const auto cause = [&](auto& trust) {
    return trust.accepted("quindle", containerOf(5, true), choices).error().cause;
  };
  EXPECT_EQ(restarted(cause), config::StorebagCause::noAttempt);
  device.files.failReads(path, {});
  device.files.put(path, whole);
  device.files.failWrites(FakeFileStore::Kind::noSpace);
  // A record that cannot be written applies in this process, and is written with the next accepted bag.
  EXPECT_EQ(restarted([&](auto& trust) {
              EXPECT_EQ(refusal(trust, 7), std::nullopt);
              EXPECT_EQ(*device.files.bytes(path), whole);
              device.files.failWrites({});
              return refusal(trust, 7);
            }),
            std::nullopt);
  EXPECT_EQ(restarted([&](auto& trust) { return refusal(trust, 6); }), Reason::storebag_rolled_back);
}

}  // namespace
}  // namespace veltrad
