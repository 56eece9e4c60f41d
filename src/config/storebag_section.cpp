// Picks from a client type's storebag the section of the process's environment. The caller's thread.
#include "config/storebag_section.h"

#include <iterator>

#include "config/client_types.h"
#include "config/process_settings.h"
#include "config/storebag_content.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

constexpr std::uint32_t kSeedEnvironment = 3;
constexpr std::uint32_t kReleaseEnvironment = 4;

// By the number of its environment; null: none.
const Dictionary* sectionOf(const Storebag& storebag, std::uint32_t environment) {
  const std::optional<Dictionary>* sections[] = {&storebag.development, &storebag.flornInternal,
                                                 &storebag.seed, &storebag.release};
  const std::uint32_t place = environment - 1;
  if (place >= std::size(sections)) return nullptr;
  if (environment == kSeedEnvironment && !storebag.seed) {
    logWarning("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
    return sectionOf(storebag, kReleaseEnvironment);
  }
  return *sections[place] ? &**sections[place] : nullptr;
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
    StorebagSectionAnswer none;
    none.cause = StorebagCause::noName;
    none.why = "client type " + std::to_string(clientType) + " has no storebag";
    return none;
  }
  const WholeStorebagAnswer whole = _download.fetchStorebagWithName(name, lastModified);
  StorebagSectionAnswer answer{whole, nullptr, {}};
  if (answer.kind == Kind::failed && answer.attempted)
    logError("fetchStorebagForEnvironmentAndClientType: Could not fetch storebag for client type %d",
             clientType);
  if (answer.kind != Kind::fetched) return answer;
  answer.kind = Kind::failed;
  const std::optional<std::uint32_t> environment = _settings.currentEnvironment();
  if (!environment) {
    answer.attempted = false;
    answer.cause = StorebagCause::noAttempt;
    answer.why = "the environment cannot be read just now";
    return answer;
  }
  const auto storebag = parsed<Storebag>(whole.storebag);
  const Dictionary* section = sectionOf(storebag, *environment);
  if (section == nullptr) {
    const char* sectionName = sectionNameForEnvironment(*environment);
    logError(
        "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type %d with %s "
        "environment",
        clientType, sectionName != nullptr ? sectionName : "(null)");
    if (answer.cause == StorebagCause::none) {
      answer.cause = StorebagCause::noSection;
      answer.why = sectionName ? "it has no section \"" + std::string(sectionName) + "\""
                               : "environment " + std::to_string(*environment) + " names no section";
    }
    return answer;
  }
  answer.kind = Kind::fetched;
  answer.section = parseSection(*section);
  answer.version = storebag.version;
  if (storebag.refreshCycle) {
    answer.maxAge = static_cast<std::int32_t>(*storebag.refreshCycle);
    logInfo("fetchStorebagForEnvironmentAndClientType: Store bag override MaxAge=%d", answer.maxAge);
  }
  return answer;
}

}  // namespace veltrad::config
