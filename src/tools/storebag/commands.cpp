// SPDX-License-Identifier: Apache-2.0
// Makes keys; signs, verifies and shows storebags.
#include "storebag/commands.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <optional>

#include "base/file_descriptor.h"
#include "config/expiry_date.h"
#include "config/storebag_container.h"
#include "config/storebag_key.h"
#include "config/storebag_signing.h"
#include "config/storebag_trust.h"
#include "config/storebag_verdict.h"
#include "formats/json.h"
#include "formats/property_list.h"
#include "platform/file_store.h"
#include "storebag/lint.h"

namespace veltrad::storebag {

using config::SigningKey;
using config::StorebagKey;

namespace {

Outcome done(std::string text) {
  return {true, std::move(text)};
}
Outcome refused(std::string text) {
  return {false, std::move(text)};
}

bool exists(const std::string& path) {
  struct stat found {};
  return ::lstat(path.c_str(), &found) == 0;
}

// The bytes of the storebag with what the request writes into it.
std::string bytesToSign(const StorebagDocument& bag, const SignRequest& request) {
  const Document& document = bag.document;
  Dictionary storebag = bag.storebag;
  if (request.serial) storebag.set("serial", *request.serial);
  if (request.expires) storebag.set("expires", *request.expires);
  if (request.name) storebag.set("name", *request.name);
  const bool unchanged = !request.serial && !request.expires && !request.name;
  if (unchanged && document.form != Document::Form::json) return document.bytes;
  return formats::writeXMLPropertyList(storebag);
}

Result<StorebagKey, std::string> publicKeyIn(const std::string& path, StorebagKey::Kind kind) {
  platform::DiskFileStore files;
  const auto bytes = files.read(path, config::kStorebagMostContainerBytes);
  if (!bytes) return Failure{bytes.error().description};
  const bool rsa = kind == StorebagKey::Kind::rsa;
  auto key = rsa ? StorebagKey::fromDER(bytes.value()) : StorebagKey::fromFile(bytes.value());
  if (key && key->kind() == kind) return std::move(*key);
  if (!rsa) return Failure{path + ": expected an Ed25519 public key in DER or PEM form"};
  return Failure{fmt::format("{}: expected an RSA public key in DER form of {} to {} bits", path,
                             StorebagKey::kFewestModulusBits, StorebagKey::kMostModulusBits)};
}

// Never replaces a file, even if it is made at the same time.
std::optional<std::string> writeNew(const std::string& path, const std::string& bytes, mode_t mode) {
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, mode));
  if (!file.isOpen()) return path + ": " + std::strerror(errno);
  const ssize_t written = ::write(file.get(), bytes.data(), bytes.size());
  if (written == static_cast<ssize_t>(bytes.size()) && ::fsync(file.get()) == 0) return std::nullopt;
  ::unlink(path.c_str());
  return path + ": could not be written";
}

}  // namespace

Outcome keygen(const std::string& directory, int bits, bool ed25519) {
  const std::string privatePath = directory + "/" + (ed25519 ? kEd25519PrivateKeyFile : kPrivateKeyFile);
  const std::string publicPath = directory + "/" + (ed25519 ? kEd25519PublicKeyFile : kPublicKeyFile);
  for (const std::string& path : {privatePath, publicPath})
    if (exists(path)) return refused(path + ": exists already; keys are never overwritten");
  if (const auto made = platform::makeDirectories(directory); !made) return refused(made.error().description);
  const SigningKey key = ed25519 ? SigningKey::generateEd25519() : SigningKey::generate(bits);
  if (const auto failure = writeNew(privatePath, key.privatePEM(), 0600)) return refused(*failure);
  if (const auto failure = writeNew(publicPath, key.publicDER(), 0644)) {
    ::unlink(privatePath.c_str());
    return refused(*failure);
  }
  return done(fmt::format("{}\n{}\nSHA-256 {}\n", privatePath, publicPath, key.fingerprint()));
}

