// SPDX-License-Identifier: Apache-2.0
// Makes the report section by section.
#include "tools/ctl/report_text.h"

#include <fmt/format.h>
#include <sys/utsname.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <set>
#include <system_error>
#include <vector>

#include "base/text.h"
#include "config/preference_keys.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "platform/file_store.h"
#include "platform/root.h"
#include "tools/ctl/answer_fields.h"
#include "tools/ctl/child_output.h"
#include "tools/ctl/commands.h"
#include "tools/ctl/control_client.h"
#include "tools/ctl/counters_report.h"
#include "tools/ctl/preference_access.h"
#include "tools/ctl/redaction.h"
#include "tools/ctl/status_report.h"
#include "veltra/veltra.h"
#include "wire/names.h"

namespace veltrad::ctl {

namespace {

constexpr std::size_t kLargestReportedFile = 1u << 20;
constexpr std::size_t kMostFiles = 100;
constexpr const char* kLogLines = "200";
// Each storebag may be fetched.
constexpr std::chrono::seconds kPatienceForChecks{150};

std::string cannot(const std::string& why) {
  return "(not in this report: " + why + ")";
}

std::string statusSection(const Options& options) {
  const auto status = askForStatus(options);
  if (!status) return cannot(status.error());
  const std::chrono::duration<double> now = std::chrono::system_clock::now().time_since_epoch();
  return formatStatus(status.value(), now.count());
}

std::string doctorSection(const Options& options) {
  auto daemon = ControlClient::connect(options.root);
  if (!daemon) return cannot(daemon.error());
  const auto answer = daemon.value().ask(wire::question::kDoctor, {}, kPatienceForChecks);
  return answer ? formats::writeJSON(answer.value(), formats::JSONStyle::pretty) : cannot(answer.error());
}

std::string statsSection(const platform::Root& root) {
  const auto file = platform::DiskFileStore().read(root.countersPath(), kLargestReportedFile);
  if (!file) return cannot(file.error().description);
  const auto counters = readCounters(file.value());
  return counters ? formatCounters(*counters) : cannot(root.countersPath() + " holds no counters");
}

// The values of identifiers are for the device's owner alone.
std::string preferencesSection(const Options& options) {
  auto access = PreferenceAccess::open(options.root, PreferenceAccess::Use::read);
  if (!access) return cannot(access.error());
  const auto answer = access.value().ask(wire::question::kConfig);
  if (!answer) return cannot(answer.error());
  Array kept;
  for (const Dictionary* one : dictionariesIn(answer.value(), "keys")) {
    Dictionary listed = *one;
    const std::string* name = listed.string("name");
    const config::PreferenceKey* key = name ? config::preferenceNamed(*name) : nullptr;
    if ((!key || key->identifies) && listed.string("value")) listed.set("value", "(left out)");
    kept.push_back(std::move(listed));
  }
  return formatPreferences(Dictionary{{"keys", std::move(kept)}});
}

// Only the properties that do not identify the owner of the device.
Dictionary deviceFacts(const Dictionary& all) {
  Dictionary kept;
  for (const auto& [key, value] : all) {
    static const std::set<std::string> kShown = {"ProductVersion", "BuildVersion", "ProductType",
                                                 "HWModelStr", "ReleaseType"};
    kept.set(key, kShown.contains(key) ? value : Value("(left out)"));
  }
  return kept;
}

// The content of files that the daemon parses. Of certificates, keys and unparsable files only their
// existence, because their content cannot be redacted.
std::string contentOf(const std::string& path, const std::string& name, const Redaction& redaction) {
  const auto bytes = platform::DiskFileStore().read(path, kLargestReportedFile);
  if (!bytes) return cannot(bytes.error().description);
  const std::string size = fmt::format("{} bytes", bytes.value().size());
  if (!name.ends_with(".plist") && !name.ends_with(".json")) return cannot(size + ", no property list");
  auto list = formats::parsePropertyList(bytes.value());
  auto json = list ? Result<Value, formats::JSONError>(std::move(list.value()))
                   : formats::parseJSONWithComments(bytes.value());
  if (!json)
    return cannot(size + "; as a property list: " + list.error().description() +
                  "; as JSON: " + json.error().detail);
  const Dictionary* dictionary = json.value().asDictionary();
  const bool isDevice = dictionary && (name == "device.plist" || name == "device.json");
  return formats::writeJSON(redaction.value(isDevice ? Value(deviceFacts(*dictionary)) : json.value()),
                            formats::JSONStyle::pretty);
}

std::string filesSection(const platform::Root& root, const Redaction& redaction) {
  namespace fs = std::filesystem;
  const fs::path directory = root.configurationDirectory();
  std::vector<std::string> names;
  std::error_code failure;
  for (fs::recursive_directory_iterator at(directory, failure), end; !failure && at != end;
       at.increment(failure)) {
    std::error_code unknown;
    if (!at->is_directory(unknown)) names.push_back(at->path().lexically_relative(directory).string());
  }
  if (failure) return cannot(directory.string() + ": " + failure.message());
  std::sort(names.begin(), names.end());
  if (names.size() > kMostFiles) names.resize(kMostFiles);
  std::string out;
  for (const std::string& name : names) {
    if (!out.empty()) out += '\n';
    out += fmt::format("-- {}\n{}", escapedForLog(name), contentOf(directory / name, name, redaction));
  }
  return out.empty() ? "no files" : out;
}

std::string distribution() {
  const auto file = platform::DiskFileStore().read("/etc/os-release", kLargestReportedFile);
  constexpr std::string_view kKey = "PRETTY_NAME=";
  const std::string text = file ? "\n" + file.value() : std::string();
  const std::size_t at = text.find("\n" + std::string(kKey));
  if (at == std::string::npos) return "unknown";
  const std::size_t from = at + 1 + kKey.size();
  std::string name = text.substr(from, text.find('\n', from) - from);
  std::erase(name, '"');
  return name;
}

std::string versionsSection(const Options& options) {
  std::string out = fmt::format("veltractl {}", veltra_version());
  auto daemon = ControlClient::connect(options.root);
  const auto answer = daemon ? daemon.value().ask(wire::question::kVersions)
                             : Result<Dictionary, std::string>(Failure{daemon.error()});
  const std::string* version = answer ? answer.value().string("veltrad") : nullptr;
  const std::string* libraries = answer ? answer.value().string("libraries") : nullptr;
  out += version ? "\nveltrad " + *version : "\nveltrad " + cannot(answer ? "no version" : answer.error());
  if (libraries) out += "\n" + *libraries;
  utsname system{};
  if (::uname(&system) == 0) out += fmt::format("\n{} {} {}", system.sysname, system.release, system.machine);
  return out + "\n" + distribution();
}

// Debug lines hold messages' contents.
std::string logSection() {
  auto lines = outputOf(
      {"journalctl", "-u", "veltrad", "-n", kLogLines, "-p", "info", "--no-pager", "-q", "-o", "short-iso"},
      std::chrono::seconds(10));
  if (!lines) return cannot("journalctl -u veltrad cannot be run or failed");
  while (!lines->empty() && lines->back() == '\n') lines->pop_back();
  return lines->empty() ? cannot("the journal has no lines of veltrad, or may not be read") : toUTF8(*lines);
}

}  // namespace

std::string reportText(const Options& options) {
  const auto root = options.root ? platform::Root(*options.root) : platform::Root::fromEnvironment();
  const Redaction redaction(namesOfMachine());
  const std::pair<const char*, std::string> sections[] = {
      {"Versions", versionsSection(options)},       {"Status", statusSection(options)},
      {"Checks", doctorSection(options)},           {"Counters", statsSection(root)},
      {"Preferences", preferencesSection(options)}, {"Files of etc/veltrad", filesSection(root, redaction)},
      {"Last lines of the log", logSection()},
  };
  std::string out;
  for (const auto& [title, text] : sections) {
    if (!out.empty()) out += "\n\n";
    out += fmt::format("== {} ==\n{}", title, text);
  }
  return redaction.text(out);
}

}  // namespace veltrad::ctl
