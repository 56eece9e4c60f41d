// SPDX-License-Identifier: Apache-2.0
// Sets up the lab's directory and reads its storebags.
#include "directory.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "base/text.h"
#include "certificate.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "platform/file_store.h"
#include "stamp.h"

namespace veltrad::lab {
namespace {

// An example: every client reports to this lab, regardless of consent.
constexpr std::string_view kExampleStorebag = R"({
  "version": "example-1",
  "release": {
    "httppost": {
      "display_url": "${url}/",
      "clients": [
        {
          "post_url": "${url}/events",
          "realtime_post_url": "${url}/realtime",
          "locale_whitelist": ["US", "DE", "GB"],
          "override_dnu": 1,
          "sampling_threshold": 1,
          "event_threshold": 49,
          "filters": [{"key": "userName", "action": "sha256"}]
        }
      ]
    }
  }
}
)";

bool exists(const std::string& path) {
  return ::access(path.c_str(), F_OK) == 0;
}

std::string replaced(std::string text, std::string_view what, const std::string& by) {
  for (auto at = text.find(what); at != std::string::npos; at = text.find(what, at + by.size()))
    text.replace(at, what.size(), by);
  return text;
}

Value withAddresses(const Value& value, const std::string& url, int dashboardPort) {
  if (const auto* text = value.asString()) {
    if (*text == "${dashboardPort}") return dashboardPort;
    return replaced(*text, "${url}", url);
  }
  if (const auto* array = value.asArray()) {
    Array changed;
    for (const auto& item : *array) changed.push_back(withAddresses(item, url, dashboardPort));
    return changed;
  }
  if (const auto* dictionary = value.asDictionary()) {
    std::vector<Dictionary::Entry> changed;
    for (const auto& [key, item] : *dictionary)
      changed.emplace_back(key, withAddresses(item, url, dashboardPort));
    return Dictionary::fromEntries(std::move(changed));
  }
  return value;
}

// A name is one path component of letters, digits, "-" and "_", so it never leads out of the directory.
bool isStorebagName(const std::string& name) {
  const auto plain = [](unsigned char c) { return std::isalnum(c) != 0 || c == '-' || c == '_'; };
  return !name.empty() && std::all_of(name.begin(), name.end(), plain);
}

Result<Value, std::string> parsed(const std::string& bytes, bool json) {
  if (json) {
    auto value = formats::parseJSONWithComments(bytes);
    if (value) return std::move(value).value();
    const TextPlace place = placeInText(bytes, value.error().offset);
    return Failure{std::to_string(place.line) + ":" + std::to_string(place.column) +
                   ": no JSON: " + value.error().detail};
  }
  auto value = formats::parsePropertyList(bytes);
  if (value) return std::move(value).value();
  return Failure{"no property list: " + value.error().description()};
}

// Makes the pair where the private half is missing, and writes the public one. Returns what failed.
std::optional<std::string> makePair(const std::string& privatePath, const std::string& publicPath,
                                    config::SigningKey (*generate)(),
                                    Result<config::SigningKey, std::string> (*load)(const std::string&)) {
  platform::DiskFileStore files;
  if (!exists(privatePath)) {
    const auto written = files.replace(privatePath, generate().privatePEM(), 0600);
    if (!written) return written.error().description;
  }
  const auto key = load(privatePath);
  if (!key) return key.error();
  const auto written = files.replace(publicPath, key.value().publicDER(), 0644);
  return written ? std::nullopt : std::optional(written.error().description);
}

std::optional<std::string> makeKeys(const std::string& directory) {
  const auto generate = [] { return config::SigningKey::generate(); };
  if (auto failure = makePair(directory + "/private.pem", directory + "/publicKey.der", generate,
                              config::SigningKey::load))
    return failure;
  return makePair(directory + "/ed25519.pem", directory + "/ed25519.der", config::SigningKey::generateEd25519,
                  config::SigningKey::loadEd25519);
}

}  // namespace

Result<Directory, std::string> Directory::open(const std::string& path) {
  const bool first = !exists(path + "/storebags");
  for (const char* part : {"/storebags", "/received", "/signing"}) {
    if (const auto made = platform::makeDirectories(path + part); !made)
      return Failure{made.error().description};
  }
  platform::DiskFileStore files;
  if (first) {
    if (const auto written = files.replace(path + "/storebags/quindle.json", kExampleStorebag, 0644);
        !written)
      return Failure{written.error().description};
  }
  if (auto failure = makeKeys(path + "/signing")) return Failure{std::move(*failure)};
  Directory directory(path);
  if (!exists(directory.certificatePath()) || !exists(directory.certificateKeyPath())) {
    if (const auto failure = makeCertificate(directory.certificatePath(), directory.certificateKeyPath()))
      return Failure{*failure};
  }
  return directory;
}

std::string Directory::keysOf(const std::string& name) const {
  return _path + "/signing" + (name == kOwnKeys ? "" : "/" + name);
}

Result<config::SigningKey, std::string> Directory::signingKey(const std::string& name) const {
  return config::SigningKey::load(keysOf(name) + "/private.pem");
}

Result<config::SigningKey, std::string> Directory::ed25519Key(const std::string& name) const {
  return config::SigningKey::loadEd25519(keysOf(name) + "/ed25519.pem");
}

Result<StorebagFile, StorebagFailure> Directory::signedStorebag(const std::string& path) const {
  struct stat status {};
  platform::DiskFileStore files;
  auto bytes = files.read(path, 16u << 20);
  if (!bytes || ::stat(path.c_str(), &status) != 0)
    return Failure{StorebagFailure{StorebagFailure::Kind::unreadable,
                                   bytes ? path + ": cannot be read" : bytes.error().description}};
  return StorebagFile{{}, status.st_mtim.tv_sec, std::move(bytes).value()};
}

Result<StorebagFile, StorebagFailure> Directory::storebag(const std::string& name, const std::string& url,
                                                          int dashboardPort) const {
  using Kind = StorebagFailure::Kind;
  if (!isStorebagName(name))
    return Failure{StorebagFailure{Kind::notFound, "a storebag's name has letters, digits, - and _ only"}};
  const std::string base = _path + "/storebags/" + name;
  if (exists(base)) return signedStorebag(base);
  const bool json = !exists(base + ".plist");
  const std::string path = base + (json ? ".json" : ".plist");
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0)
    return Failure{StorebagFailure{Kind::notFound, "neither " + base + ".plist nor .json is there"}};
  platform::DiskFileStore files;
  const auto bytes = files.read(path, 16u << 20);
  if (!bytes) return Failure{StorebagFailure{Kind::unreadable, bytes.error().description}};
  const auto value = parsed(bytes.value(), json);
  if (!value) return Failure{StorebagFailure{Kind::unreadable, path + (json ? ":" : ": ") + value.error()}};
  if (const Dictionary* whole = value.value().asDictionary(); whole && whole->string("bag"))
    return Failure{StorebagFailure{
        Kind::unreadable, path +
                              ": is signed already, and the lab signs what it serves: put the storebag "
                              "itself there (veltra-storebag show prints it), or name the file " +
                              name + ", which is served as it is"}};
  const Value changed = withAddresses(value.value(), url, dashboardPort);
  if (!changed.asDictionary())
    return Failure{StorebagFailure{Kind::unreadable, path + ": a storebag is a dictionary at its top"}};
  return StorebagFile{*changed.asDictionary(), status.st_mtim.tv_sec};
}

}  // namespace veltrad::lab
