// SPDX-License-Identifier: Apache-2.0
// Sets up a device in memory.
#include "storebag/dry_world.h"

#include <functional>

#include "config/preference_keys.h"
#include "formats/json.h"
#include "formats/property_list.h"

namespace veltrad::storebag {
namespace {

using platform::FileFailure;

double drawOf(const Given& given, const std::string& backend) {
  const auto own = given.draws.find(backend);
  return own == given.draws.end() ? given.draw : own->second;
}

// A device that says nothing of its kind has no HTTPS back ends.
Dictionary withKind(Dictionary device) {
  if (!device.contains("DeviceName")) device.set("DeviceName", "Desktop");
  return device;
}

}  // namespace

Result<std::string, FileFailure> MemoryFiles::read(const std::string& path, std::size_t) {
  const auto file = _files.find(path);
  if (file == _files.end())
    return Failure{FileFailure{FileFailure::Kind::notFound, path + ": No such file or directory"}};
  return file->second;
}

Result<Done, FileFailure> MemoryFiles::replace(const std::string& path, std::string_view bytes, unsigned) {
  _files[path] = bytes;
  return Done();
}

Result<Done, FileFailure> MemoryFiles::rename(const std::string& from, const std::string& to) {
  if (const auto file = _files.extract(from)) _files[to] = file.mapped();
  return Done();
}

Result<Done, FileFailure> MemoryFiles::unlink(const std::string& path) {
  _files.erase(path);
  return Done();
}

Result<platform::FileStamp, FileFailure> MemoryFiles::stamp(const std::string& path) {
  const auto file = _files.find(path);
  return file == _files.end() ? platform::FileStamp()
                              : platform::FileStamp(std::hash<std::string>()(file->second));
}

Result<Done, http::HTTPError> KeptPosts::start(http::HTTPRequest request, http::HTTPCompletion) {
  _posts.push_back({std::move(request.url), std::move(request.body)});
  return Done();
}

http::HTTPResult KeptPosts::perform(http::HTTPRequest) {
  return Failure{http::HTTPError{http::HTTPError::Kind::stopping, "nothing leaves"}};
}

platform::DeviceProperty GivenDevice::value(std::string_view key) {
  const std::string* text = properties.string(key);
  return text && !text->empty() ? std::optional(*text) : std::nullopt;
}

DryMachine::DryMachine(const Given& given, const std::string& backend)
    : random(drawOf(given, backend)), locale(given.country), properties(withKind(given.device)) {}

DryWorld::DryWorld(const Given& given, const std::string& backend)
    : DryMachine(given, backend),
      StandaloneServices({posts, clock, random, locale, preferences, properties, files}) {
  const std::string domain(platform::kVeltraPreferenceDomain);
  static_cast<void>(files.replace(
      "/preferences/" + domain + ".plist",
      formats::writeXMLPropertyList(Dictionary{{std::string(config::preference::kConsent), given.consent}}),
      0600));
  // Bodies that can be read.
  static_cast<void>(files.replace(root.settingsPath(), R"({"compression": {"level": 0}})", 0600));
  // The same in every run, so that runs can be compared.
  static_cast<void>(
      files.replace(root.secretPath(), std::string(platform::DeviceSecret::kBytes, '\0'), 0600));
  if (given.policy)
    static_cast<void>(files.replace(root.policyPath(), formats::writeJSON(*given.policy), 0600));
  static_cast<void>(gate.refresh());
}

}  // namespace veltrad::storebag
