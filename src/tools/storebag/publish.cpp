// SPDX-License-Identifier: Apache-2.0
// Checks storebags before they are served.
#include "storebag/publish.h"

#include <fmt/format.h>

#include <algorithm>
#include <ctime>
#include <filesystem>

#include "config/storebag_verdict.h"
#include "storebag/lint.h"
#include "storebag/served_folder.h"

namespace veltrad::storebag {

namespace {

using config::StorebagClaims;

// One storebag that is about to be published.
struct Publication {
  std::string file;
  std::string name;
  std::string bytes;
  StorebagClaims claims;
};

// Says what is wrong with the names; empty: nothing.
std::string faultOfNames(std::vector<std::string> names) {
  std::sort(names.begin(), names.end());
  const auto twice = std::adjacent_find(names.begin(), names.end());
  if (twice != names.end()) return *twice + ": is given twice";
  for (const std::string& name : names) {
    if (name.empty() || name.front() == '.' || name.front() == '-' || name.find('/') != std::string::npos)
      return fmt::format("\"{}\": expected the name of a storebag", name);
  }
  return "";
}

Result<Publication, std::string> checked(const std::string& file, const PublishRequest& request) {
  auto bytes = readBytes(file);
  if (!bytes) return Failure{bytes.error()};
  const Outcome verified = verifyBytes(request.publicKey, file, bytes.value(), request.ed25519);
  if (!verified.done) return Failure{verified.text};
  const auto bag = storebagOf(file, bytes.value());
  if (!bag) return Failure{bag.error().line()};
  if (std::string errors = errorsIn(bag.value()); !errors.empty()) return Failure{std::move(errors)};
  Publication made{file, std::filesystem::path(file).filename().string(), std::move(bytes).value(),
                   StorebagClaims::of(bag.value().storebag)};
  if (made.claims.name && *made.claims.name != made.name)
    return Failure{fmt::format("{}: the storebag's name is \"{}\", the file's is \"{}\"", file,
                               *made.claims.name, made.name)};
  return made;
}

// A storebag that no device accepts has no serial that a device could have seen.
std::optional<std::int64_t> serialIn(const std::optional<std::string>& bytes) {
  if (!bytes) return std::nullopt;
  const auto bag = storebagOf({}, *bytes);
  return bag ? StorebagClaims::of(bag.value().storebag).serial : std::nullopt;
}

// Why devices would refuse it after what is served now; empty: they would not.
Result<std::string, std::string> faultAfter(const ServedFolder& folder, const std::string& name,
                                            const StorebagClaims& claims) {
  const auto served = folder.served(name);
  if (!served) return Failure{served.error()};
  if (const auto late = config::refusalOfExpiry(claims.expires, static_cast<double>(std::time(nullptr))))
    return late->text;
  return faultOfSerial(serialIn(served.value()), claims.serial);
}

// The one to go back to, if devices take it or it is forced upon them.
Result<ServedFolder::Kept, std::string> wayBack(const ServedFolder& folder, const std::string& name,
                                                bool force) {
  auto kept = folder.before(name);
  if (!kept) return Failure{kept.error()};
  if (!kept.value()) return Failure{folder.pathOf(name) + ": nothing was published before"};
  if (force) return std::move(*kept.value());
  const auto bag = storebagOf(name, kept.value()->bytes);
  if (!bag) return Failure{bag.error().line()};
  const auto fault = faultAfter(folder, name, StorebagClaims::of(bag.value().storebag));
  if (!fault) return Failure{fault.error()};
  if (!fault.value().empty())
    return Failure{
        fmt::format("{}: in the one before, {}. Devices can refuse that: sign it anew, with a "
                    "higher serial or a later date, or use --force",
                    folder.pathOf(name), fault.value())};
  return std::move(*kept.value());
}

}  // namespace

std::string faultOfSerial(std::optional<std::int64_t> served, std::optional<std::int64_t> next) {
  if (!served) return "";
  if (!next) return fmt::format("it has no serial, the one that is served has {}", *served);
  if (*next < *served) return fmt::format("serial {} is lower than {}, which is served", *next, *served);
  return "";
}

Outcome publish(const PublishRequest& request) {
  std::vector<Publication> all;
  std::vector<std::string> names;
  for (const std::string& file : request.files) {
    auto one = checked(file, request);
    if (!one) return {false, one.error()};
    names.push_back(one.value().name);
    all.push_back(std::move(one).value());
  }
  if (std::string fault = faultOfNames(names); !fault.empty()) return {false, std::move(fault)};
  const auto folder = ServedFolder::open(request.directory, true);
  if (!folder) return {false, folder.error()};
  for (const Publication& one : all) {
    const auto fault = faultAfter(folder.value(), one.name, one.claims);
    if (!fault) return {false, fault.error()};
    if (!fault.value().empty()) return {false, one.file + ": " + fault.value()};
  }
  std::string text;
  for (const Publication& one : all) {
    if (const auto put = folder.value().put(one.name, one.bytes); !put) return {false, put.error()};
    text += folder.value().pathOf(one.name) + "\n";
  }
  return {true, std::move(text)};
}

Outcome rollback(const RollbackRequest& request) {
  if (std::string fault = faultOfNames(request.names); !fault.empty()) return {false, std::move(fault)};
  const auto folder = ServedFolder::open(request.directory, false);
  if (!folder) return {false, folder.error()};
  std::vector<ServedFolder::Kept> all;
  for (const std::string& name : request.names) {
    auto kept = wayBack(folder.value(), name, request.force);
    if (!kept) return {false, kept.error()};
    all.push_back(std::move(kept).value());
  }
  std::string text;
  for (std::size_t at = 0; at < all.size(); ++at) {
    const std::string& name = request.names[at];
    if (const auto put = folder.value().putBack(name, all[at]); !put) return {false, put.error()};
    text += folder.value().pathOf(name) + "\n";
  }
  return {true, std::move(text)};
}

}  // namespace veltrad::storebag
