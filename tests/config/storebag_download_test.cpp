// The download of a storebag: what is asked, what each answer leads to, and what it says in the log.
#include "config/storebag_download.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "config/storebag_container.h"
#include "log_lines.h"
#include "storebag_server.h"

namespace veltrad {
namespace {

using testing::ElementsAre;
using testing::StartsWith;

const Dictionary kStorebag{{"release", Dictionary{{"mivo", Dictionary{}}}}, {"version", "1.2"}};
constexpr const char* kURL = "https://bags.test/x/ostvane?version=8.0";
constexpr const char* kMonday = "Mon, 03 Mar 2025 10:00:00 GMT";
constexpr const char* kTuesday = "Tue, 04 Mar 2025 10:00:00 GMT";
constexpr std::int32_t kUntouched = -77;

// One call, its slots and its lines.
struct Fetch {
  explicit Fetch(Configuration& configuration, std::optional<std::string> held = std::nullopt,
                 const std::string& name = "ostvane")
      : lastModified(std::move(held)) {
    LogLines log;
    StorebagDownload download(configuration.server.client, configuration.settings, configuration.veltra);
    storebag = download.fetchStorebagWithName(name, maxAge, notModified, &lastModified);
    lines = log.take();
  }
  std::optional<Dictionary> storebag;
  std::int32_t maxAge = kUntouched;
  bool notModified = false;
  std::optional<std::string> lastModified;
  Lines lines;
};

std::string urlLine(const std::string& url = kURL) {
  return "debug: fetchStorebagWithName: Storebag Server URL: " + url;
}
constexpr const char* kMissing = "error: fetchStorebagWithName: Signature is missing";
constexpr const char* kNotVerified = "error: fetchStorebagWithName: Signature can not be verified, 0x";

TEST(CacheControl, GivesTheMaxAgeOrADay) {
  const std::vector<std::pair<std::optional<std::string_view>, std::int32_t>> table = {
      {std::nullopt, 86'400},
      {"", 86'400},
      {"max-age=600", 600},
      {"public, max-age=600", 600},
      {"max-age=3600, private", 3'600},
      {"no-cache", 86'400},
      {"private, max-age", 86'400},
      {"max-age=", 0},
      {"max-age=soon", 0},
      {"max-age= 600", 0},  // the component after it is the empty one between "=" and " "
      {"max-age 600", 600},
      {"max-age=+5", 5},
      {"max-age=-5", -5},
      {"max-age=600;x", 600},
      {"public,max-age=600", 86'400},  // no component of its own
      {"Max-Age=600", 86'400},
      {"s-maxage=5, max-age=7", 7},
      {"max-age=1, max-age=2", 1},
      {"max-age=max-age=2", 0},
      {"max-age=2147483648", 2'147'483'647},
      {"max-age=99999999999999999999999", 2'147'483'647},
      {"max-age=-99999999999999999999999", -2'147'483'647 - 1},
  };
  for (const auto& [text, seconds] : table)
    EXPECT_EQ(maxAgeOfCacheControl(text), seconds) << text.value_or("(absent)");
}

TEST(StorebagDownload, AsksForTheStorebagOfThisVersion) {
  Configuration configuration;
  configuration.files.put(configuration.root.packageManifestPath(),
                          writeXMLPropertyList(Dictionary{{"version", "8.1"}}));
  configuration.server.answers(container(kStorebag));
  Fetch fetch(configuration, kMonday);
  ASSERT_EQ(configuration.server.requests().size(), 1u);
  const platform::HTTPRequest& request = configuration.server.requests()[0];
  EXPECT_EQ(request.method, platform::HTTPRequest::Method::get);
  EXPECT_EQ(request.lane, platform::HTTPRequest::Lane::storebag);
  EXPECT_EQ(request.url, "https://bags.test/x/ostvane?version=8.1");
  EXPECT_EQ(request.headers, (platform::HTTPHeaders{{"If-Modified-Since", kMonday}}));
  EXPECT_EQ(request.timeout, std::chrono::seconds(15));
  EXPECT_EQ(request.body, "");
  EXPECT_EQ(fetch.lines,
            (Lines{urlLine(request.url), "debug: fetchStorebagWithName: Adding 'Last-Modified: " +
                                             std::string(kMonday) + "' to the header"}));
}

TEST(StorebagDownload, ReturnsAVerifiedStorebagWhateverTheStatus) {
  for (const int status : {200, 404, 500}) {
    Configuration configuration;
    configuration.server.answers(container(kStorebag),
                                 {{"cache-control", "max-age=600"}, {"last-modified", kTuesday}}, status);
    const Fetch fetch(configuration);
    EXPECT_EQ(fetch.storebag, kStorebag);
    EXPECT_EQ(fetch.maxAge, 600);
    EXPECT_FALSE(fetch.notModified);
    EXPECT_EQ(fetch.lastModified, kTuesday);
    EXPECT_TRUE(configuration.server.requests()[0].headers.empty());
    EXPECT_EQ(fetch.lines, (Lines{urlLine(), "debug: fetchStorebagWithName: New 'Last-Modified: " +
                                                 std::string(kTuesday) + "' received"}));
  }
}

TEST(StorebagDownload, WorksWithoutALastModifiedSlot) {
  Configuration configuration;
  configuration.server.answers(container(kStorebag), {{"Last-Modified", kTuesday}});
  StorebagDownload download(configuration.server.client, configuration.settings, configuration.veltra);
  std::int32_t maxAge = kUntouched;
  bool notModified = false;
  EXPECT_EQ(download.fetchStorebagWithName("ostvane", maxAge, notModified, nullptr), kStorebag);
  EXPECT_EQ(maxAge, 86'400);
  EXPECT_TRUE(configuration.server.requests()[0].headers.empty());
}

TEST(StorebagDownload, FallsBackForQuindleAloneWhenTheServerIsUnreachable) {
  const auto error = [](const std::string& url) {
    return "info: fetchStorebagWithName: Error resolving with lookup server " + url +
           ", sendSynchronousRequest error Could not resolve host: bags.test";
  };
  Configuration configuration;
  configuration.server.isUnreachable();
  const Fetch other(configuration);
  EXPECT_EQ(other.storebag, std::nullopt);
  EXPECT_EQ(other.lines, (Lines{urlLine(), error(kURL)}));

  const std::string url = "https://bags.test/x/quindle?version=8.0";
  const Fetch quindle(configuration, std::nullopt, "quindle");
  const Dictionary section{{"mivo", Dictionary{{"active", true}}}};
  EXPECT_EQ(quindle.storebag, (Dictionary{{"florn_internal", section},
                                          {"development", section},
                                          {"release", section},
                                          {"version", "1.0.0-Quindle-Fallback"},
                                          {"refresh_cycle", 3600}}));
  EXPECT_EQ(quindle.lines, (Lines{urlLine(url), error(url),
                                  "info: fetchStorebagWithName: Loading default storebag 'quindle'"}));
  for (const Fetch* fetch : {&other, &quindle}) {
    EXPECT_EQ(fetch->maxAge, kUntouched);
    EXPECT_FALSE(fetch->notModified);
  }
}

TEST(StorebagDownload, LeavesTheCachedStorebagWhenTheServerSaysSo) {
  Configuration configuration;
  configuration.server.answers("", {{"Last-Modified", kTuesday}, {"Cache-Control", "max-age=60"}}, 304);
  const Fetch fetch(configuration, kMonday);
  EXPECT_EQ(fetch.storebag, std::nullopt);
  EXPECT_TRUE(fetch.notModified);
  EXPECT_EQ(fetch.maxAge, 60);
  EXPECT_EQ(fetch.lastModified, kMonday);
  EXPECT_EQ(fetch.lines.back(),
            "debug: fetchStorebagWithName: storebag content has not changed. using its cached version");

  // Without the header, or without a text to compare with, an empty answer is a broken one.
  configuration.server.answers("", {}, 304);
  const Fetch bare(configuration, kMonday);
  EXPECT_FALSE(bare.notModified);
  EXPECT_EQ(bare.lastModified, kMonday);
  EXPECT_EQ(bare.lines.back(), kMissing);

  configuration.server.answers("", {{"Last-Modified", kTuesday}}, 304);
  const Fetch first(configuration);
  EXPECT_FALSE(first.notModified);
  EXPECT_EQ(first.lastModified, kTuesday);
  EXPECT_EQ(first.lines.back(), kMissing);
}

TEST(StorebagDownload, RefusesWhatIsNotSignedAsItShould) {
  const std::string bag = writeXMLPropertyList(kStorebag);
  const std::string signature = encodeBase64(RSAKey::shared().sign(bag));
  const auto list = [](Dictionary entries) { return writeXMLPropertyList(std::move(entries)); };
  struct Case {
    const char* what;
    std::string body;
    std::vector<std::string> lines;  // how each begins
  };
  const char* const parseError = "error: fetchStorebagWithName: propertyListWithData error ";
  const std::vector<Case> table = {
      {"no property list", "<html>Not Found</html>", {parseError, kMissing}},
      {"no dictionary", writeXMLPropertyList(Array{}), {kMissing}},
      {"no signature", list({{"bag", encodeBase64(bag)}}), {kMissing}},
      {"a signature that is no text", list({{"signature", 7}, {"bag", encodeBase64(bag)}}), {kMissing}},
      {"a signature that is no base64", list({{"signature", "a"}, {"bag", encodeBase64(bag)}}), {}},
      {"no bag", list({{"signature", signature}}), {}},
      {"a bag that is no base64", list({{"signature", signature}, {"bag", "a"}}), {}},
      {"an empty signature", list({{"signature", ""}, {"bag", encodeBase64(bag)}}), {kNotVerified}},
      {"a signature over other bytes",
       list({{"signature", signature}, {"bag", encodeBase64(bag + " ")}}),
       {kNotVerified}},
      {"a signed bag that is no property list", container("bag"), {}},
      {"a signed bag that is no dictionary", container(writeXMLPropertyList(Array{})), {}},
  };
  for (const Case& c : table) {
    Configuration configuration;
    configuration.server.answers(c.body, {{"Last-Modified", kTuesday}, {"Cache-Control", "max-age=600"}});
    const Fetch fetch(configuration, kMonday);
    EXPECT_EQ(fetch.storebag, std::nullopt) << c.what;
    EXPECT_EQ(fetch.maxAge, 600) << c.what;
    EXPECT_FALSE(fetch.notModified) << c.what;
    EXPECT_EQ(fetch.lastModified, kTuesday) << c.what;
    const Lines after(fetch.lines.begin() + 3, fetch.lines.end());
    ASSERT_EQ(after.size(), c.lines.size()) << c.what;
    for (std::size_t i = 0; i < after.size(); ++i) EXPECT_THAT(after[i], StartsWith(c.lines[i])) << c.what;
  }
}

TEST(StorebagDownload, RefusesWithoutAWordWhenTheKeyIsUnusable) {
  const std::vector<std::optional<std::string>> keys = {std::nullopt, "", "no key", publicKeyOfSize(1'024)};
  for (const auto& key : keys) {
    Configuration configuration;
    configuration.files.remove(configuration.root.publicKeyPath());
    if (key) configuration.files.put(configuration.root.publicKeyPath(), *key);
    configuration.server.answers(container(kStorebag));
    const Fetch fetch(configuration);
    EXPECT_EQ(fetch.storebag, std::nullopt);
    EXPECT_EQ(fetch.maxAge, 86'400);
    EXPECT_EQ(fetch.lines, Lines{urlLine()});
  }
}

TEST(StorebagDownload, ReadsTheKeyAfresh) {
  Configuration configuration;
  configuration.server.answers(container(kStorebag));
  configuration.files.put(configuration.root.publicKeyPath(), RSAKey::generate().subjectPublicKeyInfo());
  EXPECT_THAT(Fetch(configuration).lines, ElementsAre(urlLine(), StartsWith(kNotVerified)));
  configuration.files.put(configuration.root.publicKeyPath(), RSAKey::shared().rsaPublicKey());
  EXPECT_EQ(Fetch(configuration).storebag, kStorebag);
}

}  // namespace
}  // namespace veltrad
