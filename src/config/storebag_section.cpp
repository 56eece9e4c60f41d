// Picks from a client type's storebag the section of the process's environment. The caller's thread.
#include "config/storebag_section.h"

#include <algorithm>
#include <limits>

#include "config/client_types.h"
#include "config/process_settings.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

constexpr std::uint32_t kSeedEnvironment = 3;

const Dictionary* sectionOf(const Dictionary& storebag, std::uint32_t environment, const char* name) {
  const Dictionary* section = name != nullptr ? storebag.dictionary(name) : nullptr;
  if (section != nullptr || environment != kSeedEnvironment) return section;
  logWarning("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
  return storebag.dictionary("release");
}

std::optional<std::int32_t> refreshCycleOf(const Dictionary& storebag) {
  const Value* entry = storebag.find("refresh_cycle");
  const std::optional<std::int64_t> seconds = entry != nullptr ? entry->toInt64() : std::nullopt;
  if (!seconds) return std::nullopt;
  constexpr std::int64_t kLeast = std::numeric_limits<std::int32_t>::min();
  constexpr std::int64_t kMost = StorebagSections::kMostRefreshCycleSeconds;
  return static_cast<std::int32_t>(std::clamp(*seconds, kLeast, kMost));
}

}  // namespace

StorebagSections::StorebagSections(http::HTTPClient& http, ProcessSettings& settings,
                                   const support::Veltra& veltra)
    : _settings(settings), _download(http, settings, veltra) {}

StorebagSectionAnswer StorebagSections::fetchStorebagForEnvironmentAndClientType(
    std::int32_t clientType, const std::optional<std::string>& lastModified) {
  using Kind = StorebagAnswer::Kind;
  const char* name = storebagNameForClientType(clientType);
  if (name == nullptr) {
    logError("fetchStorebagForEnvironmentAndClientType: Could not find storebag name for client type %d",
             clientType);
    return {};
  }
  const WholeStorebagAnswer whole = _download.fetchStorebagWithName(name, lastModified);
  const Dictionary& storebag = whole.storebag;
  StorebagSectionAnswer answer{whole, {}, {}};
  if (answer.kind == Kind::failed && answer.attempted)
    logError("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type %d",
             clientType);
  if (answer.kind != Kind::fetched) return answer;
  answer.kind = Kind::failed;
  const std::optional<std::uint32_t> environment = _settings.currentEnvironment();
  if (!environment) {
    answer.attempted = false;
    return answer;
  }
  const char* sectionName = sectionNameForEnvironment(*environment);
  const Dictionary* section = sectionOf(storebag, *environment, sectionName);
  if (section == nullptr) {
    logError(
        "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type %d with %s "
        "environment",
        clientType, sectionName != nullptr ? sectionName : "(null)");
    return answer;
  }
  answer.kind = Kind::fetched;
  answer.section = *section;
  if (const std::string* text = storebag.string("version")) answer.version = *text;
  if (const auto cycle = refreshCycleOf(storebag)) {
    answer.maxAge = *cycle;
    logInfo("fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=%d", answer.maxAge);
  }
  return answer;
}

}  // namespace veltrad::config
