// Which section of a storebag a client type gets, for how long, and what is said when there is none.
#include "config/storebag_section.h"

#include <gtest/gtest.h>

#include "log_lines.h"
#include "storebag_server.h"

namespace veltrad {
namespace {

constexpr const char* kPrefix = "fetchStorebagForEnvironmentAndClientType: ";
constexpr std::int32_t kUntouched = -77;

Dictionary sectionNamed(const char* name) {
  return Dictionary{{name, Dictionary{}}};
}

struct Fetch {
  explicit Fetch(Configuration& configuration, std::int32_t clientType = 5,
                 std::optional<std::string> held = std::nullopt)
      : lastModified(std::move(held)) {
    LogLines log;
    configuration.settings.currentEnvironment();
    log.take();
    StorebagSections sections(configuration.server.client, configuration.settings, configuration.veltra);
    section = sections.fetchStorebagForEnvironmentAndClientType(clientType, maxAge, version, notModified,
                                                                &lastModified);
    lines = log.takeInfoAndAbove();
  }
  std::optional<Dictionary> section;
  std::int32_t maxAge = kUntouched;
  std::optional<std::string> version = "as it was";
  bool notModified = false;
  std::optional<std::string> lastModified;
  Lines lines;
};

TEST(StorebagSections, ChooseByEnvironment) {
  const Dictionary all{{"development", sectionNamed("d")},
                       {"florn_internal", sectionNamed("i")},
                       {"seed", sectionNamed("s")},
                       {"release", sectionNamed("r")},
                       {"version", "7"}};
  const Dictionary noSeed{{"release", sectionNamed("r")}, {"seed", "of the wrong type"}};
  const std::string missingSeed =
      std::string("warning: ") + kPrefix + "Seed section is missing in the storebag.";
  const auto none = [](const char* name) {
    return std::string("error: ") + kPrefix + "Could not find storebag for client type 5 with " + name +
           " environment";
  };
  struct Case {
    int environment;
    Dictionary storebag;
    std::optional<Dictionary> section;
    std::optional<std::string> version;
    Lines lines;
  };
  const std::vector<Case> table = {
      {1, all, sectionNamed("d"), "7", {}},
      {2, all, sectionNamed("i"), "7", {}},
      {3, all, sectionNamed("s"), "7", {}},
      {4, all, sectionNamed("r"), "7", {}},
      {3, noSeed, sectionNamed("r"), std::nullopt, {missingSeed}},
      {4, noSeed, sectionNamed("r"), std::nullopt, {}},
      {3, Dictionary{{"version", "7"}}, std::nullopt, "as it was", {missingSeed, none("seed")}},
      {2, noSeed, std::nullopt, "as it was", {none("florn_internal")}},
      {0, all, std::nullopt, "as it was", {none("(null)")}},
  };
  for (const Case& c : table) {
    Configuration configuration(c.environment);
    configuration.server.answers(container(c.storebag));
    const Fetch fetch(configuration);
    EXPECT_EQ(fetch.section, c.section) << c.environment;
    EXPECT_EQ(fetch.version, c.version) << c.environment;
    EXPECT_EQ(fetch.maxAge, 86'400) << c.environment;
    EXPECT_EQ(fetch.lines, c.lines) << c.environment;
  }
}

TEST(StorebagSections, LetTheStorebagCapItsOwnLifetime) {
  struct Case {
    std::optional<Value> cycle;
    const char* cacheControl;
    std::int32_t maxAge;
  };
  const std::vector<Case> table = {{Value(3600), "max-age=86400", 3'600},
                                   {Value(3600), "max-age=60", 3'600},
                                   {Value(200000), "max-age=60", 86'400},
                                   {Value(0), "max-age=600", 0},
                                   {Value(-5), "max-age=600", -5},
                                   {Value(60.9), "max-age=600", 60},
                                   {Value(5'000'000'000), "max-age=1", 86'400}};
  for (const Case& c : table) {
    Configuration configuration;
    configuration.server.answers(
        container(Dictionary{{"release", sectionNamed("r")}, {"refresh_cycle", *c.cycle}}),
        {{"Cache-Control", c.cacheControl}});
    const Fetch fetch(configuration);
    EXPECT_EQ(fetch.maxAge, c.maxAge);
    EXPECT_EQ(fetch.lines, Lines{std::string("info: ") + kPrefix +
                                 "Store bag override MaxAge=" + std::to_string(c.maxAge)});
  }
  for (const Dictionary& storebag : {Dictionary{{"release", sectionNamed("r")}},
                                     Dictionary{{"release", sectionNamed("r")}, {"refresh_cycle", "3600"}}}) {
    Configuration configuration;
    configuration.server.answers(container(storebag), {{"Cache-Control", "max-age=100000"}});
    const Fetch fetch(configuration);
    EXPECT_EQ(fetch.maxAge, 100'000);
    EXPECT_EQ(fetch.lines, Lines{});
  }
}

TEST(StorebagSections, AskNoServerForClientTypesWithoutAStorebag) {
  for (const std::int32_t clientType : {3, -1, 18}) {
    Configuration configuration;
    const Fetch fetch(configuration, clientType);
    EXPECT_EQ(fetch.section, std::nullopt);
    EXPECT_TRUE(configuration.server.requests().empty());
    EXPECT_EQ(fetch.lines,
              Lines{std::string("error: ") + kPrefix + "Could not find storebag name for client type " +
                    std::to_string(clientType)});
  }
}

TEST(StorebagSections, TellAFailureFromACopyThatIsCurrent) {
  Configuration configuration;
  configuration.server.answers("", {{"Last-Modified", "Tue"}, {"Cache-Control", "max-age=60"}}, 304);
  const Fetch current(configuration, 5, "Mon");
  EXPECT_EQ(current.section, std::nullopt);
  EXPECT_TRUE(current.notModified);
  EXPECT_EQ(current.maxAge, 60);
  EXPECT_EQ(current.version, "as it was");
  EXPECT_EQ(current.lines, Lines{});

  configuration.server.isUnreachable();
  const Fetch failed(configuration, 6);
  EXPECT_EQ(failed.section, std::nullopt);
  EXPECT_FALSE(failed.notModified);
  ASSERT_EQ(failed.lines.size(), 2u);
  EXPECT_EQ(failed.lines[1], std::string("error: ") + kPrefix + "Could not fetch storebag for client type 6");
}

TEST(StorebagSections, ServeTheDefaultStorebagInEveryEnvironment) {
  for (int environment = 1; environment <= 4; ++environment) {
    Configuration configuration(environment);
    configuration.server.isUnreachable();
    const Fetch fetch(configuration, 13);
    EXPECT_EQ(fetch.section, (Dictionary{{"mivo", Dictionary{{"active", true}}}})) << environment;
    EXPECT_EQ(fetch.version, "1.0.0-Quindle-Fallback");
    EXPECT_EQ(fetch.maxAge, 3'600);
  }
}

}  // namespace
}  // namespace veltrad
