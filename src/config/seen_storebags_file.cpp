// SPDX-License-Identifier: Apache-2.0
// Reads the file once, and replaces it when something is new.
#include "config/seen_storebags_file.h"

#include "formats/json.h"
#include "platform/log.h"

namespace veltrad::config {
namespace {

constexpr std::size_t kMostSeenBytes = 1u << 20;

}  // namespace

std::optional<SeenStorebags> seenStorebagsIn(std::string_view json) {
  const auto read = formats::parseJSON(json);
  const Dictionary* whole = read ? read.value().asDictionary() : nullptr;
  const Value* serials = whole ? whole->find("serials") : nullptr;
  const Array* revoked = whole ? whole->array("revoked") : nullptr;
  if (!serials || !serials->asDictionary() || !revoked) return std::nullopt;
  SeenStorebags seen;
  for (const auto& [name, bySigner] : *serials->asDictionary()) {
    if (!bySigner.asDictionary()) return std::nullopt;
    for (const auto& [signer, number] : *bySigner.asDictionary()) {
      const auto serial = number.isNumber() ? number.toInt64() : std::nullopt;
      if (!serial) return std::nullopt;
      seen.serials[name][signer] = *serial;
    }
  }
  for (const Value& key : *revoked) {
    if (!key.asString()) return std::nullopt;
    seen.revoked.insert(*key.asString());
  }
  return seen;
}

std::string textOf(const SeenStorebags& seen) {
  Dictionary serials;
  for (const auto& [name, bySigner] : seen.serials) {
    Dictionary numbers;
    for (const auto& [signer, serial] : bySigner) numbers.set(signer, serial);
    serials.set(name, std::move(numbers));
  }
  Array revoked;
  for (const std::string& key : seen.revoked) revoked.push_back(key);
  return formats::writeJSON(Dictionary{{"serials", std::move(serials)}, {"revoked", std::move(revoked)}}) +
         "\n";
}

Result<SeenStorebags, SeenStorebagsFile::Failed> SeenStorebagsFile::seen() {
  const Lock held(_mutex);
  return read();
}

Result<SeenStorebags, SeenStorebagsFile::Failed> SeenStorebagsFile::read() {
  if (_seen) return *_seen;
  const auto bytes = _files.read(_path, kMostSeenBytes);
  if (!bytes && bytes.error().kind == platform::FileFailure::Kind::notFound) return _seen.emplace();
  if (!bytes) return Failure{Failed{bytes.error().passes(), bytes.error().description}};
  auto seen = seenStorebagsIn(bytes.value());
  if (!seen) return Failure{Failed{false, _path + ": torn, or not written by this program"}};
  _seen = std::move(seen);
  return *_seen;
}

void SeenStorebagsFile::remember(const std::string& name, const StorebagClaims& claims,
                                 const StorebagSigners& signers, const StorebagRules& rules) {
  std::optional<std::string> failed;
  {
    const Lock held(_mutex);
    const auto before = read();
    if (!before) return;  // it was there a moment ago, when the bag was accepted
    config::remember(*_seen, name, claims, signers, rules);
    if (*_seen == before.value() && _stored) return;
    const auto written = _files.replace(_path, textOf(*_seen), 0600);
    _stored = written.ok();
    if (!written) failed = written.error().description;
  }
  if (failed)
    logWarning("Storebag '%s': its serial and revocations will not be known after the next start: %s",
               name.c_str(), failed->c_str());
}

}  // namespace veltrad::config
