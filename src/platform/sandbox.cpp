// SPDX-License-Identifier: Apache-2.0
// The daemon's sandbox profile, and entering it.
#include "platform/sandbox.h"

#include <fcntl.h>
#include <sys/prctl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <string_view>
#include <system_error>

#include "base/file_descriptor.h"
#include "platform/landlock.h"
#include "platform/root.h"

namespace veltrad::platform {

namespace {

constexpr std::uint64_t kRead = landlock::kReadFile | landlock::kReadDirectory;
// Without kRefer, because files are renamed within their directory. No rule grants kExecute.
constexpr std::uint64_t kWrite = kRead | landlock::kWriteFile | landlock::kTruncate | landlock::kRemoveFile |
                                 landlock::kRemoveDirectory | landlock::kMakeDirectory |
                                 landlock::kMakeRegularFile | landlock::kMakeSocket;

std::string failureText(const std::string& what) {
  return what + ": " + std::generic_category().message(errno);
}

struct Outcome {
  int rules = 0;
  int missing = 0;
};

// Returns the failure text, if any.
std::optional<std::string> addRules(int ruleset, const std::vector<std::string>& paths, std::uint64_t allowed,
                                    Outcome& outcome) {
  for (const std::string& path : paths) {
    const FileDescriptor place(::open(path.c_str(), O_PATH | O_CLOEXEC));
    if (!place.isOpen()) {
      if (errno != ENOENT && errno != ENOTDIR && errno != EACCES) return failureText(path);
      ++outcome.missing;
      continue;
    }
    struct stat status {};
    if (::fstat(place.get(), &status) != 0) return failureText(path);
    const std::uint64_t rights = S_ISDIR(status.st_mode) ? allowed : allowed & landlock::kRightsOfFiles;
    if (landlock::addPath(ruleset, place.get(), rights) != 0) return failureText("a rule for " + path);
    ++outcome.rules;
  }
  return std::nullopt;
}

Result<SandboxState, std::string> restrict(const SandboxProfile& profile, int abi) {
  const std::uint64_t handled = landlock::rightsOfABI(abi);
  const FileDescriptor ruleset(landlock::createRuleset(handled));
  if (!ruleset.isOpen()) return Failure{failureText("a Landlock ruleset")};
  Outcome outcome;
  if (const auto failure = addRules(ruleset.get(), profile.read, kRead & handled, outcome))
    return Failure{*failure};
  const int readRules = outcome.rules;
  if (const auto failure = addRules(ruleset.get(), profile.write, kWrite & handled, outcome)) {
    return Failure{*failure};
  }
  if (landlock::restrictSelf(ruleset.get()) != 0) return Failure{failureText("entering Landlock")};
  return SandboxState{true, "Sandbox \"" + profile.name + "\" in force: Landlock ABI " + std::to_string(abi) +
                                ", " + std::to_string(readRules) + " paths to read, " +
                                std::to_string(outcome.rules - readRules) + " to write, " +
                                std::to_string(outcome.missing) +
                                " missing and left out; no program runs, no new privileges"};
}

// The nearest existing directory, so that files that are added later can be read; never "/".
std::string itselfOrNearestAbove(const std::string& path) {
  std::string place = path;
  struct stat status {};
  while (::stat(place.c_str(), &status) != 0 || !S_ISDIR(status.st_mode)) {
    const auto slash = place.rfind('/');
    if (slash == std::string::npos || slash == 0) return path;
    place.resize(slash);
  }
  return place;
}

}  // namespace

SandboxProfile veltradSandboxProfile(const Root& root) {
  const std::string messageLog = root.messageLogDirectory();
  return {
      "com.florn.veltrad",
      {itselfOrNearestAbove(root.configurationDirectory()), itselfOrNearestAbove(root.resourcesDirectory()),
       root.adaptorBundleDirectory(), root.localeConfigurationPath(),
       // Of the host: names, certificates, time zones, libraries, facts about the machine.
       "/etc", "/proc", "/sys/class/dmi", "/sys/devices/virtual/dmi", "/sys/firmware/devicetree", "/usr/lib",
       "/usr/lib64", "/usr/local/lib", "/lib", "/lib64", "/usr/share/zoneinfo", "/usr/share/ca-certificates",
       "/usr/local/share/ca-certificates", "/run/systemd/resolve"},
      {root.stateDirectory(), root.logsDirectory(), root.runDirectory(),
       messageLog.substr(0, messageLog.rfind('/'))}};
}

Result<SandboxState, std::string> enterSandbox(const SandboxProfile& profile) {
  const char* wanted = std::getenv("VELTRA_SANDBOX");
  const std::string_view choice = wanted ? wanted : "";
  if (!choice.empty() && choice != "required") {
    return Failure{"VELTRA_SANDBOX is \"" + std::string(choice) + "\": expected required, or nothing"};
  }
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return Failure{failureText("no new privileges")};
  const int abi = landlock::abi();
  if (abi > 0) return restrict(profile, abi);
  const std::string line =
      "Sandbox \"" + profile.name + "\": this kernel has no Landlock, no new privileges alone";
  if (choice == "required") return Failure{line + "; VELTRA_SANDBOX=required"};
  return SandboxState{false, line};
}

}  // namespace veltrad::platform