Outcome sign(const SignRequest& request) {
  const auto key = SigningKey::load(request.privateKey);
  if (!key) return refused(key.error());
  std::vector<SigningKey> further;
  for (const std::string& path : request.ed25519) {
    const auto one = SigningKey::loadEd25519(path);
    if (!one) return refused(one.error());
    further.push_back(one.value());
  }
  const auto bag = readStorebag(request.in);
  if (!bag) return refused(bag.error().line());
  if (bag.value().signedContainer)
    return refused(request.in + ": is signed already; \"veltra-storebag show\" prints the storebag in it");
  if (!request.force) {
    if (std::string errors = errorsIn(bag.value()); !errors.empty())
      return refused(errors + "\n--force signs it all the same");
  }
  if (request.expires && !config::expiryOf(*request.expires))
    return refused(
        fmt::format("--expires {}: expected a date (2026-12-31) or date and time as in RFC 3339 "
                    "(2026-12-31T18:00:00Z)",
                    *request.expires));
  const std::string bytes = bytesToSign(bag.value(), request);
  const auto inner = config::parseStorebagBag(bytes);
  if (!inner)
    return refused(
        fmt::format("{}: beyond what the daemon takes of a storebag: {}", request.in, boundsOfStorebags()));
  if (const auto claims = config::StorebagClaims::of(*inner); !request.force && !claims.unreadable.empty())
    return refused(
        fmt::format("{}: {}; --force signs it all the same", request.in, claims.unreadable.begin()->second));
  const std::string container = config::makeStorebagContainerAround(key.value(), bytes, further);
  if (!config::parseStorebagContainer(container))
    return refused(fmt::format("{}: signed it has {} bytes; the daemon takes {}", request.in,
                               container.size(), config::kStorebagMostContainerBytes));
  platform::DiskFileStore files;
  if (const auto written = files.replace(request.out, container, 0644); !written)
    return refused(written.error().description);
  return done("");
}

Outcome verify(const std::string& publicKey, const std::string& file, const std::string& ed25519) {
  const auto bytes = readBytes(file);
  return bytes ? verifyBytes(publicKey, file, bytes.value(), ed25519) : refused(bytes.error());
}

Outcome verifyBytes(const std::string& publicKey, const std::string& file, const std::string& bytes,
                    const std::string& ed25519) {
  const auto key = publicKeyIn(publicKey, StorebagKey::Kind::rsa);
  if (!key) return refused(key.error());
  const auto container = config::parseStorebagContainer(bytes);
  if (!container)
    return refused(file + ": the container is no property list: " + container.error().description());
  if (!container.value().signature) return refused(file + ": the text \"signature\" is missing");
  if (!container.value().bag) return refused(file + ": the text \"bag\" is missing");
  const std::optional<config::SignedStorebag> decoded = config::decodeStorebagContainer(container.value());
  if (!decoded) return refused(file + ": \"signature\" or \"bag\" is no base64");
  const std::size_t expected = static_cast<std::size_t>(key.value().modulusBits() + 7) / 8;
  if (decoded->signature.size() != expected)
    return refused(fmt::format("{}: the signature has {} bytes; one of this key has {}", file,
                               decoded->signature.size(), expected));
  if (!key.value().verifies(decoded->bag, decoded->signature))
    return refused(file + ": the signature is not this key's over this bag");
  std::string holds =
      fmt::format("{}: the signature holds, of the key {}\n", file, key.value().fingerprint());
  if (!ed25519.empty()) {
    const auto second = publicKeyIn(ed25519, StorebagKey::Kind::ed25519);
    if (!second) return refused(second.error());
    const auto signers =
        config::ed25519SignersOf(container.value(), decoded->bag, std::vector{second.value()});
    if (signers.empty()) return refused(file + ": it has no Ed25519 signature of this key over this bag");
    holds += fmt::format("{}: the Ed25519 signature holds, of the key {}\n", file, signers.front());
  }
  if (!config::parseStorebagBag(decoded->bag))
    return refused(fmt::format("{}: signed, but the bag is no property list of a dictionary within {}", file,
                               boundsOfStorebags()));
  return done(std::move(holds));
}

Outcome show(const std::string& file, bool compact) {
  const auto bag = readStorebag(file);
  if (!bag) return refused(bag.error().line());
  std::string json = formats::writeJSON(bag.value().storebag,
                                        compact ? formats::JSONStyle::compact : formats::JSONStyle::pretty);
  if (!json.ends_with('\n')) json += '\n';
  return done(std::move(json));
}

}  // namespace veltrad::storebag
