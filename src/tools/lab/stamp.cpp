// SPDX-License-Identifier: Apache-2.0
// Reads stamps, and stamps and signs storebags.
#include "stamp.h"

#include <cmath>
#include <ctime>

#include "config/expiry_date.h"
#include "config/storebag_signing.h"
#include "directory.h"
#include "formats/property_list.h"
#include "received.h"

namespace veltrad::lab {
namespace {

constexpr const char* kExpected =
    R"(an object of "serial", "expires", "validFor", "clock", "name", "revoked", "key", "ed25519")";

bool readNumberInto(const Value& value, std::optional<std::int64_t>& into) {
  into = value.isNumber() ? value.toInt64() : std::nullopt;
  return into.has_value();
}

bool readTextInto(const Value& value, std::optional<std::string>& into) {
  if (const std::string* text = value.asString()) into = *text;
  return into.has_value();
}

bool readTextsInto(const Value& value, std::vector<std::string>& into) {
  const Array* array = value.asArray();
  if (!array) return false;
  into.clear();
  for (const Value& one : *array) {
    if (!one.asString()) return false;
    into.push_back(*one.asString());
  }
  return true;
}

bool readStampKey(const std::string& key, const Value& value, Stamp& stamp) {
  if (key == "serial") return readNumberInto(value, stamp.serial);
  if (key == "expires") return readTextInto(value, stamp.expires);
  if (key == "validFor") return readNumberInto(value, stamp.validFor);
  if (key == "clock") return readTextInto(value, stamp.clock) && config::expiryOf(*stamp.clock).has_value();
  if (key == "name") return readTextInto(value, stamp.name);
  if (key == "revoked") return readTextsInto(value, stamp.revoked.emplace());
  if (key == "ed25519") return readTextsInto(value, stamp.ed25519);
  if (key == "key" && value.asString()) {
    stamp.key = *value.asString();
    return true;
  }
  return false;
}

std::string dateAndTime(double secondsSince1970) {
  const auto whole = static_cast<std::time_t>(std::floor(secondsSince1970));
  std::tm parts{};
  char text[32];
  ::gmtime_r(&whole, &parts);
  return std::string(text, std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &parts));
}

Result<Array, std::string> fingerprintsOf(const std::vector<std::string>& revoked,
                                          const Directory& directory) {
  constexpr std::size_t kFingerprintDigits = 64;
  Array all;
  for (const std::string& one : revoked) {
    if (one.size() == kFingerprintDigits) {
      all.push_back(one);
      continue;
    }
    const auto rsa = directory.signingKey(one);
    const auto ed25519 = directory.ed25519Key(one);
    if (!rsa && !ed25519) return Failure{rsa.error()};
    if (rsa) all.push_back(rsa.value().fingerprint());
    if (ed25519) all.push_back(ed25519.value().fingerprint());
  }
  return all;
}

}  // namespace

Result<Stamp, std::string> stampFrom(const Value& value) {
  const Dictionary* entries = value.asDictionary();
  if (!entries) return Failure{std::string(kExpected)};
  Stamp stamp;
  for (const auto& [key, entry] : *entries) {
    if (!readStampKey(key, entry, stamp)) return Failure{kExpected + (", and not this \"" + key) + "\""};
  }
  return stamp;
}

Result<std::string, std::string> stampedContainer(const Dictionary& storebag, const Stamp& stamp,
                                                  const Directory& directory) {
  Dictionary bag = storebag;
  if (stamp.serial) bag.set("serial", *stamp.serial);
  if (stamp.name) bag.set("name", *stamp.name);
  if (stamp.expires) bag.set("expires", *stamp.expires);
  if (stamp.validFor) {
    const double clock = stamp.clock ? *config::expiryOf(*stamp.clock) : secondsNow();
    bag.set("expires", dateAndTime(clock + static_cast<double>(*stamp.validFor)));
  }
  if (stamp.revoked) {
    auto revoked = fingerprintsOf(*stamp.revoked, directory);
    if (!revoked) return Failure{revoked.error()};
    bag.set("revoked", std::move(revoked).value());
  }
  const auto key = directory.signingKey(stamp.key);
  if (!key) return Failure{key.error()};
  std::vector<config::SigningKey> further;
  for (const std::string& name : stamp.ed25519) {
    const auto one = directory.ed25519Key(name);
    if (!one) return Failure{one.error()};
    further.push_back(one.value());
  }
  return config::makeStorebagContainerAround(key.value(), formats::writeXMLPropertyList(bag), further);
}

}  // namespace veltrad::lab
