// SPDX-License-Identifier: Apache-2.0
// The download of a storebag and the choice of its section: the request, the result of each answer, and the
// log lines.
#include "config/storebag_download.h"

#include <gtest/gtest.h>

#include <climits>

#include "config/storebag_container.h"
#include "config/storebag_content.h"
#include "config/storebag_section.h"
#include "configuration.h"
#include "formats/property_list.h"

namespace veltrad {
namespace {

const Dictionary kStorebag{{"release", Dictionary{{"mivo", Dictionary{}}}}, {"version", "1.2"}};
constexpr const char* kTuesday = "Tue, 04 Mar 2025 10:00:00 GMT";
const std::string kAt = "fetchStorebagWithName: ";
const std::string kNoList = "3 " + kAt + "propertyListWithData error ";
const std::string kMissing = "3 " + kAt + "Signature is missing";
const std::string kNotVerified = "3 " + kAt + "Signature can not be verified, 0x";

using Kind = config::StorebagAnswer::Kind;
using Cause = config::StorebagCause;

// One call, its lines and what came of it.
struct Fetch : config::WholeStorebagAnswer {
  Fetch(Configuration& configuration, const Lines& lines) {
    const ExpectedLog log(lines);
    config::StorebagDownload download(configuration.client, configuration.settings, configuration.veltra,
                                      configuration.trust);
    WholeStorebagAnswer::operator=(download.fetchStorebagWithName("ostvane", std::nullopt, {}));
  }
};

TEST(CacheControl, GivesTheMaxAgeOrADay) {
  // A component ends at each "=" and each space, and at nothing else.
  const std::pair<std::int32_t, std::vector<std::string_view>> table[] = {
      {86'400, {"", "private, max-age", "public,max-age=600", "Max-Age=600"}},
      {600, {"public, max-age=600", "max-age=600, private", "max-age 600", "s-maxage=5, max-age=+600"}},
      {0, {"max-age=", "max-age=soon", "max-age= 600"}},
      {1, {"max-age=1, max-age=2"}},
      {-5, {"max-age=-5"}},
      {INT_MAX, {"max-age=2147483648", "max-age=99999999999999999999999"}},
      {INT_MIN, {"max-age=-99999999999999999999999"}},
  };
  for (const auto& [seconds, texts] : table)
    for (const std::string_view text : texts) EXPECT_EQ(config::maxAgeOfCacheControl(text), seconds) << text;
  EXPECT_EQ(config::maxAgeOfCacheControl(std::nullopt), 86'400);
}

// What is read before the exchange and after it, and the exchange itself.
TEST(StorebagDownload, IsNoAttemptDuringAShortage) {
  Configuration configuration;
  const auto isNone = [&](const std::string& what) {
    const Fetch fetch(configuration, {});
    EXPECT_FALSE(fetch.attempted) << what;
    EXPECT_EQ(fetch.kind, Kind::failed) << what;
  };
  configuration.preferences.runShort(true);
  isNone("preferences");
  configuration.preferences.runShort(false);
  configuration.answer = Failure{http::HTTPError{http::HTTPError::Kind::shortage, "why"}};
  isNone("exchange");
  configuration.answers(container(formats::writeXMLPropertyList(kStorebag)), {});
  for (const std::string& path :
       {configuration.root.packageManifestPath(), configuration.root.publicKeyPath()}) {
    configuration.files.failReads(path, FakeFileStore::Kind::shortage);
    isNone(path);
    configuration.files.failReads(path, {});
  }
  const Fetch after(configuration, {});
  EXPECT_EQ(after.kind, Kind::fetched);
  EXPECT_EQ(after.storebag, kStorebag);
  EXPECT_TRUE(after.attempted);
}

TEST(StorebagDownload, RefusesWhatIsNotSignedAsItShould) {
  const std::string bag = formats::writeXMLPropertyList(kStorebag), bagText = encodeBase64(bag);
  const std::string signature = encodeBase64(RSAKey::shared().sign(bag));
  const auto list = [](Value sign, Value content) {
    return formats::writeXMLPropertyList(
        Dictionary{{"signature", std::move(sign)}, {"bag", std::move(content)}});
  };
  const std::tuple<std::string, Lines, Cause, std::optional<bool>> table[] = {
      // Current only to one who holds a copy.
      {"", {kNoList, kMissing}, Cause::noStorebag, {}},
      {"<html>Not Found</html>", {kNoList, kMissing}, Cause::noStorebag, {}},
      {formats::writeXMLPropertyList(Array{}), {kMissing}, Cause::signature, false},
      {list(7, bagText), {kMissing}, Cause::signature, false},
      {list("a", bagText), {}, Cause::signature, false},
      {list(signature, 7), {}, Cause::signature, false},
      {list(signature, "a"), {}, Cause::signature, false},
      {list("", bagText), {kNotVerified}, Cause::signature, false},
      {list(signature, encodeBase64(bag + " ")), {kNotVerified}, Cause::signature, false},
      {container("signed, but no list"), {}, Cause::content, true},
      {container(formats::writeXMLPropertyList(Array{})), {}, Cause::content, true}};
  for (const auto& [body, lines, cause, genuine] : table) {
    Configuration configuration;
    configuration.answers(body, {{"Last-Modified", kTuesday}, {"Cache-Control", "max-age=600"}});
    SCOPED_TRACE(body);
    const Fetch fetch(configuration, lines);
    EXPECT_EQ(fetch.kind, Kind::failed);
    EXPECT_EQ(fetch.cause, cause);
    EXPECT_EQ(fetch.genuine, genuine);
    EXPECT_FALSE(fetch.why.empty());
    EXPECT_EQ(fetch.maxAge, 600);
    EXPECT_EQ(fetch.lastModified, kTuesday);
  }
}

// The tests of the codecs cover hostile lists; this test checks that these bounds apply.
TEST(StorebagContainer, IsReadWithinItsOwnBounds) {
  Value deep(1);
  for (int i = 0; i < 9; ++i) deep = Array{deep};
  for (const Value& list :
       {deep, Value(Array(1'001, Value(1))), Value(std::string(config::kStorebagMostContainerBytes, 'x'))})
    EXPECT_FALSE(config::parseStorebagContainer(formats::writeXMLPropertyList(list)));
  Dictionary bag;
  for (int depth = 1; depth < config::kStorebagBagLimits.depth; ++depth) bag = Dictionary{{"deeper", bag}};
  EXPECT_EQ(config::parseStorebagBag(writeBinaryPropertyList(bag)), bag);
  EXPECT_FALSE(config::parseStorebagBag(writeBinaryPropertyList(Dictionary{{"deeper", bag}})));
}

struct Choice : config::StorebagSectionAnswer {
  Choice(int environment, const Dictionary& storebag, const Lines& lines,
         const char* cacheControl = "max-age=600") {
    const ExpectedLog log(lines);
    Configuration configuration(environment);
    configuration.answers(container(formats::writeXMLPropertyList(storebag)),
                          {{"Cache-Control", cacheControl}});
    config::StorebagSections sections(configuration.client, configuration.settings, configuration.veltra,
                                      configuration.trust, configuration.choices, configuration.store,
                                      configuration.counters);
    StorebagSectionAnswer::operator=(sections.fetchStorebagForEnvironmentAndClientType(5, std::nullopt));
  }
};

const std::string kChoosing = "fetchStorebagForEnvironmentAndClientType: ";
const Dictionary kD{{"d", 1}}, kI{{"i", 1}}, kS{{"s", 1}}, kR{{"r", 1}};

TEST(StorebagSections, ChooseByEnvironment) {
  const Dictionary full{
      {"development", kD}, {"florn_internal", kI}, {"seed", kS}, {"release", kR}, {"version", "7"}};
  const Dictionary noSeed{{"release", kR}, {"seed", "of the wrong type"}};
  const std::string missingSeed = "4 " + kChoosing + "Seed section is missing in the storebag.";
  const auto none = [](const std::string& name) {
    return "3 " + kChoosing + "Could not find storebag for client type 5 with " + name + " environment";
  };
  using Text = std::optional<std::string>;
  const std::tuple<int, Dictionary, std::optional<Dictionary>, Text, Lines> table[] = {
      {1, full, kD, "7", {}},
      {2, full, kI, "7", {}},
      {3, full, kS, "7", {}},
      {4, full, kR, "7", {}},
      {3, noSeed, kR, {}, {missingSeed}},
      {3, Dictionary{{"version", "7"}}, {}, {}, {missingSeed, none("seed")}},
      {2, noSeed, {}, {}, {none("florn_internal")}},
      {0, full, {}, {}, {none("(null)")}}};
  for (const auto& [environment, storebag, section, version, lines] : table) {
    SCOPED_TRACE(environment);
    const Choice fetch(environment, storebag, lines);
    EXPECT_EQ(fetch.kind, section ? Kind::fetched : Kind::failed);
    EXPECT_EQ(fetch.section ? std::optional(fetch.section->asGiven) : std::nullopt, section);
    EXPECT_EQ(fetch.version, version);
    EXPECT_EQ(fetch.maxAge, 600);
  }
}

TEST(StorebagSections, LetTheStorebagCapItsOwnLifetime) {
  const std::pair<Value, std::int32_t> table[] = {{3600, 3'600}, {200'000, 86'400}, {5'000'000'000, 86'400},
                                                  {0, 0},        {-5, -5},          {60.9, 60}};
  for (const auto& [cycle, seconds] : table) {
    const Lines line{"6 " + kChoosing + "Store bag override MaxAge=" + std::to_string(seconds)};
    EXPECT_EQ(Choice(4, Dictionary{{"release", kR}, {"refresh_cycle", cycle}}, line).maxAge, seconds);
  }
  // Only the storebag's own value is capped, and a text does not count as a value.
  EXPECT_EQ(Choice(4, Dictionary{{"release", kR}, {"refresh_cycle", "3600"}}, {}, "max-age=100000").maxAge,
            100'000);
}

}  // namespace
}  // namespace veltrad
